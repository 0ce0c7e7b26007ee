// Test media for the clip writer's tests and benchmark: elementary streams
// made by the ffmpeg program, split into the frames a camera would send,
// wrapped in a host header and gathered into a finished capture; and
// ffprobe/ffmpeg checks of the files written.
//
// Every helper runs the real tools; a missing tool makes the calling test
// fail, never skip.
#ifndef ALERTMOD_VIDEO_TESTING_CLIP_MEDIA_H_
#define ALERTMOD_VIDEO_TESTING_CLIP_MEDIA_H_

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "alertmod/video/video_email_stream.h"

namespace cliptest {

// One camera frame: its payload bytes and whether it is a key frame.
struct MediaFrame {
  std::vector<uint8_t> payload;
  bool key = false;
};

struct MediaRecipe {
  uint32_t codec = hx::kCodecH264;  // host codec code: 4, 5 or 6
  uint32_t width = 1280;
  uint32_t height = 720;
  uint32_t frames = 25;
  uint32_t gop = 25;
  uint32_t bframes = 0;  // B-frames between references (H.264, H.265)
};

// Runs `command` through the shell; returns its standard output and error.
std::string RunCommand(const std::string& command, int* status);

// True when both ffmpeg and ffprobe run.
bool HaveFfmpegTools();

// Encodes a test pattern as a raw elementary stream into `directory` and
// splits it into frames. Empty on failure.
std::vector<MediaFrame> MakeFrames(const MediaRecipe& recipe, const std::string& directory);

// Splits a raw stream at its access unit delimiters (H.264, H.265) or
// pictures (MPEG-4 Part 2; headers go with the picture they precede).
std::vector<MediaFrame> SplitFrames(const std::vector<uint8_t>& stream, uint32_t codec);

// Frames as the host lends them: each payload behind `header`, kept alive by
// this object, gathered into one finished capture.
class HostClip {
 public:
  // Frame i arrives at startMs + i * intervalMs (unsigned 32-bit).
  HostClip(const MediaRecipe& recipe, const std::vector<MediaFrame>& frames,
           const std::string& header, uint32_t startMs, uint32_t intervalMs);
  // The same with one arrival time per frame.
  HostClip(const MediaRecipe& recipe, const std::vector<MediaFrame>& frames,
           const std::string& header, const std::vector<uint32_t>& arrivalMs);

  const hx::CVideoEmailStream& Stream() const { return *m_stream; }
  // The whole host buffer of frame `i`, header included.
  const std::vector<uint8_t>& Buffer(size_t i) const { return m_buffers[i]; }
  size_t HeaderSize() const { return m_headerSize; }
  // Makes frame `i` lose its buffer, as a frame the host took back.
  void ClearBuffer(size_t i) { m_holders[i]->Clear(); }

 private:
  std::vector<std::vector<uint8_t>> m_buffers;
  std::vector<std::shared_ptr<hx::FrameData>> m_holders;
  std::unique_ptr<hx::CVideoEmailStream> m_stream;
  size_t m_headerSize = 0;
};

// ffprobe's view of a written file: "codec_name", "width", "height",
// "nb_read_packets", "codec_tag_string", "r_frame_rate", "TAG:language" of
// the video stream and "TAG:creation_time" of the file.
std::map<std::string, std::string> Probe(const std::string& path);

// Presentation times of the video frames in the order the decoder returns
// them; empty when the file cannot be read.
std::vector<int64_t> FramePresentationTimes(const std::string& path);

// What `ffmpeg -v error` prints while decoding the whole file.
std::string DecodeErrors(const std::string& path);

// Byte offset of the first video packet in the file; -1 when unknown.
long FirstPacketOffset(const std::string& path);

std::vector<uint8_t> ReadBytes(const std::string& path);

// The bytes of the file's top-level "moov" box; empty when there is none.
std::vector<uint8_t> MoovBox(const std::vector<uint8_t>& file);

// True when the four-letter box type `type` occurs anywhere in `bytes`.
bool ContainsBoxType(const std::vector<uint8_t>& bytes, const char* type);

// The picture size that the first track header ("tkhd") in `moov` states,
// as "WIDTHxHEIGHT"; empty when there is none.
std::string TrackHeaderSize(const std::vector<uint8_t>& moov);

// Top-level boxes of an MP4/QuickTime file in order, as (type, offset).
std::vector<std::pair<std::string, uint64_t>> TopLevelBoxes(const std::vector<uint8_t>& bytes);

}  // namespace cliptest

#endif  // ALERTMOD_VIDEO_TESTING_CLIP_MEDIA_H_
