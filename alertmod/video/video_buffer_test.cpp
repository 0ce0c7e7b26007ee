#include "alertmod/video/video_buffer.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "alertmod/diag/log.h"
#include "alertmod/video/video_test_util.h"

namespace {

using videotest::CountingReady;
using videotest::FakeBuffer;
using videotest::Format;

class BufferTest : public videotest::VideoBufferTest {};

TEST_F(BufferTest, ARefusedFrameIsNeverReleasedAndAKeptOneExactlyOnceByItsLastHolder) {
  buffer.SetMaxBytes(1000);
  ASSERT_FALSE(Feed(false, 100, 1000));  // no key frame yet
  const void* refused = lastBuffer;
  ASSERT_TRUE(Feed(true, 500, 1100));
  const void* first = lastBuffer;
  ASSERT_TRUE(Feed(false, 400, 1200));
  const void* second = lastBuffer;
  auto capture = Attach(0, 60, nullptr);  // shares the GOP
  ASSERT_TRUE(capture);
  ASSERT_TRUE(Feed(true, 600, 1300));  // the history drops the old GOP
  EXPECT_TRUE(capture->Done());        // full: the frame could not join
  EXPECT_EQ(0, host.Releases(first));  // the capture still holds it
  EXPECT_EQ(0u, host.Total());
  capture.reset();
  EXPECT_EQ(1, host.Releases(first));
  EXPECT_EQ(1, host.Releases(second));
  ASSERT_TRUE(Feed(true, 500, 1400));
  EXPECT_EQ(3u, host.Total());
  buffer.RemoveStream(kStream);
  EXPECT_EQ(0, host.Releases(refused));
  EXPECT_EQ(4u, host.Total());
  for (const auto& entry : host.All()) EXPECT_EQ(1, entry.second);
  EXPECT_EQ(0u, host.Malformed());
}

TEST(FrameDataTest, WithoutHostOrAfterClearNothingIsSent) {
  videotest::ReleaseCountingHost host;
  { auto loose = hx::MakeFrameData(nullptr, FakeBuffer(1), 10); }
  {
    auto cleared = hx::MakeFrameData(host.callback(), FakeBuffer(2), 10);
    cleared->Clear();
    EXPECT_EQ(nullptr, cleared->Data());
    EXPECT_EQ(10u, cleared->Size());
  }
  { auto empty = hx::MakeFrameData(host.callback(), nullptr, 0); }
  EXPECT_EQ(0u, host.Total());
  { auto sent = hx::MakeFrameData(host.callback(), FakeBuffer(3), 10); }
  EXPECT_EQ(1, host.Releases(FakeBuffer(3)));
}

// Mended: a payload offset beyond the buffer made every reader of the frame
// (the still writer above all) read outside the host's buffer, and an empty
// payload ended its clip there, losing every later frame.
TEST_F(BufferTest, MalformedFramesAreRefusedWithOneWarningPerStream) {
  struct Case {
    const char* what;
    const void* data;
    uint32_t size;
    uint32_t payloadOffset;
    bool kept;
  } cases[] = {
      {"offset beyond the length", FakeBuffer(1), 100, 101, false},
      {"largest offset", FakeBuffer(2), 100, 0xFFFFFFFFu, false},
      {"no data", nullptr, 100, 0, false},
      {"no length", FakeBuffer(3), 0, 0, false},
      {"empty payload", FakeBuffer(4), 100, 100, false},
      {"offset inside", FakeBuffer(5), 100, 32, true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    EXPECT_EQ(c.kept, buffer.AddFrame(3, hx::kKeyFrameType, c.payloadOffset, c.data, c.size,
                                      Format(hx::kCodecH264)));
  }
  EXPECT_FALSE(buffer.AddFrame(4, hx::kKeyFrameType, 9, FakeBuffer(6), 8, Format(5)));
  EXPECT_EQ(nullptr, buffer.FindStream(4));
  auto warnings = host.host().LogTexts(hx::LogLevelWarning);
  ASSERT_EQ(2u, warnings.size());
  EXPECT_EQ("Refused a malformed video frame of stream 3 (length 100, payload offset 101)",
            warnings[0]);
  EXPECT_EQ("Refused a malformed video frame of stream 4 (length 8, payload offset 9)",
            warnings[1]);
  const hx::Gop& gop = buffer.FindStream(3)->History().Gops().back();
  EXPECT_EQ(32u, gop.frames.back().payloadOffset);
  buffer.RemoveStream(3);
  EXPECT_EQ(1u, host.Total());
}

TEST_F(BufferTest, AttachingToAStreamWithoutBufferLogsAndAttachesNothing) {
  auto ready = std::make_shared<CountingReady>();
  EXPECT_EQ(nullptr, Attach(5, 10, ready, 42));
  EXPECT_EQ(nullptr, Attach(5, 10, ready, -3));
  EXPECT_EQ(0, ready->calls);
  EXPECT_EQ((std::vector<std::string>{
                "Unable to locate corresponding video frame for channel/stream id 42 to attach to "
                "this notification profile",
                "Unable to locate corresponding video frame for channel/stream id -3 to attach to "
                "this notification profile"}),
            host.host().LogTexts(hx::LogLevelWarning));
}

TEST_F(BufferTest, TriggerIsComposedFromSecondsAndMillisecondsAndNegativeLimitsCountAsNone) {
  ASSERT_TRUE(Feed(true, 100, 1000));
  auto capture = buffer.AttachEmailStream(kStream, -5, -1, 12, 345, nullptr);
  ASSERT_TRUE(capture);
  EXPECT_EQ(12345u, capture->TriggerMs());
  EXPECT_EQ(0u, capture->MaxDurationMs());
  EXPECT_TRUE(capture->Done());
  auto wide = buffer.AttachEmailStream(kStream, 0, 0x7FFFFFFF, 4294967, 295, nullptr);
  EXPECT_EQ(0xFFFFFFFFu, wide->TriggerMs());
  EXPECT_EQ(0xFFFFFFFFu, wide->MaxDurationMs());
}

TEST_F(BufferTest, SetMaxBytesLimitsHistoriesButNotAttachedCaptures) {
  ASSERT_TRUE(Feed(true, 100, 1000));
  auto capture = Attach(0, 60, nullptr);
  buffer.SetMaxBytes(250);
  EXPECT_EQ(250u, buffer.MaxBytes());
  EXPECT_EQ(250u, buffer.FindStream(kStream)->History().MaxBytes());
  EXPECT_EQ(kLimit, capture->Clip().MaxBytes());
  ASSERT_TRUE(Feed(false, 100, 1100));
  EXPECT_TRUE(Feed(false, 100, 1200));  // the capture takes what the history cannot
  EXPECT_TRUE(buffer.FindStream(kStream)->History().WaitForKey());
  EXPECT_EQ(3u, capture->FrameCount());
  ASSERT_TRUE(Feed(true, 100, 1300, Format(hx::kCodecH264), 8));
  EXPECT_EQ(250u, buffer.FindStream(8)->History().MaxBytes());
}

TEST_F(BufferTest, RemoveStreamReleasesItsFramesAndFinishesItsCaptures) {
  for (int32_t id : {9, -4, 7, 0}) ASSERT_TRUE(Feed(true, 100, 1000, Format(5), id));
  ASSERT_TRUE(Feed(false, 100, 1100, Format(5), 7));
  std::vector<int32_t> ids{99};
  buffer.StreamIds(&ids);
  EXPECT_EQ((std::vector<int32_t>{99, -4, 0, 7, 9}), ids);

  auto ready = std::make_shared<CountingReady>();
  auto capture = Attach(10, 60, ready, 7);
  ASSERT_FALSE(capture->Done());
  buffer.RemoveStream(7);
  buffer.RemoveStream(1234);
  EXPECT_TRUE(capture->Done());
  EXPECT_EQ(1, ready->calls);
  EXPECT_EQ(0u, host.Total());  // the capture still holds the frames
  capture.reset();
  EXPECT_EQ(2u, host.Total());
  ids.clear();
  buffer.StreamIds(&ids);
  EXPECT_EQ((std::vector<int32_t>{-4, 0, 9}), ids);
  buffer.StreamIds(nullptr);
}

TEST_F(BufferTest, ACompletionFiresOnceAlthoughTheCaptureIsFinishedAgain) {
  ASSERT_TRUE(Feed(true, 100, 1000));
  auto ready = std::make_shared<CountingReady>();
  auto capture = Attach(0, 1, ready);
  ASSERT_TRUE(Feed(false, 100, 2000));
  EXPECT_TRUE(capture->Done());
  capture->Finish();
  buffer.RemoveStream(kStream);
  EXPECT_EQ(1, ready->calls);
  // Released after firing: the capture no longer holds the notifier.
  EXPECT_EQ(1, ready.use_count());
}

}  // namespace
