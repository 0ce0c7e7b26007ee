#include "alertmod/manager/event_source.h"

#include <tinyxml.h>

#include <optional>

#include "alertmod/config/xml_attr.h"
#include "alertmod/mail/event_types.h"
#include "alertmod/manager/catalogue.h"
#include "alertmod/manager/event_source_key.h"
#include "alertmod/manager/source_aliases.h"

namespace hx {
namespace {

// Events of this type name a camera stream; the context bits of their key
// are not part of the source.
constexpr int32_t kWholeCameraEventType = 18;

}  // namespace

EventSource ReadEventSource(const TiXmlElement& eventSource, const SourceAliases& aliases) {
  std::optional<int32_t> plugin = IntAttribute(eventSource, "Plugin");
  std::optional<int32_t> device = IntAttribute(eventSource, "Device");
  std::optional<int32_t> input = IntAttribute(eventSource, "Input");
  std::optional<int32_t> context = IntAttribute(eventSource, "Context");
  std::optional<int32_t> type = IntAttribute(eventSource, "Type");
  if (!plugin || !device || !input || !context || !type) return EventSource{};
  uint32_t key = EventSourceKey(*plugin, *device, *input, *context);
  if (*type == kWholeCameraEventType) key &= kKeyWithoutContextMask;
  return EventSource{aliases.Replace(key), *type};
}

EventSource ReadSourceGroup(const TiXmlElement& sourceGroup) {
  std::optional<int32_t> id = IntAttribute(sourceGroup, "ID");
  return EventSource{id ? SourceGroupKey(*id) : kSourceGroupKeyBase, kSourceGroupEventType};
}

EventSource RequestEventSource(const TiXmlElement& request, const SourceAliases& aliases) {
  if (const TiXmlElement* eventSource = request.FirstChildElement("EventSource")) {
    return ReadEventSource(*eventSource, aliases);
  }
  if (const TiXmlElement* sourceGroup = request.FirstChildElement("SourceGroup")) {
    return ReadSourceGroup(*sourceGroup);
  }
  return EventSource{};
}

void AppendSourceGroupMembers(const TiXmlElement& sourceGroup, const SourceAliases& aliases,
                              const HostSystemCatalogue& catalogue, NotifyWorkItem& item) {
  for (const TiXmlElement* member = sourceGroup.FirstChildElement("EventSource"); member != nullptr;
       member = member->NextSiblingElement("EventSource")) {
    const EventSource source = ReadEventSource(*member, aliases);
    if ((source.key == 0 && source.type == 0) || !IsCameraEventType(source.type)) continue;
    VideoSource video;
    video.sourceKey = source.key;
    video.name = catalogue.SourceName(source.key, source.type);
    item.videoSources.push_back(std::move(video));
  }
}

}  // namespace hx
