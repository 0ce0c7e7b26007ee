#include "host/camera_feed.h"

#include <cstring>
#include <limits>

#include "host/system_description.h"

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavcodec/bsf.h>
#include <libavformat/avformat.h>
#include <libavutil/avutil.h>
}

namespace refhost {
namespace {

constexpr double kDefaultFps = 25.0;

std::string AvError(const char* what, int code) {
  char text[AV_ERROR_MAX_STRING_SIZE] = {0};
  av_strerror(code, text, sizeof(text));
  return std::string(what) + ": " + text;
}

// Host codec code of a libavcodec codec, or -1 for one the host cannot carry.
int HostCodec(AVCodecID id) {
  switch (id) {
    case AV_CODEC_ID_MJPEG:
      return kStandardJpeg;
    case AV_CODEC_ID_MPEG4:
      return kStandardMpeg4;
    case AV_CODEC_ID_H264:
      return kStandardH264;
    case AV_CODEC_ID_HEVC:
      return kStandardH265;
    default:
      return -1;
  }
}

// Cameras deliver H.264 and H.265 with start codes and the parameter sets in
// the stream; MP4 and MOV files store them length-prefixed with the sets in
// the header, which this filter turns back.
const char* AnnexBFilter(const AVCodecParameters& codec) {
  const bool lengthPrefixed = codec.extradata_size > 0 && codec.extradata[0] == 1;
  if (!lengthPrefixed) return nullptr;
  if (codec.codec_id == AV_CODEC_ID_H264) return "h264_mp4toannexb";
  if (codec.codec_id == AV_CODEC_ID_HEVC) return "hevc_mp4toannexb";
  return nullptr;
}

double FrameRate(const AVStream& stream) {
  for (AVRational rate : {stream.avg_frame_rate, stream.r_frame_rate}) {
    if (rate.num > 0 && rate.den > 0) return av_q2d(rate);
  }
  return kDefaultFps;
}

struct PacketDeleter {
  void operator()(AVPacket* packet) const { av_packet_free(&packet); }
};
using PacketPtr = std::unique_ptr<AVPacket, PacketDeleter>;

}  // namespace

// The file's video packets in decoding order, each with start codes where
// the codec uses them.
class CameraFeed::Demuxer {
 public:
  ~Demuxer() {
    av_bsf_free(&m_filter);
    avformat_close_input(&m_format);
  }

  bool Open(const std::string& path, std::string* error) {
    int result = avformat_open_input(&m_format, path.c_str(), nullptr, nullptr);
    if (result < 0) return Fail(AvError(("cannot open " + path).c_str(), result), error);
    result = avformat_find_stream_info(m_format, nullptr);
    if (result < 0) return Fail(AvError("cannot read stream information", result), error);
    m_index = av_find_best_stream(m_format, AVMEDIA_TYPE_VIDEO, -1, -1, nullptr, 0);
    if (m_index < 0) return Fail(path + " holds no video stream", error);
    m_packet.reset(av_packet_alloc());
    if (!m_packet) return Fail("out of memory", error);
    return OpenFilter(error);
  }

  const AVStream& Stream() const { return *m_format->streams[m_index]; }

  // 1 with a packet in `out`, 0 at the end of the file, -1 on a read error.
  int Next(AVPacket* out, std::string* error) {
    for (;;) {
      if (m_filter != nullptr) {
        const int received = av_bsf_receive_packet(m_filter, out);
        if (received == 0) return 1;
        if (received == AVERROR_EOF) return 0;
        if (received != AVERROR(EAGAIN))
          return FailRead("cannot convert a packet", received, error);
      }
      const int read = av_read_frame(m_format, m_packet.get());
      if (read == AVERROR_EOF) {
        if (m_filter == nullptr) return 0;
        av_bsf_send_packet(m_filter, nullptr);  // drain what the filter holds
        continue;
      }
      if (read < 0) return FailRead("cannot read a packet", read, error);
      if (m_packet->stream_index != m_index) {
        av_packet_unref(m_packet.get());
        continue;
      }
      if (m_filter == nullptr) {
        av_packet_move_ref(out, m_packet.get());
        return 1;
      }
      const int sent = av_bsf_send_packet(m_filter, m_packet.get());
      if (sent < 0) {
        av_packet_unref(m_packet.get());
        return FailRead("cannot convert a packet", sent, error);
      }
    }
  }

 private:
  static bool Fail(const std::string& text, std::string* error) {
    if (error != nullptr) *error = text;
    return false;
  }
  static int FailRead(const char* what, int code, std::string* error) {
    Fail(AvError(what, code), error);
    return -1;
  }

  bool OpenFilter(std::string* error) {
    const AVStream& stream = Stream();
    const char* name = AnnexBFilter(*stream.codecpar);
    if (name == nullptr) return true;
    const AVBitStreamFilter* filter = av_bsf_get_by_name(name);
    if (filter == nullptr) return Fail(std::string("missing bitstream filter ") + name, error);
    int result = av_bsf_alloc(filter, &m_filter);
    if (result >= 0) result = avcodec_parameters_copy(m_filter->par_in, stream.codecpar);
    if (result >= 0) {
      m_filter->time_base_in = stream.time_base;
      result = av_bsf_init(m_filter);
    }
    if (result < 0) return Fail(AvError("cannot set up the bitstream filter", result), error);
    return true;
  }

  AVFormatContext* m_format = nullptr;
  AVBSFContext* m_filter = nullptr;
  PacketPtr m_packet;
  int m_index = -1;
};

CameraFeed::CameraFeed(ReferenceHost& host, FramePool& pool, FeedOptions options)
    : m_host(host), m_pool(pool), m_options(std::move(options)) {}

CameraFeed::~CameraFeed() {
  Stop();
}

bool CameraFeed::Open(std::string* error) {
  static std::once_flag quiet;
  std::call_once(quiet, [] { av_log_set_level(AV_LOG_ERROR); });
  auto demuxer = std::make_unique<Demuxer>();
  if (!demuxer->Open(m_options.path, error)) return false;
  const AVStream& stream = demuxer->Stream();
  const int codec = HostCodec(stream.codecpar->codec_id);
  if (codec < 0) {
    if (error != nullptr) {
      *error = m_options.path + ": codec " + avcodec_get_name(stream.codecpar->codec_id) +
               " cannot be fed";
    }
    return false;
  }
  m_format.width = static_cast<uint32_t>(stream.codecpar->width);
  m_format.height = static_cast<uint32_t>(stream.codecpar->height);
  m_format.codec = static_cast<uint32_t>(codec);
  m_format.fps = FrameRate(stream);
  m_demuxer = std::move(demuxer);
  return true;
}

bool CameraFeed::Run(std::string* error) {
  if (!m_demuxer && !Open(error)) return false;
  m_start = std::chrono::steady_clock::now();
  for (int loop = 0; m_options.loops == 0 || loop < m_options.loops; ++loop) {
    {
      MutexLock lock(m_mutex);
      if (m_stop) break;
    }
    // Each further round starts from a freshly opened file.
    if (loop > 0 && !Open(error)) return false;
    if (!PlayOnce(error)) return false;
  }
  return true;
}

bool CameraFeed::PlayOnce(std::string* error) {
  PacketPtr packet(av_packet_alloc());
  if (!packet) {
    if (error != nullptr) *error = "out of memory";
    return false;
  }
  const AVRational timeBase = m_demuxer->Stream().time_base;
  for (;;) {
    {
      MutexLock lock(m_mutex);
      if (m_stop) return true;
    }
    const int next = m_demuxer->Next(packet.get(), error);
    if (next <= 0) return next == 0;
    const bool key = m_format.codec == kStandardJpeg || (packet->flags & AV_PKT_FLAG_KEY) != 0;
    const int64_t stamp = packet->pts != AV_NOPTS_VALUE ? packet->pts : packet->dts;
    const int64_t timeMs = stamp == AV_NOPTS_VALUE ? 0 : av_rescale_q(stamp, timeBase, {1, 1000});
    if (m_options.realTime) Pace();
    Push(packet->data, static_cast<size_t>(packet->size), key, timeMs);
    av_packet_unref(packet.get());
  }
}

void CameraFeed::Pace() {
  const auto due = m_start + std::chrono::duration_cast<std::chrono::steady_clock::duration>(
                                 std::chrono::duration<double>(m_sequence / m_format.fps));
  MutexLock lock(m_mutex);
  while (!m_stop && m_wake.WaitUntil(m_mutex, due)) {
  }
}

void CameraFeed::Push(const uint8_t* payload, size_t size, bool key, int64_t timeMs) {
  constexpr size_t kHeader = sizeof(FrameHeader);
  uint8_t* buffer = nullptr;
  if (size <= std::numeric_limits<uint32_t>::max() - kHeader)
    buffer = m_pool.Allocate(kHeader + size);
  if (buffer == nullptr) {
    MutexLock lock(m_statsMutex);
    ++m_stats.failed;
    return;
  }
  const FrameHeader header{kFrameHeaderMagic,
                           static_cast<uint16_t>(kHeader),
                           static_cast<uint16_t>(key ? kFrameFlagKey : 0),
                           m_options.streamId,
                           static_cast<uint32_t>(size),
                           m_sequence++,
                           timeMs};
  std::memcpy(buffer, &header, kHeader);
  if (size > 0) std::memcpy(buffer + kHeader, payload, size);
  if (m_options.observer) m_options.observer(header, buffer + kHeader);
  const bool kept = WriteFrame(buffer, static_cast<uint32_t>(kHeader + size), key);
  MutexLock lock(m_statsMutex);
  ++m_stats.frames;
  if (key) ++m_stats.keyFrames;
  ++(kept ? m_stats.kept : m_stats.refused);
  m_stats.payloadBytes += size;
}

bool CameraFeed::WriteFrame(uint8_t* buffer, uint32_t length, bool key) {
  hx::core::WriteParmsIn in{};
  in.length = length;
  in.data = buffer;
  in.source = m_options.streamId;
  in.requestClass = hx::core::kWriteClassFrame;
  in.payloadOffset = sizeof(FrameHeader);
  in.frameType = key ? hx::core::kFrameTypeKey : 0;
  hx::core::WriteParmsOut out{};
  try {
    m_host.Write(in, &out);
  } catch (const std::exception&) {
    out.frameKept = 0;  // the host is stopping; the frame never reached the module
  }
  // A refused frame is still the host's: free it now. A kept one is freed
  // when the module sends its release.
  if (out.frameKept == 0) m_pool.Discard(buffer);
  return out.frameKept != 0;
}

bool CameraFeed::Start(std::string* error) {
  if (m_thread.joinable()) {
    if (error != nullptr) *error = "the feed is already running";
    return false;
  }
  if (!m_demuxer && !Open(error)) return false;
  m_thread = std::thread([this] {
    std::string runError;
    const bool result = Run(&runError);
    MutexLock lock(m_mutex);
    m_result = result;
    m_error = runError;
  });
  return true;
}

bool CameraFeed::Wait(std::string* error) {
  if (m_thread.joinable()) m_thread.join();
  MutexLock lock(m_mutex);
  if (error != nullptr) *error = m_error;
  return m_result;
}

void CameraFeed::Stop() {
  {
    MutexLock lock(m_mutex);
    m_stop = true;
  }
  m_wake.NotifyAll();
  if (m_thread.joinable()) m_thread.join();
}

FeedStats CameraFeed::Stats() const {
  MutexLock lock(m_statsMutex);
  return m_stats;
}

}  // namespace refhost
