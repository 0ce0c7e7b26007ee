#include "host/config_store.h"

#include <tinyxml.h>

namespace refhost {
namespace {

constexpr char kMaskedPassword[] = "***";

const TiXmlElement* RootChild(const TiXmlDocument& document, const char* name) {
  const TiXmlElement* root = document.FirstChildElement("Trellan");
  return root != nullptr ? root->FirstChildElement(name) : nullptr;
}

int64_t IntegerAttribute(const TiXmlElement& element, const char* name) {
  const char* text = element.Attribute(name);
  return text != nullptr ? strtoll(text, nullptr, 10) : 0;
}

// Hides every "password" attribute, wherever it is, so that nothing
// printed for people shows one in clear.
void MaskPasswords(TiXmlElement& element) {
  if (element.Attribute("password") != nullptr) element.SetAttribute("password", kMaskedPassword);
  for (TiXmlElement* child = element.FirstChildElement(); child != nullptr;
       child = child->NextSiblingElement()) {
    MaskPasswords(*child);
  }
}

}  // namespace

void ConfigStore::Record(const hx::core::HostRequest& request) {
  // Every request passes here (log lines, process messages, frame releases);
  // only documents and status reports are copied.
  if (request.data == nullptr) return;
  const bool document = request.requestClass == hx::core::kClassDocument;
  if (!document && request.requestClass != hx::core::kClassProfileStatus) return;
  const std::string text(static_cast<const char*>(request.data), request.length);
  if (document) {
    RecordDocument(text);
  } else {
    RecordStatus(text);
  }
}

void ConfigStore::RecordDocument(const std::string& text) {
  TiXmlDocument document;
  document.Parse(text.c_str());
  if (document.Error()) return;
  std::lock_guard<std::mutex> lock(m_mutex);
  if (RootChild(document, "Notify") != nullptr) {
    m_configuration = text;
    ++m_configurationCount;
    m_signal.notify_all();
  } else if (RootChild(document, "Modules") != nullptr) {
    m_moduleDescription = text;
  }
}

void ConfigStore::RecordStatus(const std::string& text) {
  TiXmlDocument document;
  document.Parse(text.c_str());
  const TiXmlElement* notify = RootChild(document, "Notify");
  const TiXmlElement* profiles =
      notify != nullptr ? notify->FirstChildElement("Profiles") : nullptr;
  const TiXmlElement* profile =
      profiles != nullptr ? profiles->FirstChildElement("Profile") : nullptr;
  if (profile == nullptr) return;
  ProfileStatusReport report;
  report.id = static_cast<int32_t>(IntegerAttribute(*profile, "ID"));
  report.status = static_cast<int32_t>(IntegerAttribute(*profile, "Status"));
  report.time = IntegerAttribute(*profile, "Time");
  std::lock_guard<std::mutex> lock(m_mutex);
  m_reports.push_back(report);
}

std::string ConfigStore::Configuration() const {
  std::lock_guard<std::mutex> lock(m_mutex);
  return m_configuration;
}

size_t ConfigStore::ConfigurationCount() const {
  std::lock_guard<std::mutex> lock(m_mutex);
  return m_configurationCount;
}

std::string ConfigStore::ModuleDescription() const {
  std::lock_guard<std::mutex> lock(m_mutex);
  return m_moduleDescription;
}

std::vector<ProfileStatusReport> ConfigStore::StatusReports() const {
  std::lock_guard<std::mutex> lock(m_mutex);
  return m_reports;
}

bool ConfigStore::WaitForConfigurations(size_t count, std::chrono::milliseconds timeout) const {
  std::unique_lock<std::mutex> lock(m_mutex);
  return m_signal.wait_for(lock, timeout, [&] { return m_configurationCount >= count; });
}

std::string MaskedConfiguration(const std::string& text) {
  TiXmlDocument document;
  document.Parse(text.c_str());
  if (document.Error()) return text;
  if (TiXmlElement* root = document.RootElement()) MaskPasswords(*root);
  TiXmlPrinter printer;
  printer.SetIndent("    ");
  document.Accept(&printer);
  return printer.Str();
}

std::string ConfigurationUpdateDocument(const std::string& notifyOrDocument) {
  TiXmlDocument document;
  document.Parse(notifyOrDocument.c_str());
  if (!document.Error() && document.FirstChildElement("Trellan") != nullptr) {
    return notifyOrDocument;
  }
  std::string body = notifyOrDocument;
  // A declaration of the given text would be misplaced inside the root.
  if (body.compare(0, 5, "<?xml") == 0) {
    size_t end = body.find("?>");
    body.erase(0, end == std::string::npos ? body.size() : end + 2);
  }
  return "<?xml ?><Trellan Delta=\"1\">" + body + "</Trellan>";
}

}  // namespace refhost
