// Feeds arbitrary subject and body texts through placeholder expansion and
// address extraction: both read text that users and the host supply.
#include <cstddef>
#include <cstdint>
#include <string>

#include "alertmod/mail/mail_file.h"
#include "alertmod/mail/templates.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  std::string text(reinterpret_cast<const char*>(data), size);
  hx::NotifyWorkItem item(hx::kWorkItemNotification);
  item.eventTime = 1700000000;
  item.eventType = size > 0 ? static_cast<int8_t>(data[0]) : 0;
  item.sourceName = "{date}";
  item.profile.subject = text;
  item.profile.body = text.substr(size / 2);
  if (hx::HasPlaceholders(text)) hx::ExpandTemplates(item, nullptr, std::chrono::seconds(10));
  std::string address = text;
  hx::ExtractAddress(address);
  return 0;
}
