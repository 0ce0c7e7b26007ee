#include "alertmod/video/video_email_stream.h"

#include <gtest/gtest.h>

#include <memory>
#include <vector>

#include "alertmod/video/video_buffer.h"
#include "alertmod/video/video_test_util.h"

namespace {

using videotest::CountingReady;
using videotest::Format;

// First-frame arrival of every GOP, oldest first.
std::vector<uint32_t> GopStarts(const std::deque<hx::Gop>& gops) {
  std::vector<uint32_t> starts;
  for (const hx::Gop& gop : gops) starts.push_back(gop.frames.front().arrivalMs);
  return starts;
}

class CaptureTest : public videotest::VideoBufferTest {
 protected:
  // GOPs of `frames` frames each, `stepMs` apart, starting at `fromMs`.
  void FeedGops(int gops, int frames, uint32_t fromMs, uint32_t stepMs) {
    uint32_t at = fromMs;
    for (int g = 0; g < gops; ++g) {
      for (int f = 0; f < frames; ++f, at += stepMs) ASSERT_TRUE(Feed(f == 0, 100, at));
    }
  }
  std::shared_ptr<CountingReady> ready = std::make_shared<CountingReady>();
};

TEST_F(CaptureTest, AttachToAJpegStreamTakesTheNewestStillAndIsDoneAtOnce) {
  for (uint32_t i = 0; i < 30; ++i) ASSERT_TRUE(Feed(true, 100, 1000 + i * 100, Format(0)));
  EXPECT_EQ(hx::kMaxJpegStills, buffer.FindStream(kStream)->History().Gops().size());
  tick.Set(5000);
  auto capture = Attach(5, 10, ready);
  ASSERT_TRUE(capture);
  EXPECT_TRUE(capture->Done());
  EXPECT_EQ(1, ready->calls);
  EXPECT_EQ(std::vector<uint32_t>{3900}, GopStarts(capture->Gops()));
  EXPECT_EQ(1u, capture->FrameCount());
  // Done captures take nothing more and leave the stream at its next frame.
  EXPECT_TRUE(Feed(true, 100, 5100, Format(0)));
  EXPECT_EQ(1u, capture->FrameCount());
  EXPECT_TRUE(buffer.FindStream(kStream)->Attached().empty());
}

TEST_F(CaptureTest, NoDurationTakesTheTwoNewestGopsAndIsDoneAtOnce) {
  struct Case {
    int gops;
    std::vector<uint32_t> starts;
  } cases[] = {{1, {1000}}, {2, {1000, 1300}}, {4, {1600, 1900}}};
  for (const Case& c : cases) {
    SCOPED_TRACE(c.gops);
    buffer.RemoveStream(kStream);
    FeedGops(c.gops, 3, 1000, 100);
    auto done = std::make_shared<CountingReady>();
    auto capture = Attach(60, 0, done);
    ASSERT_TRUE(capture);
    EXPECT_TRUE(capture->Done());
    EXPECT_EQ(1, done->calls);
    EXPECT_EQ(c.starts, GopStarts(capture->Gops()));
  }
}

TEST_F(CaptureTest, PreTriggerWalkStagesGopsEndingWithinTheWindowAndStopsAtTheFirstOlder) {
  // GOPs [1000, 2000], [2500, 3000], [4000, 7000].
  const uint32_t frames[][2] = {{1000, 1}, {2000, 0}, {2500, 1}, {3000, 0}, {4000, 1}, {7000, 0}};
  for (const auto& f : frames) ASSERT_TRUE(Feed(f[1] == 1, 100, f[0]));
  struct Case {
    uint32_t triggerMs;
    std::vector<uint32_t> staged;
  } cases[] = {{8000, {2500}}, {8001, {}}, {7000, {1000, 2500}}, {7001, {2500}}};
  for (const Case& c : cases) {
    SCOPED_TRACE(c.triggerMs);
    tick.Set(c.triggerMs);
    auto capture = Attach(5, 60, nullptr);
    EXPECT_EQ(std::vector<uint32_t>{4000}, GopStarts(capture->Gops()));
    EXPECT_EQ(c.staged, GopStarts(capture->Staging().Gops()));
    EXPECT_FALSE(capture->Done());
  }
}

TEST_F(CaptureTest, FinishMovesStagedGopsThatFitTheDuration) {
  FeedGops(4, 10, 1000, 100);  // GOPs start at 1000, 2000, 3000, 4000
  tick.Set(5000);
  auto capture = Attach(10, 3, ready);
  EXPECT_EQ((std::vector<uint32_t>{1000, 2000, 3000}), GopStarts(capture->Staging().Gops()));
  capture->Finish();
  // Newest frame 4900: the GOP from 2000 still fits 3 s, the one from 1000 not.
  EXPECT_EQ((std::vector<uint32_t>{2000, 3000, 4000}), GopStarts(capture->Gops()));
  EXPECT_TRUE(capture->Staging().Empty());
  EXPECT_EQ(1, ready->calls);
  capture->Finish();
  EXPECT_EQ(1, ready->calls);
}

TEST_F(CaptureTest, StagedGopsJoinAsTimeAfterTheTriggerMatchesTheirDistance) {
  FeedGops(3, 10, 1000, 100);  // GOPs [1000..1900], [2000..2900], [3000..3900]
  tick.Set(4000);
  auto capture = Attach(5, 10, ready);
  ASSERT_EQ(2u, capture->Staging().Gops().size());
  struct Step {
    uint32_t atMs;
    size_t clipGops;
  } steps[] = {{4100, 1}, {5099, 1}, {5100, 2}, {6000, 2}, {6099, 2}, {6100, 3}, {7000, 3}};
  for (const Step& step : steps) {
    SCOPED_TRACE(step.atMs);
    ASSERT_TRUE(Feed(false, 100, step.atMs));
    EXPECT_EQ(step.clipGops, capture->Gops().size());
  }
  EXPECT_TRUE(capture->Staging().Empty());
  EXPECT_FALSE(capture->Done());
  EXPECT_EQ(0, ready->calls);
}

TEST_F(CaptureTest, AStagedGopThatNoLongerFitsDiscardsTheStaging) {
  FeedGops(3, 10, 1000, 100);
  tick.Set(4000);
  auto capture = Attach(5, 3, ready);
  ASSERT_TRUE(Feed(false, 100, 5100));  // 5100 - 2000 exceeds 3 s
  EXPECT_TRUE(capture->Staging().Empty());
  EXPECT_EQ(std::vector<uint32_t>{3000}, GopStarts(capture->Gops()));
  // The history still holds the discarded GOPs: nothing went back to the host.
  EXPECT_EQ(0u, host.Total());
}

// The clip's span may reach the limit exactly; a frame beyond it ends the
// capture without joining. Also across the wrap of the 32-bit tick.
TEST_F(CaptureTest, SpanExactlyAtTheLimitCompletesAndAFrameBeyondIsNotAdded) {
  struct Case {
    const char* what;
    uint32_t base;
    uint32_t lastOffset;
    bool doneAtLast;
  } cases[] = {
      {"exactly at the limit", 1000, 2000, true},
      {"exactly at the limit across the wrap", 0xFFFFFC18u, 2000, true},
      {"one below, then beyond", 1000, 1999, false},
      {"one below, then beyond, across the wrap", 0xFFFFFFFFu, 1999, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    buffer.RemoveStream(kStream);
    auto done = std::make_shared<CountingReady>();
    ASSERT_TRUE(Feed(true, 100, c.base));
    auto capture = Attach(0, 2, done);
    ASSERT_TRUE(Feed(false, 100, c.base + 500));
    ASSERT_TRUE(Feed(false, 100, c.base + c.lastOffset));
    EXPECT_EQ(c.doneAtLast, capture->Done());
    EXPECT_EQ(3u, capture->FrameCount());
    EXPECT_EQ(c.lastOffset, capture->LastFrameMs() - capture->FirstFrameMs());
    if (!c.doneAtLast) {
      EXPECT_TRUE(Feed(false, 100, c.base + 2001));  // the history keeps it
      EXPECT_TRUE(capture->Done());
      EXPECT_EQ(3u, capture->FrameCount());
    }
    EXPECT_EQ(1, done->calls);
  }
}

TEST_F(CaptureTest, ByteLimitEndsTheCapture) {
  buffer.SetMaxBytes(1000);
  ASSERT_TRUE(Feed(true, 400, 1000));
  auto capture = Attach(0, 60, ready);
  ASSERT_TRUE(Feed(false, 400, 1100));
  EXPECT_FALSE(capture->Done());
  ASSERT_TRUE(Feed(true, 300, 1200));  // history drops its GOP and keeps this one
  EXPECT_TRUE(capture->Done());
  EXPECT_EQ(800u, capture->ByteCount());
  EXPECT_EQ(1, ready->calls);
}

TEST_F(CaptureTest, FormatChangeCompletesCapturesAndRestartsTheHistory) {
  FeedGops(2, 5, 1000, 100);
  tick.Set(2500);
  auto first = Attach(10, 60, ready);
  auto secondReady = std::make_shared<CountingReady>();
  auto second = Attach(10, 60, secondReady);
  ASSERT_EQ(2u, buffer.FindStream(kStream)->Attached().size());

  const hx::StreamFormat formats[] = {Format(hx::kCodecH264, 1280, 480),
                                      Format(hx::kCodecH264, 1280, 720),
                                      Format(hx::kCodecH265, 1280, 720)};
  for (const hx::StreamFormat& format : formats) {
    ASSERT_TRUE(Feed(true, 100, tick.Get() + 100, format));
    const hx::GopBuffer& history = buffer.FindStream(kStream)->History();
    EXPECT_EQ(1u, history.Frames());
    EXPECT_EQ(format.width, history.Format().width);
    EXPECT_EQ(format.codec, history.Format().codec);
  }
  EXPECT_TRUE(first->Done());
  EXPECT_TRUE(second->Done());
  EXPECT_EQ(1, ready->calls);
  EXPECT_EQ(1, secondReady->calls);
  // Finishing drew the staged GOP into the clip; the new frame is in neither.
  EXPECT_EQ((std::vector<uint32_t>{1000, 1500}), GopStarts(first->Gops()));
  EXPECT_EQ(hx::kCodecH264, first->Codec());
  EXPECT_EQ(640u, first->Width());
  EXPECT_TRUE(buffer.FindStream(kStream)->Attached().empty());

  // The two leading words take part in no comparison.
  hx::StreamFormat same = formats[2];
  same.lead0 = 77;
  same.lead1 = 88;
  ASSERT_TRUE(Feed(false, 100, tick.Get() + 100, same));
  EXPECT_EQ(2u, buffer.FindStream(kStream)->History().Frames());
}

// Mended: with no picture yet, a dependent frame used to complete a capture
// that wants no duration, sending the notification without any picture.
TEST_F(CaptureTest, ACaptureOfAnEmptyHistoryWaitsForAKeyFrame) {
  ASSERT_FALSE(Feed(false, 100, 1000));  // the stream has a buffer, no GOP
  auto capture = Attach(5, 0, ready);
  ASSERT_TRUE(capture);
  EXPECT_FALSE(capture->Done());
  EXPECT_FALSE(Feed(false, 100, 1100));
  EXPECT_FALSE(capture->Done());
  EXPECT_EQ(0, ready->calls);
  EXPECT_TRUE(Feed(true, 100, 1200));
  EXPECT_TRUE(capture->Done());
  EXPECT_EQ(std::vector<uint32_t>{1200}, GopStarts(capture->Gops()));
  EXPECT_EQ(1, ready->calls);
}

TEST_F(CaptureTest, ATimedCaptureOfAnEmptyHistoryStartsAtTheNextKeyFrame) {
  ASSERT_FALSE(Feed(false, 100, 1000));
  auto capture = Attach(5, 1, ready);
  EXPECT_FALSE(Feed(false, 100, 1100));
  EXPECT_TRUE(Feed(true, 100, 1200));
  EXPECT_TRUE(Feed(false, 100, 2200));
  EXPECT_TRUE(capture->Done());
  EXPECT_EQ(2u, capture->FrameCount());
  EXPECT_EQ(1200u, capture->FirstFrameMs());
}

// Mended: a capture copied a history GOP that had skipped frames and then
// appended live frames behind the hole.
TEST_F(CaptureTest, ACaptureOfAHistoryWaitingForAKeyFrameWaitsToo) {
  buffer.SetMaxBytes(300);
  ASSERT_TRUE(Feed(true, 200, 1000));
  ASSERT_FALSE(Feed(false, 200, 1100));  // skipped: the open GOP is full
  buffer.SetMaxBytes(10000);
  tick.Set(1150);
  auto capture = Attach(0, 60, ready);
  EXPECT_TRUE(capture->Clip().WaitForKey());
  EXPECT_FALSE(Feed(false, 200, 1200));
  EXPECT_EQ(1u, capture->FrameCount());
  EXPECT_TRUE(Feed(true, 200, 1300));
  EXPECT_EQ(2u, capture->FrameCount());
  EXPECT_EQ((std::vector<uint32_t>{1000, 1300}), GopStarts(capture->Gops()));
}

TEST_F(CaptureTest, AHandBuiltCaptureCollectsFramesUntilItsDuration) {
  hx::CVideoEmailStream capture(Format(hx::kCodecH265, 320, 240), 1u << 20, 0, 1000, ready);
  EXPECT_EQ(0u, capture.FirstFrameMs());
  EXPECT_EQ(0u, capture.LastFrameMs());
  EXPECT_FALSE(capture.OfferFrame(videotest::LooseFrame(10, false, 5)));
  EXPECT_TRUE(capture.OfferFrame(videotest::LooseFrame(20, true, 5)));
  EXPECT_TRUE(capture.OfferFrame(videotest::LooseFrame(520, false, 5)));
  EXPECT_TRUE(capture.OfferFrame(videotest::LooseFrame(1020, true, 5)));
  EXPECT_TRUE(capture.Done());
  EXPECT_FALSE(capture.OfferFrame(videotest::LooseFrame(1030, false, 5)));
  EXPECT_EQ(3u, capture.FrameCount());
  EXPECT_EQ(15u, capture.ByteCount());
  EXPECT_EQ((std::vector<uint32_t>{20, 1020}), GopStarts(capture.Gops()));
  EXPECT_EQ(1, ready->calls);
}

}  // namespace
