#include "alertmod/video/gop_buffer.h"

#include <gtest/gtest.h>

#include <vector>

#include "alertmod/video/video_test_util.h"

namespace {

using videotest::Format;
using videotest::LooseFrame;

struct PushStep {
  const char* what;
  bool key;
  uint32_t size;
  bool accepted;
  size_t gops;
  uint64_t bytes;
  bool waitForKey;
};

void RunSteps(hx::GopBuffer& buffer, const std::vector<PushStep>& steps) {
  uint32_t arrival = 1000;
  for (const PushStep& step : steps) {
    SCOPED_TRACE(step.what);
    EXPECT_EQ(step.accepted, buffer.Push(LooseFrame(arrival += 40, step.key, step.size)));
    EXPECT_EQ(step.gops, buffer.Gops().size());
    EXPECT_EQ(step.bytes, buffer.Bytes());
    EXPECT_EQ(step.waitForKey, buffer.WaitForKey());
    uint64_t frames = 0;
    for (const hx::Gop& gop : buffer.Gops()) {
      ASSERT_FALSE(gop.frames.empty());
      EXPECT_TRUE(gop.frames.front().IsKey());
      frames += gop.frames.size();
    }
    EXPECT_EQ(frames, buffer.Frames());
  }
}

TEST(GopBufferTest, KeyFramesOpenGopsAndAHeadlessGopWaitsForTheNextKey) {
  hx::GopBuffer buffer(Format(hx::kCodecH264), 1000);
  RunSteps(buffer, {
                       {"dependent before any key frame", false, 100, false, 0, 0, false},
                       {"first key frame opens a GOP", true, 300, true, 1, 300, false},
                       {"dependent joins it", false, 300, true, 1, 600, false},
                       {"dependent fills to the limit", false, 400, true, 1, 1000, false},
                       {"one open GOP at the limit", false, 1, false, 1, 1000, true},
                       {"waits for a key even if small", false, 0, false, 1, 1000, true},
                       {"key frame replaces the history", true, 500, true, 1, 500, false},
                       {"dependent joins the new GOP", false, 100, true, 1, 600, false},
                       {"second GOP", true, 200, true, 2, 800, false},
                       {"oldest GOP dropped for room", false, 300, true, 1, 500, false},
                   });
}

TEST(GopBufferTest, AFrameLargerThanTheLimitIsRefusedAfterEmptyingTheBuffer) {
  hx::GopBuffer buffer(Format(hx::kCodecH264), 1000);
  RunSteps(buffer,
           {
               {"key", true, 400, true, 1, 400, false},
               {"key", true, 400, true, 2, 800, false},
               {"oversized dependent: drops to the open GOP", false, 2000, false, 1, 400, true},
               {"oversized key: nothing left", true, 2000, false, 0, 0, false},
               {"dependent: no GOP to join", false, 10, false, 0, 0, false},
               {"key fits again", true, 1000, true, 1, 1000, false},
           });
}

TEST(GopBufferTest, JpegHistoryHoldsTheNewestTwentyStills) {
  hx::GopBuffer buffer(Format(hx::kCodecJpeg), 1u << 30);
  for (uint32_t i = 1; i <= 25; ++i) {
    ASSERT_TRUE(buffer.Push(LooseFrame(i * 100, true, 10)));
    EXPECT_EQ(std::min<size_t>(i, hx::kMaxJpegStills), buffer.Gops().size());
  }
  EXPECT_EQ(600u, buffer.FirstArrivalMs());
  EXPECT_EQ(2500u, buffer.LastArrivalMs());
  EXPECT_EQ(200u, buffer.Bytes());

  // A video stream has no such cap.
  hx::GopBuffer video(Format(hx::kCodecH265), 1u << 30);
  for (uint32_t i = 1; i <= 25; ++i) ASSERT_TRUE(video.Push(LooseFrame(i, true, 10)));
  EXPECT_EQ(25u, video.Gops().size());
}

}  // namespace
