#include "alertmod/video/clip_writer.h"

#include <gtest/gtest.h>

#include <string>

#include "alertmod/diag/log.h"
#include "alertmod/platform/testing/manual_env.h"
#include "alertmod/video/testing/clip_media.h"
#include "tests/support/fake_host.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace {

using cliptest::HostClip;
using cliptest::MediaFrame;
using cliptest::MediaRecipe;

// Put in front of every payload, as the host does with its frame header. Its
// binary fields may look like a start code, as this one does.
const std::string kHostHeader("HOSTFRAME\x00\x00\x01\x65HEADER-24B", 24);

class ClipWriterTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_TRUE(cliptest::HaveFfmpegTools()) << "ffmpeg and ffprobe needed"; }

  std::vector<MediaFrame> Frames(const MediaRecipe& recipe) {
    std::vector<MediaFrame> frames = cliptest::MakeFrames(recipe, m_dir.path());
    EXPECT_EQ(frames.size(), recipe.frames) << "test media could not be made";
    return frames;
  }

  bool Logged(uint32_t source, int32_t level, const std::string& text) {
    for (const testsupport::LogLine& line : m_host.Log().Lines()) {
      if (line.source == source && line.level == level && line.text == text) return true;
    }
    return false;
  }

  testsupport::TempDir m_dir;
  testsupport::FakeHost m_host;
  platform::ManualEnv m_env;
};

// The first bytes of `payload` as the container should hold them: for H.264
// and H.265 its first two NAL units, each behind a 4-byte length instead of
// its start code; for MPEG-4 Part 2 the bytes unchanged.
std::vector<uint8_t> ExpectedPacketStart(const std::vector<uint8_t>& payload, uint32_t codec) {
  if (codec == kCodecMpeg4) return std::vector<uint8_t>(payload.begin(), payload.begin() + 16);
  std::vector<size_t> starts;  // first byte after each start code
  for (size_t i = 0; i + 3 <= payload.size() && starts.size() < 3; ++i) {
    if (payload[i] == 0 && payload[i + 1] == 0 && payload[i + 2] == 1) starts.push_back(i + 3);
  }
  std::vector<uint8_t> expected;
  for (size_t n = 0; n < 2 && n + 1 < starts.size(); ++n) {
    size_t end = starts[n + 1] - 3;
    while (end > starts[n] && payload[end - 1] == 0) --end;
    const uint32_t length = static_cast<uint32_t>(end - starts[n]);
    for (int shift : {24, 16, 8, 0}) expected.push_back(static_cast<uint8_t>(length >> shift));
    expected.insert(expected.end(), payload.begin() + starts[n], payload.begin() + end);
  }
  return expected;
}

TEST_F(ClipWriterTest, ClipsPlayBackWithTheirStreamDescription) {
  struct Case {
    MediaRecipe recipe;
    const char* extension;
    const char* codecName;
  };
  const Case cases[] = {
      {{kCodecH264, 1920, 1080, 50, 25}, ".mov", "h264"},
      {{kCodecH264, 1280, 720, 50, 25}, ".mov", "h264"},
      {{kCodecH265, 1920, 1080, 50, 25}, ".mp4", "hevc"},
      {{kCodecH265, 1280, 720, 50, 25}, ".mp4", "hevc"},
      {{kCodecMpeg4, 1280, 720, 50, 25}, ".mov", "mpeg4"},
      {{kCodecH264, 1280, 720, 50, 25, 2}, ".mov", "h264"},
      {{kCodecH265, 1280, 720, 50, 25, 3}, ".mp4", "hevc"},
  };
  for (const Case& c : cases) {
    const std::string name = std::string(c.codecName) + std::to_string(c.recipe.height) + "b" +
                             std::to_string(c.recipe.bframes);
    SCOPED_TRACE(name);
    const std::vector<MediaFrame> frames = Frames(c.recipe);
    ASSERT_FALSE(frames.empty());
    HostClip clip(c.recipe, frames, kHostHeader, 5000, 40);
    std::vector<std::vector<uint8_t>> before;
    for (size_t i = 0; i < frames.size(); ++i) before.push_back(clip.Buffer(i));
    const std::string path = m_dir.File(name + c.extension);

    ASSERT_TRUE(WriteVideoAttachment(9, clip.Stream(), path, m_host.callback(), m_env));

    const auto probe = cliptest::Probe(path);
    EXPECT_EQ(probe.at("codec_name"), c.codecName);
    EXPECT_EQ(probe.at("width"), std::to_string(c.recipe.width));
    EXPECT_EQ(probe.at("height"), std::to_string(c.recipe.height));
    EXPECT_EQ(probe.at("nb_read_packets"), std::to_string(c.recipe.frames));
    // 50 frames over 1960 ms play at 51000 / 1960 = 26 frames per second.
    EXPECT_EQ(probe.at("r_frame_rate"), "26/1");
    if (c.recipe.codec == kCodecH265) {
      EXPECT_EQ(probe.at("codec_tag_string"), "hvc1");
    }
    EXPECT_EQ(probe.count("TAG:language") ? probe.at("TAG:language") : "", "eng");
    EXPECT_FALSE(probe.count("TAG:creation_time") == 0 || probe.at("TAG:creation_time").empty());
    EXPECT_EQ(cliptest::DecodeErrors(path), "");
    // Shown in display order, B-frames included.
    const std::vector<int64_t> shown = cliptest::FramePresentationTimes(path);
    EXPECT_EQ(shown.size(), frames.size());
    for (size_t i = 1; i < shown.size(); ++i) ASSERT_LT(shown[i - 1], shown[i]) << i;

    const std::vector<uint8_t> file = cliptest::ReadBytes(path);
    const std::vector<uint8_t> moov = cliptest::MoovBox(file);
    EXPECT_FALSE(cliptest::ContainsBoxType(moov, "elst"));
    // Exact, not rounded down to 16-pixel units (1080 would become 1072).
    EXPECT_EQ(cliptest::TrackHeaderSize(moov),
              std::to_string(c.recipe.width) + "x" + std::to_string(c.recipe.height));
    const auto boxes = cliptest::TopLevelBoxes(file);
    ASSERT_GE(boxes.size(), 3u);
    EXPECT_EQ(boxes[1].first, "moov");  // the reserved movie header comes first
    EXPECT_EQ(boxes.back().first, "mdat");
    EXPECT_GE(boxes.back().second, 16352u);

    // Only the payload reaches the file, and the host's buffers stay as lent.
    const long offset = cliptest::FirstPacketOffset(path);
    ASSERT_GT(offset, 0);
    const std::vector<uint8_t> expected = ExpectedPacketStart(frames[0].payload, c.recipe.codec);
    ASSERT_GE(expected.size(), 8u);
    ASSERT_GT(file.size(), offset + expected.size());
    EXPECT_EQ(std::vector<uint8_t>(file.begin() + offset, file.begin() + offset + expected.size()),
              expected);
    for (size_t i = 0; i < frames.size(); ++i) ASSERT_EQ(clip.Buffer(i), before[i]) << i;
  }
}

TEST_F(ClipWriterTest, FrameRateComesFromTheArrivalSpan) {
  struct Case {
    const char* name;
    std::vector<uint32_t> arrivals;
    const char* rate;
  };
  const Case cases[] = {
      {"one frame counts a span of 1 ms", {7000}, "2000/1"},
      {"two frames 100 ms apart", {7000, 7100}, "30/1"},
      {"sparse frames still play", {7000, 12000}, "1/1"},
  };
  const MediaRecipe recipe{kCodecH264, 320, 240, 2, 1};
  const std::vector<MediaFrame> frames = Frames(recipe);
  ASSERT_EQ(frames.size(), 2u);
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const std::vector<MediaFrame> used(frames.begin(), frames.begin() + c.arrivals.size());
    HostClip clip(recipe, used, kHostHeader, c.arrivals);
    const std::string path = m_dir.File("rate.mov");
    ASSERT_TRUE(WriteVideoAttachment(1, clip.Stream(), path, m_host.callback(), m_env));
    const auto probe = cliptest::Probe(path);
    EXPECT_EQ(probe.at("r_frame_rate"), c.rate);
    EXPECT_EQ(probe.at("nb_read_packets"), std::to_string(c.arrivals.size()));
    EXPECT_EQ(cliptest::DecodeErrors(path), "");
  }
}

TEST_F(ClipWriterTest, LateKeyFramesAreLoggedAndWritten) {
  const MediaRecipe recipe{kCodecH264, 320, 240, 15, 5};
  const std::vector<MediaFrame> frames = Frames(recipe);
  ASSERT_EQ(frames.size(), 15u);
  // Key frames at 0, 5 and 10; the one at 5 comes exactly 1500 ms late, the
  // one at 10 comes 1640 ms late.
  std::vector<uint32_t> arrivals;
  uint32_t now = 10000;
  for (size_t i = 0; i < frames.size(); ++i) {
    now += i == 5 ? 1500 : i == 10 ? 1640 : 40;
    arrivals.push_back(now);
  }
  HostClip clip(recipe, frames, kHostHeader, arrivals);
  const std::string path = m_dir.File("gap.mov");
  ASSERT_TRUE(WriteVideoAttachment(4, clip.Stream(), path, m_host.callback(), m_env));

  EXPECT_TRUE(Logged(core::kClipWriterLogSource, LogLevelError,
                     "Existing at full_ts - m_activeClip->LastFrame gap is 1640"));
  EXPECT_FALSE(Logged(core::kClipWriterLogSource, LogLevelError,
                      "Existing at full_ts - m_activeClip->LastFrame gap is 1500"));
  EXPECT_EQ(cliptest::Probe(path).at("nb_read_packets"), "15");
}

TEST_F(ClipWriterTest, ArrivalTicksThatWrapKeepTheWholeClip) {
  const MediaRecipe recipe{kCodecH264, 320, 240, 25, 25};
  const std::vector<MediaFrame> frames = Frames(recipe);
  // The eleventh frame arrives at tick 0 exactly.
  HostClip clip(recipe, frames, kHostHeader, 0u - 400u, 40);
  const std::string path = m_dir.File("wrap.mov");
  ASSERT_TRUE(WriteVideoAttachment(2, clip.Stream(), path, m_host.callback(), m_env));
  EXPECT_EQ(cliptest::Probe(path).at("nb_read_packets"), "25");
  EXPECT_EQ(cliptest::DecodeErrors(path), "");
}

TEST_F(ClipWriterTest, CodecsWithoutAContainerAreRefused) {
  for (uint32_t codec : {kCodecJpeg, 3u, 7u}) {
    SCOPED_TRACE(codec);
    MediaRecipe recipe{codec, 320, 240, 1, 1};
    HostClip clip(recipe, {MediaFrame{{1, 2, 3}, true}}, kHostHeader, 100, 40);
    const std::string path = m_dir.File("refused.mov");
    EXPECT_FALSE(WriteVideoAttachment(2, clip.Stream(), path, m_host.callback(), m_env));
    EXPECT_FALSE(testsupport::FileExists(path));
  }
  EXPECT_TRUE(Logged(core::kModuleId, LogLevelWarning, "Invalid codec type received."));
}

TEST_F(ClipWriterTest, FilesThatCannotBeStartedAreLogged) {
  const MediaRecipe recipe{kCodecH264, 320, 240, 10, 5};
  const std::vector<MediaFrame> frames = Frames(recipe);
  HostClip clip(recipe, frames, kHostHeader, 100, 40);
  for (const std::string& path : {m_dir.File("missing/clip.mov"), m_dir.File("clip.unknown")}) {
    SCOPED_TRACE(path);
    EXPECT_TRUE(WriteVideoAttachment(12, clip.Stream(), path, m_host.callback(), m_env));
    EXPECT_FALSE(testsupport::FileExists(path));
  }
  // One line per key frame: each retries the open.
  size_t lines = 0;
  for (const testsupport::LogLine& line : m_host.Log().Lines()) {
    if (line.source == core::kClipWriterLogSource && line.level == LogLevelError &&
        line.text == "failed to start mp4/mov file for 12: -1") {
      ++lines;
    }
  }
  EXPECT_EQ(lines, 4u);
}

TEST_F(ClipWriterTest, LongClipsKeepEveryFrame) {
  // 30 frames and one key frame a second, few bytes a frame. The movie
  // header of 10 s fits the 16352 bytes always reserved for it, and its file
  // stays as it always was; that of 3 minutes needs more.
  struct Case {
    uint32_t seconds;
    const char* sha256;  // null: any content
  };
  const Case cases[] = {{10, "933ca41a31b1bebf0fbe946e6fc47f96ef58fe93add8871a826243800ed2874c"},
                        {180, nullptr}};
  m_env.Reset(0, 1700000000);
  for (const Case& c : cases) {
    SCOPED_TRACE(c.seconds);
    const MediaRecipe recipe{kCodecH264, 64, 64, c.seconds * 30, 30};
    HostClip clip(recipe, Frames(recipe), kHostHeader, 100, 33);
    const std::string path = m_dir.File("long.mov");
    EXPECT_TRUE(WriteVideoAttachment(5, clip.Stream(), path, m_host.callback(), m_env));
    EXPECT_EQ(cliptest::Probe(path)["nb_read_packets"], std::to_string(recipe.frames));
    EXPECT_EQ(cliptest::DecodeErrors(path), "");
    if (c.sha256 != nullptr) {
      EXPECT_EQ(cliptest::RunCommand("sha256sum '" + path + "'", nullptr).substr(0, 64), c.sha256);
    }
  }
}

TEST_F(ClipWriterTest, JpegStillIsThePayloadOfTheFirstFrame) {
  const std::string source = m_dir.File("still.jpg");
  int status = -1;
  cliptest::RunCommand("ffmpeg -v error -y -f lavfi -i testsrc2=size=320x240 -frames:v 1 " + source,
                       &status);
  ASSERT_EQ(status, 0);
  const std::vector<uint8_t> still = cliptest::ReadBytes(source);
  MediaRecipe recipe{kCodecJpeg, 320, 240, 2, 1};
  HostClip clip(recipe, {MediaFrame{still, true}, MediaFrame{{9, 9, 9}, true}}, kHostHeader, 100,
                40);
  const std::string path = m_dir.File("attachment.jpg");
  ASSERT_TRUE(WriteJpegAttachment(clip.Stream(), path, m_env));
  EXPECT_EQ(cliptest::ReadBytes(path), still);
  EXPECT_EQ(cliptest::Probe(path).at("codec_name"), "mjpeg");
}

TEST_F(ClipWriterTest, JpegStillFailures) {
  MediaRecipe recipe{kCodecJpeg, 320, 240, 1, 1};
  const std::vector<uint8_t> still = {0xFF, 0xD8, 0xFF, 0xD9};
  HostClip empty(recipe, {}, kHostHeader, 100, 40);
  HostClip good(recipe, {MediaFrame{still, true}}, kHostHeader, 100, 40);
  HostClip headerOnly(recipe, {MediaFrame{{}, true}}, kHostHeader, 100, 40);
  HostClip taken(recipe, {MediaFrame{still, true}}, kHostHeader, 100, 40);
  taken.ClearBuffer(0);
  struct Case {
    const char* name;
    const HostClip& clip;
    std::string path;
  };
  const Case cases[] = {
      {"empty clip", empty, m_dir.File("a.jpg")},
      {"empty path", good, ""},
      {"buffer taken back", taken, m_dir.File("b.jpg")},
      {"no payload", headerOnly, m_dir.File("c.jpg")},
      {"directory missing", good, m_dir.File("missing/d.jpg")},
      {"disk full", good, "/dev/full"},
  };
  for (const Case& c : cases) {
    EXPECT_FALSE(WriteJpegAttachment(c.clip.Stream(), c.path, m_env)) << c.name;
  }
}

}  // namespace
}  // namespace hx
