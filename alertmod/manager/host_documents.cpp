// Host system documents (IOCTL code 2): the catalogue, the video the module
// buffers, second reviewer mode, pre-alarm times, analytics aliases and
// configuration updates, in that order.
#include "alertmod/manager/host_documents.h"

#include <tinyxml.h>

#include <initializer_list>
#include <optional>
#include <string>

#include "alertmod/config/xml_attr.h"
#include "alertmod/config/xml_document.h"
#include "alertmod/manager/event_source_key.h"
#include "alertmod/manager/notify_manager.h"
#include "alertmod/manager/source_aliases.h"

namespace hx {
namespace {

// The first element along `names`, each the first child of that name of the
// one before; null when the path breaks off.
const TiXmlElement* FirstOnPath(const TiXmlElement* element,
                                std::initializer_list<const char*> names) {
  for (const char* name : names) {
    if (element == nullptr) return nullptr;
    element = element->FirstChildElement(name);
  }
  return element;
}

// The key of a camera input as event definitions name it: the input cut to
// eight bits, the device not.
uint32_t CameraInputKey(int32_t plugin, int32_t device, int32_t input, int32_t context) {
  return EventSourceKey(plugin, device, input & 0xFF, context);
}

// "Video" / "Input" (Number, Context) under the device, or else the first
// encoder channel under the device or its "Context".
uint32_t DeviceVideoKey(const TiXmlElement& device, int32_t plugin, int32_t deviceNumber) {
  if (const TiXmlElement* input = FirstOnPath(&device, {"Video", "Input"})) {
    std::optional<int32_t> number = IntAttribute(*input, "Number");
    if (!number) return 0;
    return CameraInputKey(plugin, deviceNumber, *number, IntAttributeOr(*input, "Context", 0));
  }
  const TiXmlElement* holder = &device;
  int32_t context = 0;
  if (const TiXmlElement* contextElement = device.FirstChildElement("Context")) {
    std::optional<int32_t> number = IntAttribute(*contextElement, "Number");
    if (!number) return 0;
    holder = contextElement;
    context = *number;
  }
  const TiXmlElement* channel = FirstOnPath(holder, {"Codec", "Encoder", "Channel"});
  std::optional<int32_t> number =
      channel != nullptr ? IntAttribute(*channel, "Number") : std::nullopt;
  return number ? CameraInputKey(plugin, deviceNumber, *number, context) : 0;
}

uint32_t DevicesVideoKey(const TiXmlElement& devices) {
  std::optional<int32_t> plugin = IntAttribute(devices, "ID");
  const TiXmlElement* device = devices.FirstChildElement("Device");
  std::optional<int32_t> number =
      device != nullptr ? IntAttribute(*device, "Number") : std::nullopt;
  if (!plugin || !number) return 0;
  return DeviceVideoKey(*device, *plugin, *number);
}

// The camera of an analytics input when its alias is known; otherwise the
// input waits as unresolved and there is no key yet.
uint32_t AnalyticsVideoKey(const TiXmlElement& analytics, SourceAliases& aliases) {
  std::optional<int32_t> id = IntAttribute(analytics, "ID");
  const TiXmlElement* device = analytics.FirstChildElement("Device");
  std::optional<int32_t> deviceNumber =
      device != nullptr ? IntAttribute(*device, "Number") : std::nullopt;
  const TiXmlElement* input = device != nullptr ? device->FirstChildElement("Input") : nullptr;
  std::optional<int32_t> inputNumber =
      input != nullptr ? IntAttribute(*input, "Number") : std::nullopt;
  if (!id || !deviceNumber || !inputNumber) return 0;
  const uint32_t key = CameraKey(*id, *deviceNumber, *inputNumber);
  if (std::optional<SourceAlias> alias = aliases.Find(key)) return alias->EventKey();
  aliases.MarkUnresolved(key);
  return 0;
}

bool HasNotifyAction(const TiXmlElement& event) {
  const TiXmlElement* action = event.FirstChildElement("Action");
  return action != nullptr && action->FirstChildElement("Notify") != nullptr;
}

void AddGroupMembers(const TiXmlElement& events, const std::set<int32_t>& groups,
                     SourceAliases& aliases, std::set<uint32_t>& sources) {
  for (const TiXmlElement* group = events.FirstChildElement("SourceGroup"); group != nullptr;
       group = group->NextSiblingElement("SourceGroup")) {
    std::optional<int32_t> id = IntAttribute(*group, "ID");
    if (!id || groups.count(*id) == 0) continue;
    for (const TiXmlElement* entry = group->FirstChildElement("Entry"); entry != nullptr;
         entry = entry->NextSiblingElement("Entry")) {
      if (uint32_t key = VideoSourceKey(*entry, aliases)) sources.insert(key);
    }
  }
}

// One "Input" of an analytics section. False when a number is missing.
bool ApplyAnalyticsInput(const TiXmlElement& input, int32_t section, int32_t device,
                         SourceAliases& aliases, std::set<uint32_t>& sources) {
  std::optional<int32_t> number = IntAttribute(input, "Number");
  std::optional<int32_t> plugin = IntAttribute(input, "DevicesID");
  std::optional<int32_t> cameraDevice = IntAttribute(input, "DeviceNumber");
  std::optional<int32_t> cameraInput = IntAttribute(input, "InputNumber");
  if (!number || !plugin || !cameraDevice || !cameraInput) return false;
  const TiXmlElement* rule = input.FirstChildElement("Rule");
  if (rule == nullptr) return true;
  if (!IntAttribute(*rule, "ID")) return false;
  // Unmasked here, unlike in event definitions; the two agree below 256.
  const uint32_t key = (static_cast<uint32_t>(device) << 8) | static_cast<uint32_t>(*number) |
                       (static_cast<uint32_t>(section) & kPluginBitsMask);
  const SourceAlias alias = aliases.Add(key, SourceAlias{*plugin, *cameraDevice, *cameraInput, 0});
  if (aliases.TakeUnresolved(key)) sources.insert(alias.CameraVideoKey());
  return true;
}

bool HasEncoderChannel(const TiXmlElement& trellan) {
  return FirstOnPath(&trellan, {"Devices", "Device", "Codec", "Encoder", "Channel"}) != nullptr;
}

}  // namespace

uint32_t VideoSourceKey(const TiXmlElement& element, SourceAliases& aliases) {
  if (const TiXmlElement* devices = element.FirstChildElement("Devices")) {
    return DevicesVideoKey(*devices);
  }
  if (const TiXmlElement* analytics = element.FirstChildElement("Analytics")) {
    return AnalyticsVideoKey(*analytics, aliases);
  }
  return 0;
}

void RebuildVideoSources(const TiXmlElement& events, SourceAliases& aliases,
                         std::set<uint32_t>& sources) {
  if (events.ValueStr() != "Events") return;
  sources.clear();
  std::set<int32_t> groups;
  for (const TiXmlElement* event = events.FirstChildElement("Event"); event != nullptr;
       event = event->NextSiblingElement()) {
    if (!HasNotifyAction(*event)) continue;
    if (uint32_t key = VideoSourceKey(*event, aliases)) {
      sources.insert(key);
      continue;
    }
    const TiXmlElement* group = event->FirstChildElement("SourceGroup");
    std::optional<int32_t> id = group != nullptr ? IntAttribute(*group, "ID") : std::nullopt;
    if (id) groups.insert(*id);
  }
  if (!groups.empty()) AddGroupMembers(events, groups, aliases, sources);
}

bool ApplyAnalyticsAliases(const TiXmlElement& root, SourceAliases& aliases,
                           std::set<uint32_t>& sources) {
  for (const TiXmlElement* section = root.FirstChildElement("Analytics"); section != nullptr;
       section = section->NextSiblingElement()) {
    std::optional<int32_t> id = IntAttribute(*section, "ID");
    if (!id) return false;
    for (const TiXmlElement* device = section->FirstChildElement("Device"); device != nullptr;
         device = device->NextSiblingElement()) {
      std::optional<int32_t> number = IntAttribute(*device, "Number");
      if (!number) return false;
      for (const TiXmlElement* input = device->FirstChildElement("Input"); input != nullptr;
           input = input->NextSiblingElement()) {
        if (!ApplyAnalyticsInput(*input, *id, *number, aliases, sources)) return false;
      }
    }
  }
  return true;
}

void NotifyManager::OnHostDocument(const void* data, uint32_t length) {
  if (data == nullptr || length == 0) return;
  TiXmlDocument document;
  if (!ParseXmlDocument(std::string(static_cast<const char*>(data), length), document,
                        m_callback)) {
    return;
  }
  const TiXmlElement* trellan = document.FirstChildElement("Trellan");
  if (trellan == nullptr) return;
  std::optional<int32_t> delta = IntAttribute(*trellan, "Delta");
  if (delta && *delta == 0) ApplyFullDocument(document, *trellan);
  const bool aliasesRead = ApplyAnalyticsAliases(*trellan, m_aliases, m_wanted.MutableSources());
  if (aliasesRead && delta && *delta != 0 && trellan->FirstChildElement("Notify") != nullptr) {
    ApplyConfigurationUpdate(document);
  }
  // Captures of streams that were dropped have ended; their notifications
  // need not wait for the next frame or tick.
  if (!m_ready.empty()) ReleaseReady();
}

void NotifyManager::ApplyFullDocument(const TiXmlDocument& document, const TiXmlElement& trellan) {
  m_catalogue.RebuildCatalogue(trellan);
  const TiXmlElement* events = trellan.FirstChildElement("Events");
  if (events != nullptr || HasEncoderChannel(trellan)) {
    if (events != nullptr) RebuildVideoSources(*events, m_aliases, m_wanted.MutableSources());
    RelinkStreams(m_wanted, m_catalogue, m_videoBuffer);
    ReconcileVideoBuffer(m_wanted, m_catalogue, m_videoBuffer);
  }
  ApplySecondReviewer(document);
  m_config.UpdatePreAlarm(document);
}

}  // namespace hx
