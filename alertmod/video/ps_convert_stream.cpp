#include "alertmod/video/ps_convert_stream.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <numeric>

#include "alertmod/platform/utc_time.h"
#include "alertmod/video/movie_header.h"

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
constexpr const char* kMovieHeaderOption = "moov_size";
// The H.264 and H.265 framing written in place of start codes never takes
// more than twice the bytes of the stream as received.
constexpr uint64_t kStoredBytesPerPayloadByte = 2;

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

// Each frame's rank in display order. Frames without a known picture order
// keep the group in decoding order.
template <typename Frame>
std::vector<int64_t> DisplayRanks(const std::vector<Frame>& gop, int unknown) {
  std::vector<size_t> byOrder(gop.size());
  std::iota(byOrder.begin(), byOrder.end(), 0);
  const bool known = std::none_of(gop.begin(), gop.end(),
                                  [unknown](const Frame& frame) { return frame.order == unknown; });
  if (known) {
    std::stable_sort(byOrder.begin(), byOrder.end(),
                     [&gop](size_t a, size_t b) { return gop[a].order < gop[b].order; });
  }
  std::vector<int64_t> ranks(gop.size());
  for (size_t rank = 0; rank < byOrder.size(); ++rank) ranks[byOrder[rank]] = rank;
  return ranks;
}

}  // namespace

PSConvertAVCodecStream::PSConvertAVCodecStream(platform::Env& env, av_init& libs)
    : m_env(env), m_libs(libs) {}

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
  const std::string now = platform::FormatUtc(m_env.WallSeconds(), kCreationTimeFormat);
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
  slot.extentKnown = info.GetStreamExtent(index, &slot.extent);
  if (IsNalCodec(descriptor.codec)) CreateParser(&slot, id);
  return true;
}

void PSConvertAVCodecStream::CreateParser(StreamSlot* slot, AVCodecID id) {
  // Without a parser the frames keep their decoding order, as a stream
  // without B-frames needs.
  slot->parser = m_libs.av_parser_init(id);
  slot->parserCodec = m_libs.avcodec_alloc_context3(nullptr);
  if (slot->parser != nullptr) slot->parser->flags |= PARSER_FLAG_COMPLETE_FRAMES;
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
  if (m_headerFailed) return kConvertHeaderFailed;
  const int order = PictureOrder(&slot, packet);
  if (m_headerWritten) return WriteToContainer(&slot, packet, order);
  CollectConfiguration(&slot, packet);
  NoteFirstGop(&slot, packet, order);
  HoldBack(packet, order);
  return ReadyForHeader() ? WriteHeader() : 0;
}

int PSConvertAVCodecStream::PictureOrder(StreamSlot* slot, const _PSFILE_PACKET& packet) {
  if (slot->parser == nullptr || slot->parserCodec == nullptr || packet.data == nullptr ||
      packet.size == 0) {
    return kNoPictureOrder;
  }
  // The parser's bit reader may look past the end by up to the padding, and
  // the caller's bytes end where the frame does.
  m_parserInput.assign(packet.data, packet.data + packet.size);
  m_parserInput.resize(packet.size + AV_INPUT_BUFFER_PADDING_SIZE, 0);
  slot->parser->output_picture_number = kNoPictureOrder;
  uint8_t* out = nullptr;
  int outSize = 0;
  m_libs.av_parser_parse2(slot->parser, slot->parserCodec, &out, &outSize, m_parserInput.data(),
                          static_cast<int>(packet.size), AV_NOPTS_VALUE, AV_NOPTS_VALUE, 0);
  return outSize > 0 ? slot->parser->output_picture_number : kNoPictureOrder;
}

void PSConvertAVCodecStream::NoteFirstGop(StreamSlot* slot, const _PSFILE_PACKET& packet,
                                          int order) {
  if (packet.frameType == kPSKeyFrame && ++slot->keyFramesSeen > 1) return;
  if (slot->keyFramesSeen != 1 || order == kNoPictureOrder) return;
  if (packet.frameType != kPSKeyFrame && order < slot->highestOrder) slot->reorders = true;
  slot->highestOrder =
      packet.frameType == kPSKeyFrame ? order : std::max(slot->highestOrder, order);
}

bool PSConvertAVCodecStream::ReadyForHeader() const {
  if (!AllConfigured()) return false;
  // The movie header's room depends on whether frames are reordered, which
  // the first group of pictures shows.
  for (const StreamSlot& slot : m_slots) {
    if (slot.parser != nullptr && slot.keyFramesSeen < 2) return false;
  }
  return true;
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

void PSConvertAVCodecStream::HoldBack(const _PSFILE_PACKET& packet, int order) {
  HeldPacket held;
  held.order = order;
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
    const std::string value =
        option.name == kMovieHeaderOption ? MovieHeaderSize(option.value) : option.value;
    m_libs.av_dict_set(&m_formatOptions, option.name.c_str(), value.c_str(), option.flags);
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

std::string PSConvertAVCodecStream::MovieHeaderSize(const std::string& requested) const {
  char* end = nullptr;
  const long long asked = strtoll(requested.c_str(), &end, 10);
  if (end == requested.c_str() || *end != '\0') return requested;  // the container judges it
  uint64_t needed = 0;
  for (const StreamSlot& slot : m_slots) {
    if (slot.stream == nullptr || !slot.extentKnown) continue;
    MovieTrackShape track;
    track.samples = slot.extent.frames;
    track.keyFrames = slot.extent.keyFrames;
    track.mediaBytes = slot.extent.bytes * kStoredBytesPerPayloadByte;
    track.configBytes = static_cast<uint64_t>(slot.stream->codecpar->extradata_size);
    // One frame lasts tick.den * den / (tick.num * num) ticks.
    const AVRational tick = slot.stream->time_base;
    const int64_t divisor = int64_t{tick.num} * slot.frameRate.num;
    track.evenFrameDuration =
        divisor != 0 && (int64_t{tick.den} * slot.frameRate.den) % divisor == 0;
    track.reordered = slot.reorders;
    needed += MovieHeaderBound(track);
  }
  // A header that fits keeps the room asked for, so such files stay as
  // they always were.
  if (asked >= 0 && needed <= static_cast<uint64_t>(asked)) return requested;
  return std::to_string(needed);
}

int PSConvertAVCodecStream::WriteHeldBack() {
  std::vector<HeldPacket> held;
  held.swap(m_heldBack);
  for (HeldPacket& entry : held) {
    entry.packet.data = entry.payload.data();
    const int result =
        WriteToContainer(&m_slots[entry.packet.streamIndex], entry.packet, entry.order);
    if (result < 0) return result;
  }
  return 0;
}

int PSConvertAVCodecStream::WriteToContainer(StreamSlot* slot, const _PSFILE_PACKET& packet,
                                             int order) {
  const bool key = packet.frameType == kPSKeyFrame;
  if (slot->parser == nullptr) {
    const int filled = FillPayload(packet.data, packet.size);
    if (filled <= 0) return filled;  // nothing to write, or out of memory
    return Mux(slot, key, slot->frameCounter);
  }
  if (key) {
    const int result = WriteGop(slot);
    if (result < 0) return result;
  }
  if (packet.data == nullptr) return 0;
  SplitNalUnits(packet.data, packet.size, &m_units);
  if (m_units.empty()) return 0;
  GopFrame frame;
  frame.key = key;
  frame.order = order;
  frame.data.resize(PrefixedSize(m_units));
  WritePrefixed(m_units, m_isAvi, frame.data.data());
  slot->gop.push_back(std::move(frame));
  return 0;
}

int PSConvertAVCodecStream::WriteGop(StreamSlot* slot) {
  std::vector<GopFrame> gop;
  gop.swap(slot->gop);
  const std::vector<int64_t> ranks = DisplayRanks(gop, kNoPictureOrder);
  // A frame shown before frames decoded ahead of it makes presentation trail
  // decoding by that many frames from here on; the depth never shrinks, so
  // that presentation times keep rising from one group to the next.
  for (size_t i = 0; i < gop.size(); ++i) {
    slot->reorderDepth = std::max(slot->reorderDepth, static_cast<int64_t>(i) - ranks[i]);
  }
  const int64_t first = slot->frameCounter;
  for (size_t i = 0; i < gop.size(); ++i) {
    const int filled = FillPayload(gop[i].data.data(), gop[i].data.size());
    if (filled < 0) return filled;
    const int result = Mux(slot, gop[i].key, first + ranks[i] + slot->reorderDepth);
    if (result < 0) return result;
  }
  return 0;
}

int PSConvertAVCodecStream::Mux(StreamSlot* slot, bool key, int64_t presentation) {
  // Time counts frames at the stream's constant rate, whatever the
  // packets' own times say.
  const AVRational frame = av_inv_q(slot->frameRate);
  const AVRational timeBase = slot->stream->time_base;
  const int64_t dts = m_libs.av_rescale_q(slot->frameCounter, frame, timeBase);
  const int64_t next = m_libs.av_rescale_q(slot->frameCounter + 1, frame, timeBase);
  ++slot->frameCounter;
  m_avPacket->stream_index = slot->stream->index;
  m_avPacket->flags = key ? AV_PKT_FLAG_KEY : 0;
  m_avPacket->pts = m_libs.av_rescale_q(presentation, frame, timeBase);
  m_avPacket->dts = dts;
  m_avPacket->duration = next - dts;
  return m_libs.av_interleaved_write_frame(m_context, m_avPacket);
}

int PSConvertAVCodecStream::FillPayload(const uint8_t* data, size_t size) {
  m_libs.av_packet_unref(m_avPacket);
  if (data == nullptr || size == 0) return 0;
  if (m_libs.av_new_packet(m_avPacket, static_cast<int>(size)) < 0) return AVERROR(ENOMEM);
  memcpy(m_avPacket->data, data, size);
  return 1;
}

int PSConvertAVCodecStream::Close() {
  if (m_context == nullptr) return 0;
  int result = kConvertHeaderFailed;
  if (m_headerWritten) {
    // A failed write leaves the frames before it, as a stop of the caller does.
    for (StreamSlot& slot : m_slots) {
      if (slot.stream != nullptr) WriteGop(&slot);
    }
    result = m_libs.av_write_trailer(m_context);
  }
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
  ReleaseParsers();
  m_slots = {};
  m_headerWritten = false;
}

void PSConvertAVCodecStream::ReleaseParsers() {
  for (StreamSlot& slot : m_slots) {
    if (slot.parser != nullptr) m_libs.av_parser_close(slot.parser);
    if (slot.parserCodec != nullptr) m_libs.avcodec_free_context(&slot.parserCodec);
    slot.parser = nullptr;
  }
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
