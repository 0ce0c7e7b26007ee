// Helpers for the video buffer's unit tests: a hand-driven tick, a host that
// counts the buffer releases per buffer, and fake frame buffers. The buffers
// are addresses only: the buffer code never reads frame bytes.
#ifndef ALERTMOD_VIDEO_VIDEO_TEST_UTIL_H_
#define ALERTMOD_VIDEO_VIDEO_TEST_UTIL_H_

#include <gtest/gtest.h>

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>

#include "alertmod/platform/testing/manual_env.h"
#include "alertmod/video/frame_data.h"
#include "alertmod/video/gop_buffer.h"
#include "alertmod/video/notify_ready.h"
#include "alertmod/video/video_buffer.h"
#include "tests/support/fake_host.h"

namespace videotest {

// The Env of a buffer under test, whose tick (from 0) moves by hand.
class TestTick : public hx::platform::ManualEnv {
 public:
  TestTick() { SetTick(0); }
  void Set(uint32_t ms) { SetTick(ms); }
  void Advance(uint32_t ms) { SetTick(TickMs() + ms); }
  uint32_t Get() { return TickMs(); }
};

// A FakeHost whose buffer releases are counted per buffer address.
class ReleaseCountingHost {
 public:
  ReleaseCountingHost() {
    m_host.SetHandler(hx::core::kClassFrameRelease, [this](hx::core::HostRequest& request) {
      std::lock_guard<std::mutex> lock(m_mutex);
      ++m_releases[reinterpret_cast<uintptr_t>(request.data)];
      ++m_total;
      if (request.length != 0 || request.code != 0 || request.requester != hx::core::kModuleId ||
          request.size != hx::core::kHostRequestSize || request.version != 1) {
        ++m_malformed;
      }
      return 0;
    });
  }

  hx::core::HostCallbackFn callback() const { return m_host.callback(); }
  testsupport::FakeHost& host() { return m_host; }

  int Releases(const void* buffer) const {
    std::lock_guard<std::mutex> lock(m_mutex);
    auto found = m_releases.find(reinterpret_cast<uintptr_t>(buffer));
    return found == m_releases.end() ? 0 : found->second;
  }
  uint64_t Total() const {
    std::lock_guard<std::mutex> lock(m_mutex);
    return m_total;
  }
  uint64_t Malformed() const {
    std::lock_guard<std::mutex> lock(m_mutex);
    return m_malformed;
  }
  std::map<uintptr_t, int> All() const {
    std::lock_guard<std::mutex> lock(m_mutex);
    return m_releases;
  }

 private:
  testsupport::FakeHost m_host;
  mutable std::mutex m_mutex;
  std::map<uintptr_t, int> m_releases;
  uint64_t m_total = 0;
  uint64_t m_malformed = 0;
};

// The address of fake buffer number `n`; never dereferenced.
inline const void* FakeBuffer(uint64_t n) {
  return reinterpret_cast<const void*>(static_cast<uintptr_t>(0x100000) + n * 64);
}

// A frame that belongs to nobody (no release is sent for it).
inline hx::VideoFrame LooseFrame(uint32_t arrivalMs, bool key, uint32_t size) {
  hx::VideoFrame frame;
  frame.arrivalMs = arrivalMs;
  frame.frameType = key ? hx::kKeyFrameType : 0;
  frame.payloadOffset = 0;
  frame.data = hx::MakeFrameData(nullptr, FakeBuffer(arrivalMs), size);
  return frame;
}

inline hx::StreamFormat Format(uint32_t codec, uint32_t width = 640, uint32_t height = 480) {
  hx::StreamFormat format;
  format.codec = codec;
  format.width = width;
  format.height = height;
  return format;
}

// A completion that counts its calls.
class CountingReady final : public hx::INotifyReady {
 public:
  void OnReady() override { ++calls; }
  int calls = 0;
};

// A VideoBuffer on a counting host, fed frames at chosen ticks.
class VideoBufferTest : public ::testing::Test {
 protected:
  static constexpr int32_t kStream = 7;
  static constexpr uint64_t kLimit = 1u << 20;

  // Feeds a frame of `size` bytes arriving at `atMs`; remembers its buffer.
  bool Feed(bool key, uint32_t size, uint32_t atMs, const hx::StreamFormat& format,
            int32_t stream = kStream) {
    tick.Set(atMs);
    lastBuffer = FakeBuffer(++m_sequence);
    return buffer.AddFrame(stream, key ? hx::kKeyFrameType : 0, 0, lastBuffer, size, format);
  }
  bool Feed(bool key, uint32_t size, uint32_t atMs) {
    return Feed(key, size, atMs, Format(hx::kCodecH264));
  }
  // Attaches a capture at the current tick.
  std::shared_ptr<hx::CVideoEmailStream> Attach(int32_t preSeconds, int32_t maxSeconds,
                                                std::shared_ptr<hx::INotifyReady> completion,
                                                int32_t stream = kStream) {
    const uint32_t now = tick.Get();
    return buffer.AttachEmailStream(stream, preSeconds, maxSeconds, now / 1000,
                                    static_cast<uint16_t>(now % 1000), std::move(completion));
  }

  ReleaseCountingHost host;
  TestTick tick;
  hx::VideoBuffer buffer{host.callback(), tick, kLimit};
  const void* lastBuffer = nullptr;

 private:
  uint64_t m_sequence = 0;
};

}  // namespace videotest

#endif  // ALERTMOD_VIDEO_VIDEO_TEST_UTIL_H_
