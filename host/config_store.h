// ConfigStore keeps what the module told the reference host about its
// configuration: the last configuration document it posted (class 256 with a
// "Notify" element, passwords in clear), its module description, and every
// profile status report (class 4), as a real host would keep them for its
// configuration screens. It also builds the configuration updates that the
// host sends the module (IOCTL code 2).
//
// Record() runs on whichever module thread made the request; every method
// is thread-safe.
#ifndef ALERTMOD_HOST_CONFIG_STORE_H_
#define ALERTMOD_HOST_CONFIG_STORE_H_

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include "alertmod/host_records.h"

namespace refhost {

struct ProfileStatusReport {
  int32_t id = 0;
  int32_t status = 0;
  int64_t time = 0;
};

class ConfigStore {
 public:
  // Keeps the document or report `request` carries; other requests and
  // documents that are neither are passed over.
  void Record(const hx::core::HostRequest& request);

  // The last configuration document, as posted (compact); empty when none.
  std::string Configuration() const;
  // How many configuration documents have been posted.
  size_t ConfigurationCount() const;
  // The module description; empty when none.
  std::string ModuleDescription() const;
  std::vector<ProfileStatusReport> StatusReports() const;

  // Waits until at least `count` configuration documents have been posted.
  bool WaitForConfigurations(size_t count, std::chrono::milliseconds timeout) const;

 private:
  void RecordDocument(const std::string& text);
  void RecordStatus(const std::string& text);

  mutable std::mutex m_mutex;
  mutable std::condition_variable m_signal;
  std::string m_configuration;
  size_t m_configurationCount = 0;
  std::string m_moduleDescription;
  std::vector<ProfileStatusReport> m_reports;
};

// A configuration document printed for people: indented, with every SMTP
// password shown as "***". Unparseable text comes back as it is.
std::string MaskedConfiguration(const std::string& text);

// The host document that carries a configuration update: "Trellan" with
// Delta 1 around `notifyOrDocument` when that is a "Notify" element; a text
// whose root already is "Trellan" is sent as it stands.
std::string ConfigurationUpdateDocument(const std::string& notifyOrDocument);

}  // namespace refhost

#endif  // ALERTMOD_HOST_CONFIG_STORE_H_
