// The documents the module posts to the host on its own initiative: the module
// description (once at Open), the capability attributes of the configuration
// document, and profile status reports. All are printed compactly and begin
// with the declaration "<?xml ?>".
//
// PostToHost and PostModuleDescription may be called from any thread. A
// ProfileStatusDocument belongs to one user (the configuration commands, or
// the worker's notification job) and is used only on that user's thread.
#ifndef ALERTMOD_CONFIG_MODULE_REPLIES_H_
#define ALERTMOD_CONFIG_MODULE_REPLIES_H_

#include <cstdint>
#include <string>

#include <tinyxml.h>

#include "alertmod/host_records.h"

namespace hx {

// Profile status values.
constexpr int32_t kProfileStatusDelivered = 0;
constexpr int32_t kProfileStatusFailed = 1;
constexpr int32_t kProfileStatusUnknown = -1;  // changed by a configuration update

// Posts `text` (without terminator) to the host with `requestClass` and the
// document code. The host's answer is not used; nothing happens without a
// callback.
void PostToHost(core::HostCallbackFn callback, uint32_t requestClass, const std::string& text);

// `document` printed compactly: no indentation, no line breaks.
std::string PrintCompact(const TiXmlDocument& document);

// Writes the capability attributes onto a "Notify" element, in their order.
// Second reviewer mode withdraws image and video attachments; "SSL" is
// written only when the transfer tool speaks SMTPS.
void AddCapabilityAttributes(TiXmlElement& notify, bool attachmentsDisabled, bool smtpsAvailable);

// The module description document, compact.
std::string ModuleDescriptionText();

// Posts the module description with class 256.
void PostModuleDescription(core::HostCallbackFn callback);

// The document of profile status reports: Trellan / Notify (ID 786432) /
// Profiles / Profile. Each report rewrites the attributes of its one
// "Profile" element, so one document serves any number of reports.
class ProfileStatusDocument {
 public:
  ProfileStatusDocument();
  ProfileStatusDocument(const ProfileStatusDocument&) = delete;
  ProfileStatusDocument& operator=(const ProfileStatusDocument&) = delete;

  const TiXmlDocument& Document() const { return m_document; }
  TiXmlElement& Profile() { return *m_profile; }

 private:
  TiXmlDocument m_document;
  TiXmlElement* m_profile;  // owned by m_document
};

// Sets "ID", "Status" and "Time" (`nowSeconds` since 1970, UTC, as a 32-bit
// decimal) on the document's "Profile" element and posts the document with
// class 4.
void ReportProfileStatus(ProfileStatusDocument& document, int32_t profileId, int32_t status,
                         int64_t nowSeconds, core::HostCallbackFn callback);

}  // namespace hx

#endif  // ALERTMOD_CONFIG_MODULE_REPLIES_H_
