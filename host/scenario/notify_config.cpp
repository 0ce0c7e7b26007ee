#include "host/scenario/notify_config.h"

#include <tinyxml.h>

#include <algorithm>
#include <memory>

#include "alertmod/host_records.h"

namespace refhost::scenario {
namespace {

constexpr int kAlertModuleId = static_cast<int>(hx::core::kModuleId);

TiXmlElement* AddChild(TiXmlElement* parent, const char* name) {
  return static_cast<TiXmlElement*>(parent->LinkEndChild(new TiXmlElement(name)));
}

void AddText(TiXmlElement* parent, const char* name, const std::string& text) {
  AddChild(parent, name)->LinkEndChild(new TiXmlText(text));
}

template <typename T>
void SetIfGiven(TiXmlElement* element, const char* name, const std::optional<T>& value) {
  if (value) element->SetAttribute(name, static_cast<int>(*value));
}

void AddServer(TiXmlElement* servers, const SmtpServerSetting& server) {
  TiXmlElement* smtp = AddChild(servers, "smtp");
  smtp->SetAttribute("description", server.description);
  smtp->SetAttribute("address", server.address);
  SetIfGiven(smtp, "port", server.port);
  SetIfGiven(smtp, "UseSSL", server.security);
  if (server.user.empty() && server.password.empty()) return;
  TiXmlElement* authentication = AddChild(smtp, "Authentication");
  authentication->SetAttribute("username", server.user);
  authentication->SetAttribute("password", server.password);
}

void AddProfile(TiXmlElement* profiles, const ProfileSetting& profile) {
  TiXmlElement* smtp = AddChild(profiles, "smtp");
  smtp->SetAttribute("ID", profile.id);
  if (profile.attach) smtp->SetAttribute("attach", *profile.attach ? 1 : 0);
  smtp->SetAttribute("description", profile.description);
  SetIfGiven(smtp, "ThrottleSeconds", profile.throttleSeconds);
  smtp->SetAttribute("from", profile.from);
  smtp->SetAttribute("subject", profile.subject);
  SetIfGiven(smtp, "MaxVideoSeconds", profile.maxVideoSeconds);
  SetIfGiven(smtp, "EventEdge", profile.eventEdge);
  for (const std::string& to : profile.to) AddText(smtp, "to", to);
  for (const std::string& cc : profile.cc) AddText(smtp, "cc", cc);
  for (const std::string& bcc : profile.bcc) AddText(smtp, "bcc", bcc);
  const std::string body = ProfileBody(profile);
  if (body.empty()) {
    AddChild(smtp, "body");
  } else {
    AddText(smtp, "body", body);
  }
}

std::unique_ptr<TiXmlElement> NotifyElement(const ConfigSetting& config) {
  auto notify = std::make_unique<TiXmlElement>("Notify");
  notify->SetAttribute("ID", kAlertModuleId);
  SetIfGiven(notify.get(), "MaxRetrySeconds", config.maxRetrySeconds);
  SetIfGiven(notify.get(), "MaxRetryQueue", config.maxRetryQueue);
  SetIfGiven(notify.get(), "EmailSizeLimitMB", config.emailSizeLimitMb);
  if (config.webAddress) AddChild(notify.get(), "Web")->SetAttribute("address", *config.webAddress);
  TiXmlElement* servers = AddChild(notify.get(), "Servers");
  for (const SmtpServerSetting& server : config.servers) AddServer(servers, server);
  TiXmlElement* profiles = AddChild(notify.get(), "Profiles");
  int32_t next = 1;
  for (const ProfileSetting& profile : config.profiles) next = std::max(next, profile.id + 1);
  profiles->SetAttribute("autoincrement", next);
  for (const ProfileSetting& profile : config.profiles) AddProfile(profiles, profile);
  return notify;
}

}  // namespace

std::string ProfileBody(const ProfileSetting& profile) {
  std::string body;
  for (size_t i = 0; i < profile.bodyLines.size(); ++i) {
    if (i > 0) body += "\r\n";
    // A line may hold line breaks of its own ("\n" in the scenario).
    for (char c : profile.bodyLines[i]) {
      if (c == '\n') body += '\r';
      body += c;
    }
  }
  return body;
}

std::string NotifyFileText(const ConfigSetting& config) {
  TiXmlDocument document;
  document.LinkEndChild(new TiXmlDeclaration("", "", ""));
  auto trellan = std::make_unique<TiXmlElement>("Trellan");
  trellan->SetAttribute("Delta", 0);
  trellan->LinkEndChild(NotifyElement(config).release());
  document.LinkEndChild(trellan.release());
  TiXmlPrinter printer;
  printer.SetIndent("    ");
  document.Accept(&printer);
  return printer.Str();
}

std::string NotifyElementText(const ConfigSetting& config) {
  std::string text;
  text << *NotifyElement(config);
  return text;
}

}  // namespace refhost::scenario
