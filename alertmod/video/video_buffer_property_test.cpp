// A long random run of several streams with captures attached, finished and
// dropped at random, checking the buffer's bounds after every frame and the
// host's buffer accounting at the end.
#include <gtest/gtest.h>

#include <memory>
#include <random>
#include <vector>

#include "alertmod/video/video_buffer.h"
#include "alertmod/video/video_test_util.h"

namespace {

using videotest::CountingReady;

constexpr uint64_t kLimit = 64 * 1024;
constexpr int kSteps = 200000;

struct Camera {
  int32_t id;
  hx::StreamFormat format;
  int framesToKey = 0;
};

struct Capture {
  std::shared_ptr<hx::CVideoEmailStream> stream;
  std::shared_ptr<CountingReady> ready;
  uint32_t spanAtAttach = 0;
};

// Arrival order within a buffer: each frame no earlier than the one before.
void CheckGops(const hx::GopBuffer& buffer) {
  uint64_t bytes = 0;
  uint64_t frames = 0;
  const uint32_t first = buffer.FirstArrivalMs();
  uint32_t previous = 0;
  for (const hx::Gop& gop : buffer.Gops()) {
    ASSERT_FALSE(gop.frames.empty());
    ASSERT_TRUE(gop.frames.front().IsKey());
    uint64_t gopBytes = 0;
    for (const hx::VideoFrame& frame : gop.frames) {
      const uint32_t sinceFirst = frame.arrivalMs - first;
      ASSERT_GE(sinceFirst, previous);
      previous = sinceFirst;
      gopBytes += frame.Size();
    }
    ASSERT_EQ(gopBytes, gop.bytes);
    bytes += gop.bytes;
    frames += gop.frames.size();
  }
  ASSERT_EQ(bytes, buffer.Bytes());
  ASSERT_EQ(frames, buffer.Frames());
}

void CheckHistories(const hx::VideoBuffer& buffer) {
  std::vector<int32_t> ids;
  buffer.StreamIds(&ids);
  for (int32_t id : ids) {
    const hx::GopBuffer& history = buffer.FindStream(id)->History();
    ASSERT_LE(history.Bytes(), kLimit);
    if (history.Format().codec == hx::kCodecJpeg) {
      ASSERT_LE(history.Gops().size(), hx::kMaxJpegStills);
    }
    CheckGops(history);
  }
}

void CheckCapture(const Capture& capture) {
  const hx::CVideoEmailStream& stream = *capture.stream;
  CheckGops(stream.Clip());
  CheckGops(stream.Staging());
  ASSERT_LE(stream.ByteCount(), kLimit);
  ASSERT_EQ(stream.Done() ? 1 : 0, capture.ready->calls);
  const bool timed = stream.Codec() != hx::kCodecJpeg && stream.MaxDurationMs() > 0;
  if (timed) {
    // A GOP is never cut, so the newest one at attach may exceed the span.
    ASSERT_LE(stream.Clip().SpanMs(), std::max(stream.MaxDurationMs(), capture.spanAtAttach));
  }
}

class PropertyRun {
 public:
  PropertyRun() : m_random(20240611u) {
    m_cameras = {{1, videotest::Format(hx::kCodecH264)},
                 {2, videotest::Format(hx::kCodecH265, 1920, 1080)},
                 {-5, videotest::Format(hx::kCodecMpeg4, 352, 288)},
                 {40, videotest::Format(hx::kCodecJpeg)}};
  }

  void Run() {
    // Starts shortly before the tick wraps so that the run crosses it.
    const uint32_t start = 0xFFFFFFFFu - 400000u;
    m_tick.Set(start);
    for (int step = 0; step < kSteps; ++step) {
      FeedOneFrame();
      Act();
      CheckHistories(*m_buffer);
      for (const Capture& capture : m_captures) CheckCapture(capture);
      if (::testing::Test::HasFatalFailure()) return;
    }
    // The run must have crossed the tick's wrap and exercised the captures.
    EXPECT_LT(m_tick.Get(), start / 2);
    EXPECT_GT(m_attached, 1000);
    EXPECT_GT(m_grownClips, 50);
    m_captures.clear();
    m_buffer.reset();
    CheckReleases();
  }

 private:
  uint32_t Below(uint32_t bound) { return static_cast<uint32_t>(m_random() % bound); }

  void FeedOneFrame() {
    m_tick.Advance(Below(40));
    Camera& camera = m_cameras[Below(static_cast<uint32_t>(m_cameras.size()))];
    if (Below(3000) == 0) camera.format.width ^= 16;  // a format change
    bool key = camera.format.codec == hx::kCodecJpeg || camera.framesToKey-- <= 0;
    if (key && camera.format.codec != hx::kCodecJpeg) camera.framesToKey = 1 + Below(40);
    if (Below(100) == 0) key = !key;
    uint32_t size = key ? 2000 + Below(8000) : 100 + Below(900);
    if (Below(2000) == 0) size = kLimit + 1;
    const uint64_t sequence = m_kept.size();
    const bool kept = m_buffer->AddFrame(camera.id, key ? hx::kKeyFrameType : 0, 16,
                                         videotest::FakeBuffer(sequence), size, camera.format);
    m_kept.push_back(kept);
  }

  void Act() {
    if (Below(150) == 0) AttachOne();
    if (!m_captures.empty() && Below(100) == 0) {
      m_captures[Below(static_cast<uint32_t>(m_captures.size()))].stream->Finish();
    }
    if (!m_captures.empty() && Below(60) == 0) {
      const size_t index = Below(static_cast<uint32_t>(m_captures.size()));
      const hx::CVideoEmailStream& stream = *m_captures[index].stream;
      if (stream.Done()) {
        // Pre-trigger GOPs or later GOPs joined the GOP taken at attach.
        if (stream.Gops().size() > 2) ++m_grownClips;
        m_captures.erase(m_captures.begin() + index);
      }
    }
    if (Below(20000) == 0) m_buffer->RemoveStream(m_cameras[Below(4)].id);
  }

  void AttachOne() {
    Capture capture;
    capture.ready = std::make_shared<CountingReady>();
    const uint32_t now = m_tick.Get();
    const int32_t pre = static_cast<int32_t>(Below(9)) - 1;
    const int32_t duration = static_cast<int32_t>(Below(7)) - 1;
    capture.stream = m_buffer->AttachEmailStream(m_cameras[Below(4)].id, pre, duration, now / 1000,
                                                 static_cast<uint16_t>(now % 1000), capture.ready);
    if (!capture.stream) return;
    capture.spanAtAttach = capture.stream->Clip().SpanMs();
    ++m_attached;
    m_captures.push_back(std::move(capture));
  }

  void CheckReleases() {
    uint64_t keptCount = 0;
    for (uint64_t i = 0; i < m_kept.size(); ++i) {
      ASSERT_EQ(m_kept[i] ? 1 : 0, m_host.Releases(videotest::FakeBuffer(i))) << "frame " << i;
      if (m_kept[i]) ++keptCount;
    }
    EXPECT_EQ(keptCount, m_host.Total());
    EXPECT_GT(keptCount, m_kept.size() / 2);
    EXPECT_LT(keptCount, m_kept.size());
  }

  videotest::ReleaseCountingHost m_host;
  videotest::TestTick m_tick;
  std::mt19937 m_random;
  std::unique_ptr<hx::VideoBuffer> m_buffer =
      std::make_unique<hx::VideoBuffer>(m_host.callback(), m_tick, kLimit);
  std::vector<Camera> m_cameras;
  std::vector<Capture> m_captures;
  std::vector<bool> m_kept;
  int m_attached = 0;
  int m_grownClips = 0;
};

TEST(VideoBufferPropertyTest, RandomStreamsStayBoundedAndReleaseEveryKeptFrameOnce) {
  PropertyRun run;
  run.Run();
}

}  // namespace
