// NotifyCfg is everything the user configures for the alert module: the retry
// and size limits, the web server used for links, the SMTP servers and the
// notification profiles, plus facts learnt from the host (second reviewer
// mode, pre-alarm seconds per event, whether the transfer tool speaks SMTPS).
//
// Its one XML form is the "Notify" element below a "Trellan" root. It is read
// from "notify.xml" at Open and from the host's configuration updates, and
// written back to the file (passwords protected by the host) and to the host
// (passwords in clear) after every change.
//
// The manager owns the live configuration and touches it only on the host
// threads of Open and IOCTL code 2, one at a time; it takes no lock. Work
// items carry copies of what a notification needs, so the worker never reads
// it. Copies are plain values and may be used on any thread.
#ifndef ALERTMOD_CONFIG_NOTIFY_CFG_H_
#define ALERTMOD_CONFIG_NOTIFY_CFG_H_

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "alertmod/config/credentials.h"
#include "alertmod/config/notify_types.h"
#include "alertmod/host_records.h"

class TiXmlDocument;
class TiXmlElement;

namespace hx {

// True when a subject or body holds a template placeholder.
using PlaceholderTest = bool (*)(const std::string& text);

// What reading and writing the configuration needs from outside it: the
// host's password service and the template vocabulary.
struct ConfigServices {
  core::HostCallbackFn callback = nullptr;    // reaches the host's password service
  ErrorSink errorSink;                        // every failure text; logged at error level
  PlaceholderTest hasPlaceholders = nullptr;  // null: no profile counts as templated
};

constexpr int32_t kDefaultMaxRetrySeconds = 172800;  // 48 hours
constexpr int32_t kDefaultMaxRetryQueue = 100;
constexpr int32_t kDefaultEmailSizeLimitMB = 10;
// The largest byte limit a configuration yields: 2047 MiB, the most that a
// signed 32-bit count of bytes holds in whole MiB.
constexpr int64_t kMaxEmailSizeLimitBytes = int64_t{2047} << 20;

class NotifyCfg {
 public:
  NotifyCfg() = default;  // the defaults: no servers, no profiles, 48 h, 100, 10 MiB

  // Reads the "Notify" element below the document's root element. False, with
  // nothing changed, when there is none or its "ID" is not the module's. The
  // three limits are read next; false when "Servers" or "Profiles" is missing
  // (the limits then stay applied). Otherwise the web address (when a "Web"
  // element exists), the servers and the profiles are replaced; servers and
  // profiles that fail a check are skipped. True on success.
  bool Parse(const TiXmlDocument& document, const ConfigServices& services);

  // A new "Notify" element with the whole configuration and the capability
  // attributes. Passwords are protected by the host and marked encrypt="algo".
  // A password the host cannot protect is written in the stored form known
  // for it; without one it is left out and `*passwordsWritten` (when given)
  // becomes false. A password that could not be read is written back
  // unchanged. Every failure goes to the error sink.
  std::unique_ptr<TiXmlElement> ToXml(const ConfigServices& services,
                                      bool* passwordsWritten = nullptr) const;

  // Records the protected passwords of `saved` as the stored forms of the
  // servers' passwords. `saved` must have been built from this configuration
  // (BuildConfigDocument) and be what notify.xml now holds.
  void RememberStoredPasswords(const TiXmlDocument& saved);

  // Normalizes the web server address from its text; null clears it.
  void SetWebAddress(const char* text);

  // Records the pre-alarm seconds of the events of a full host document
  // (root "Trellan", "Events" / "Event" with integer "ID" and "PreAlarm").
  // Entries are added or replaced, never removed.
  void UpdatePreAlarm(const TiXmlDocument& document);

  // Pre-alarm seconds of host event `actionId`; 0 when unknown.
  int32_t PreAlarmSeconds(int32_t actionId) const;

  // The message and video size limit in bytes: EmailSizeLimitMB MiB, never
  // negative (0 for a limit of 0 or less) and at most kMaxEmailSizeLimitBytes.
  int64_t EmailSizeLimitBytes() const;

  // Sets second reviewer mode. Returns whether the flag changed.
  bool SetAttachmentsDisabled(bool disabled);
  // Clears every profile's attach flag. Returns whether any was set.
  bool DisableAllAttachments();

  void SetSmtpsAvailable(bool available) { m_smtpsAvailable = available; }

  // The profile with identifier `id`, or null.
  const NotifyProfile* FindProfile(int32_t id) const;
  const std::map<int32_t, NotifyProfile>& Profiles() const { return m_profiles; }
  const std::vector<SmtpServer>& Servers() const { return m_servers; }
  const WebServerAddress& Web() const { return m_web; }
  int32_t NextProfileId() const { return m_nextProfileId; }
  bool AttachmentsDisabled() const { return m_attachmentsDisabled; }
  bool SmtpsAvailable() const { return m_smtpsAvailable; }
  int32_t MaxRetrySeconds() const { return m_maxRetrySeconds; }
  int32_t MaxRetryQueue() const { return m_maxRetryQueue; }
  int32_t EmailSizeLimitMB() const { return m_emailSizeLimitMB; }
  const std::map<int32_t, int32_t>& PreAlarmTable() const { return m_preAlarm; }

 private:
  void ReadLimits(const TiXmlElement& notify);
  void ReadServers(const TiXmlElement& firstServers, const ConfigServices& services);
  void ReadProfiles(const TiXmlElement& profiles, const ConfigServices& services);
  bool ReadProfile(const TiXmlElement& smtp, int32_t& next, const ConfigServices& services,
                   NotifyProfile& profile) const;
  bool WriteServers(TiXmlElement& notify, const ConfigServices& services) const;
  void WriteProfiles(TiXmlElement& notify) const;

  int32_t m_nextProfileId = 1;
  bool m_attachmentsDisabled = false;
  bool m_smtpsAvailable = false;
  std::vector<SmtpServer> m_servers;
  std::map<int32_t, NotifyProfile> m_profiles;
  WebServerAddress m_web;
  int32_t m_maxRetrySeconds = kDefaultMaxRetrySeconds;
  int32_t m_maxRetryQueue = kDefaultMaxRetryQueue;
  int32_t m_emailSizeLimitMB = kDefaultEmailSizeLimitMB;
  std::map<int32_t, int32_t> m_preAlarm;
};

// Appends the servers of one "Servers" element to `servers`. An "smtp" child
// without "description" or "address" is skipped. Port 25 and security mode 0
// by default (1 for port 465). A password marked "encrypt" is decrypted by
// the host; when that fails, the server keeps its protected text and no
// password (the failure goes to the error sink).
void ParseSmtpServers(const TiXmlElement& serversElement, std::vector<SmtpServer>& servers,
                      const ConfigServices& services);

// Fills an empty `document` with the declaration "<?xml ?>" and the root
// "Trellan" (Delta 0) holding `config.ToXml(services)`. Returns false when a
// password could neither be protected nor written in a stored form: such a
// document must not replace notify.xml, which would lose the password.
bool BuildConfigDocument(TiXmlDocument& document, const NotifyCfg& config,
                         const ConfigServices& services);

// Turns the protected passwords of a configuration document into clear text
// for the host: for each "smtp" of the first "Servers" element, a password
// marked "encrypt" is decrypted, and "encrypt" is removed. A password that
// cannot be decrypted is sent empty, so that the host still receives every
// other setting; the failure goes to the error sink. Returns false when some
// password could not be decrypted.
bool RevealPasswords(TiXmlDocument& document, const ConfigServices& services);

}  // namespace hx

#endif  // ALERTMOD_CONFIG_NOTIFY_CFG_H_
