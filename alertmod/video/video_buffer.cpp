#include "alertmod/video/video_buffer.h"

#include <algorithm>
#include <limits>
#include <utility>

#include "alertmod/diag/log.h"

namespace hx {
namespace {

// Seconds of a profile or request as milliseconds of the 32-bit tick;
// nonsense (negative) counts as none, and the product cannot wrap.
uint32_t SecondsToMs(int32_t seconds) {
  if (seconds <= 0) return 0;
  const uint64_t ms = static_cast<uint64_t>(seconds) * 1000u;
  return static_cast<uint32_t>(std::min<uint64_t>(ms, std::numeric_limits<uint32_t>::max()));
}

bool IsDone(const std::shared_ptr<CVideoEmailStream>& stream) {
  return stream->Done();
}

}  // namespace

StreamBuffer::StreamBuffer(uint64_t maxBytes) : m_history(StreamFormat{}, maxBytes) {}

bool StreamBuffer::AddFrame(const VideoFrame& frame, const StreamFormat& format) {
  if (!format.SameEncoding(m_history.Format())) {
    // Frames of the old encoding cannot be continued by the new ones.
    m_history.Clear();
    m_history.SetFormat(format);
    FinishAll();
  }
  if (m_attached.empty()) return m_history.Push(frame);
  const bool captured = OfferToCaptures(frame);
  const bool inHistory = m_history.Push(frame);
  return captured || inHistory;
}

bool StreamBuffer::OfferToCaptures(const VideoFrame& frame) {
  bool kept = false;
  // By index: a completion that fires here must not invalidate the walk.
  for (size_t i = 0; i < m_attached.size(); ++i) {
    if (m_attached[i]->OfferFrame(frame)) kept = true;
  }
  m_attached.erase(std::remove_if(m_attached.begin(), m_attached.end(), IsDone), m_attached.end());
  return kept;
}

void StreamBuffer::Attach(std::shared_ptr<CVideoEmailStream> stream) {
  m_attached.push_back(std::move(stream));
}

void StreamBuffer::FinishAll() {
  for (size_t i = 0; i < m_attached.size(); ++i) m_attached[i]->Finish();
}

VideoBuffer::VideoBuffer(core::HostCallbackFn host, platform::Env& env, uint64_t maxBytes)
    : m_host(host), m_env(env), m_maxBytes(maxBytes) {}

VideoBuffer::~VideoBuffer() = default;

bool VideoBuffer::AddFrame(int32_t streamId, uint32_t frameType, uint32_t payloadOffset,
                           const void* data, uint32_t size, const StreamFormat& format) noexcept {
  // A frame must carry picture bytes behind the host's header: the clip
  // writer takes an empty payload for the end of the clip, so such a frame
  // would cut off every frame kept after it.
  if (data == nullptr || payloadOffset >= size) {
    ReportMalformed(streamId, payloadOffset, size);
    return false;
  }
  // The frame's own handle is the only local one: a second copy would cost
  // an extra pair of atomic count changes on every frame of every camera.
  VideoFrame frame{0, frameType, payloadOffset, nullptr};
  try {
    frame.data = MakeFrameData(m_host, data, size);
    frame.arrivalMs = m_env.TickMs();
    if (StreamFor(streamId).AddFrame(frame, format)) return true;
  } catch (...) {
    // Out of memory part way: whoever took the frame before still holds it,
    // and the host must then leave the buffer to the module.
    if (frame.data && frame.data.use_count() > 1) return true;
  }
  // Still the host's: forget the pointer so that dropping the handle sends
  // no release.
  if (frame.data) frame.data->Clear();
  return false;
}

StreamBuffer& VideoBuffer::StreamFor(int32_t streamId) {
  auto found = m_streams.find(streamId);
  if (found != m_streams.end()) return found->second;
  return m_streams.emplace(streamId, StreamBuffer(m_maxBytes)).first->second;
}

void VideoBuffer::ReportMalformed(int32_t streamId, uint32_t payloadOffset,
                                  uint32_t size) noexcept {
  try {
    // Once per stream: a source that sends one such frame tends to send many.
    if (!m_malformedReported.insert(streamId).second) return;
    LogToHost(core::kModuleId, m_host, LogLevelWarning,
              "Refused a malformed video frame of stream %d (length %u, payload offset %u)",
              streamId, size, payloadOffset);
  } catch (...) {
  }
}

std::shared_ptr<CVideoEmailStream> VideoBuffer::AttachEmailStream(
    int32_t streamId, int32_t preTriggerSeconds, int32_t maxDurationSeconds, uint32_t triggerSec,
    uint16_t triggerMsPart, std::shared_ptr<INotifyReady> completion) {
  auto found = m_streams.find(streamId);
  if (found == m_streams.end()) {
    LogToHost(core::kModuleId, m_host, LogLevelWarning,
              "Unable to locate corresponding video frame for channel/stream id %d to attach to "
              "this notification profile",
              streamId);
    return nullptr;
  }
  StreamBuffer& buffer = found->second;
  const GopBuffer& history = buffer.History();
  const uint32_t triggerMs = triggerSec * 1000u + triggerMsPart;
  auto stream =
      std::make_shared<CVideoEmailStream>(history.Format(), history.MaxBytes(), triggerMs,
                                          SecondsToMs(maxDurationSeconds), std::move(completion));
  stream->TakeHistory(history, SecondsToMs(preTriggerSeconds));
  buffer.Attach(stream);
  return stream;
}

void VideoBuffer::SetMaxBytes(uint64_t bytes) {
  m_maxBytes = bytes;
  for (auto& entry : m_streams) entry.second.History().SetMaxBytes(bytes);
}

void VideoBuffer::RemoveStream(int32_t streamId) {
  auto found = m_streams.find(streamId);
  if (found == m_streams.end()) return;
  found->second.FinishAll();
  m_streams.erase(found);
}

void VideoBuffer::StreamIds(std::vector<int32_t>* ids) const {
  if (ids == nullptr) return;
  for (const auto& entry : m_streams) ids->push_back(entry.first);
}

const StreamBuffer* VideoBuffer::FindStream(int32_t streamId) const {
  auto found = m_streams.find(streamId);
  return found == m_streams.end() ? nullptr : &found->second;
}

}  // namespace hx
