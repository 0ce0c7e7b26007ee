// Groups of pictures and the bounded queue of them that serves both as a
// camera stream's rolling history and as the clip collected for one
// notification.
//
// A GopBuffer has no lock. The stream's history is used only on the host
// thread that delivers frames; a clip is filled on that thread and read,
// once its capture is done, by the worker.
#ifndef ALERTMOD_VIDEO_GOP_BUFFER_H_
#define ALERTMOD_VIDEO_GOP_BUFFER_H_

#include <cstddef>
#include <cstdint>
#include <deque>
#include <vector>

#include "alertmod/video/frame_data.h"

namespace hx {

// Host codec codes of StreamFormat::codec.
constexpr uint32_t kCodecJpeg = 0;  // motion JPEG: every frame a complete still
constexpr uint32_t kCodecMpeg4 = 4;
constexpr uint32_t kCodecH264 = 5;
constexpr uint32_t kCodecH265 = 6;

// A JPEG history holds at most this many stills.
constexpr size_t kMaxJpegStills = 20;

// The encoding of a stream, as the host system catalogue describes it.
struct StreamFormat {
  // Two leading words that take part in no comparison.
  uint32_t lead0 = 0;
  uint32_t lead1 = 0xFFFFFFFFu;
  uint32_t width = 0;
  uint32_t height = 0;
  uint32_t codec = 0;

  // True when width, height and codec are equal.
  bool SameEncoding(const StreamFormat& other) const {
    return width == other.width && height == other.height && codec == other.codec;
  }
};

// One group of pictures: a key frame and the frames that depend on it, in
// arrival order. Never empty while held by a GopBuffer.
struct Gop {
  uint64_t bytes = 0;  // sum of the frames' buffer sizes
  std::vector<VideoFrame> frames;
};

class GopBuffer {
 public:
  GopBuffer(const StreamFormat& format, uint64_t maxBytes)
      : m_format(format), m_maxBytes(maxBytes) {}

  // Offers one frame. A key frame opens a new GOP; a dependent frame joins
  // the newest one. Older GOPs are dropped (their frames released when no
  // other holder is left) to stay within the byte limit and, for JPEG, the
  // still count. Returns false, keeping nothing, when the frame cannot be
  // placed: a dependent frame with no GOP to join or after a dropped head
  // (then the buffer waits for the next key frame), or a frame that does not
  // fit even alone.
  bool Push(const VideoFrame& frame);

  // Drops every GOP.
  void Clear();
  // Drops the oldest GOP; nothing when empty.
  void DropFront();
  // Puts `gop` before the oldest GOP (it must not be empty).
  void PushFront(Gop gop);
  // Appends `gop` after the newest GOP (it must not be empty).
  void PushBack(Gop gop);
  // Removes and returns the newest GOP; requires a non-empty buffer.
  Gop PopBack();

  const StreamFormat& Format() const { return m_format; }
  void SetFormat(const StreamFormat& format) { m_format = format; }
  uint64_t MaxBytes() const { return m_maxBytes; }
  void SetMaxBytes(uint64_t maxBytes) { m_maxBytes = maxBytes; }
  uint64_t Bytes() const { return m_bytes; }
  uint64_t Frames() const { return m_frames; }
  bool WaitForKey() const { return m_waitForKey; }
  // Makes dependent frames wait for the next key frame, as after a gap.
  void SetWaitForKey(bool wait) { m_waitForKey = wait; }
  bool Empty() const { return m_gops.empty(); }
  // Oldest first.
  const std::deque<Gop>& Gops() const { return m_gops; }

  // arrivalMs of the oldest and of the newest frame held; 0 when empty.
  uint32_t FirstArrivalMs() const;
  uint32_t LastArrivalMs() const;
  // Newest minus oldest arrivalMs (unsigned 32-bit); 0 when empty.
  uint32_t SpanMs() const { return LastArrivalMs() - FirstArrivalMs(); }

 private:
  void TrimStills();
  bool MakeRoom(uint64_t size, bool key);
  void OpenGop(const VideoFrame& frame);
  void Insert(Gop gop, bool atFront);

  StreamFormat m_format;
  uint64_t m_maxBytes;
  uint64_t m_bytes = 0;
  uint64_t m_frames = 0;
  bool m_waitForKey = false;
  std::deque<Gop> m_gops;
};

}  // namespace hx

#endif  // ALERTMOD_VIDEO_GOP_BUFFER_H_
