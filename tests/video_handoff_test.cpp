// Captures finished on the host thread are read and dropped on another
// thread, as the worker does with a notification's clips, while the host
// thread goes on feeding frames that share buffers with them. Every kept
// buffer must still go back to the host exactly once.
#include <gtest/gtest.h>

#include <condition_variable>
#include <deque>
#include <memory>
#include <mutex>
#include <random>
#include <thread>
#include <vector>

#include "alertmod/video/video_buffer.h"
#include "alertmod/video/video_test_util.h"

namespace {

using CapturePtr = std::shared_ptr<hx::CVideoEmailStream>;

// The worker's side: takes finished captures, reads every frame, drops them.
class Worker {
 public:
  Worker() : m_thread([this] { Run(); }) {}
  ~Worker() { Join(); }
  // Ends the thread after what was handed; returns the frames it read.
  uint64_t Join() {
    if (m_thread.joinable()) {
      Hand(nullptr);
      m_thread.join();
    }
    return m_framesRead;
  }
  void Hand(CapturePtr capture) {
    {
      std::lock_guard<std::mutex> lock(m_mutex);
      m_queue.push_back(std::move(capture));
    }
    m_signal.notify_one();
  }

 private:
  void Run() {
    for (;;) {
      CapturePtr capture;
      {
        std::unique_lock<std::mutex> lock(m_mutex);
        m_signal.wait(lock, [this] { return !m_queue.empty(); });
        capture = std::move(m_queue.front());
        m_queue.pop_front();
      }
      if (!capture) return;
      for (const hx::Gop& gop : capture->Gops()) {
        for (const hx::VideoFrame& frame : gop.frames) {
          if (frame.data->Data() != nullptr && frame.payloadOffset <= frame.Size()) ++m_framesRead;
        }
      }
    }
  }

  std::mutex m_mutex;
  std::condition_variable m_signal;
  std::deque<CapturePtr> m_queue;
  uint64_t m_framesRead = 0;  // read after the thread is joined
  std::thread m_thread;
};

TEST(VideoHandoffTest, CapturesDroppedOnAnotherThreadReleaseEveryKeptFrameOnce) {
  videotest::ReleaseCountingHost host;
  videotest::TestTick tick;
  std::vector<bool> kept;
  uint64_t framesRead = 0;
  {
    hx::VideoBuffer buffer(host.callback(), tick, 256 * 1024);
    std::vector<CapturePtr> collecting;
    std::mt19937 random(7);
    Worker worker;
    for (uint32_t i = 0; i < 20000; ++i) {
      tick.Advance(10);
      const int32_t stream = static_cast<int32_t>(random() % 4);
      const bool key = random() % 15 == 0;
      kept.push_back(buffer.AddFrame(stream, key ? hx::kKeyFrameType : 0, 8,
                                     videotest::FakeBuffer(i), 1000 + random() % 4000,
                                     videotest::Format(hx::kCodecH264)));
      if (i % 40 == 0) {
        const uint32_t now = tick.Get();
        CapturePtr capture = buffer.AttachEmailStream(stream, 2, 1 + random() % 3, now / 1000,
                                                      static_cast<uint16_t>(now % 1000), nullptr);
        if (capture) collecting.push_back(capture);
      }
      // As the manager does for a ready notification: finish, then hand over.
      for (auto it = collecting.begin(); it != collecting.end();) {
        if (!(*it)->Done() && random() % 50 != 0) {
          ++it;
          continue;
        }
        (*it)->Finish();
        worker.Hand(std::move(*it));
        it = collecting.erase(it);
      }
    }
    for (CapturePtr& capture : collecting) worker.Hand(std::move(capture));
    framesRead = worker.Join();
  }
  uint64_t keptCount = 0;
  for (size_t i = 0; i < kept.size(); ++i) {
    ASSERT_EQ(kept[i] ? 1 : 0, host.Releases(videotest::FakeBuffer(i))) << "frame " << i;
    keptCount += kept[i] ? 1 : 0;
  }
  EXPECT_EQ(keptCount, host.Total());
  EXPECT_GT(keptCount, 0u);
  EXPECT_GT(framesRead, 0u);
}

}  // namespace
