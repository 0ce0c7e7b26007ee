// Drives one manager, without its worker, through a sequence of host system
// documents, alarm documents, frames and ticks taken from the input, then
// destroys it. Whatever the documents say, nothing may crash, and every frame
// the manager kept must go back to the host exactly once by the end.
//
// Input: records separated by 0x1E. A record's first byte says what it is:
//   'H' host system document (IOCTL code 2), the rest is its text;
//   'A' alarm document (Write from another module), the rest is its text;
//   'F' frames: one frame per following byte b, on the (b & 15)-th stream the
//       catalogue knows, a key frame when b & 0x80, 40 ms apart;
//   'T' tick: the clocks move on by the next byte's count of seconds.
#include <tinyxml.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <iterator>
#include <map>
#include <string>
#include <vector>

#include "alertmod/host_records.h"
#include "alertmod/manager/notify_manager.h"
#include "alertmod/platform/testing/manual_env.h"
#include "tests/support/fuzz_scratch.h"

namespace {

constexpr char kSeparator = '\x1E';
constexpr size_t kMaxFramesPerInput = 4096;
constexpr uint32_t kFrameIntervalMs = 40;

constexpr char kProfiles[] =
    "<Trellan Delta=\"1\"><Notify ID=\"786432\" EmailSizeLimitMB=\"1\"><Servers/><Profiles>"
    "<smtp ID=\"1\" attach=\"1\" description=\"Still\" from=\"a@b\" subject=\"{source} "
    "{event state}\" MaxVideoSeconds=\"10\" EventEdge=\"2\"><to>c@d</to></smtp>"
    "<smtp ID=\"2\" attach=\"1\" description=\"Clip\" from=\"a@b\" subject=\"s\" "
    "MaxVideoSeconds=\"3\" EventEdge=\"0\" ThrottleSeconds=\"5\"><to>c@d</to></smtp>"
    "<smtp ID=\"3\" attach=\"0\" description=\"Plain\" from=\"a@b\" subject=\"s\" "
    "EventEdge=\"1\"><to>c@d</to></smtp>"
    "</Profiles></Notify></Trellan>";

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
std::map<const void*, int> g_releases;

int32_t HostCallback(hx::core::HostRequest* request, void*) {
  if (request->requestClass == hx::core::kClassFrameRelease) ++g_releases[request->data];
  // A high log threshold: the lines cost time and say nothing here.
  if (request->requestClass == hx::core::kClassLog &&
      request->code == hx::core::kCodeLogLevelQuery) {
    return 100;
  }
  return 0;
}

// A job that is never run: no worker is lent.
std::unique_ptr<hx::IWorkerJob> NoJob() {
  return nullptr;
}

// Frame buffers: distinct addresses that the module never reads.
uint8_t g_frames[kMaxFramesPerInput];

class Session {
 public:
  Session() : m_manager(&HostCallback, g_env, &NoJob) {
    TiXmlDocument profiles;
    profiles.Parse(kProfiles);
    Check(m_manager.ApplyConfigurationUpdate(profiles));
  }

  void Play(const std::string& record) {
    if (record.empty()) return;
    const std::string body = record.substr(1);
    switch (record[0]) {
      case 'H':
        m_manager.OnHostDocument(body.data(), static_cast<uint32_t>(body.size()));
        break;
      case 'A':
        m_manager.OnAlarmDocument(body.data(), static_cast<uint32_t>(body.size()));
        break;
      case 'F':
        for (unsigned char b : body) PushFrame(b);
        break;
      case 'T':
        Tick(body.empty() ? 0 : static_cast<unsigned char>(body[0]));
        break;
      default:
        break;
    }
  }

  size_t Kept() const { return m_kept; }

 private:
  void PushFrame(unsigned char b) {
    if (m_frames >= kMaxFramesPerInput) return;
    const auto& streams = m_manager.Catalogue().Streams();
    if (streams.empty()) return;
    auto stream = streams.begin();
    std::advance(stream, (b & 0x0F) % streams.size());
    g_tickMs += kFrameIntervalMs;
    const uint8_t* buffer = &g_frames[m_frames++];
    const uint32_t size = 64 + (b & 0x70) * 1024;
    const uint8_t type = (b & 0x80) != 0 ? hx::core::kFrameTypeKey : 0;
    if (m_manager.OnFrame(static_cast<uint32_t>(stream->first), type, 8, buffer, size)) ++m_kept;
  }

  void Tick(unsigned seconds) {
    g_tickMs += seconds * 1000u;
    g_wallSeconds += seconds;
    m_manager.OnTick();
  }

  hx::NotifyManager m_manager;
  size_t m_frames = 0;
  size_t m_kept = 0;
};

}  // namespace

extern "C" int LLVMFuzzerInitialize(int* argc, char*** argv) {
  // Configuration changes save "notify.xml" in the working directory.
  testsupport::MoveToFuzzScratchDirectory(argc, argv, "documents_fuzz");
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string input(reinterpret_cast<const char*>(data), size);
  g_releases.clear();
  g_tickMs = 0xFFFF0000u;  // the tick wraps during longer inputs
  g_wallSeconds = 1767225600;
  size_t kept = 0;
  {
    Session session;
    for (size_t start = 0; start <= input.size();) {
      size_t end = input.find(kSeparator, start);
      if (end == std::string::npos) end = input.size();
      session.Play(input.substr(start, end - start));
      start = end + 1;
    }
    kept = session.Kept();
  }
  Check(g_releases.size() == kept);
  for (const auto& release : g_releases) Check(release.second == 1);
  return 0;
}
