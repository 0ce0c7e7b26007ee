// Configuration documents as the host or "notify.xml" may hold them. Any text
// must give a defined result, and a configuration that was accepted must
// survive its own forms: the document built from it (passwords protected),
// printed compactly or indented as "notify.xml" is, reads back to a
// configuration that builds the same document again. The document posted to
// the host (passwords revealed) must read back to the same configuration too.
#include <tinyxml.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <string>

#include "alertmod/config/durable_xml.h"
#include "alertmod/config/module_replies.h"
#include "alertmod/config/notify_cfg.h"
#include "alertmod/config/xml_document.h"
#include "alertmod/host_records.h"

namespace {

void Check(bool condition) {
  if (!condition) __builtin_trap();
}

// TinyXML condenses white space in text as it reads it (runs become one
// space, a text's leading and trailing spaces go), and a text read from
// malformed entities may hold spaces it made itself, which the next read
// condenses. Texts are compared in their condensed form.
std::string Condensed(const std::string& text) {
  std::string condensed;
  for (char c : text) {
    const char last = condensed.empty() ? '>' : condensed.back();
    if (c == ' ' && (last == ' ' || last == '>')) continue;
    if (c == '<' && last == ' ') condensed.pop_back();
    condensed.push_back(c);
  }
  return condensed;
}

// Shows both texts before the crash, so that a finding explains itself.
void CheckSame(const std::string& expected, const std::string& actual) {
  if (Condensed(expected) == Condensed(actual)) return;
  fprintf(stderr, "expected: %s\nactual:   %s\n", expected.c_str(), actual.c_str());
  __builtin_trap();
}

// The host's password service, reduced to a reversible byte mask so that a
// protected password reads back without a key.
constexpr uint8_t kMask = 0x5A;

int32_t HostCallback(hx::core::HostRequest* request, void*) {
  if (request->requestClass != hx::core::kClassCrypto) return 0;
  if (request->extValue < 0 || static_cast<uint32_t>(request->extValue) > request->length) {
    return -1;
  }
  auto* bytes = static_cast<uint8_t*>(request->data);
  for (int32_t i = 0; i < request->extValue; ++i) bytes[i] ^= kMask;
  return 0;
}

hx::ConfigServices Services() {
  hx::ConfigServices services;
  services.callback = &HostCallback;
  services.hasPlaceholders = [](const std::string& text) {
    return text.find('{') != std::string::npos;
  };
  return services;
}

// The compact configuration document of `config`.
std::string Built(const hx::NotifyCfg& config, const hx::ConfigServices& services) {
  TiXmlDocument document;
  hx::BuildConfigDocument(document, config, services);
  return hx::PrintCompact(document);
}

// Reads `text` as a configuration document; it must be accepted.
hx::NotifyCfg ReadBack(const std::string& text, const hx::ConfigServices& services) {
  TiXmlDocument document;
  Check(hx::ParseXmlDocument(text, document));
  hx::NotifyCfg config;
  Check(config.Parse(document, services));
  return config;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string text(reinterpret_cast<const char*>(data), size);
  const hx::ConfigServices services = Services();
  TiXmlDocument document;
  if (!hx::ParseXmlDocument(text, document)) return 0;
  hx::NotifyCfg config;
  config.UpdatePreAlarm(document);
  if (!config.Parse(document, services)) return 0;
  (void)config.EmailSizeLimitBytes();

  const std::string built = Built(config, services);
  CheckSame(built, Built(ReadBack(built, services), services));

  TiXmlDocument saved;
  hx::BuildConfigDocument(saved, config, services);
  CheckSame(built, Built(ReadBack(hx::PrintXmlIndented(saved), services), services));

  TiXmlDocument posted;
  hx::BuildConfigDocument(posted, config, services);
  // A password kept in its unreadable protected form is posted empty, by
  // design, and a clear password with a NUL byte (only ever the result of
  // decrypting damaged bytes) cannot travel in an XML attribute; every other
  // configuration reads back whole.
  bool postable = true;
  for (const hx::SmtpServer& server : config.Servers()) {
    postable = postable && server.password.find('\0') == std::string::npos;
  }
  if (hx::RevealPasswords(posted, services) && postable) {
    CheckSame(built, Built(ReadBack(hx::PrintCompact(posted), services), services));
  }
  return 0;
}
