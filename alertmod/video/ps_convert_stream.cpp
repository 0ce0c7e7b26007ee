#include "alertmod/video/ps_convert_stream.h"

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "alertmod/platform/clock.h"
#include "alertmod/platform/utc_time.h"

namespace hx {
namespace {

constexpr const char* kCreationTimeFormat = "%Y-%m-%d %H:%M:%S";
// The streams are English. MP4 and QuickTime store three-letter codes and
// would drop the two-letter "en", so the stream carries its three-letter form.
constexpr const char* kStreamLanguage = "eng";
// A descriptor's size byte of 0 stands for 256 units of 16 pixels.
constexpr uint32_t kZeroSizeUnitsPixels = 4096;
constexpr AVRational kStreamTimeBase{1, 90000};
constexpr AVRational kMilliseconds{1, 1000};
constexpr int kFrameRatePrecision = 100000;

struct CodecEntry {
  uint8_t codec;
  AVCodecID id;
};

const CodecEntry kCodecTable[] = {
    {kPSCodecMjpeg, AV_CODEC_ID_MJPEG},      {kPSCodecH263, AV_CODEC_ID_H263},
    {kPSCodecMpeg4, AV_CODEC_ID_MPEG4},      {kPSCodecH264, AV_CODEC_ID_H264},
    {kPSCodecH265, AV_CODEC_ID_HEVC},        {kPSCodecMulaw, AV_CODEC_ID_PCM_MULAW},
    {kPSCodecMsAdpcm, AV_CODEC_ID_ADPCM_MS}, {kPSCodecAac, AV_CODEC_ID_AAC},
    {kPSCodecG726, AV_CODEC_ID_ADPCM_G726},  {kPSCodecPcm16, AV_CODEC_ID_PCM_S16LE},
};

AVCodecID CodecIdFor(uint8_t codec) {
  for (const CodecEntry& entry : kCodecTable) {
    if (entry.codec == codec) return entry.id;
  }
  return AV_CODEC_ID_NONE;
}

bool IsVideoCodec(uint8_t codec) {
  return codec >= kPSCodecMjpeg && codec <= kPSCodecH265;
}

bool IsNalCodec(uint8_t codec) {
  return codec == kPSCodecH264 || codec == kPSCodecH265;
}

NalCodec NalCodecOf(uint8_t codec) {
  return codec == kPSCodecH265 ? NalCodec::kH265 : NalCodec::kH264;
}

uint32_t PixelsFromUnits(uint8_t units) {
  return units == 0 ? kZeroSizeUnitsPixels : units * 16u;
}

bool IsIsoMediaFormat(const AVOutputFormat* format) {
  return strcmp(format->name, "mov") == 0 || strcmp(format->name, "mp4") == 0;
}

}  // namespace

PSConvertAVCodecStream::PSConvertAVCodecStream(av_init& libs) : m_libs(libs) {}

PSConvertAVCodecStream::~PSConvertAVCodecStream() {
  Close();
  if (m_avPacket != nullptr && m_libs.av_packet_free != nullptr) m_libs.av_packet_free(&m_avPacket);
}

bool PSConvertAVCodecStream::Usable() const {
  return m_libs.AllLoaded();
}

int PSConvertAVCodecStream::Open(const PSFileHeader& header, const IPSConvertStreamInfo& info,
                                 const std::string& fileName) {
  Close();
  if (!Usable()) return kConvertOpenFailed;
  if (m_avPacket == nullptr) m_avPacket = m_libs.av_packet_alloc();
  m_context = m_libs.avformat_alloc_context();
  if (m_avPacket == nullptr || m_context == nullptr) {
    Release(false);
    return kConvertOpenFailed;
  }
  m_fileName = fileName;
  m_context->flags |= AVFMT_FLAG_BITEXACT;
  // The shared output format is read-only in current releases, so its
  // time-stamp strictness is left alone; packets here are strictly ordered.
  m_context->oformat = m_libs.av_guess_format(nullptr, fileName.c_str(), nullptr);
  if (m_context->oformat == nullptr || !CheckPrimaryCodec(header)) {
    Release(false);
    return kConvertOpenFailed;
  }
  m_context->url = m_libs.av_strdup(fileName.c_str());
  m_isAvi = strcmp(m_context->oformat->name, "avi") == 0;
  if (!CreateOutput(fileName)) {
    Release(false);
    return kConvertOpenFailed;
  }
  SetCreationTime();
  m_slots = {};
  m_heldBack.clear();
  m_headerWritten = false;
  m_headerFailed = false;
  if (!CreateStreams(info)) {
    Release(true);
    return kConvertOpenFailed;
  }
  ApplyStartTime(info);
  return 0;
}

bool PSConvertAVCodecStream::CheckPrimaryCodec(const PSFileHeader& header) {
  const AVOutputFormat* format = m_context->oformat;
  if (header.primaryCodec != kPSCodecNone) {
    const AVCodecID id = CodecIdFor(header.primaryCodec);
    if (id == AV_CODEC_ID_NONE) return false;
    if (m_libs.avformat_query_codec(format, id, FF_COMPLIANCE_NORMAL) != 1) return false;
  }
  if ((header.streamFlags & kPSHeaderMjpegStreams) != 0 &&
      m_libs.avformat_query_codec(format, AV_CODEC_ID_MJPEG, FF_COMPLIANCE_NORMAL) != 1) {
    return false;
  }
  return true;
}

bool PSConvertAVCodecStream::CreateOutput(const std::string& fileName) {
  if ((m_context->oformat->flags & AVFMT_NOFILE) != 0) return true;
  return m_libs.avio_open2(&m_context->pb, fileName.c_str(), AVIO_FLAG_WRITE, nullptr,
                           &m_formatOptions) >= 0;
}

void PSConvertAVCodecStream::SetCreationTime() {
  const std::string now = platform::FormatUtc(platform::WallSeconds(), kCreationTimeFormat);
  m_libs.av_dict_set(&m_context->metadata, "creation_time", now.c_str(), 0);
}

bool PSConvertAVCodecStream::CreateStreams(const IPSConvertStreamInfo& info) {
  for (uint32_t index = 0; index < kMaxConvertStreams; ++index) {
    PSStreamDescriptor descriptor;
    if (!info.GetStreamHeader(index, &descriptor)) break;
    if (!CreateStream(info, index, descriptor)) return false;
  }
  return true;
}

bool PSConvertAVCodecStream::CreateStream(const IPSConvertStreamInfo& info, uint32_t index,
                                          const PSStreamDescriptor& descriptor) {
  const AVCodecID id = CodecIdFor(descriptor.codec);
  if (id == AV_CODEC_ID_NONE) return true;  // a stream without codec is not written
  // Only video passes through; anything that would need re-encoding (or an
  // audio description the descriptor does not carry) fails here.
  if (!IsVideoCodec(descriptor.codec)) return false;
  if (m_libs.avformat_query_codec(m_context->oformat, id, FF_COMPLIANCE_NORMAL) != 1) return false;
  const double fps = info.GetFrameRate();
  if (!(fps > 0)) return false;
  AVStream* stream = m_libs.avformat_new_stream(m_context, nullptr);
  if (stream == nullptr) return false;
  m_libs.av_dict_set(&stream->metadata, "language", kStreamLanguage, 0);
  AVCodecParameters* parameters = stream->codecpar;
  parameters->codec_type = AVMEDIA_TYPE_VIDEO;
  parameters->codec_id = id;
  if (id == AV_CODEC_ID_HEVC && IsIsoMediaFormat(m_context->oformat)) {
    parameters->codec_tag = MKTAG('h', 'v', 'c', '1');
  }
  uint32_t width = PixelsFromUnits(descriptor.width16);
  uint32_t height = PixelsFromUnits(descriptor.height16);
  info.GetStreamSize(index, &width, &height);
  parameters->width = static_cast<int>(width);
  parameters->height = static_cast<int>(height);
  StreamSlot& slot = m_slots[index];
  slot.frameRate = m_libs.av_d2q(fps, kFrameRatePrecision);
  stream->avg_frame_rate = slot.frameRate;
  stream->r_frame_rate = slot.frameRate;
  stream->time_base = kStreamTimeBase;
  slot.stream = stream;
  slot.codec = descriptor.codec;
  slot.configured = !IsNalCodec(descriptor.codec) && descriptor.codec != kPSCodecMpeg4;
  return true;
}

void PSConvertAVCodecStream::ApplyStartTime(const IPSConvertStreamInfo& info) {
  const int64_t startMs = info.GetStartTime();
  if (startMs == 0) return;
  const int64_t startUs = startMs * 1000;
  if (m_context->start_time_realtime == AV_NOPTS_VALUE ||
      startUs < m_context->start_time_realtime) {
    m_context->start_time_realtime = startUs;
  }
}

int PSConvertAVCodecStream::WritePacket(const _PSFILE_PACKET& packet) {
  if (m_context == nullptr) return kConvertOpenFailed;
  if (packet.streamIndex >= kMaxConvertStreams) return 0;
  StreamSlot& slot = m_slots[packet.streamIndex];
  if (slot.stream == nullptr) return 0;
  if (m_headerWritten) return WriteToContainer(&slot, packet);
  if (m_headerFailed) return kConvertHeaderFailed;
  CollectConfiguration(&slot, packet);
  HoldBack(packet);
  return AllConfigured() ? WriteHeader() : 0;
}

void PSConvertAVCodecStream::CollectConfiguration(StreamSlot* slot, const _PSFILE_PACKET& packet) {
  if (slot->configured || packet.data == nullptr) return;
  if (slot->codec == kPSCodecMpeg4) {
    // The first picture's leading headers (VOS, VOL) configure the decoder.
    const size_t configSize = Mpeg4ConfigSize(packet.data, packet.size);
    slot->configured = configSize == 0 || SetExtradata(slot, packet.data, configSize);
    return;
  }
  const NalCodec codec = NalCodecOf(slot->codec);
  SplitNalUnits(packet.data, packet.size, &m_units);
  CollectParameterSets(m_units, codec, &slot->parameterSets);
  if (!slot->parameterSets.Complete(codec)) return;
  const std::vector<uint8_t> record = codec == NalCodec::kH264
                                          ? BuildAvcConfig(slot->parameterSets)
                                          : BuildHevcConfig(slot->parameterSets);
  slot->configured = !record.empty() && SetExtradata(slot, record.data(), record.size());
}

bool PSConvertAVCodecStream::SetExtradata(StreamSlot* slot, const uint8_t* data, size_t size) {
  AVCodecParameters* parameters = slot->stream->codecpar;
  if (parameters->extradata != nullptr) return true;
  auto* copy = static_cast<uint8_t*>(m_libs.av_mallocz(size + AV_INPUT_BUFFER_PADDING_SIZE));
  if (copy == nullptr) return false;
  memcpy(copy, data, size);
  parameters->extradata = copy;
  parameters->extradata_size = static_cast<int>(size);
  return true;
}

bool PSConvertAVCodecStream::AllConfigured() const {
  for (const StreamSlot& slot : m_slots) {
    if (slot.stream != nullptr && !slot.configured) return false;
  }
  return true;
}

void PSConvertAVCodecStream::HoldBack(const _PSFILE_PACKET& packet) {
  HeldPacket held;
  held.packet = packet;
  held.packet.data = nullptr;
  if (packet.data != nullptr) held.payload.assign(packet.data, packet.data + packet.size);
  m_heldBack.push_back(std::move(held));
}

int PSConvertAVCodecStream::WriteHeader() {
  if (m_context == nullptr || m_headerFailed) return kConvertHeaderFailed;
  if (m_headerWritten) return 0;
  m_libs.av_dict_set(&m_formatOptions, "use_editlist", "0", 0);
  for (const PSConvertOption& option : m_options) {
    m_libs.av_dict_set(&m_formatOptions, option.name.c_str(), option.value.c_str(), option.flags);
  }
  if (m_libs.avformat_write_header(m_context, &m_formatOptions) < 0) {
    // A container that failed its header is in no state to be asked again.
    m_headerFailed = true;
    m_heldBack.clear();
    return kConvertHeaderFailed;
  }
  m_headerWritten = true;
  return WriteHeldBack();
}

int PSConvertAVCodecStream::WriteHeldBack() {
  std::vector<HeldPacket> held;
  held.swap(m_heldBack);
  for (HeldPacket& entry : held) {
    entry.packet.data = entry.payload.data();
    const int result = WriteToContainer(&m_slots[entry.packet.streamIndex], entry.packet);
    if (result < 0) return result;
  }
  return 0;
}

int PSConvertAVCodecStream::WriteToContainer(StreamSlot* slot, const _PSFILE_PACKET& packet) {
  const int filled = FillPayload(*slot, packet);
  if (filled <= 0) return filled;  // nothing to write, or out of memory
  // Time counts frames at the stream's constant rate, whatever the
  // packets' own times say.
  const AVRational frame = av_inv_q(slot->frameRate);
  const AVRational timeBase = slot->stream->time_base;
  const int64_t pts = m_libs.av_rescale_q(slot->frameCounter, frame, timeBase);
  const int64_t next = m_libs.av_rescale_q(slot->frameCounter + 1, frame, timeBase);
  ++slot->frameCounter;
  m_avPacket->stream_index = slot->stream->index;
  m_avPacket->flags = packet.frameType == kPSKeyFrame ? AV_PKT_FLAG_KEY : 0;
  m_avPacket->pts = pts;
  m_avPacket->dts = pts;
  m_avPacket->duration = next - pts;
  return m_libs.av_interleaved_write_frame(m_context, m_avPacket);
}

int PSConvertAVCodecStream::FillPayload(const StreamSlot& slot, const _PSFILE_PACKET& packet) {
  m_libs.av_packet_unref(m_avPacket);
  if (packet.data == nullptr || packet.size == 0) return 0;
  if (!IsNalCodec(slot.codec)) {
    if (m_libs.av_new_packet(m_avPacket, static_cast<int>(packet.size)) < 0) {
      return AVERROR(ENOMEM);
    }
    memcpy(m_avPacket->data, packet.data, packet.size);
    return 1;
  }
  // The caller's bytes are shared with other clips and the stream's
  // history, so the new framing is built in the packet's own buffer.
  SplitNalUnits(packet.data, packet.size, &m_units);
  if (m_units.empty()) return 0;
  if (m_libs.av_new_packet(m_avPacket, static_cast<int>(PrefixedSize(m_units))) < 0) {
    return AVERROR(ENOMEM);
  }
  WritePrefixed(m_units, m_isAvi, m_avPacket->data);
  return 1;
}

int PSConvertAVCodecStream::Close() {
  if (m_context == nullptr) return 0;
  int result = kConvertHeaderFailed;
  if (m_headerWritten) result = m_libs.av_write_trailer(m_context);
  Release(result < 0);
  return result;
}

void PSConvertAVCodecStream::Release(bool removeFile) {
  if (m_context != nullptr) {
    const bool created = m_context->pb != nullptr;
    if (created) m_libs.avio_closep(&m_context->pb);
    m_libs.avformat_free_context(m_context);
    m_context = nullptr;
    // A file the container could not finish would reach the mail broken.
    if (removeFile && created) std::remove(m_fileName.c_str());
  }
  if (m_formatOptions != nullptr) m_libs.av_dict_free(&m_formatOptions);
  if (m_avPacket != nullptr) m_libs.av_packet_unref(m_avPacket);
  m_heldBack.clear();
  m_slots = {};
  m_headerWritten = false;
}

bool PSConvertAVCodecStream::CanWrite(const std::string& fileName) {
  return Usable() && m_libs.av_guess_format(nullptr, fileName.c_str(), nullptr) != nullptr;
}

void PSConvertAVCodecStream::SetOptions(const std::vector<PSConvertOption>& options) {
  m_options = options;
}

double PSConvertAVCodecStream::FrameRate(uint32_t index) {
  if (index >= kMaxConvertStreams || m_slots[index].stream == nullptr) return 0;
  const AVRational rate = m_slots[index].frameRate;
  return rate.num == 0 ? -1 : av_q2d(rate);
}

int64_t PSConvertAVCodecStream::FrameDuration(uint32_t index) {
  if (index >= kMaxConvertStreams || m_slots[index].stream == nullptr) return 0;
  const AVRational rate = m_slots[index].frameRate;
  if (rate.num == 0) return 0;
  return m_libs.av_rescale_q(1, av_inv_q(rate), kMilliseconds);
}

}  // namespace hx
