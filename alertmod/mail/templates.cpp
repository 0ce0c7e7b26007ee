#include "alertmod/mail/templates.h"

#include <tinyxml.h>

#include <cstring>
#include <ctime>
#include <optional>
#include <vector>

#include "alertmod/config/xml_document.h"
#include "alertmod/diag/log.h"
#include "alertmod/mail/event_types.h"
#include "alertmod/platform/local_time.h"
#include "alertmod/weblink/web_link.h"

namespace hx {
namespace {

constexpr char kWebLink[] = "{weblink}";
constexpr char kSource[] = "{source}";
constexpr char kEventType[] = "{event type}";
constexpr char kDate[] = "{date}";
constexpr char kTime[] = "{time}";
constexpr char kDateFormat[] = "{date format";
constexpr char kSystemName[] = "{system name}";
constexpr char kSerial[] = "{serial}";
constexpr char kLicensedMac[] = "{licensed mac}";
constexpr char kEventState[] = "{event state}";

constexpr const char* kPlaceholders[] = {kWebLink,     kSource,     kEventType,  kDate,
                                         kTime,        kDateFormat, kSystemName, kSerial,
                                         kLicensedMac, kEventState};
constexpr const char* kDateTimeTriggers[] = {kDate, kDateFormat, kTime};

constexpr char kNoWebServerText[] = "[No Valid Web Server Address]";
constexpr char kNotVideoEventText[] = "[Not a Video Source Event]";
constexpr char kTestEventTypeText[] = "[Test Event Type]";
constexpr char kHealthText[] = "Health";
constexpr char kInvalidFormatText[] = "[invalid format specified]";

// The conversions a user may put in a format attribute: the classic ones of
// strftime, which every C runtime formats the same way.
constexpr char kAllowedConversions[] = "aAbBcdHIjmMpSUwWxXyYZ%";
constexpr size_t kFormattedDateCapacity = 80;

bool ContainsAny(const std::string& text, const char* const* first, const char* const* last) {
  for (; first != last; ++first) {
    if (text.find(*first) != std::string::npos) return true;
  }
  return false;
}

void ReplaceFirst(std::string& text, const char* placeholder, const std::string& value) {
  size_t at = text.find(placeholder);
  if (at != std::string::npos) text.replace(at, strlen(placeholder), value);
}

void ReplaceFirstInBodyAndSubject(NotifyWorkItem& item, const char* placeholder,
                                  const std::string& value) {
  ReplaceFirst(item.profile.body, placeholder, value);
  ReplaceFirst(item.profile.subject, placeholder, value);
}

void ExpandWebLink(NotifyWorkItem& item, core::HostCallbackFn callback,
                   std::chrono::milliseconds webTimeout) {
  std::string& body = item.profile.body;
  if (body.find(kWebLink) == std::string::npos) return;
  std::string link;
  if (item.web.host.empty()) {
    LogToHost(core::kModuleId, callback, LogLevelWarning,
              "Web Server not configured. No link will be generated");
    link = kNoWebServerText;
  } else if (IsCameraEventType(item.eventType) || item.sourceKey == kTestSourceKey ||
             !item.videoSources.empty()) {
    std::vector<uint32_t> cameraKeys;
    for (const VideoSource& source : item.videoSources) cameraKeys.push_back(source.sourceKey);
    link = MakeWebLink(item.web, item.serial, item.eventTime, cameraKeys, callback, webTimeout);
  } else {
    link = kNotVideoEventText;
  }
  ReplaceFirst(body, kWebLink, link);
}

// The text for "{event type}", or nothing when the placeholder stays as it is.
std::optional<std::string> EventTypeValue(int32_t code) {
  if (code == kTestEventType) return std::string(kTestEventTypeText);
  if (code < 1) return std::nullopt;
  if (SystemHealthEventTypes().count(code) || DeviceHealthEventTypes().count(code)) {
    return std::string(kHealthText);
  }
  return EventTypeName(code);
}

std::string SourceValue(const NotifyWorkItem& item) {
  // A system health event has no device of its own to name.
  if (SystemHealthEventTypes().count(item.eventType)) return EventTypeName(item.eventType);
  return item.sourceName;
}

bool IsValidFormat(const char* format) {
  for (const char* c = format; *c != '\0'; ++c) {
    if (*c != '%') continue;
    ++c;
    if (*c == '\0' || strchr(kAllowedConversions, *c) == nullptr) return false;
  }
  return true;
}

std::string FormatDateElement(const TiXmlElement& element, int64_t eventTime,
                              const char* defaultFormat) {
  std::tm local{};
  if (!platform::LocalFields(eventTime, &local)) return std::string();
  const char* format = element.Attribute("format");
  if (format == nullptr) {
    format = defaultFormat;
  } else if (!IsValidFormat(format)) {
    return kInvalidFormatText;
  }
  // A result that does not fit makes strftime return 0: nothing is inserted.
  char formatted[kFormattedDateCapacity];
  size_t length = strftime(formatted, sizeof(formatted), format, &local);
  return std::string(formatted, length);
}

// What one brace group (the text between "{" and "}") becomes.
std::string ExpandGroup(const std::string& group, int64_t eventTime) {
  size_t start = group.find_first_not_of(' ');
  std::string xml = "<?xml ?><";
  if (start != std::string::npos) xml.append(group, start, std::string::npos);
  xml += " />";
  TiXmlDocument document;
  const TiXmlElement* root = ParseXmlDocument(xml, document) ? document.RootElement() : nullptr;
  if (root == nullptr) return std::string();
  if (root->ValueStr() == "date") return FormatDateElement(*root, eventTime, "%x");
  if (root->ValueStr() == "time") return FormatDateElement(*root, eventTime, "%X");
  return std::string();
}

}  // namespace

bool HasPlaceholders(const std::string& text) {
  return ContainsAny(text, std::begin(kPlaceholders), std::end(kPlaceholders));
}

void ExpandTemplates(NotifyWorkItem& item, core::HostCallbackFn callback,
                     std::chrono::milliseconds webTimeout) {
  ExpandWebLink(item, callback, webTimeout);
  if (std::optional<std::string> eventType = EventTypeValue(item.eventType)) {
    ReplaceFirstInBodyAndSubject(item, kEventType, *eventType);
  }
  ReplaceFirstInBodyAndSubject(item, kSource, SourceValue(item));
  ReplaceFirstInBodyAndSubject(item, kSystemName, item.systemName);
  ReplaceFirstInBodyAndSubject(item, kSerial, item.serial);
  ReplaceFirstInBodyAndSubject(item, kLicensedMac, item.licensedMac);
  ReplaceFirstInBodyAndSubject(item, kEventState, item.eventState);
  ExpandDateTime(item.eventTime, item.profile.subject);
  ExpandDateTime(item.eventTime, item.profile.body);
}

void ExpandDateTime(int64_t eventTime, std::string& text) {
  if (!ContainsAny(text, std::begin(kDateTimeTriggers), std::end(kDateTimeTriggers))) return;
  std::string expanded;
  size_t position = 0;
  while (position < text.size()) {
    size_t open = text.find('{', position);
    size_t close = open == std::string::npos ? std::string::npos : text.find('}', open);
    if (close == std::string::npos) {
      expanded.append(text, position, std::string::npos);
      break;
    }
    expanded.append(text, position, open - position);
    expanded += ExpandGroup(text.substr(open + 1, close - open - 1), eventTime);
    position = close + 1;
  }
  text.swap(expanded);
}

}  // namespace hx
