// Frame intake of the video buffer under a recording server's load: 64
// camera streams of 100 KB frames with a key frame every 30 frames, 8 of them
// with a notification capture attached at all times (a finished capture is
// dropped, as after its mail, and a new one attached). The baseline copies
// every frame into a per-stream ring instead of keeping the host's buffer.
//
// Counters: items_per_second is frames per second on one core; peak_held_MiB
// is the most frame memory the host had lent at once, bound_MiB what the
// configured limits allow (each history, and each capture's clip and staging).
#include <benchmark/benchmark.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "alertmod/platform/testing/manual_env.h"
#include "alertmod/video/video_buffer.h"
#include "bench/manager_session.h"
#include "host/system_description.h"

namespace {

constexpr int kStreams = 64;
constexpr uint32_t kFrameBytes = 100 * 1024;
constexpr uint32_t kHeaderBytes = 32;
constexpr int kKeySpacing = 30;
constexpr int kCaptures = 8;
constexpr uint32_t kFrameIntervalMs = 33;
constexpr int32_t kPreSeconds = 5;
constexpr int32_t kCaptureSeconds = 10;
constexpr double kMiB = 1048576.0;

// The host's view of its lent buffers. The benchmark runs on one thread.
struct LentBuffers {
  uint64_t outstandingBytes = 0;
  uint64_t peakBytes = 0;
  void Lend(uint64_t bytes) {
    outstandingBytes += bytes;
    peakBytes = std::max(peakBytes, outstandingBytes);
  }
} g_lent;

int32_t HostCallback(hx::core::HostRequest* request, void*) {
  if (request->requestClass == hx::core::kClassFrameRelease) g_lent.outstandingBytes -= kFrameBytes;
  return 0;
}

uint32_t g_tickMs = 0;

const uint8_t* SourceFrame() {
  static const std::vector<uint8_t> frame(kFrameBytes, 0x5A);
  return frame.data();
}

void KeepCapturesAttached(hx::VideoBuffer& buffer,
                          std::array<std::shared_ptr<hx::CVideoEmailStream>, kCaptures>& captures) {
  for (int i = 0; i < kCaptures; ++i) {
    std::shared_ptr<hx::CVideoEmailStream>& capture = captures[i];
    if (capture && !capture->Done()) continue;
    capture =
        buffer.AttachEmailStream(i * (kStreams / kCaptures), kPreSeconds, kCaptureSeconds,
                                 g_tickMs / 1000, static_cast<uint16_t>(g_tickMs % 1000), nullptr);
  }
}

void BM_ZeroCopyIntake(benchmark::State& state) {
  hx::platform::ManualEnv env;
  g_lent = LentBuffers{};
  hx::StreamFormat format;
  format.width = 1920;
  format.height = 1080;
  format.codec = hx::kCodecH264;
  const uint8_t* frame = SourceFrame();
  uint64_t captures = 0;
  {
    hx::VideoBuffer buffer(&HostCallback, env);
    std::array<std::shared_ptr<hx::CVideoEmailStream>, kCaptures> attached;
    uint64_t round = 0;
    for (auto _ : state) {
      g_tickMs += kFrameIntervalMs;
      env.SetTick(g_tickMs);
      for (int stream = 0; stream < kStreams; ++stream) {
        const uint32_t type = (round + stream) % kKeySpacing == 0 ? hx::kKeyFrameType : 0;
        if (buffer.AddFrame(stream, type, kHeaderBytes, frame, kFrameBytes, format)) {
          g_lent.Lend(kFrameBytes);
        }
      }
      ++round;
      for (const auto& capture : attached) captures += capture && capture->Done() ? 1 : 0;
      KeepCapturesAttached(buffer, attached);
    }
  }
  if (g_lent.outstandingBytes != 0) state.SkipWithError("frame buffers were not all returned");
  state.SetItemsProcessed(state.iterations() * kStreams);
  const double bound = (kStreams + 2.0 * kCaptures) * hx::kDefaultVideoBufferBytes;
  state.counters["peak_held_MiB"] = g_lent.peakBytes / kMiB;
  state.counters["bound_MiB"] = bound / kMiB;
  state.counters["captures_done"] = static_cast<double>(captures);
}
BENCHMARK(BM_ZeroCopyIntake)->MinTime(2.0);

// The same streams, each frame copied into its stream's ring of the same
// byte limit.
void BM_CopyingIntakeBaseline(benchmark::State& state) {
  struct Ring {
    std::vector<uint8_t> bytes = std::vector<uint8_t>(hx::kDefaultVideoBufferBytes);
    size_t position = 0;
  };
  std::vector<Ring> rings(kStreams);
  const uint8_t* frame = SourceFrame();
  for (auto _ : state) {
    for (Ring& ring : rings) {
      if (ring.position + kFrameBytes > ring.bytes.size()) ring.position = 0;
      std::memcpy(ring.bytes.data() + ring.position, frame, kFrameBytes);
      ring.position += kFrameBytes;
    }
    benchmark::ClobberMemory();
  }
  state.SetItemsProcessed(state.iterations() * kStreams);
}
BENCHMARK(BM_CopyingIntakeBaseline)->MinTime(2.0);

// The same load through the module's Write export from the reference host:
// the frame-intake gate (catalogue, wanted streams, formats) in front of the
// buffer, and 8 cameras raised by an alarm document every 100 rounds, whose
// notifications attach the captures (the worker drops the finished items).
constexpr int32_t kEncoders = 0x10000;
constexpr int kAlarmEveryRounds = 100;

uint32_t CameraStream(int camera) {
  return refhost::HostStreamId(kEncoders, 1 + camera / 4, camera % 4, 0);
}

std::string CaptureNotifyFile() {
  return "<Trellan><Notify ID=\"786432\"><Servers/><Profiles><smtp ID=\"1\" attach=\"1\" "
         "description=\"Clips\" ThrottleSeconds=\"0\" from=\"a@b\" subject=\"s\" "
         "MaxVideoSeconds=\"" +
         std::to_string(kCaptureSeconds) +
         "\" EventEdge=\"2\"><to>c@d</to></smtp></Profiles></Notify></Trellan>";
}

std::string CaptureSystem() {
  refhost::SystemDescription site;
  for (int i = 0; i < kStreams; ++i) {
    refhost::CameraDescription camera{
        "Camera " + std::to_string(i), kEncoders, 1 + i / 4, i % 4, {}};
    camera.streams = {
        refhost::StreamDescription{0, refhost::kStandardH264, 1920, 1080, std::nullopt}};
    site.cameras.push_back(camera);
    site.events.push_back(
        {100 + i, kPreSeconds, refhost::EventSourceRef::Camera(kEncoders, 1 + i / 4, i % 4), {1}});
  }
  return refhost::BuildSystemDocument(site);
}

std::string CaptureAlarms() {
  refhost::AlarmDocument alarm;
  for (int i = 0; i < kCaptures; ++i) {
    const int camera = i * (kStreams / kCaptures);
    refhost::AlarmRequest request;
    request.profile = 1;
    request.action = 100 + camera;
    request.source = refhost::AlarmRequest::Source{kEncoders, 1 + camera / 4, camera % 4, 0, 1};
    alarm.requests.push_back(request);
  }
  return refhost::BuildAlarmDocument(alarm);
}

void BM_ZeroCopyIntakeThroughWrite(benchmark::State& state) {
  std::atomic<uint64_t> released{0};
  uint64_t kept = 0;
  {
    benchsupport::ManagerSession session(CaptureNotifyFile());
    if (!session.Ready()) {
      state.SkipWithError("the testing module could not be started");
      return;
    }
    session.Host().SetHandler(hx::core::kClassFrameRelease, [&](hx::core::HostRequest&) {
      released.fetch_add(1);
      return 0;
    });
    session.Host().SendHostDocument(CaptureSystem());
    const std::string alarms = CaptureAlarms();
    const uint8_t* frame = SourceFrame();
    session.OnDispatcher([&] {
      uint64_t round = 0;
      for (auto _ : state) {
        session.AdvanceTick(kFrameIntervalMs);
        for (int stream = 0; stream < kStreams; ++stream) {
          hx::core::WriteParmsIn in{};
          in.length = kFrameBytes;
          in.data = frame;
          in.source = CameraStream(stream);
          in.requestClass = hx::core::kWriteClassFrame;
          in.payloadOffset = kHeaderBytes;
          in.frameType = (round + stream) % kKeySpacing == 0 ? hx::core::kFrameTypeKey : 0;
          hx::core::WriteParmsOut out{};
          session.Host().Write(in, &out);
          kept += out.frameKept;
        }
        if (++round % kAlarmEveryRounds == 0) session.Host().WriteDocument(alarms, kEncoders);
      }
    });
  }
  if (released.load() != kept) state.SkipWithError("frame buffers were not all returned");
  state.SetItemsProcessed(state.iterations() * kStreams);
  state.counters["kept"] = static_cast<double>(kept);
}
BENCHMARK(BM_ZeroCopyIntakeThroughWrite)->MinTime(2.0)->UseRealTime();

}  // namespace

BENCHMARK_MAIN();
