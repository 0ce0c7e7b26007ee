// VideoBuffer keeps, for every camera stream, a short rolling history of its
// compressed frames grouped into GOPs, and feeds the live frames to the
// captures (CVideoEmailStream) attached for notifications that want video.
// Frames are never copied: the host's buffers are held through shared
// FrameData handles and handed back when the last holder lets go.
//
// The manager owns the one VideoBuffer. It has no lock: frames, alarm
// documents, host documents and ticks reach it on host threads that the host
// calls one at a time. Completions of captures fire inside AddFrame,
// AttachEmailStream and RemoveStream; a completion must not call back into
// this VideoBuffer (finishing other captures is fine).
#ifndef ALERTMOD_VIDEO_VIDEO_BUFFER_H_
#define ALERTMOD_VIDEO_VIDEO_BUFFER_H_

#include <cstdint>
#include <map>
#include <memory>
#include <set>
#include <vector>

#include "alertmod/host_records.h"
#include "alertmod/platform/env.h"
#include "alertmod/video/frame_data.h"
#include "alertmod/video/gop_buffer.h"
#include "alertmod/video/notify_ready.h"
#include "alertmod/video/video_email_stream.h"

namespace hx {

// Per-stream byte limit until the configuration says otherwise: 10 MiB.
constexpr uint64_t kDefaultVideoBufferBytes = 10ull * 1048576;

// One stream's history and the captures attached to it, in attach order.
class StreamBuffer {
 public:
  explicit StreamBuffer(uint64_t maxBytes);

  // Offers `frame` in `format` to the attached captures, then to the history.
  // A change of width, height or codec first empties the history and
  // finishes every capture. Captures that are done leave the list. Returns
  // whether any of them kept the frame.
  bool AddFrame(const VideoFrame& frame, const StreamFormat& format);

  // Appends a capture (done or not) that receives the following frames.
  void Attach(std::shared_ptr<CVideoEmailStream> stream);
  // Finishes every capture that is not done yet.
  void FinishAll();

  GopBuffer& History() { return m_history; }
  const GopBuffer& History() const { return m_history; }
  const std::vector<std::shared_ptr<CVideoEmailStream>>& Attached() const { return m_attached; }

 private:
  bool OfferToCaptures(const VideoFrame& frame);

  GopBuffer m_history;
  std::vector<std::shared_ptr<CVideoEmailStream>> m_attached;
};

class VideoBuffer {
 public:
  // `host` receives the buffer releases and the log lines; it may be null
  // (nothing is sent). `maxBytes` bounds each stream's history. Frames are
  // stamped with the tick of `env`, which must outlive the buffer.
  VideoBuffer(core::HostCallbackFn host, platform::Env& env,
              uint64_t maxBytes = kDefaultVideoBufferBytes);
  ~VideoBuffer();

  VideoBuffer(const VideoBuffer&) = delete;
  VideoBuffer& operator=(const VideoBuffer&) = delete;

  // Offers one frame of stream `streamId`: `size` bytes at `data`, the
  // picture from `payloadOffset`, `frameType` 1 for a key frame, encoded as
  // `format`. Creates the stream's buffer on its first frame. Returns true
  // when the history or a capture kept the frame: the buffer then belongs to
  // the module until it sends the release. Returns false when nothing kept
  // it (no release will ever be sent for it), also for a frame without data
  // or without picture bytes (payload offset at or beyond its length). Never
  // throws.
  bool AddFrame(int32_t streamId, uint32_t frameType, uint32_t payloadOffset, const void* data,
                uint32_t size, const StreamFormat& format) noexcept;

  // Starts a capture of stream `streamId` for a notification raised at the
  // tick triggerSec * 1000 + triggerMsPart (the caller splits the current
  // tick), wanting `preTriggerSeconds` of video before the trigger and
  // `maxDurationSeconds` in all (negative values count as 0). The capture
  // takes the pre-trigger part from the history at once and may complete at
  // once, firing `completion` before this returns. Returns an empty handle,
  // logging a warning, when the stream has no buffer yet.
  std::shared_ptr<CVideoEmailStream> AttachEmailStream(int32_t streamId, int32_t preTriggerSeconds,
                                                       int32_t maxDurationSeconds,
                                                       uint32_t triggerSec, uint16_t triggerMsPart,
                                                       std::shared_ptr<INotifyReady> completion);

  // Sets the byte limit of new streams and of every existing history;
  // captures already attached keep their own.
  void SetMaxBytes(uint64_t bytes);
  uint64_t MaxBytes() const { return m_maxBytes; }

  // Drops the stream's buffer, releasing its frames. Its captures can get no
  // more video, so those not done are finished (their completions fire).
  // Nothing when the stream has no buffer.
  void RemoveStream(int32_t streamId);

  // Appends the id of every stream with a buffer to `ids`, ascending.
  void StreamIds(std::vector<int32_t>* ids) const;

  // The stream's buffer, or null.
  const StreamBuffer* FindStream(int32_t streamId) const;

 private:
  StreamBuffer& StreamFor(int32_t streamId);
  void ReportMalformed(int32_t streamId, uint32_t payloadOffset, uint32_t size) noexcept;

  core::HostCallbackFn m_host;
  platform::Env& m_env;  // the arrival tick of every frame
  uint64_t m_maxBytes;
  std::map<int32_t, StreamBuffer> m_streams;
  std::set<int32_t> m_malformedReported;
};

}  // namespace hx

#endif  // ALERTMOD_VIDEO_VIDEO_BUFFER_H_
