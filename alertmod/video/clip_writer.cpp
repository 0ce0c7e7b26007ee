#include "alertmod/video/clip_writer.h"

#include <exception>

#include "alertmod/diag/log.h"
#include "alertmod/platform/files.h"
#include "alertmod/video/ps_packet.h"
#include "alertmod/video/stream_info.h"

namespace hx {
namespace {

struct Payload {
  const uint8_t* data = nullptr;
  uint32_t size = 0;
};

// The picture bytes of `frame` behind the host's header; empty when the
// frame has lost its buffer or the offset lies beyond it.
Payload PayloadOf(const VideoFrame& frame) {
  if (!frame.data || frame.data->Data() == nullptr) return Payload{};
  const uint32_t size = frame.data->Size();
  if (frame.payloadOffset >= size) return Payload{};
  return Payload{frame.data->Data() + frame.payloadOffset, size - frame.payloadOffset};
}

bool PacketCodecFor(uint32_t codec, uint8_t* packetCodec) {
  switch (codec) {
    case kCodecMpeg4:
      *packetCodec = kPSCodecMpeg4;
      return true;
    case kCodecH264:
      *packetCodec = kPSCodecH264;
      return true;
    case kCodecH265:
      *packetCodec = kPSCodecH265;
      return true;
    default:
      return false;
  }
}

// A clip of n frames over s ms plays n + 1 frames per s; at least one frame
// per second, so that sparse frames still give a playable rate.
uint32_t ClipFps(const CVideoEmailStream& stream, uint32_t spanMs) {
  const uint64_t fps = (stream.FrameCount() + 1) * 1000 / spanMs;
  if (fps == 0) return 1;
  return fps > UINT32_MAX ? UINT32_MAX : static_cast<uint32_t>(fps);
}

// Arrival ticks are 32-bit and wrap; the clip's timeline counts on from its
// first frame instead. It never reaches 0, which WriteFrame reads as "no time".
int64_t ClipTimeMs(uint32_t firstMs, uint32_t arrivalMs) {
  const int64_t base = firstMs == 0 ? 1 : firstMs;
  return base + static_cast<uint32_t>(arrivalMs - firstMs);
}

// The most that FeedFrames will offer.
PSStreamExtent ClipExtent(const CVideoEmailStream& stream) {
  PSStreamExtent extent;
  for (const Gop& gop : stream.Gops()) {
    for (const VideoFrame& frame : gop.frames) {
      ++extent.frames;
      if (frame.frameType == kKeyFrameType) ++extent.keyFrames;
      extent.bytes += PayloadOf(frame).size;
    }
  }
  return extent;
}

void FeedFrames(const CVideoEmailStream& stream, videomake::CStreamInfo* info) {
  const uint32_t firstMs = stream.FirstFrameMs();
  for (const Gop& gop : stream.Gops()) {
    for (const VideoFrame& frame : gop.frames) {
      const Payload payload = PayloadOf(frame);
      if (payload.data == nullptr) return;  // a frame without picture ends the clip
      if (!info->WriteFrame(payload.data, payload.size, ClipTimeMs(firstMs, frame.arrivalMs), 0,
                            frame.frameType)) {
        return;
      }
    }
  }
}

}  // namespace

bool WriteVideoAttachment(uint32_t streamId, const CVideoEmailStream& stream,
                          const std::string& path, core::HostCallbackFn callback,
                          platform::Env& env, av_init& libs) {
  uint8_t packetCodec = 0;
  if (!PacketCodecFor(stream.Codec(), &packetCodec)) {
    LogToHost(core::kModuleId, callback, LogLevelWarning, "Invalid codec type received.");
    return false;
  }
  try {
    const uint32_t firstMs = stream.FirstFrameMs();
    const uint32_t lastMs = stream.LastFrameMs();
    const uint32_t spanMs = lastMs != firstMs ? lastMs - firstMs : 1;
    videomake::CStreamInfo info(streamId, packetCodec, stream.Width(), stream.Height(),
                                ClipFps(stream, spanMs), path.c_str(), spanMs, callback, env, libs);
    info.SetExtent(ClipExtent(stream));
    FeedFrames(stream, &info);
    info.Close();
    return true;
  } catch (const std::exception&) {
    LogToHost(core::kModuleId, callback, LogLevelWarning,
              "Failed to write video frames to mov or mp4 format file %s", path.c_str());
    return false;
  }
}

bool WriteJpegAttachment(const CVideoEmailStream& stream, const std::string& path,
                         platform::Env& env) {
  if (stream.Gops().empty() || stream.Gops().front().frames.empty() || path.empty()) return false;
  const Payload payload = PayloadOf(stream.Gops().front().frames.front());
  if (payload.data == nullptr) return false;
  platform::File file;
  if (!env.NewWritableFile(path, false, &file).ok()) return false;
  // A short write (a full disk) would mail a truncated picture.
  size_t written = 0;
  const bool wrote = file.Write(payload.data, payload.size, &written).ok();
  const bool closed = file.Close().ok();
  return wrote && written == payload.size && closed;
}

}  // namespace hx
