#include "alertmod/hostsvc/process_service.h"

#include <algorithm>
#include <atomic>
#include <cstring>
#include <map>

#include "alertmod/diag/log.h"

namespace hx {
namespace ipc {
namespace {

// The one registry of the process: id to client, the last id issued, the
// module id and the send function. The send function is read without the
// lock, so that a sender never takes the registry lock after a client's.
class ProcessRegistry final {
 public:
  static ProcessRegistry& Instance() {
    // Destroyed when the library is unloaded, after the host has stopped
    // calling into it; a heap object would leak at every unload.
    static ProcessRegistry registry;
    return registry;
  }

  std::mutex lock;
  std::map<uint32_t, std::shared_ptr<client>> clients;
  bool closed = false;
  uint32_t lastId = 0;
  uint32_t moduleId = 0;
  std::atomic<SendFunction> send{nullptr};
  std::atomic<core::HostCallbackFn> logTo{nullptr};

 private:
  ProcessRegistry() = default;
};

// Every value of the counter is tried once before a start gives up.
constexpr uint32_t kCounterAttempts = kIdCounterMask + 1;

constexpr size_t kMaxPayloadBytes = core::kProcessMessageMaxBytes - core::kProcessHeaderBytes;

std::atomic<int64_t> g_startAnswerTimeoutMs{kDefaultStartAnswerTimeout.count()};

bool SendOne(SendFunction send, uint32_t id, uint32_t type, uint32_t value, const char* payload,
             size_t length, std::vector<unsigned char>& message) {
  message.resize(core::kProcessHeaderBytes + length);
  const core::ProcessMessageHeader header{static_cast<uint32_t>(message.size()), id, type, value};
  memcpy(message.data(), &header, sizeof(header));
  if (length > 0) memcpy(message.data() + core::kProcessHeaderBytes, payload, length);
  return send(message.data(), message.size());
}

// Appends output without its carriage returns, which may arrive in any
// piece, so the buffers hold lines separated by line feeds only.
void AppendOutput(std::string& buffer, const char* data, size_t length) {
  buffer.reserve(buffer.size() + length);
  std::remove_copy(data, data + length, std::back_inserter(buffer), '\r');
}

bool EndsInPs1(const std::string& program) {
  static const char kSuffix[] = ".ps1";
  constexpr size_t kSuffixLength = sizeof(kSuffix) - 1;
  return program.size() > kSuffixLength &&
         program.compare(program.size() - kSuffixLength, kSuffixLength, kSuffix) == 0;
}

std::string BuildStartPayload(const ProcessOptions& options) {
  std::string payload;
  if (options.flags & core::kProcessFlagFirstText) {
    payload.append(options.firstText).push_back('\0');
  }
  if (options.flags & core::kProcessFlagSecondText) {
    payload.append(options.secondText).push_back('\0');
  }
  for (size_t i = 0; i < options.arguments.size(); ++i) {
    if (i > 0) payload.push_back('\0');
    payload.append(options.arguments[i]);
  }
  return payload;
}

// Chooses the next id not in use. Requires the registry lock. False when
// every id is taken.
bool NextFreeId(ProcessRegistry& registry, uint32_t& id) {
  for (uint32_t attempt = 0; attempt < kCounterAttempts; ++attempt) {
    id = ((registry.lastId + 1) & kIdCounterMask) | (registry.moduleId << 4);
    registry.lastId = id;
    if (registry.clients.count(id) == 0) return true;
  }
  return false;
}

void SetState(client& process, int32_t state) {
  std::lock_guard<std::mutex> lock(process.lock);
  process.state = state;
}

// Gives up a run: the id is forgotten, so that anything the host still sends
// for it is dropped, and the run counts as failed. Returns false, changing
// nothing, when the run has reached `settled` meanwhile and its result
// stands.
template <typename Settled>
bool Abandon(const std::shared_ptr<client>& process, Settled settled) {
  ProcessRegistry& registry = ProcessRegistry::Instance();
  std::lock_guard<std::mutex> lock(registry.lock);
  std::lock_guard<std::mutex> clientLock(process->lock);
  if (settled(process->state)) return false;
  auto found = registry.clients.find(process->id);
  if (found != registry.clients.end() && found->second == process) registry.clients.erase(found);
  process->state = kStateFailed;
  return true;
}

// Waits for the host's answer to the start of `process`. A host that takes
// the start and never answers would hold the caller (Open's probe, the
// worker's delivery) for ever; past the time-out the run counts as not
// started. An answer that comes in while it is given up still counts.
void AwaitStartAnswer(const std::shared_ptr<client>& process, const std::string& program) {
  const std::chrono::milliseconds timeout(g_startAnswerTimeoutMs.load());
  const auto answered = [](int32_t state) { return state != kStateStarting; };
  {
    std::unique_lock<std::mutex> lock(process->lock);
    if (process->condition.wait_for(lock, timeout, [&] { return answered(process->state); })) {
      return;
    }
  }
  if (!Abandon(process, answered)) return;
  ProcessRegistry& registry = ProcessRegistry::Instance();
  uint32_t moduleId = 0;
  {
    std::lock_guard<std::mutex> lock(registry.lock);
    moduleId = registry.moduleId;
  }
  LogToHost(moduleId, registry.logTo.load(), LogLevelError,
            "The host did not answer the start of %s within %lld ms. The program counts as not "
            "started.",
            program.c_str(), static_cast<long long>(timeout.count()));
}

}  // namespace

void RegisterProcessService(uint32_t moduleId, SendFunction send, core::HostCallbackFn logTo) {
  ProcessRegistry& registry = ProcessRegistry::Instance();
  std::lock_guard<std::mutex> lock(registry.lock);
  registry.moduleId = moduleId;
  registry.send.store(send);
  registry.logTo.store(logTo);
  registry.closed = false;
}

void ShutdownProcessService(bool closed) {
  ProcessRegistry& registry = ProcessRegistry::Instance();
  std::lock_guard<std::mutex> lock(registry.lock);
  for (auto& entry : registry.clients) {
    client& process = *entry.second;
    {
      std::lock_guard<std::mutex> clientLock(process.lock);
      // A run cut off here has no exit code; reporting 0 would read as
      // success to a caller that then discards what the program was for.
      if (process.state == kStateRunning || process.state == kStateStarting) {
        process.state = kStateFailed;
      }
    }
    process.condition.notify_all();
  }
  registry.clients.clear();
  registry.closed = closed;
}

int OnProcessMessage(const void* data, uint64_t length) {
  if (data == nullptr || length < core::kProcessHeaderBytes) return 0;
  core::ProcessMessageHeader header;
  memcpy(&header, data, sizeof(header));
  const int32_t value = static_cast<int32_t>(header.value);
  const char* payload = static_cast<const char*>(data) + core::kProcessHeaderBytes;
  const size_t payloadLength = static_cast<size_t>(length - core::kProcessHeaderBytes);
  if (header.type < core::kProcessOutput || header.type > core::kProcessExited) return 0;

  ProcessRegistry& registry = ProcessRegistry::Instance();
  std::lock_guard<std::mutex> lock(registry.lock);
  auto found = registry.clients.find(header.id);
  if (found == registry.clients.end()) return 0;
  std::shared_ptr<client> process = found->second;
  {
    std::lock_guard<std::mutex> clientLock(process->lock);
    switch (header.type) {
      case core::kProcessOutput:
        AppendOutput(process->standardOutput, payload, payloadLength);
        break;
      case core::kProcessErrorOutput:
        AppendOutput(process->standardError, payload, payloadLength);
        break;
      case core::kProcessRunning:
        process->value = value;
        process->state = kStateRunning;
        break;
      default:  // failed or exited: the id is free again
        process->value = value;
        process->state = header.type == core::kProcessFailed ? kStateFailed : kStateExited;
        registry.clients.erase(found);
        break;
    }
    process->condition.notify_all();
  }
  return 1;
}

bool SendProcessMessage(uint32_t id, uint32_t type, uint32_t value, const void* data,
                        size_t length) {
  SendFunction send = ProcessRegistry::Instance().send.load();
  if (send == nullptr || (data == nullptr && length > 0)) return false;
  if (type != core::kProcessInput && length > kMaxPayloadBytes) return false;
  const char* bytes = static_cast<const char*>(data);
  std::vector<unsigned char> message;
  size_t offset = 0;
  do {
    size_t piece = std::min(length - offset, kMaxPayloadBytes);
    if (!SendOne(send, id, type, value, bytes + offset, piece, message)) return false;
    offset += piece;
  } while (offset < length);
  return true;
}

std::shared_ptr<client> StartProcess(const ProcessOptions& options) {
  auto process = std::make_shared<client>();
  if (options.arguments.empty()) {
    process->state = kStateFailed;
    return process;
  }
  if (!(options.flags & kFlagKeepInputAtWait) && EndsInPs1(options.arguments[0])) {
    process->endInputAtWait = true;
  }
  const std::string payload = BuildStartPayload(options);
  {
    // The start is sent under the registry lock, so that the host's answer,
    // which may come at once on another thread, finds the client registered.
    ProcessRegistry& registry = ProcessRegistry::Instance();
    std::lock_guard<std::mutex> lock(registry.lock);
    uint32_t id = 0;
    if (registry.closed || !NextFreeId(registry, id)) {
      SetState(*process, kStateFailed);
      return process;
    }
    process->id = id;
    if (!SendProcessMessage(id, core::kProcessStart, options.flags, payload.data(),
                            payload.size())) {
      SetState(*process, kStateFailed);
      return process;
    }
    registry.clients[id] = process;
  }
  AwaitStartAnswer(process, options.arguments[0]);
  return process;
}

bool ReadOutputLine(client& process, std::string& line, int channel) {
  if (channel != 0 && channel != 1) return false;
  std::unique_lock<std::mutex> lock(process.lock);
  std::string& buffer = channel == 0 ? process.standardOutput : process.standardError;
  for (;;) {
    std::string::size_type end = buffer.find('\n');
    if (end != std::string::npos) {
      line.assign(buffer, 0, end);
      buffer.erase(0, end + 1);
      return true;
    }
    if (process.state != kStateRunning) {
      if (buffer.empty()) return false;
      line.swap(buffer);
      buffer.clear();
      return true;
    }
    process.condition.wait(lock);
  }
}

void WaitForExit(client& process) {
  std::unique_lock<std::mutex> lock(process.lock);
  if (process.state == kStateRunning && process.endInputAtWait) {
    process.endInputAtWait = false;
    // Sent without the client's lock: the host may be delivering output for
    // this client meanwhile, which needs it.
    lock.unlock();
    SendProcessMessage(process.id, core::kProcessInput, 1, nullptr, 0);
    lock.lock();
  }
  process.condition.wait(lock, [&] { return process.state != kStateRunning; });
}

bool RunProcess(const std::vector<std::string>& arguments, const std::string& input,
                int32_t& exitCode, std::vector<std::string>& errorLines, std::string* output) {
  ProcessOptions options;
  options.arguments = arguments;
  std::shared_ptr<client> process = StartProcess(options);
  {
    std::lock_guard<std::mutex> lock(process->lock);
    if (process->state == kStateFailed) return false;
    process->endInputAtWait = false;
  }
  bool inputSent =
      SendProcessMessage(process->id, core::kProcessInput, 1, input.data(), input.size());
  // The host ends the program's input at a message shorter than the
  // maximum; input filling whole messages needs one more, empty.
  if (inputSent && !input.empty() && input.size() % kMaxPayloadBytes == 0) {
    inputSent = SendProcessMessage(process->id, core::kProcessInput, 1, nullptr, 0);
  }
  // Without its input the program would wait for the end of it, and its
  // caller with it, until Close: the run is given up unless it has ended.
  if (!inputSent && Abandon(process, [](int32_t state) { return state == kStateExited; })) {
    return false;
  }
  std::string line;
  while (ReadOutputLine(*process, line, 1)) errorLines.push_back(line);
  WaitForExit(*process);
  std::lock_guard<std::mutex> lock(process->lock);
  if (output != nullptr) output->swap(process->standardOutput);
  if (process->state != kStateExited) return false;
  exitCode = process->value;
  return true;
}

void SetStartAnswerTimeout(std::chrono::milliseconds timeout) {
  g_startAnswerTimeoutMs.store(std::max<int64_t>(timeout.count(), 0));
}

void SetLastProcessId(uint32_t id) {
  ProcessRegistry& registry = ProcessRegistry::Instance();
  std::lock_guard<std::mutex> lock(registry.lock);
  registry.lastId = id;
}

}  // namespace ipc
}  // namespace hx
