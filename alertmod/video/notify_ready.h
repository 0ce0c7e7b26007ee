// The completion through which a video capture tells its waiting notification
// that the clip is complete. Called on the host thread that delivers frames,
// documents and ticks.
#ifndef ALERTMOD_VIDEO_NOTIFY_READY_H_
#define ALERTMOD_VIDEO_NOTIFY_READY_H_

namespace hx {

class INotifyReady {
 public:
  virtual ~INotifyReady() = default;
  // The clip is complete. Called at most once per capture stream.
  virtual void OnReady() = 0;
};

}  // namespace hx

#endif  // ALERTMOD_VIDEO_NOTIFY_READY_H_
