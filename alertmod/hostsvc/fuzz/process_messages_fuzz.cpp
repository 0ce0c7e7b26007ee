// The host's process messages while a program run waits for them. One thread
// runs a program through the client (RunProcess, or StartProcess with its
// options and the output reads of a caller that drives the run itself); the
// fuzzer's thread plays the host: raw bytes, and messages for the live id or
// near it. The service is shut down at the end, which must release the
// waiter whatever the messages said.
//
// What the run reports must match what the host accepted: a run that ended
// has the last exit value, the output and error text arrive whole without
// carriage returns, and the module's own messages (start, input) are well
// formed and carry the input unchanged.
//
// Input: byte 0 chooses the mode (bit 0: the host refuses the start; bit 1:
// the host refuses input; bits 2-4: the input size; bit 5: StartProcess with
// flags; bit 6: a ".ps1" program); then records, each opened by one byte:
//   op % 4 == 0: two bytes of length, then that many raw bytes;
//   otherwise:   type, 4 bytes of value, an id offset (128 = the live id),
//                a length byte, then that many payload bytes.
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "alertmod/host_records.h"
#include "alertmod/hostsvc/process_service.h"
#include "alertmod/platform/testing/manual_env.h"
#include "tests/support/fuzz_input.h"

namespace {

namespace core = hx::core;
namespace ipc = hx::ipc;

constexpr uint32_t kModuleId = core::kModuleId;
constexpr size_t kMaxPayload = core::kProcessMessageMaxBytes - core::kProcessHeaderBytes;
const size_t kInputSizes[] = {
    0, 1, 100, kMaxPayload - 1, kMaxPayload, kMaxPayload + 1, 2 * kMaxPayload, 3 * kMaxPayload + 7};

void Check(bool condition) {
  if (!condition) __builtin_trap();
}

// What the fake host saw of the module's messages.
struct HostSide {
  std::mutex mutex;
  std::condition_variable started;
  bool startSeen = false;
  bool refuseStart = false;
  bool refuseInput = false;
  uint32_t liveId = 0;
  std::string startPayload;
  uint32_t startFlags = 0;
  std::string input;
  bool inputEnded = false;
  bool malformed = false;
  bool inputAfterEnd = false;
};

HostSide* g_host = nullptr;

bool Send(const void* data, uint64_t length) {
  HostSide& host = *g_host;
  std::lock_guard<std::mutex> lock(host.mutex);
  core::ProcessMessageHeader header;
  if (length < sizeof(header) || length > core::kProcessMessageMaxBytes) {
    host.malformed = true;
    return false;
  }
  memcpy(&header, data, sizeof(header));
  host.malformed = host.malformed || header.length != length;
  const char* payload = static_cast<const char*>(data) + sizeof(header);
  const size_t payloadLength = length - sizeof(header);
  if (header.type == core::kProcessStart) {
    host.startSeen = true;
    host.started.notify_all();
    if (host.refuseStart) return false;
    host.liveId = header.id;
    host.startFlags = header.value;
    host.startPayload.assign(payload, payloadLength);
    return true;
  }
  if (header.type != core::kProcessInput || header.id != host.liveId) {
    host.malformed = true;
    return false;
  }
  if (host.refuseInput) return false;
  if (host.inputEnded && payloadLength > 0) host.inputAfterEnd = true;
  host.input.append(payload, payloadLength);
  if (length < core::kProcessMessageMaxBytes) host.inputEnded = true;
  return true;
}

// What the module accepted from the host, read back from each accepted
// message's own header.
struct Accepted {
  std::string output;
  std::string errorOutput;
  bool ended = false;
  bool exited = false;
  int32_t value = 0;

  void Add(const uint8_t* message, size_t length) {
    core::ProcessMessageHeader header;
    memcpy(&header, message, sizeof(header));
    std::string payload(reinterpret_cast<const char*>(message) + sizeof(header),
                        length - sizeof(header));
    std::string clean;
    for (char c : payload) {
      if (c != '\r') clean.push_back(c);
    }
    if (header.type == core::kProcessOutput) output += clean;
    if (header.type == core::kProcessErrorOutput) errorOutput += clean;
    if (header.type == core::kProcessExited || header.type == core::kProcessFailed) {
      ended = true;
      exited = header.type == core::kProcessExited;
      value = static_cast<int32_t>(header.value);
    }
  }
};

// Error lines as the caller collects them, joined back into the text.
std::string Joined(const std::vector<std::string>& lines) {
  std::string text;
  for (size_t i = 0; i < lines.size(); ++i) text += (i > 0 ? "\n" : "") + lines[i];
  return text;
}

bool SameText(const std::string& received, const std::string& lines) {
  return received == lines || received == lines + "\n";
}

using Reader = testsupport::FuzzInput;

// Plays the host's side of one record, noting what the module accepted.
void PlayRecord(Reader& reader, uint32_t liveId, Accepted& accepted) {
  const uint8_t op = reader.Byte();
  std::string message;
  if (op % 4 == 0) {
    size_t length = reader.Byte();
    length |= size_t{reader.Byte()} << 8;
    message = reader.Bytes(length);
  } else {
    core::ProcessMessageHeader header{};
    header.type = reader.Byte() % 8;
    header.value = reader.Word();
    header.id = liveId + reader.Byte() - 128u;
    const std::string payload = reader.Bytes(reader.Byte());
    header.length = static_cast<uint32_t>(sizeof(header) + payload.size());
    message.assign(reinterpret_cast<const char*>(&header), sizeof(header));
    message += payload;
  }
  std::vector<uint8_t> copy(message.begin(), message.end());
  if (ipc::OnProcessMessage(copy.data(), copy.size()) == 1) accepted.Add(copy.data(), copy.size());
}

struct RunResult {
  bool ran = false;
  int32_t exitCode = -1;
  std::vector<std::string> errorLines;
  std::string output;
  int32_t state = ipc::kStateStarting;
};

// A caller that drives the run itself: standard output line by line, then
// the wait for the end.
void DriveStartedProcess(const ipc::ProcessOptions& options, RunResult& result) {
  std::shared_ptr<ipc::client> process = ipc::StartProcess(options);
  Check(process->State() != ipc::kStateStarting);
  std::string line;
  std::vector<std::string> lines;
  while (ipc::ReadOutputLine(*process, line, 0)) lines.push_back(line);
  ipc::WaitForExit(*process);
  const int32_t state = process->State();
  Check(state != ipc::kStateRunning && state != ipc::kStateStarting);
  result.state = state;
  result.output = Joined(lines);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  Reader reader(data, size);
  const uint8_t mode = reader.Byte();
  HostSide host;
  host.refuseStart = (mode & 1) != 0;
  host.refuseInput = (mode & 2) != 0;
  g_host = &host;
  ipc::RegisterProcessService(kModuleId, &Send, nullptr, *hx::platform::SystemEnvForTests());

  std::string input(kInputSizes[(mode >> 2) & 7], '\0');
  for (size_t i = 0; i < input.size(); ++i) input[i] = static_cast<char>('a' + i % 23);
  const bool started = (mode & 0x20) != 0;
  ipc::ProcessOptions options;
  options.arguments = {(mode & 0x40) != 0 ? "tool.ps1" : "./curl", "-V", ""};
  options.flags = mode & 0x1E;
  options.firstText = "first";
  options.secondText = "second";

  RunResult result;
  std::thread caller([&] {
    if (started) {
      DriveStartedProcess(options, result);
    } else {
      result.ran = ipc::RunProcess(options.arguments, input, result.exitCode, result.errorLines,
                                   &result.output);
    }
  });
  uint32_t liveId = 0;
  {
    std::unique_lock<std::mutex> lock(host.mutex);
    host.started.wait(lock, [&] { return host.startSeen; });
    liveId = host.liveId;
  }
  Accepted accepted;
  while (!reader.Empty()) PlayRecord(reader, liveId, accepted);
  ipc::ShutdownProcessService(false);
  caller.join();

  std::lock_guard<std::mutex> lock(host.mutex);
  Check(!host.malformed && !host.inputAfterEnd);
  if (host.refuseStart) {
    Check(!result.ran && result.state != ipc::kStateExited && !accepted.ended);
    return 0;
  }
  Check((liveId & ~ipc::kIdCounterMask) == kModuleId << 4);
  if (started) {
    if (accepted.ended) {
      Check(result.state == (accepted.exited ? ipc::kStateExited : ipc::kStateFailed));
      Check(SameText(accepted.output, result.output));
    }
    return 0;
  }
  Check(host.startPayload == options.arguments[0] + std::string("\0-V\0", 4));
  Check(result.ran == (accepted.ended && accepted.exited));
  if (result.ran) {
    Check(result.exitCode == accepted.value);
    Check(result.output == accepted.output);
    Check(SameText(accepted.errorOutput, Joined(result.errorLines)));
    if (!host.refuseInput) Check(host.input == input && host.inputEnded);
  }
  return 0;
}
