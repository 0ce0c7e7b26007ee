#include "alertmod/video/ps_convert_stream.h"

#include <gtest/gtest.h>

#include "alertmod/platform/testing/manual_env.h"
#include "alertmod/video/testing/clip_media.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace {

class OneVideoStream final : public IPSConvertStreamInfo {
 public:
  OneVideoStream(uint8_t codec, uint32_t width, uint32_t height, double fps)
      : m_codec(codec), m_width(width), m_height(height), m_fps(fps) {}
  bool GetStreamHeader(uint32_t index, PSStreamDescriptor* descriptor) const override {
    if (index != 0) return false;
    *descriptor = MakeStreamDescriptor(m_codec, m_width, m_height);
    return true;
  }
  int64_t GetStartTime() const override { return 0; }
  double GetFrameRate() const override { return m_fps; }

 private:
  uint8_t m_codec;
  uint32_t m_width;
  uint32_t m_height;
  double m_fps;
};

_PSFILE_PACKET Packet(const std::vector<uint8_t>& payload, bool key, int64_t timeMs,
                      uint16_t stream = 0) {
  _PSFILE_PACKET packet;
  packet.streamIndex = stream;
  packet.frameType = key ? kPSKeyFrame : 0;
  packet.size = static_cast<uint32_t>(payload.size());
  packet.data = payload.data();
  SetPacketTime(timeMs, &packet);
  return packet;
}

// `payload` without its H.264 parameter sets.
std::vector<uint8_t> WithoutParameterSets(const std::vector<uint8_t>& payload) {
  std::vector<NalUnit> units;
  SplitNalUnits(payload.data(), payload.size(), &units);
  std::vector<uint8_t> out;
  for (const NalUnit& unit : units) {
    const uint8_t type = unit.data[0] & 0x1F;
    if (type == 7 || type == 8) continue;
    out.insert(out.end(), {0, 0, 0, 1});
    out.insert(out.end(), unit.data, unit.data + unit.size);
  }
  return out;
}

class StreamMuxerTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_TRUE(cliptest::HaveFfmpegTools()) << "ffmpeg and ffprobe needed"; }
  testsupport::TempDir m_dir;
};

TEST_F(StreamMuxerTest, PacketsWaitForTheParameterSets) {
  const cliptest::MediaRecipe recipe{kCodecH264, 320, 240, 20, 10};
  std::vector<cliptest::MediaFrame> frames = cliptest::MakeFrames(recipe, m_dir.path());
  ASSERT_EQ(frames.size(), 20u);
  // Only the second key frame carries the parameter sets.
  frames[0].payload = WithoutParameterSets(frames[0].payload);
  PSConvertAVCodecStream muxer(*platform::SystemEnvForTests());
  const std::string path = m_dir.File("late.mov");
  ASSERT_EQ(muxer.Open(PSFileHeader(), OneVideoStream(kPSCodecH264, 320, 240, 25), path), 0);
  for (size_t i = 0; i < frames.size(); ++i) {
    ASSERT_GE(muxer.WritePacket(Packet(frames[i].payload, frames[i].key, 1000 + 40 * i)), 0) << i;
  }
  EXPECT_EQ(muxer.Close(), 0);
  EXPECT_EQ(cliptest::Probe(path).at("nb_read_packets"), "20");
  EXPECT_EQ(cliptest::DecodeErrors(path), "");
}

TEST_F(StreamMuxerTest, OpenFailsCleanly) {
  struct Case {
    const char* name;
    std::string file;
    uint8_t codec;
    uint8_t primaryCodec;
    uint8_t streamFlags;
  };
  const Case cases[] = {
      {"no container for the name", "clip.unknown", kPSCodecH264, kPSCodecNone, 0},
      {"directory missing", "missing/clip.mov", kPSCodecH264, kPSCodecNone, 0},
      {"container cannot store the stream", "clip.webm", kPSCodecH264, kPSCodecNone, 0},
      {"primary codec unknown", "clip.mov", kPSCodecH264, 200, 0},
      {"motion JPEG not storable", "clip.webm", kPSCodecH264, kPSCodecNone, kPSHeaderMjpegStreams},
      {"audio is not passed through", "clip.mov", kPSCodecPcm16, kPSCodecNone, 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    PSFileHeader header;
    header.primaryCodec = c.primaryCodec;
    header.streamFlags = c.streamFlags;
    PSConvertAVCodecStream muxer(*platform::SystemEnvForTests());
    const std::string path = m_dir.File(c.file);
    EXPECT_EQ(muxer.Open(header, OneVideoStream(c.codec, 320, 240, 25), path), kConvertOpenFailed);
    EXPECT_FALSE(testsupport::FileExists(path));
    EXPECT_EQ(muxer.WritePacket(Packet({0, 0, 1, 9}, true, 1000)), kConvertOpenFailed);
    EXPECT_EQ(muxer.Close(), 0);
  }
}

TEST_F(StreamMuxerTest, DescribesItsStreams) {
  PSConvertAVCodecStream muxer(*platform::SystemEnvForTests());
  EXPECT_TRUE(muxer.CanWrite("a.mp4"));
  EXPECT_TRUE(muxer.CanWrite("a.mov"));
  EXPECT_FALSE(muxer.CanWrite("a.unknown"));
  EXPECT_EQ(muxer.WriteHeader(), kConvertHeaderFailed);
  const std::string path = m_dir.File("empty.mp4");
  ASSERT_EQ(muxer.Open(PSFileHeader(), OneVideoStream(kPSCodecH265, 320, 240, 25), path), 0);
  EXPECT_DOUBLE_EQ(muxer.FrameRate(0), 25.0);
  EXPECT_EQ(muxer.FrameDuration(0), 40);
  EXPECT_EQ(muxer.FrameRate(1), 0);
  EXPECT_EQ(muxer.FrameDuration(1), 0);
  // Packets of streams that were not created are ignored.
  EXPECT_EQ(muxer.WritePacket(Packet({0, 0, 1, 0x40, 1}, true, 1000, 1)), 0);
  EXPECT_EQ(muxer.WritePacket(Packet({0, 0, 1, 0x40, 1}, true, 1000, 60)), 0);
  // Nothing was written, so the file cannot be finished and is not left.
  EXPECT_EQ(muxer.Close(), kConvertHeaderFailed);
  EXPECT_FALSE(testsupport::FileExists(path));
}

TEST_F(StreamMuxerTest, ARefusedHeaderIsNotRetried) {
  const cliptest::MediaRecipe recipe{kCodecH264, 320, 240, 3, 1};
  const std::vector<cliptest::MediaFrame> frames = cliptest::MakeFrames(recipe, m_dir.path());
  ASSERT_EQ(frames.size(), 3u);
  PSConvertAVCodecStream muxer(*platform::SystemEnvForTests());
  muxer.SetOptions({{"moov_size", "not a number", 0}});
  const std::string path = m_dir.File("refused.mov");
  ASSERT_EQ(muxer.Open(PSFileHeader(), OneVideoStream(kPSCodecH264, 320, 240, 25), path), 0);
  // The header waits until the first group of pictures is whole.
  EXPECT_EQ(muxer.WritePacket(Packet(frames[0].payload, true, 1000)), 0);
  EXPECT_EQ(muxer.WritePacket(Packet(frames[1].payload, true, 1040)), kConvertHeaderFailed);
  EXPECT_EQ(muxer.WritePacket(Packet(frames[2].payload, true, 1080)), kConvertHeaderFailed);
  EXPECT_EQ(muxer.WriteHeader(), kConvertHeaderFailed);
  EXPECT_EQ(muxer.Close(), kConvertHeaderFailed);
  EXPECT_FALSE(testsupport::FileExists(path));
}

TEST_F(StreamMuxerTest, AFileThatCannotBeFinishedIsRemoved) {
  const cliptest::MediaRecipe recipe{kCodecH264, 320, 240, 3, 1};
  const std::vector<cliptest::MediaFrame> frames = cliptest::MakeFrames(recipe, m_dir.path());
  ASSERT_EQ(frames.size(), 3u);
  PSConvertAVCodecStream muxer(*platform::SystemEnvForTests());
  // No room for the movie header, and no extent to raise it by.
  muxer.SetOptions({{"moov_size", "100", 0}});
  const std::string path = m_dir.File("unfinished.mov");
  ASSERT_EQ(muxer.Open(PSFileHeader(), OneVideoStream(kPSCodecH264, 320, 240, 25), path), 0);
  for (size_t i = 0; i < frames.size(); ++i) {
    ASSERT_EQ(muxer.WritePacket(Packet(frames[i].payload, true, 1000 + 40 * i)), 0) << i;
  }
  EXPECT_LT(muxer.Close(), 0);
  EXPECT_FALSE(testsupport::FileExists(path));
}

}  // namespace
}  // namespace hx
