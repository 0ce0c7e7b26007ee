// A frame of a camera stream as the video buffer keeps it: the host's own
// buffer, lent to the module without a copy, and the small record that places
// it in time.
//
// FrameData is shared through std::shared_ptr (atomic counts): the stream's
// history and every clip that holds the frame share one FrameData. When the
// last handle goes, the buffer is handed back to the host. Handles may be
// dropped on any thread (the worker drops the clips it has written); the
// FrameData itself is not changed after it is shared, except by Clear() on
// the host thread that created it, before anybody else holds it.
#ifndef ALERTMOD_VIDEO_FRAME_DATA_H_
#define ALERTMOD_VIDEO_FRAME_DATA_H_

#include <cstdint>
#include <memory>

#include "alertmod/host_records.h"

namespace hx {

// Frame type of a key frame: the first frame of a group of pictures.
constexpr uint32_t kKeyFrameType = 1;

class FrameData {
 public:
  // Lends `size` bytes at `data` from the host reached through `host`.
  // Either may be null; then no release is ever sent.
  FrameData(core::HostCallbackFn host, const void* data, uint32_t size)
      : m_host(host), m_data(data), m_size(size) {}
  // Sends the host the release request (class 0x200, data = the buffer) when
  // both the host and the buffer pointer are still set.
  ~FrameData();

  FrameData(const FrameData&) = delete;
  FrameData& operator=(const FrameData&) = delete;

  // The first byte of the whole buffer (host header included), or null once
  // cleared.
  const uint8_t* Data() const { return static_cast<const uint8_t*>(m_data); }
  // The length of the whole buffer in bytes; kept after Clear().
  uint32_t Size() const { return m_size; }

  // Forgets the buffer so that no release is sent: for a frame the host was
  // told was not kept, and which therefore still belongs to the host.
  void Clear() { m_data = nullptr; }

 private:
  core::HostCallbackFn m_host;
  const void* m_data;
  uint32_t m_size;
};

// Builds the one shared holder of a lent buffer.
std::shared_ptr<FrameData> MakeFrameData(core::HostCallbackFn host, const void* data,
                                         uint32_t size);

// One buffered frame: a small value, copied freely; copies share the buffer.
struct VideoFrame {
  // The module's millisecond tick when the frame arrived. All buffer timing
  // uses this value, compared by unsigned 32-bit differences.
  uint32_t arrivalMs = 0;
  // kKeyFrameType for a key frame; any other value is a dependent frame.
  uint32_t frameType = 0;
  // Offset of the picture payload inside the buffer (the host header's length).
  uint32_t payloadOffset = 0;
  std::shared_ptr<FrameData> data;

  bool IsKey() const { return frameType == kKeyFrameType; }
  // Length of the whole buffer; 0 without data.
  uint32_t Size() const { return data ? data->Size() : 0; }
};

}  // namespace hx

#endif  // ALERTMOD_VIDEO_FRAME_DATA_H_
