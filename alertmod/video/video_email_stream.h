// CVideoEmailStream is the video collected for one notification from one
// camera stream: the pre-trigger part taken from the stream's history when
// the notification is raised, and the frames that follow until the clip is
// long enough, too large, or finished from outside.
//
// It is shared (std::shared_ptr) between the stream buffer it is attached to
// and the notification. While it collects, only the host thread that delivers
// frames, documents and ticks touches it. Once Done() it is never changed
// again, so the worker reads the clip without a lock.
//
// To build a clip by hand (tests of its readers): construct it with the
// stream's format and limits and offer it frames; it takes them while the
// clip's span stays within the duration limit.
#ifndef ALERTMOD_VIDEO_VIDEO_EMAIL_STREAM_H_
#define ALERTMOD_VIDEO_VIDEO_EMAIL_STREAM_H_

#include <cstdint>
#include <deque>
#include <memory>

#include "alertmod/video/frame_data.h"
#include "alertmod/video/gop_buffer.h"
#include "alertmod/video/notify_ready.h"

namespace hx {

class CVideoEmailStream {
 public:
  // An empty capture of a stream in `format` that holds at most `maxBytes`
  // in its clip, raised at `triggerMs`, that wants `maxDurationMs` of video.
  // `completion` (may be null) is told once when the capture is done.
  CVideoEmailStream(const StreamFormat& format, uint64_t maxBytes, uint32_t triggerMs,
                    uint32_t maxDurationMs, std::shared_ptr<INotifyReady> completion);

  CVideoEmailStream(const CVideoEmailStream&) = delete;
  CVideoEmailStream& operator=(const CVideoEmailStream&) = delete;

  // Takes the pre-trigger part from `history` (whose GOPs it shares, never
  // changes): the newest GOP into the clip and the older ones that ended at
  // most `preTriggerMs` before the trigger into staging. May finish the
  // capture at once (JPEG, no duration or byte limit, or a newest GOP that
  // already spans the duration), firing the completion before it returns.
  // Called once, right after construction.
  void TakeHistory(const GopBuffer& history, uint32_t preTriggerMs);

  // Offers a live frame. Returns whether the clip kept it. Staged GOPs join
  // the clip as time passes after the trigger; the capture finishes (firing
  // the completion) when the clip reaches its duration or byte limit.
  bool OfferFrame(const VideoFrame& frame);

  // Moves what staged video still fits into the clip, marks the capture done
  // and fires the completion if it has not fired. Does nothing when done.
  void Finish();

  bool Done() const { return m_done; }

  // The clip, oldest GOP first, and its description.
  const StreamFormat& Format() const { return m_clip.Format(); }
  uint32_t Width() const { return m_clip.Format().width; }
  uint32_t Height() const { return m_clip.Format().height; }
  uint32_t Codec() const { return m_clip.Format().codec; }
  uint64_t FrameCount() const { return m_clip.Frames(); }
  uint64_t ByteCount() const { return m_clip.Bytes(); }
  const std::deque<Gop>& Gops() const { return m_clip.Gops(); }
  // arrivalMs of the clip's first and last frame; 0 when the clip is empty.
  uint32_t FirstFrameMs() const { return m_clip.FirstArrivalMs(); }
  uint32_t LastFrameMs() const { return m_clip.LastArrivalMs(); }
  uint32_t TriggerMs() const { return m_triggerMs; }
  uint32_t MaxDurationMs() const { return m_maxDurationMs; }

  const GopBuffer& Clip() const { return m_clip; }
  // Pre-trigger GOPs not yet in the clip; emptied when the capture is done.
  const GopBuffer& Staging() const { return m_staging; }

 private:
  bool UsesShortRule() const;
  bool OfferToShortClip(const VideoFrame& frame);
  bool OfferToTimedClip(const VideoFrame& frame);
  void StagePreTrigger(const GopBuffer& history, uint32_t preTriggerMs);
  void BalancePreTrigger(uint32_t arrivalMs);
  bool MoveNewestStagedGop();
  void MarkDone();

  GopBuffer m_staging;
  GopBuffer m_clip;
  uint32_t m_triggerMs;
  uint32_t m_maxDurationMs;
  bool m_done = false;
  std::shared_ptr<INotifyReady> m_completion;
};

}  // namespace hx

#endif  // ALERTMOD_VIDEO_VIDEO_EMAIL_STREAM_H_
