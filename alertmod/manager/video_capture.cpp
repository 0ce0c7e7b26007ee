#include "alertmod/manager/video_capture.h"

#include <tinyxml.h>

#include <string>

#include "alertmod/diag/log.h"
#include "alertmod/mail/event_types.h"
#include "alertmod/manager/catalogue.h"
#include "alertmod/manager/event_source.h"
#include "alertmod/manager/stream_links.h"
#include "alertmod/video/video_buffer.h"

namespace hx {
namespace {

constexpr int64_t kBytesPerMB = 1048576;

std::string CaptureLogStart(const NotifyWorkItem& item) {
  const NotifyProfile& profile = item.profile;
  return "Profile " + profile.description + ": PreTrigger(" +
         std::to_string(profile.preAlarmSeconds) + ")" + ", MaxDuration(" +
         std::to_string(profile.maxVideoSeconds) + ")" + ", MaxSizeMB(" +
         std::to_string(profile.sizeLimit / kBytesPerMB) + ")";
}

void AttachCapture(const CaptureContext& context, NotifyWorkItem& item, VideoSource& source,
                   const std::shared_ptr<INotifyReady>& completion) {
  const int32_t streamId =
      MapSourceToStream(source.sourceKey, context.catalogue, context.wanted, context.callback);
  // The trigger is this very moment of the tick, which the buffer takes as
  // whole seconds and a millisecond part.
  const uint32_t nowMs = context.env.TickMs();
  source.stream = context.buffer.AttachEmailStream(streamId, item.profile.preAlarmSeconds,
                                                   item.profile.maxVideoSeconds, nowMs / 1000,
                                                   static_cast<uint16_t>(nowMs % 1000), completion);
}

void AttachAll(const CaptureContext& context, NotifyWorkItem& item,
               const std::shared_ptr<INotifyReady>& completion) {
  // By index: the list does not change while captures are attached.
  for (size_t i = 0; i < item.videoSources.size(); ++i) {
    AttachCapture(context, item, item.videoSources[i], completion);
  }
}

std::string SetupEventSource(const CaptureContext& context, const TiXmlElement& eventSource,
                             NotifyWorkItem& item) {
  const EventSource source = ReadEventSource(eventSource, context.aliases);
  item.sourceKey = source.key;
  item.eventType = source.type;
  item.sourceName = context.catalogue.SourceName(source.key, source.type);
  if (IsCameraEventType(source.type)) {
    VideoSource video;
    video.sourceKey = source.key;
    video.name = item.sourceName;
    item.videoSources.push_back(std::move(video));
  }
  return ", event source (" + item.sourceName + ")" + ", event state (" + item.eventState + ")";
}

std::string SetupSourceGroup(const CaptureContext& context, bool attach,
                             const TiXmlElement& sourceGroup, NotifyWorkItem& item) {
  const EventSource source = ReadSourceGroup(sourceGroup);
  item.sourceKey = source.key;
  item.eventType = source.type;
  item.sourceName = context.catalogue.SourceName(source.key, source.type);
  if (attach) AppendSourceGroupMembers(sourceGroup, context.aliases, context.catalogue, item);
  return ",  event source group (" + item.sourceName + ")" + ", event state (" + item.eventState +
         ")";
}

}  // namespace

void SetupVideoCapture(const CaptureContext& context, bool attach, const TiXmlElement& request,
                       NotifyWorkItem& item, const std::shared_ptr<INotifyReady>& completion) {
  std::string line = CaptureLogStart(item);
  if (const TiXmlElement* eventSource = request.FirstChildElement("EventSource")) {
    line += SetupEventSource(context, *eventSource, item);
  } else if (const TiXmlElement* sourceGroup = request.FirstChildElement("SourceGroup")) {
    line += SetupSourceGroup(context, attach, *sourceGroup, item);
  }
  if (attach) AttachAll(context, item, completion);
  LogToHost(core::kModuleId, context.callback, LogLevelInfo, "%s", line.c_str());
}

}  // namespace hx
