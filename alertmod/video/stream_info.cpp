#include "alertmod/video/stream_info.h"

#include "alertmod/diag/log.h"
#include "alertmod/video/ps_packet.h"

namespace videomake {
namespace {

constexpr uint8_t kCodecByteBase = 128;

}  // namespace

const std::vector<hx::PSConvertOption>& ClipMuxerOptions() {
  static const std::vector<hx::PSConvertOption> options = {{"moov_size", "16352", 0}};
  return options;
}

CStreamInfo::CStreamInfo(uint32_t streamId, uint8_t codec, uint32_t width, uint32_t height,
                         uint32_t fps, const char* path, int64_t maxSpanMs,
                         hx::core::HostCallbackFn callback, hx::platform::Env& env,
                         hx::av_init& libs)
    : m_streamId(streamId),
      m_width(width),
      m_height(height),
      m_codec(codec < kCodecByteBase ? static_cast<uint8_t>(codec + kCodecByteBase) : codec),
      m_fps(fps),
      m_maxSpanMs(maxSpanMs),
      m_path(path != nullptr ? path : env.TempDirectory()),
      m_callback(callback),
      m_env(env),
      m_libs(libs) {}

CStreamInfo::~CStreamInfo() {
  Close();
}

bool CStreamInfo::GetStreamHeader(uint32_t index, hx::PSStreamDescriptor* descriptor) const {
  if (index != 0 || descriptor == nullptr) return false;
  // Byte 1 belongs to the caller and stays as it was.
  descriptor->codec = m_codec;
  descriptor->width16 = static_cast<uint8_t>(m_width / 16);
  descriptor->height16 = static_cast<uint8_t>(m_height / 16);
  return true;
}

bool CStreamInfo::GetStreamSize(uint32_t index, uint32_t* width, uint32_t* height) const {
  if (index != 0 || width == nullptr || height == nullptr) return false;
  *width = m_width;
  *height = m_height;
  return true;
}

bool CStreamInfo::GetStreamExtent(uint32_t index, hx::PSStreamExtent* extent) const {
  if (index != 0 || extent == nullptr || !m_extentKnown) return false;
  *extent = m_extent;
  return true;
}

bool CStreamInfo::LibrariesReady() {
  if (m_libs.AllLoaded()) return true;
  return m_libs.Reload();
}

bool CStreamInfo::WriteFrame(const uint8_t* data, uint32_t size, int64_t timeMs, uint8_t flag,
                             uint32_t frameType) {
  if (!LibrariesReady() || timeMs == 0) return false;
  if (frameType == hx::kPSKeyFrame && !AcceptKeyFrame(timeMs)) return false;
  if (!m_activeClip) return m_started;

  hx::_PSFILE_PACKET packet;
  packet.streamIndex = 0;
  packet.frameType = static_cast<uint16_t>(frameType);
  packet.size = size;
  packet.data = data;
  packet.flag = flag;
  hx::SetPacketTime(timeMs, &packet);
  if (m_activeClip->muxer->WritePacket(packet) < 0) return false;
  m_activeClip->LastFrame = timeMs;
  return true;
}

bool CStreamInfo::AcceptKeyFrame(int64_t timeMs) {
  if (m_activeClip) {
    if (timeMs - m_activeClip->FirstFrame > m_maxSpanMs) return false;
    const int64_t gap = timeMs - m_activeClip->LastFrame;
    if (gap > kKeyFrameGapLogMs) {
      hx::LogToHost(hx::core::kClipWriterLogSource, m_callback, hx::LogLevelError,
                    "Existing at full_ts - m_activeClip->LastFrame gap is %d",
                    static_cast<int>(gap));
    }
  }
  m_started = true;
  if (!m_activeClip) OpenClip(timeMs);
  return true;
}

void CStreamInfo::OpenClip(int64_t timeMs) {
  auto clip = std::make_unique<ActiveClip>();
  clip->FirstFrame = timeMs;
  clip->LastFrame = timeMs;
  clip->muxer = std::make_unique<hx::PSConvertAVCodecStream>(m_env, m_libs);
  clip->muxer->SetOptions(ClipMuxerOptions());
  const int result = clip->muxer->Open(hx::PSFileHeader(), *this, m_path);
  if (result != 0) {
    hx::LogToHost(hx::core::kClipWriterLogSource, m_callback, hx::LogLevelError,
                  "failed to start mp4/mov file for %d: %d", static_cast<int>(m_streamId), result);
    return;
  }
  m_activeClip = std::move(clip);
}

void CStreamInfo::Close() {
  if (m_activeClip) {
    m_activeClip->muxer->WriteHeader();
    const int result = m_activeClip->muxer->Close();
    if (result < 0) {
      // The muxer has removed the unfinished file; say why the clip is missing.
      hx::LogToHost(hx::core::kClipWriterLogSource, m_callback, hx::LogLevelError,
                    "failed to finish mp4/mov file for %d: %d", static_cast<int>(m_streamId),
                    result);
    }
    m_activeClip.reset();
  }
  m_started = false;
}

}  // namespace videomake
