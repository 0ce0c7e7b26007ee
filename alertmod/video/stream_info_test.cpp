#include "alertmod/video/stream_info.h"

#include <gtest/gtest.h>
#include <stdlib.h>

#include "alertmod/diag/log.h"
#include "alertmod/platform/testing/manual_env.h"
#include "alertmod/video/testing/clip_media.h"
#include "tests/support/fake_host.h"
#include "tests/support/temp_dir.h"

namespace videomake {
namespace {

class StreamInfoTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_TRUE(cliptest::HaveFfmpegTools()) << "ffmpeg and ffprobe needed";
    // Every frame a key frame, so that any frame may end a clip.
    m_frames = cliptest::MakeFrames({hx::kCodecH264, 320, 240, 6, 1}, m_dir.path());
    ASSERT_EQ(m_frames.size(), 6u);
  }

  bool Write(CStreamInfo& info, size_t frame, int64_t timeMs, uint32_t frameType) {
    const std::vector<uint8_t>& payload = m_frames[frame].payload;
    return info.WriteFrame(payload.data(), static_cast<uint32_t>(payload.size()), timeMs, 0,
                           frameType);
  }

  testsupport::TempDir m_dir;
  testsupport::FakeHost m_host;
  hx::platform::ManualEnv m_env;
  std::vector<cliptest::MediaFrame> m_frames;
};

TEST_F(StreamInfoTest, DescribesOneStream) {
  struct Case {
    uint8_t codec;
    uint8_t stored;
  };
  for (const Case c : {Case{5, 133}, Case{6, 134}, Case{132, 132}, Case{255, 255}}) {
    CStreamInfo info(1, c.codec, 1920, 1080, 25, "x.mov", 1000, nullptr, m_env);
    hx::PSStreamDescriptor descriptor;
    descriptor.unused = 0x5A;
    ASSERT_TRUE(info.GetStreamHeader(0, &descriptor));
    EXPECT_EQ(descriptor.codec, c.stored);
    EXPECT_EQ(descriptor.unused, 0x5A);
    EXPECT_EQ(descriptor.width16, 120);
    EXPECT_EQ(descriptor.height16, 67);
    EXPECT_FALSE(info.GetStreamHeader(1, &descriptor));
    EXPECT_EQ(info.GetStartTime(), 0);
    EXPECT_DOUBLE_EQ(info.GetFrameRate(), 25.0);
  }
}

TEST_F(StreamInfoTest, FeedingFollowsKeyFramesAndTheSpan) {
  const std::string path = m_dir.File("span.mov");
  CStreamInfo info(3, 5, 320, 240, 25, path.c_str(), 1000, m_host.callback(), m_env);
  EXPECT_FALSE(Write(info, 1, 900, 0));  // nothing before the first key frame
  EXPECT_TRUE(Write(info, 0, 1000, 1));  // opens the file
  EXPECT_TRUE(Write(info, 1, 1400, 0));
  EXPECT_FALSE(Write(info, 2, 0, 0));     // no time
  EXPECT_TRUE(Write(info, 3, 2000, 1));   // exactly the span
  EXPECT_FALSE(Write(info, 4, 2001, 1));  // beyond it: the clip is complete
  info.Close();
  EXPECT_EQ(cliptest::Probe(path).at("nb_read_packets"), "3");
  EXPECT_EQ(cliptest::DecodeErrors(path), "");
}

TEST_F(StreamInfoTest, WithoutPathTheTemporaryDirectoryIsTheName) {
  ASSERT_EQ(setenv("TMPDIR", m_dir.path().c_str(), 1), 0);
  CStreamInfo info(3, 5, 320, 240, 25, nullptr, 1000, m_host.callback(), m_env);
  EXPECT_EQ(info.Path(), m_dir.path() + "/");
  // A directory names no container: the open fails and is logged, and the
  // caller is still asked for frames until the next key frame retries.
  EXPECT_TRUE(Write(info, 0, 1000, 1));
  EXPECT_TRUE(Write(info, 1, 1040, 0));
  info.Close();
  EXPECT_EQ(m_host.LogTexts(hx::LogLevelError),
            std::vector<std::string>{"failed to start mp4/mov file for 3: -1"});
}

}  // namespace
}  // namespace videomake
