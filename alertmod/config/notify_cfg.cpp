#include "alertmod/config/notify_cfg.h"

#include <algorithm>
#include <cctype>
#include <limits>

#include <tinyxml.h>

#include "alertmod/util/base64.h"
#include "alertmod/config/module_replies.h"
#include "alertmod/config/xml_attr.h"

namespace hx {
namespace {

constexpr int32_t kDefaultSmtpPort = 25;
constexpr int32_t kSmtpsPort = 465;
constexpr int32_t kSmtpsMode = 1;
constexpr char kEncryptMarker[] = "algo";
constexpr int64_t kBytesPerMB = 1048576;

void Report(const ConfigServices& services, const std::string& text) {
  if (services.errorSink) services.errorSink(text);
}

// The text of `element`'s first child when that is a text node; empty
// otherwise, also for a missing element.
std::string FirstChildText(const TiXmlElement* element) {
  const char* text = element != nullptr ? element->GetText() : nullptr;
  return text != nullptr ? text : "";
}

bool HasPlaceholders(const ConfigServices& services, const std::string& text) {
  return services.hasPlaceholders != nullptr && services.hasPlaceholders(text);
}

void ReadAuthentication(const TiXmlElement& authentication, SmtpServer& server,
                        const ConfigServices& services) {
  const char* username = authentication.Attribute("username");
  const char* password = authentication.Attribute("password");
  server.username = username != nullptr ? username : "";
  server.password = password != nullptr ? password : "";
  if (password == nullptr || authentication.Attribute("encrypt") == nullptr) return;
  std::optional<std::string> clear = UnprotectPassword(Base64Decode(password), core::kModuleId,
                                                       services.callback, services.errorSink);
  if (clear) {
    server.password = *clear;
    server.storedPassword = password;
    return;
  }
  // Nothing is lost: the stored text goes back to the file unchanged, and
  // the password may become readable again under the right key.
  server.unreadablePassword = password;
  server.password.clear();
  Report(services, "The stored password of SMTP server " + server.description +
                       " cannot be read; the server is used without a password until the "
                       "password is entered again.");
}

// A server the host sends back keeps what notify.xml holds for the same
// account. With an empty password, that is the stored text that could not
// be read: the host was shown no password for it, so an empty one means
// "unchanged", not "removed". In any case, it is the stored protected form,
// written again when the host cannot protect the password at a save.
void KeepStoredPasswords(const std::vector<SmtpServer>& previous,
                         std::vector<SmtpServer>& servers) {
  for (SmtpServer& server : servers) {
    const bool passwordSent = !server.password.empty();
    for (const SmtpServer& old : previous) {
      if (old.description != server.description || old.address != server.address ||
          old.username != server.username) {
        continue;
      }
      if (!passwordSent && server.unreadablePassword.empty()) {
        server.unreadablePassword = old.unreadablePassword;
      }
      if (server.storedPassword.empty()) server.storedPassword = old.storedPassword;
    }
  }
}

// `lowerPrefix` must be in lower case.
bool StartsWithIgnoringCase(const std::string& text, const std::string& lowerPrefix) {
  if (text.size() < lowerPrefix.size()) return false;
  for (size_t i = 0; i < lowerPrefix.size(); ++i) {
    if (std::tolower(static_cast<unsigned char>(text[i])) != lowerPrefix[i]) return false;
  }
  return true;
}

TiXmlElement* AppendElement(TiXmlElement& parent, const char* name) {
  auto* child = new TiXmlElement(name);
  parent.LinkEndChild(child);
  return child;
}

void AppendTextElement(TiXmlElement& parent, const char* name, const std::string& text) {
  AppendElement(parent, name)->LinkEndChild(new TiXmlText(text));
}

void ReportUnprotected(const ConfigServices& services, const SmtpServer& server, bool keptStored) {
  const char* outcome =
      keptStored ? "notify.xml keeps the one stored before." : "notify.xml is left unchanged.";
  Report(services, "The password of SMTP server " + server.description +
                       " could not be protected; " + outcome);
}

// Returns false when the password could not be protected and no stored form
// of it is known; it is then left out, since a password is never written in
// clear.
bool WriteAuthentication(TiXmlElement& smtp, const SmtpServer& server,
                         const ConfigServices& services) {
  TiXmlElement* authentication = AppendElement(smtp, "Authentication");
  authentication->SetAttribute("username", server.username);
  // A password that could not be read goes back as it was stored.
  std::string text = server.unreadablePassword;
  if (!server.password.empty() || text.empty()) {
    std::optional<std::string> protectedBytes =
        ProtectPassword(server.password, core::kModuleId, services.callback, services.errorSink);
    text = protectedBytes ? Base64Encode(*protectedBytes) : server.storedPassword;
    if (!protectedBytes) ReportUnprotected(services, server, !text.empty());
  }
  if (text.empty()) return false;
  authentication->SetAttribute("password", text);
  authentication->SetAttribute("encrypt", kEncryptMarker);
  return true;
}

void WriteProfile(TiXmlElement& profiles, const NotifyProfile& profile) {
  TiXmlElement* smtp = AppendElement(profiles, "smtp");
  smtp->SetAttribute("ID", profile.id);
  smtp->SetAttribute("attach", profile.attach ? "1" : "0");
  smtp->SetAttribute("description", profile.description);
  smtp->SetAttribute("ThrottleSeconds", profile.throttleSeconds);
  smtp->SetAttribute("from", profile.from);
  smtp->SetAttribute("subject", profile.subject);
  smtp->SetAttribute("MaxVideoSeconds", profile.maxVideoSeconds);
  smtp->SetAttribute("EventEdge", profile.eventEdge);
  for (const std::string& to : profile.to) AppendTextElement(*smtp, "to", to);
  for (const std::string& cc : profile.cc) AppendTextElement(*smtp, "cc", cc);
  for (const std::string& bcc : profile.bcc) AppendTextElement(*smtp, "bcc", bcc);
  AppendTextElement(*smtp, "body", profile.body);
}

// Appends the non-empty texts of every `name` child of `smtp`, in order.
void ReadAddressList(const TiXmlElement& smtp, const char* name, std::vector<std::string>& list) {
  for (const TiXmlElement* element = smtp.FirstChildElement(name); element != nullptr;
       element = element->NextSiblingElement(name)) {
    std::string text = FirstChildText(element);
    if (!text.empty()) list.push_back(std::move(text));
  }
}

// The checks a profile must pass before anything else is read from it.
bool HasRequiredProfileParts(const TiXmlElement& smtp) {
  if (smtp.Attribute("description") == nullptr || smtp.Attribute("from") == nullptr ||
      smtp.Attribute("subject") == nullptr) {
    return false;
  }
  if (FirstChildText(smtp.FirstChildElement("to")).empty()) return false;
  const TiXmlElement* body = smtp.FirstChildElement("body");
  return body == nullptr || body->NextSiblingElement("body") == nullptr;
}

// The first "Servers" element of a configuration document, or null.
const TiXmlElement* ServersElement(const TiXmlDocument& document) {
  const TiXmlElement* root = document.FirstChildElement();
  const TiXmlElement* notify = root != nullptr ? root->FirstChildElement("Notify") : nullptr;
  return notify != nullptr ? notify->FirstChildElement("Servers") : nullptr;
}

void ApplyEventPreAlarm(const TiXmlElement& container, std::map<int32_t, int32_t>& table) {
  for (const TiXmlElement* event = container.FirstChildElement("Event"); event != nullptr;
       event = event->NextSiblingElement()) {
    std::optional<int32_t> id = IntAttribute(*event, "ID");
    std::optional<int32_t> seconds = IntAttribute(*event, "PreAlarm");
    if (id && seconds) table[*id] = *seconds;
  }
}

}  // namespace

bool NotifyCfg::Parse(const TiXmlDocument& document, const ConfigServices& services) {
  const TiXmlElement* root = document.FirstChildElement();
  const TiXmlElement* notify = root != nullptr ? root->FirstChildElement("Notify") : nullptr;
  if (notify == nullptr) return false;
  std::optional<int32_t> id = IntAttribute(*notify, "ID");
  if (!id || *id != static_cast<int32_t>(core::kModuleId)) return false;
  ReadLimits(*notify);
  const TiXmlElement* servers = notify->FirstChildElement("Servers");
  const TiXmlElement* profiles = notify->FirstChildElement("Profiles");
  if (servers == nullptr || profiles == nullptr) return false;
  if (const TiXmlElement* web = notify->FirstChildElement("Web")) {
    SetWebAddress(web->Attribute("address"));
  }
  ReadServers(*servers, services);
  for (; profiles != nullptr; profiles = profiles->NextSiblingElement("Profiles")) {
    ReadProfiles(*profiles, services);
  }
  return true;
}

void NotifyCfg::ReadLimits(const TiXmlElement& notify) {
  m_maxRetrySeconds = IntAttributeOr(notify, "MaxRetrySeconds", m_maxRetrySeconds);
  m_maxRetryQueue = IntAttributeOr(notify, "MaxRetryQueue", m_maxRetryQueue);
  m_emailSizeLimitMB = IntAttributeOr(notify, "EmailSizeLimitMB", m_emailSizeLimitMB);
}

void NotifyCfg::ReadServers(const TiXmlElement& firstServers, const ConfigServices& services) {
  std::vector<SmtpServer> previous;
  previous.swap(m_servers);
  for (const TiXmlElement* servers = &firstServers; servers != nullptr;
       servers = servers->NextSiblingElement("Servers")) {
    ParseSmtpServers(*servers, m_servers, services);
  }
  KeepStoredPasswords(previous, m_servers);
}

void NotifyCfg::ReadProfiles(const TiXmlElement& profiles, const ConfigServices& services) {
  int32_t next = std::max(m_nextProfileId, IntAttributeOr(profiles, "autoincrement", 0));
  std::map<int32_t, NotifyProfile> read;
  for (const TiXmlElement* smtp = profiles.FirstChildElement("smtp"); smtp != nullptr;
       smtp = smtp->NextSiblingElement("smtp")) {
    NotifyProfile profile;
    if (ReadProfile(*smtp, next, services, profile)) read[profile.id] = std::move(profile);
  }
  m_nextProfileId = next;
  m_profiles.swap(read);
}

bool NotifyCfg::ReadProfile(const TiXmlElement& smtp, int32_t& next, const ConfigServices& services,
                            NotifyProfile& profile) const {
  std::optional<int32_t> id = IntAttribute(smtp, "ID");
  if (!id) return false;
  // An automatic identifier is spent even when the profile is then skipped.
  // The counter stops at the largest identifier instead of overflowing (an
  // "autoincrement" of 2147483647 comes only from a host that sent it).
  profile.id = *id != 0 ? *id : next;
  if (*id == 0 && next < std::numeric_limits<int32_t>::max()) ++next;
  if (!HasRequiredProfileParts(smtp)) return false;
  const NotifyProfile* previous = FindProfile(profile.id);
  if (std::optional<int32_t> attach = IntAttribute(smtp, "attach")) {
    profile.attach = *attach == 1 && !m_attachmentsDisabled;
  } else {
    profile.attach = previous != nullptr && previous->attach;
  }
  profile.maxVideoSeconds =
      IntAttributeOr(smtp, "MaxVideoSeconds", previous != nullptr ? previous->maxVideoSeconds : 0);
  profile.description = smtp.Attribute("description");
  profile.from = smtp.Attribute("from");
  profile.subject = smtp.Attribute("subject");
  profile.body = FirstChildText(smtp.FirstChildElement("body"));
  profile.hasPlaceholders =
      HasPlaceholders(services, profile.subject) || HasPlaceholders(services, profile.body);
  profile.throttleSeconds = IntAttributeOr(smtp, "ThrottleSeconds", 0);
  profile.eventEdge =
      IntAttributeOr(smtp, "EventEdge", previous != nullptr ? previous->eventEdge : 0);
  ReadAddressList(smtp, "to", profile.to);
  ReadAddressList(smtp, "cc", profile.cc);
  ReadAddressList(smtp, "bcc", profile.bcc);
  return true;
}

void ParseSmtpServers(const TiXmlElement& serversElement, std::vector<SmtpServer>& servers,
                      const ConfigServices& services) {
  for (const TiXmlElement* smtp = serversElement.FirstChildElement("smtp"); smtp != nullptr;
       smtp = smtp->NextSiblingElement("smtp")) {
    const char* description = smtp->Attribute("description");
    const char* address = smtp->Attribute("address");
    if (description == nullptr || address == nullptr) continue;
    SmtpServer server;
    server.description = description;
    server.address = address;
    server.port = IntAttributeOr(*smtp, "port", kDefaultSmtpPort);
    server.useSsl = IntAttributeOr(*smtp, "UseSSL", server.port == kSmtpsPort ? kSmtpsMode : 0);
    if (const TiXmlElement* authentication = smtp->FirstChildElement("Authentication")) {
      ReadAuthentication(*authentication, server, services);
    }
    servers.push_back(std::move(server));
  }
}

std::unique_ptr<TiXmlElement> NotifyCfg::ToXml(const ConfigServices& services,
                                               bool* passwordsWritten) const {
  auto notify = std::make_unique<TiXmlElement>("Notify");
  notify->SetAttribute("ID", static_cast<int>(core::kModuleId));
  AddCapabilityAttributes(*notify, m_attachmentsDisabled, m_smtpsAvailable);
  notify->SetAttribute("MaxRetrySeconds", m_maxRetrySeconds);
  notify->SetAttribute("MaxRetryQueue", m_maxRetryQueue);
  notify->SetAttribute("EmailSizeLimitMB", m_emailSizeLimitMB);
  AppendElement(*notify, "Web")->SetAttribute("address", m_web.address);
  const bool written = WriteServers(*notify, services);
  if (passwordsWritten != nullptr) *passwordsWritten = written;
  WriteProfiles(*notify);
  return notify;
}

bool NotifyCfg::WriteServers(TiXmlElement& notify, const ConfigServices& services) const {
  TiXmlElement* servers = AppendElement(notify, "Servers");
  bool allWritten = true;
  for (const SmtpServer& server : m_servers) {
    TiXmlElement* smtp = AppendElement(*servers, "smtp");
    smtp->SetAttribute("description", server.description);
    smtp->SetAttribute("address", server.address);
    smtp->SetAttribute("port", server.port);
    smtp->SetAttribute("UseSSL", server.useSsl);
    if (!server.username.empty() || !server.password.empty() ||
        !server.unreadablePassword.empty()) {
      allWritten = WriteAuthentication(*smtp, server, services) && allWritten;
    }
  }
  return allWritten;
}

void NotifyCfg::WriteProfiles(TiXmlElement& notify) const {
  TiXmlElement* profiles = AppendElement(notify, "Profiles");
  profiles->SetAttribute("autoincrement", m_nextProfileId);
  for (const auto& entry : m_profiles) WriteProfile(*profiles, entry.second);
}

void NotifyCfg::SetWebAddress(const char* text) {
  m_web = WebServerAddress{};
  if (text == nullptr) return;
  std::string working = text;
  for (const std::string scheme : {"http://", "https://"}) {
    if (StartsWithIgnoringCase(working, scheme)) {
      working.erase(0, scheme.size());
      break;
    }
  }
  m_web.host = working;
  m_web.port = "80";
  if (std::count(working.begin(), working.end(), ':') > 1) {
    m_web.plainHost = false;
    size_t bracket = working.find("]:");
    if (bracket == std::string::npos) {
      m_web.address = working;
      return;
    }
    m_web.port = working.substr(bracket + 2);
    // The opening bracket is dropped whatever it is.
    m_web.host = bracket > 0 ? working.substr(1, bracket - 1) : std::string();
    m_web.address = "[" + m_web.host + "]:" + m_web.port;
    return;
  }
  size_t colon = working.find(':');
  if (colon == std::string::npos) {
    m_web.address = m_web.host;
    return;
  }
  m_web.port = working.substr(colon + 1);
  m_web.host = working.substr(0, colon);
  m_web.address = m_web.host + ":" + m_web.port;
}

void NotifyCfg::UpdatePreAlarm(const TiXmlDocument& document) {
  const TiXmlElement* root = document.FirstChildElement();
  if (root == nullptr || root->ValueStr() != "Trellan") return;
  for (const TiXmlElement* events = root->FirstChildElement("Events"); events != nullptr;
       events = events->NextSiblingElement()) {
    ApplyEventPreAlarm(*events, m_preAlarm);
  }
}

int32_t NotifyCfg::PreAlarmSeconds(int32_t actionId) const {
  auto found = m_preAlarm.find(actionId);
  return found != m_preAlarm.end() ? found->second : 0;
}

int64_t NotifyCfg::EmailSizeLimitBytes() const {
  // Computed wide and clamped: the 32-bit product overflows from 2048 MiB
  // on, and a negative limit would read as an enormous unsigned one.
  int64_t bytes = int64_t{m_emailSizeLimitMB} * kBytesPerMB;
  return std::clamp<int64_t>(bytes, 0, kMaxEmailSizeLimitBytes);
}

bool NotifyCfg::SetAttachmentsDisabled(bool disabled) {
  bool changed = m_attachmentsDisabled != disabled;
  m_attachmentsDisabled = disabled;
  return changed;
}

bool NotifyCfg::DisableAllAttachments() {
  bool anySet = false;
  for (auto& entry : m_profiles) {
    anySet = anySet || entry.second.attach;
    entry.second.attach = false;
  }
  return anySet;
}

const NotifyProfile* NotifyCfg::FindProfile(int32_t id) const {
  auto found = m_profiles.find(id);
  return found != m_profiles.end() ? &found->second : nullptr;
}

void NotifyCfg::RememberStoredPasswords(const TiXmlDocument& saved) {
  const TiXmlElement* servers = ServersElement(saved);
  const TiXmlElement* smtp = servers != nullptr ? servers->FirstChildElement("smtp") : nullptr;
  // The document holds one "smtp" per server, in list order.
  for (SmtpServer& server : m_servers) {
    if (smtp == nullptr) return;
    const TiXmlElement* authentication = smtp->FirstChildElement("Authentication");
    const char* password =
        authentication != nullptr ? authentication->Attribute("password") : nullptr;
    if (password != nullptr && server.unreadablePassword.empty()) {
      server.storedPassword = password;
    }
    smtp = smtp->NextSiblingElement("smtp");
  }
}

bool BuildConfigDocument(TiXmlDocument& document, const NotifyCfg& config,
                         const ConfigServices& services) {
  document.LinkEndChild(new TiXmlDeclaration("", "", ""));
  auto* root = new TiXmlElement("Trellan");
  root->SetAttribute("Delta", 0);
  document.LinkEndChild(root);
  bool passwordsWritten = true;
  root->LinkEndChild(config.ToXml(services, &passwordsWritten).release());
  return passwordsWritten;
}

bool RevealPasswords(TiXmlDocument& document, const ConfigServices& services) {
  auto* servers = const_cast<TiXmlElement*>(ServersElement(document));
  if (servers == nullptr) return true;
  bool allRead = true;
  for (TiXmlElement* smtp = servers->FirstChildElement("smtp"); smtp != nullptr;
       smtp = smtp->NextSiblingElement("smtp")) {
    TiXmlElement* authentication = smtp->FirstChildElement("Authentication");
    if (authentication == nullptr) continue;
    const char* password = authentication->Attribute("password");
    if (password != nullptr && authentication->Attribute("encrypt") != nullptr) {
      std::optional<std::string> clear = UnprotectPassword(Base64Decode(password), core::kModuleId,
                                                           services.callback, services.errorSink);
      if (!clear) {
        allRead = false;
        const char* description = smtp->Attribute("description");
        Report(services, std::string("The password of SMTP server ") +
                             (description != nullptr ? description : "") +
                             " cannot be read; the configuration goes to the host without it.");
      }
      authentication->SetAttribute("password", clear ? *clear : std::string());
    }
    authentication->RemoveAttribute("encrypt");
  }
  return allRead;
}

}  // namespace hx
