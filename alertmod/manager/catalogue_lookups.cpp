// The catalogue's read side: stream lookups, name lookups and the display
// names of event sources.
#include <string>

#include "alertmod/manager/catalogue.h"
#include "alertmod/manager/event_source_key.h"

namespace hx {
namespace {

// How the display name of an event source is found, by host event type.
enum class Naming {
  kUnknown,       // "Unknown": the type has no source
  kNone,          // empty: the event type itself says it all
  kFixedText,     // the row's text and the device number
  kVideoInput,    // the camera input, with its context
  kTriggerInput,  // a trigger input of a device
  kSerialData,    // a serial data device, with its POS/ATM keyword
  kSourceGroup,
  kConnection,
  kSoftTrigger,
  kAudioStream,  // the audio channel of encoder 0 that carries the input
  kDevice,
  kTimeTrigger,
};

struct TypeNaming {
  Naming naming;
  const char* text;
};

constexpr int32_t kLastEventType = 35;
constexpr TypeNaming kNamingByType[kLastEventType + 1] = {
    {Naming::kUnknown, nullptr},                  // 0
    {Naming::kVideoInput, nullptr},               // 1
    {Naming::kVideoInput, nullptr},               // 2
    {Naming::kTriggerInput, nullptr},             // 3
    {Naming::kSerialData, nullptr},               // 4
    {Naming::kSerialData, nullptr},               // 5
    {Naming::kFixedText, "Button "},              // 6
    {Naming::kFixedText, "Device Temperature "},  // 7
    {Naming::kNone, nullptr},                     // 8
    {Naming::kVideoInput, nullptr},               // 9
    {Naming::kNone, nullptr},                     // 10
    {Naming::kNone, nullptr},                     // 11
    {Naming::kSourceGroup, nullptr},              // 12
    {Naming::kFixedText, "Power Supply "},        // 13
    {Naming::kConnection, nullptr},               // 14
    {Naming::kUnknown, nullptr},                  // 15
    {Naming::kSoftTrigger, nullptr},              // 16
    {Naming::kNone, nullptr},                     // 17
    {Naming::kVideoInput, nullptr},               // 18
    {Naming::kFixedText, "Device Failure "},      // 19
    {Naming::kAudioStream, nullptr},              // 20
    {Naming::kDevice, nullptr},                   // 21
    {Naming::kNone, nullptr},                     // 22
    {Naming::kFixedText, "Device Fan "},          // 23
    {Naming::kTimeTrigger, nullptr},              // 24
    {Naming::kNone, nullptr},                     // 25
    {Naming::kNone, nullptr},                     // 26
    {Naming::kNone, nullptr},                     // 27
    {Naming::kNone, nullptr},                     // 28
    {Naming::kNone, nullptr},                     // 29
    {Naming::kDevice, nullptr},                   // 30
    {Naming::kTriggerInput, nullptr},             // 31
    {Naming::kTriggerInput, nullptr},             // 32
    {Naming::kDevice, nullptr},                   // 33
    {Naming::kVideoInput, nullptr},               // 34
    {Naming::kNone, nullptr},                     // 35
};

TypeNaming NamingOf(int32_t type) {
  if (type < 0 || type > kLastEventType) {
    return {Naming::kUnknown, nullptr};
  }
  return kNamingByType[type];
}

}  // namespace

std::optional<SourceIdentity> HostSystemCatalogue::StreamIdentity(int32_t streamId) const {
  const auto it = m_streams.find(streamId);
  if (it == m_streams.end()) {
    return std::nullopt;
  }
  return it->second;
}

uint32_t HostSystemCatalogue::StreamSourceKey(int32_t streamId) const {
  const auto it = m_streams.find(streamId);
  return it == m_streams.end() ? 0 : SourceKeyOf(it->second);
}

std::optional<StreamFormatRecord> HostSystemCatalogue::StreamFormat(int32_t streamId) const {
  const auto it = m_formats.find(streamId);
  if (it == m_formats.end()) {
    return std::nullopt;
  }
  return it->second;
}

std::vector<int32_t> HostSystemCatalogue::CameraStreams(uint32_t cameraKey) const {
  const auto it = m_cameraStreams.find(static_cast<int32_t>(cameraKey));
  return it == m_cameraStreams.end() ? std::vector<int32_t>() : it->second;
}

std::optional<int32_t> HostSystemCatalogue::FirstVideoStreamOfKey(uint32_t key) const {
  for (const auto& [streamId, identity] : m_streams) {
    if (identity.kind == kKindVideoInput && SourceKeyOf(identity) == key) {
      return streamId;
    }
  }
  return std::nullopt;
}

std::optional<std::string> HostSystemCatalogue::LookupName(const SourceIdentity& identity) const {
  auto it = m_names.find(identity);
  if (it != m_names.end()) {
    return it->second;
  }
  // Serial and POS/ATM sources are named under their section's number,
  // which an event's key does not carry.
  SourceIdentity alternative = identity;
  for (const int32_t section : m_sections) {
    alternative.plugin = section;
    it = m_names.find(alternative);
    if (it != m_names.end()) {
      return it->second;
    }
  }
  return std::nullopt;
}

std::string HostSystemCatalogue::NameOf(const SourceIdentity& identity) const {
  return LookupName(identity).value_or(std::string());
}

std::string HostSystemCatalogue::SourceName(uint32_t key, int32_t type) const {
  if (key == 0) {
    return std::string();
  }
  const int32_t plugin = KeyPlugin(key);
  const int32_t device = KeyDevice(key);
  const int32_t input = KeyInput(key);
  const int32_t context = KeyContext(key);
  const TypeNaming naming = NamingOf(type);
  switch (naming.naming) {
    case Naming::kUnknown:
      return "Unknown";
    case Naming::kNone:
      return std::string();
    case Naming::kFixedText:
      return naming.text + std::to_string(device);
    case Naming::kVideoInput:
      return NameOf({kKindVideoInput, plugin, device, context, input});
    case Naming::kTriggerInput:
      return NameOf({kKindTriggerInput, plugin, device, 0, input});
    case Naming::kSerialData:
      return SerialSourceName(plugin, device, input);
    case Naming::kSourceGroup:
      return NameOf({kKindSourceGroup, plugin, input, 0, 0});
    case Naming::kConnection:
      return NameOf({kKindOutboundConnection, plugin, device, 0, 0});
    case Naming::kSoftTrigger:
      return NameOf({kKindSoftTrigger, plugin, input, 0, 0});
    case Naming::kAudioStream:
      return StreamNameAt({kKindAudioInput, plugin, device, 0, input, context});
    case Naming::kDevice:
      return NameOf({kKindDevice, plugin, device, 0, 0});
    case Naming::kTimeTrigger:
      return NameOf({kKindTimeTrigger, plugin, input, 0, 0});
  }
  return "Unknown";
}

// A serial data source: the name of its input, else its device's name, with
// the POS/ATM keyword text when the device's profile has one for the input.
std::string HostSystemCatalogue::SerialSourceName(int32_t plugin, int32_t device,
                                                  int32_t input) const {
  if (std::optional<std::string> name = LookupName({kKindSerialDevice, plugin, device, 0, input})) {
    return *name;
  }
  const std::string deviceName = NameOf({kKindSerialDevice, plugin, device, 0, 0});
  const auto profile = m_serialProfiles.find(static_cast<int32_t>(CameraKey(plugin, device, 0)));
  if (profile == m_serialProfiles.end()) {
    return deviceName;
  }
  const auto keywords = m_posAtm.find(profile->second);
  if (keywords == m_posAtm.end()) {
    return deviceName;
  }
  const auto keyword = keywords->second.find(input);
  return keyword == keywords->second.end() ? deviceName : deviceName + " - " + keyword->second;
}

std::string HostSystemCatalogue::StreamNameAt(const EncoderSlot& slot) const {
  const auto it = m_identities.find(slot);
  return it == m_identities.end() ? std::string() : NameOf(it->second);
}

}  // namespace hx
