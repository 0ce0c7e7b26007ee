#include "alertmod/config/module_replies.h"

namespace hx {
namespace {

constexpr char kModuleName[] = "Alertmod";
constexpr char kModuleVersion[] = "25.1.6.0";
constexpr int kSmtpsMode = 2;
constexpr int kTemplateSupportLevel = 3;

// Declaration with no version, encoding or standalone value: "<?xml ?>".
void AddDeclaration(TiXmlDocument& document) {
  document.LinkEndChild(new TiXmlDeclaration("", "", ""));
}

}  // namespace

void PostToHost(core::HostCallbackFn callback, uint32_t requestClass, const std::string& text) {
  if (callback == nullptr) return;
  core::HostRequest request =
      core::MakeHostRequest(core::kModuleId, requestClass, core::kCodeDocument);
  request.length = static_cast<uint32_t>(text.size());
  // The host only reads the text; the record has no const pointer.
  request.data = const_cast<char*>(text.data());
  callback(&request, nullptr);
}

std::string PrintCompact(const TiXmlDocument& document) {
  TiXmlPrinter printer;
  printer.SetStreamPrinting();
  document.Accept(&printer);
  return printer.Str();
}

void AddCapabilityAttributes(TiXmlElement& notify, bool attachmentsDisabled, bool smtpsAvailable) {
  const char* attachments = attachmentsDisabled ? "0" : "1";
  notify.SetAttribute("SupportsThrottleSeconds", "1");
  notify.SetAttribute("SupportsAttach", attachments);
  notify.SetAttribute("SupportsVideoAttach", attachments);
  notify.SetAttribute("SupportsStatus", "1");
  notify.SetAttribute("SupportsEventEdge", "1");
  notify.SetAttribute("TemplateSupportLevel", kTemplateSupportLevel);
  notify.SetAttribute("IsSupported", 1);
  if (smtpsAvailable) notify.SetAttribute("SSL", kSmtpsMode);
}

std::string ModuleDescriptionText() {
  TiXmlDocument document;
  AddDeclaration(document);
  auto* root = new TiXmlElement("Trellan");
  root->SetAttribute("Delta", 0);
  document.LinkEndChild(root);
  auto* modules = new TiXmlElement("Modules");
  root->LinkEndChild(modules);
  auto* module = new TiXmlElement("Module");
  module->SetAttribute("Name", kModuleName);
  module->SetAttribute("ID", static_cast<int>(core::kModuleId));
  module->SetAttribute("Version", kModuleVersion);
  modules->LinkEndChild(module);
  return PrintCompact(document);
}

void PostModuleDescription(core::HostCallbackFn callback) {
  PostToHost(callback, core::kClassDocument, ModuleDescriptionText());
}

ProfileStatusDocument::ProfileStatusDocument() {
  AddDeclaration(m_document);
  auto* root = new TiXmlElement("Trellan");
  m_document.LinkEndChild(root);
  auto* notify = new TiXmlElement("Notify");
  notify->SetAttribute("ID", static_cast<int>(core::kModuleId));
  root->LinkEndChild(notify);
  auto* profiles = new TiXmlElement("Profiles");
  notify->LinkEndChild(profiles);
  m_profile = new TiXmlElement("Profile");
  profiles->LinkEndChild(m_profile);
}

void ReportProfileStatus(ProfileStatusDocument& document, int32_t profileId, int32_t status,
                         int64_t nowSeconds, core::HostCallbackFn callback) {
  TiXmlElement& profile = document.Profile();
  profile.SetAttribute("ID", profileId);
  profile.SetAttribute("Status", status);
  profile.SetAttribute("Time", static_cast<int32_t>(nowSeconds));
  PostToHost(callback, core::kClassProfileStatus, PrintCompact(document.Document()));
}

}  // namespace hx
