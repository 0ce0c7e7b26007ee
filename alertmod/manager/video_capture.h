// Video capture setup for one notification: names the event's source, lists
// the cameras whose video goes with the message and, when the profile wants
// attachments, attaches a capture (CVideoEmailStream) to the buffered stream
// of each camera. Each capture reports completion through the notification's
// INotifyReady, possibly before SetupVideoCapture returns.
//
// Runs on the host thread of Write, with the manager's host-side tables.
#ifndef ALERTMOD_MANAGER_VIDEO_CAPTURE_H_
#define ALERTMOD_MANAGER_VIDEO_CAPTURE_H_

#include <memory>

#include "alertmod/host_records.h"
#include "alertmod/mail/notify_work_item.h"
#include "alertmod/platform/env.h"
#include "alertmod/video/notify_ready.h"

class TiXmlElement;

namespace hx {

class HostSystemCatalogue;
class SourceAliases;
class VideoBuffer;
class WantedVideo;

// The manager's tables that a capture reads, and its video buffer.
struct CaptureContext {
  const HostSystemCatalogue& catalogue;
  VideoBuffer& buffer;
  const WantedVideo& wanted;
  const SourceAliases& aliases;
  core::HostCallbackFn callback;
  platform::Env& env;  // the tick a capture is raised at
};

// Fills `item`'s source key, event type, source name and video sources from
// alarm request `request` ("EventSource" or "SourceGroup" child) and logs
// one line describing the capture. When `attach` is set, attaches a capture
// of each video source, raised now, with the item's pre-alarm seconds and
// its profile's MaxVideoSeconds, completing through `completion`. A camera
// whose stream has no buffered frame yet gets no capture (a warning is
// logged); its source stays listed.
void SetupVideoCapture(const CaptureContext& context, bool attach, const TiXmlElement& request,
                       NotifyWorkItem& item, const std::shared_ptr<INotifyReady>& completion);

}  // namespace hx

#endif  // ALERTMOD_MANAGER_VIDEO_CAPTURE_H_
