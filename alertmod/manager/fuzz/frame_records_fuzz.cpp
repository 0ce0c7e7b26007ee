// Frame records with arbitrary headers through the frame-intake gate: stream
// ids known and unknown, any frame type, payload offsets inside, at and past
// the length, lengths from 0 to 4 GiB, buffers without data, interleaved with
// alarms that attach captures, ticks, catalogue changes and a size limit of 0
// that turns video off. Whatever the records say, a refused buffer is never
// released and every kept buffer goes back to the host exactly once by the
// time the manager is gone.
//
// Input: records, each opened by one byte `op`:
//   op % 8 < 5: a frame: a stream selector byte, a type byte, an offset kind
//               byte, 4 bytes of length and 4 of offset (used as the kinds
//               say), and a byte of milliseconds since the last frame;
//   5: an alarm start or end (next byte) for profile 1 or 2 on a camera;
//   6: a tick after the next byte's count of seconds;
//   7: a document (next byte): the catalogue again, a smaller catalogue
//      with other picture sizes, size limit 0, or size limit 1 MiB.
#include <tinyxml.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "alertmod/host_records.h"
#include "alertmod/manager/notify_manager.h"
#include "alertmod/platform/testing/manual_env.h"
#include "host/system_description.h"
#include "tests/support/fake_host.h"
#include "tests/support/fuzz_input.h"
#include "tests/support/fuzz_scratch.h"

namespace {

constexpr size_t kMaxFrames = 2048;
constexpr int32_t kEncoders = 0x10000;
constexpr int32_t kEventId = 7;

void Check(bool condition) {
  if (!condition) __builtin_trap();
}

uint32_t g_tickMs = 0;
int64_t g_wallSeconds = 0;

// The fuzz input's clocks.
class InputClockEnv final : public hx::platform::EnvWrapper {
 public:
  InputClockEnv() : EnvWrapper(hx::platform::SystemEnvForTests()) {}
  uint32_t TickMs() override { return g_tickMs; }
  int64_t WallSeconds() override { return g_wallSeconds; }
};

InputClockEnv g_env;

std::unique_ptr<hx::IWorkerJob> NoJob() {
  return nullptr;
}

refhost::SystemDescription System(bool smaller) {
  using refhost::StreamDescription;
  refhost::SystemDescription system;
  const int32_t width = smaller ? 640 : 1280;
  system.cameras = {
      {"Lobby",
       kEncoders,
       1,
       0,
       {StreamDescription{0, refhost::kStandardH264, width, 720, std::nullopt},
        StreamDescription{1, refhost::kStandardJpeg, 320, 240, std::nullopt}}},
      {"Gate",
       kEncoders,
       2,
       0,
       {StreamDescription{0, refhost::kStandardH265, 640, 480, std::nullopt}}},
  };
  if (!smaller) {
    system.cameras.push_back(
        {"Yard",
         kEncoders,
         3,
         1,
         {StreamDescription{0, refhost::kStandardMpeg4, 352, 288, std::nullopt}}});
  }
  system.groups = {{4,
                    std::string("All"),
                    {refhost::EventSourceRef::Camera(kEncoders, 2, 0),
                     refhost::EventSourceRef::Camera(kEncoders, 3, 1)}}};
  system.events = {{kEventId, 3, refhost::EventSourceRef::Camera(kEncoders, 1, 0), {1, 2}},
                   {8, 1, refhost::EventSourceRef::Group(4), {2}}};
  return system;
}

std::string SizeLimitDocument(int megabytes) {
  return "<Trellan Delta=\"1\"><Notify ID=\"786432\" EmailSizeLimitMB=\"" +
         std::to_string(megabytes) +
         "\"><Servers/><Profiles>"
         "<smtp ID=\"1\" attach=\"1\" description=\"Still\" from=\"a@b\" subject=\"s\" "
         "MaxVideoSeconds=\"0\" EventEdge=\"2\"><to>c@d</to></smtp>"
         "<smtp ID=\"2\" attach=\"1\" description=\"Clip\" from=\"a@b\" subject=\"s\" "
         "MaxVideoSeconds=\"4\" EventEdge=\"0\"><to>c@d</to></smtp>"
         "</Profiles></Notify></Trellan>";
}

using Reader = testsupport::FuzzInput;

class Session {
 public:
  explicit Session(testsupport::FakeHost& host)
      : m_manager(host.callback(), g_env, &NoJob), m_streams(StreamIds()) {
    Document(SizeLimitDocument(1));
    Document(refhost::BuildSystemDocument(System(false)));
  }

  void Play(Reader& reader) {
    const uint8_t op = reader.Byte();
    switch (op % 8) {
      case 5:
        Alarm(reader.Byte());
        break;
      case 6:
        g_tickMs += reader.Byte() * 1000u;
        g_wallSeconds += 1;
        m_manager.OnTick();
        break;
      case 7:
        ChangeDocument(reader.Byte());
        break;
      default:
        Frame(reader);
        break;
    }
  }

  // Buffers the manager said it kept, each once.
  const std::vector<const void*>& Kept() const { return m_kept; }
  const std::vector<const void*>& Refused() const { return m_refused; }

 private:
  static std::vector<uint32_t> StreamIds() {
    std::vector<uint32_t> ids;
    for (const auto& camera : System(false).cameras) {
      for (const auto& stream : camera.streams) {
        ids.push_back(
            refhost::HostStreamId(camera.plugin, camera.device, camera.input, stream.context));
      }
    }
    return ids;
  }

  void Document(const std::string& text) {
    m_manager.OnHostDocument(text.data(), static_cast<uint32_t>(text.size()));
  }

  void ChangeDocument(uint8_t which) {
    switch (which % 4) {
      case 0:
        Document(refhost::BuildSystemDocument(System(false)));
        break;
      case 1:
        Document(refhost::BuildSystemDocument(System(true)));
        break;
      case 2:
        Document(SizeLimitDocument(0));
        break;
      default:
        Document(SizeLimitDocument(1));
        break;
    }
  }

  void Alarm(uint8_t b) {
    refhost::AlarmDocument alarm;
    refhost::AlarmRequest request;
    request.alarm = (b & 1) != 0 ? 1 : 0;
    request.profile = 1 + ((b >> 1) & 1);
    request.action = (b & 4) != 0 ? kEventId : 8;
    request.time = g_wallSeconds;
    if ((b & 8) != 0) {
      request.source.reset();
      request.group = 4;
    } else {
      request.source->device = 1 + (b >> 4) % 3;
    }
    alarm.requests.push_back(request);
    const std::string text = refhost::BuildAlarmDocument(alarm);
    m_manager.OnAlarmDocument(text.data(), static_cast<uint32_t>(text.size()));
  }

  uint32_t StreamId(uint8_t selector, Reader& reader) {
    if (selector % 8 < m_streams.size()) return m_streams[selector % 8];
    return reader.Word();
  }

  void Frame(Reader& reader) {
    if (m_frames >= kMaxFrames) return;
    const uint32_t stream = StreamId(reader.Byte(), reader);
    const uint8_t type = reader.Byte();
    const uint8_t kinds = reader.Byte();
    uint32_t length = reader.Word();
    uint32_t offset = reader.Word();
    if ((kinds & 3) != 0) length = 1 + length % 200000;  // mostly sizes a camera sends
    switch ((kinds >> 2) & 3) {
      case 0:
        offset = length < 32 ? 0 : 32;
        break;
      case 1:
        offset = length;
        break;
      case 2:
        offset = length + 1 + offset % 16;
        break;
      default:
        break;  // as read
    }
    g_tickMs += reader.Byte();
    const void* buffer = (kinds & 0x10) != 0 ? nullptr : &m_arena[m_frames];
    ++m_frames;
    const bool kept = m_manager.OnFrame(stream, type, offset, buffer, length);
    Check(!kept || buffer != nullptr);
    if (buffer != nullptr) (kept ? m_kept : m_refused).push_back(buffer);
  }

  // Before the manager, so that the buffers outlive every holder.
  uint8_t m_arena[kMaxFrames] = {};
  hx::NotifyManager m_manager;
  std::vector<uint32_t> m_streams;
  size_t m_frames = 0;
  std::vector<const void*> m_kept;
  std::vector<const void*> m_refused;
};

}  // namespace

extern "C" int LLVMFuzzerInitialize(int* argc, char*** argv) {
  testsupport::MoveToFuzzScratchDirectory(argc, argv, "frame_records_fuzz");
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  g_tickMs = 0xFFFF8000u;  // the tick wraps in longer inputs
  g_wallSeconds = 1767225600;
  testsupport::FakeHost host(/*logThreshold=*/100);
  std::vector<const void*> kept;
  std::vector<const void*> refused;
  {
    auto session = std::make_unique<Session>(host);
    Reader reader(data, size);
    while (!reader.Empty()) session->Play(reader);
    kept = session->Kept();
    refused = session->Refused();
  }
  std::map<uintptr_t, int> releases;
  for (const auto& request : host.Requests().OfClass(hx::core::kClassFrameRelease)) {
    ++releases[request.dataPointer];
  }
  Check(releases.size() == kept.size());
  for (const void* buffer : kept) Check(releases[reinterpret_cast<uintptr_t>(buffer)] == 1);
  for (const void* buffer : refused)
    Check(releases.count(reinterpret_cast<uintptr_t>(buffer)) == 0);
  return 0;
}
