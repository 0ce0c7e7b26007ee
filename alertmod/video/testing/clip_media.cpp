#include "alertmod/video/testing/clip_media.h"

#include <cstdio>
#include <fstream>
#include <iterator>
#include <sstream>

namespace cliptest {
namespace {

constexpr uint8_t kH264Aud = 9;
constexpr uint8_t kH264Idr = 5;
constexpr uint8_t kH265Aud = 35;
constexpr uint8_t kH265FirstIrap = 16;
constexpr uint8_t kH265LastIrap = 21;
constexpr uint8_t kMpeg4Vop = 0xB6;

// Offsets of every 00 00 01 in `bytes`.
std::vector<size_t> StartCodes(const std::vector<uint8_t>& bytes) {
  std::vector<size_t> codes;
  for (size_t i = 0; i + 3 < bytes.size(); ++i) {
    if (bytes[i] == 0 && bytes[i + 1] == 0 && bytes[i + 2] == 1) codes.push_back(i);
  }
  return codes;
}

uint8_t NalType(uint8_t header, uint32_t codec) {
  return codec == hx::kCodecH265 ? (header >> 1) & 0x3F : header & 0x1F;
}

bool IsKeyNal(uint8_t type, uint32_t codec) {
  if (codec == hx::kCodecH265) return type >= kH265FirstIrap && type <= kH265LastIrap;
  return type == kH264Idr;
}

std::vector<MediaFrame> SplitAtDelimiters(const std::vector<uint8_t>& stream, uint32_t codec) {
  const uint8_t aud = codec == hx::kCodecH265 ? kH265Aud : kH264Aud;
  std::vector<MediaFrame> frames;
  size_t frameStart = 0;
  bool key = false;
  for (size_t code : StartCodes(stream)) {
    const uint8_t type = NalType(stream[code + 3], codec);
    if (type == aud) {
      // A zero before the start code makes it a four-byte one.
      const size_t begin = (code > 0 && stream[code - 1] == 0) ? code - 1 : code;
      if (begin > frameStart) {
        frames.push_back({{stream.begin() + frameStart, stream.begin() + begin}, key});
      }
      frameStart = begin;
      key = false;
    }
    key = key || IsKeyNal(type, codec);
  }
  if (frameStart < stream.size())
    frames.push_back({{stream.begin() + frameStart, stream.end()}, key});
  return frames;
}

std::vector<MediaFrame> SplitAtPictures(const std::vector<uint8_t>& stream) {
  std::vector<MediaFrame> frames;
  size_t frameStart = 0;
  bool afterPicture = false;
  bool key = false;
  for (size_t code : StartCodes(stream)) {
    if (afterPicture) {
      frames.push_back({{stream.begin() + frameStart, stream.begin() + code}, key});
      frameStart = code;
      afterPicture = false;
    }
    if (stream[code + 3] == kMpeg4Vop) {
      afterPicture = true;
      key = code + 4 < stream.size() && (stream[code + 4] >> 6) == 0;
    }
  }
  if (frameStart < stream.size())
    frames.push_back({{stream.begin() + frameStart, stream.end()}, key});
  return frames;
}

std::string EncoderArguments(const MediaRecipe& recipe) {
  const std::string gop = std::to_string(recipe.gop);
  const std::string bframes = std::to_string(recipe.bframes);
  switch (recipe.codec) {
    case hx::kCodecH265:
      return "-c:v libx265 -preset ultrafast -x265-params aud=1:keyint=" + gop +
             ":min-keyint=" + gop + ":bframes=" + bframes + ":log-level=error -f hevc";
    case hx::kCodecMpeg4:
      return "-c:v mpeg4 -g " + gop + " -bf 0 -q:v 5 -f m4v";
    default:
      return "-c:v libx264 -preset ultrafast -g " + gop + " -bf " + bframes +
             " -x264-params aud=1 -f h264";
  }
}

}  // namespace

std::string RunCommand(const std::string& command, int* status) {
  std::string output;
  FILE* pipe = popen((command + " 2>&1").c_str(), "r");
  if (pipe == nullptr) {
    if (status != nullptr) *status = -1;
    return output;
  }
  char buffer[4096];
  size_t got = 0;
  while ((got = fread(buffer, 1, sizeof(buffer), pipe)) > 0) output.append(buffer, got);
  const int result = pclose(pipe);
  if (status != nullptr) *status = result;
  return output;
}

bool HaveFfmpegTools() {
  int ffmpegStatus = -1;
  int ffprobeStatus = -1;
  RunCommand("ffmpeg -version", &ffmpegStatus);
  RunCommand("ffprobe -version", &ffprobeStatus);
  return ffmpegStatus == 0 && ffprobeStatus == 0;
}

std::vector<MediaFrame> MakeFrames(const MediaRecipe& recipe, const std::string& directory) {
  const std::string output = directory + "/source.es";
  std::ostringstream command;
  command << "ffmpeg -v error -y -f lavfi -i testsrc2=size=" << recipe.width << "x" << recipe.height
          << ":rate=25 -frames:v " << recipe.frames << " -pix_fmt yuv420p "
          << EncoderArguments(recipe) << " " << output;
  int status = -1;
  RunCommand(command.str(), &status);
  if (status != 0) return {};
  return SplitFrames(ReadBytes(output), recipe.codec);
}

std::vector<MediaFrame> SplitFrames(const std::vector<uint8_t>& stream, uint32_t codec) {
  return codec == hx::kCodecMpeg4 ? SplitAtPictures(stream) : SplitAtDelimiters(stream, codec);
}

HostClip::HostClip(const MediaRecipe& recipe, const std::vector<MediaFrame>& frames,
                   const std::string& header, uint32_t startMs, uint32_t intervalMs)
    : HostClip(recipe, frames, header, [&] {
        std::vector<uint32_t> times;
        for (size_t i = 0; i < frames.size(); ++i) {
          times.push_back(startMs + static_cast<uint32_t>(i) * intervalMs);
        }
        return times;
      }()) {}

HostClip::HostClip(const MediaRecipe& recipe, const std::vector<MediaFrame>& frames,
                   const std::string& header, const std::vector<uint32_t>& arrivalMs)
    : m_headerSize(header.size()) {
  hx::StreamFormat format;
  format.width = recipe.width;
  format.height = recipe.height;
  format.codec = recipe.codec;
  const uint32_t trigger = arrivalMs.empty() ? 0 : arrivalMs.front();
  // Limits far beyond any test clip, so that every frame offered is kept.
  m_stream = std::make_unique<hx::CVideoEmailStream>(format, uint64_t{1} << 40, trigger,
                                                     0xFFFFFFFFu, nullptr);
  m_buffers.reserve(frames.size());
  for (size_t i = 0; i < frames.size(); ++i) {
    std::vector<uint8_t> buffer(header.begin(), header.end());
    buffer.insert(buffer.end(), frames[i].payload.begin(), frames[i].payload.end());
    m_buffers.push_back(std::move(buffer));
    auto holder = hx::MakeFrameData(nullptr, m_buffers.back().data(),
                                    static_cast<uint32_t>(m_buffers.back().size()));
    m_holders.push_back(holder);
    hx::VideoFrame frame;
    frame.arrivalMs = arrivalMs[i];
    frame.frameType = frames[i].key ? hx::kKeyFrameType : 0;
    frame.payloadOffset = static_cast<uint32_t>(header.size());
    frame.data = holder;
    m_stream->OfferFrame(frame);
  }
  m_stream->Finish();
}

std::map<std::string, std::string> Probe(const std::string& path) {
  const std::string command =
      "ffprobe -v error -count_packets -select_streams v:0 -show_entries "
      "stream=codec_name,width,height,nb_read_packets,codec_tag_string,r_frame_rate:"
      "stream_tags=language:format_tags=creation_time -of default=noprint_wrappers=1 '" +
      path + "'";
  std::map<std::string, std::string> values;
  std::istringstream lines(RunCommand(command, nullptr));
  std::string line;
  while (std::getline(lines, line)) {
    const size_t equals = line.find('=');
    if (equals != std::string::npos) values[line.substr(0, equals)] = line.substr(equals + 1);
  }
  return values;
}

std::vector<int64_t> FramePresentationTimes(const std::string& path) {
  std::istringstream lines(RunCommand(
      "ffprobe -v error -select_streams v:0 -show_entries frame=pts -of csv=p=0 '" + path + "'",
      nullptr));
  std::vector<int64_t> times;
  std::string line;
  while (std::getline(lines, line)) {
    char* end = nullptr;
    const long long pts = strtoll(line.c_str(), &end, 10);
    if (end != line.c_str()) times.push_back(pts);  // "N/A" and messages are left out
  }
  return times;
}

std::string DecodeErrors(const std::string& path) {
  int status = -1;
  std::string output = RunCommand("ffmpeg -v error -i '" + path + "' -f null -", &status);
  if (status != 0) output += "\n(ffmpeg exit status " + std::to_string(status) + ")";
  return output;
}

long FirstPacketOffset(const std::string& path) {
  const std::string command =
      "ffprobe -v error -select_streams v:0 -show_entries packet=pos -read_intervals '%+#1' "
      "-of csv=p=0 '" +
      path + "'";
  try {
    return std::stol(RunCommand(command, nullptr));
  } catch (const std::exception&) {
    return -1;
  }
}

std::vector<uint8_t> ReadBytes(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return std::vector<uint8_t>(std::istreambuf_iterator<char>(file),
                              std::istreambuf_iterator<char>());
}

std::vector<uint8_t> MoovBox(const std::vector<uint8_t>& file) {
  const auto boxes = TopLevelBoxes(file);
  for (size_t i = 0; i < boxes.size(); ++i) {
    if (boxes[i].first != "moov") continue;
    const uint64_t end = i + 1 < boxes.size() ? boxes[i + 1].second : file.size();
    return std::vector<uint8_t>(file.begin() + boxes[i].second, file.begin() + end);
  }
  return {};
}

bool ContainsBoxType(const std::vector<uint8_t>& bytes, const char* type) {
  const std::string needle(type, 4);
  return std::string(bytes.begin(), bytes.end()).find(needle) != std::string::npos;
}

std::string TrackHeaderSize(const std::vector<uint8_t>& moov) {
  const std::string bytes(moov.begin(), moov.end());
  const size_t type = bytes.find("tkhd");
  if (type == std::string::npos || type < 4) return "";
  auto u32 = [&](size_t at) {
    return (uint32_t{moov[at]} << 24) | (uint32_t{moov[at + 1]} << 16) |
           (uint32_t{moov[at + 2]} << 8) | moov[at + 3];
  };
  const size_t end = type - 4 + u32(type - 4);
  if (end > moov.size() || end < type + 8) return "";
  // The box ends with width and height as 16.16 fixed-point numbers.
  return std::to_string(u32(end - 8) >> 16) + "x" + std::to_string(u32(end - 4) >> 16);
}

std::vector<std::pair<std::string, uint64_t>> TopLevelBoxes(const std::vector<uint8_t>& bytes) {
  std::vector<std::pair<std::string, uint64_t>> boxes;
  uint64_t offset = 0;
  while (offset + 8 <= bytes.size()) {
    const uint64_t size = (uint64_t{bytes[offset]} << 24) | (uint64_t{bytes[offset + 1]} << 16) |
                          (uint64_t{bytes[offset + 2]} << 8) | bytes[offset + 3];
    boxes.emplace_back(std::string(bytes.begin() + offset + 4, bytes.begin() + offset + 8), offset);
    if (size < 8) break;
    offset += size;
  }
  return boxes;
}

}  // namespace cliptest
