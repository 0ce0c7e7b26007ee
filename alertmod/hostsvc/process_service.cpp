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

  Mutex lock;
  std::map<uint32_t, std::shared_ptr<client>> clients GUARDED_BY(lock);
  bool closed GUARDED_BY(lock) = false;
  uint32_t lastId GUARDED_BY(lock) = 0;
  uint32_t moduleId GUARDED_BY(lock) = 0;
  std::chrono::milliseconds startAnswerTimeout GUARDED_BY(lock) =
      platform::kDefaultProcessStartTimeout;
  std::atomic<SendFunction> send{nullptr};
  std::atomic<core::HostCallbackFn> logTo{nullptr};

 private:
  ProcessRegistry() = default;
};

// Every value of the counter is tried once before a start gives up.
constexpr uint32_t kCounterAttempts = kIdCounterMask + 1;

constexpr size_t kMaxPayloadBytes = core::kProcessMessageMaxBytes - core::kProcessHeaderBytes;

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

// Chooses the next id not in use. False when every id is taken.
bool NextFreeId(ProcessRegistry& registry, uint32_t& id) REQUIRES(registry.lock) {
  for (uint32_t attempt = 0; attempt < kCounterAttempts; ++attempt) {
    id = ((registry.lastId + 1) & kIdCounterMask) | (registry.moduleId << 4);
    registry.lastId = id;
    if (registry.clients.count(id) == 0) return true;
  }
  return false;
}

// Gives up a run: the id is forgotten, so that anything the host still sends
// for it is dropped, and the run counts as failed. Returns false, changing
// nothing, when the run has reached `settled` meanwhile and its result
// stands.
bool Abandon(const std::shared_ptr<client>& process, bool (*settled)(int32_t state)) {
  ProcessRegistry& registry = ProcessRegistry::Instance();
  // The registry lock is held throughout, so that no message of the host
  // reaches the run between the two steps.
  MutexLock lock(registry.lock);
  if (!process->FailUnless(settled)) return false;
  auto found = registry.clients.find(process->Id());
  if (found != registry.clients.end() && found->second == process) registry.clients.erase(found);
  return true;
}

bool IsAnswered(int32_t state) {
  return state != kStateStarting;
}

bool IsExited(int32_t state) {
  return state == kStateExited;
}

bool HasEnded(int32_t state) {
  return state == kStateExited || state == kStateFailed;
}

// Waits for the host's answer to the start of `process`. A host that takes
// the start and never answers would hold the caller (Open's probe, the
// worker's delivery) for ever; past the time-out the run counts as not
// started. An answer that comes in while it is given up still counts.
void AwaitStartAnswer(const std::shared_ptr<client>& process, const std::string& program) {
  ProcessRegistry& registry = ProcessRegistry::Instance();
  uint32_t moduleId = 0;
  std::chrono::milliseconds timeout{0};
  {
    MutexLock lock(registry.lock);
    moduleId = registry.moduleId;
    timeout = registry.startAnswerTimeout;
  }
  if (process->WaitWhileIn(kStateStarting, timeout)) return;
  if (!Abandon(process, IsAnswered)) return;
  LogToHost(moduleId, registry.logTo.load(), LogLevelError,
            "The host did not answer the start of %s within %lld ms. The program counts as not "
            "started.",
            program.c_str(), static_cast<long long>(timeout.count()));
}

}  // namespace

int32_t client::State() const {
  MutexLock lock(m_lock);
  return m_state;
}

uint32_t client::Id() const {
  MutexLock lock(m_lock);
  return m_id;
}

int32_t client::Value() const {
  MutexLock lock(m_lock);
  return m_value;
}

bool client::EndsInputAtWait() const {
  MutexLock lock(m_lock);
  return m_endInputAtWait;
}

void client::SetState(int32_t state) {
  MutexLock lock(m_lock);
  m_state = state;
}

void client::SetId(uint32_t id) {
  MutexLock lock(m_lock);
  m_id = id;
}

void client::SetEndInputAtWait(bool end) {
  MutexLock lock(m_lock);
  m_endInputAtWait = end;
}

bool client::Apply(uint32_t type, int32_t value, const char* payload, size_t length) {
  MutexLock lock(m_lock);
  bool ended = false;
  switch (type) {
    case core::kProcessOutput:
      AppendOutput(m_standardOutput, payload, length);
      break;
    case core::kProcessErrorOutput:
      AppendOutput(m_standardError, payload, length);
      break;
    case core::kProcessRunning:
      m_value = value;
      m_state = kStateRunning;
      break;
    default:  // failed or exited
      m_value = value;
      m_state = type == core::kProcessFailed ? kStateFailed : kStateExited;
      ended = true;
      break;
  }
  m_changed.NotifyAll();
  return ended;
}

bool client::FailUnless(bool (*settled)(int32_t state)) {
  MutexLock lock(m_lock);
  if (settled(m_state)) return false;
  m_state = kStateFailed;
  m_changed.NotifyAll();
  return true;
}

bool client::WaitWhileIn(int32_t state, std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  MutexLock lock(m_lock);
  while (m_state == state && m_changed.WaitUntil(m_lock, deadline)) {
  }
  return m_state != state;
}

bool client::ReadLine(std::string& line, int channel) {
  MutexLock lock(m_lock);
  std::string& buffer = channel == 0 ? m_standardOutput : m_standardError;
  for (;;) {
    std::string::size_type end = buffer.find('\n');
    if (end != std::string::npos) {
      line.assign(buffer, 0, end);
      buffer.erase(0, end + 1);
      return true;
    }
    if (m_state != kStateRunning) {
      if (buffer.empty()) return false;
      line.swap(buffer);
      buffer.clear();
      return true;
    }
    m_changed.Wait(m_lock);
  }
}

bool client::TakeEndInputAtWait() {
  MutexLock lock(m_lock);
  const bool take = m_state == kStateRunning && m_endInputAtWait;
  if (take) m_endInputAtWait = false;
  return take;
}

void client::WaitUntilNotRunning() {
  MutexLock lock(m_lock);
  while (m_state == kStateRunning) m_changed.Wait(m_lock);
}

bool client::TakeResult(int32_t& exitCode, std::string* output) {
  MutexLock lock(m_lock);
  if (output != nullptr) output->swap(m_standardOutput);
  if (m_state != kStateExited) return false;
  exitCode = m_value;
  return true;
}

void RegisterProcessService(uint32_t moduleId, SendFunction send, core::HostCallbackFn logTo,
                            platform::Env& env) {
  ProcessRegistry& registry = ProcessRegistry::Instance();
  MutexLock lock(registry.lock);
  registry.moduleId = moduleId;
  registry.startAnswerTimeout = std::max(env.ProcessStartTimeout(), std::chrono::milliseconds(0));
  // The counter otherwise goes on from where the last run left it, so that
  // ids of an earlier run that the host may still hold are not reissued at
  // once.
  if (uint32_t counter = env.InitialProcessIdCounter()) registry.lastId = counter;
  registry.send.store(send);
  registry.logTo.store(logTo);
  registry.closed = false;
}

void ShutdownProcessService(bool closed) {
  ProcessRegistry& registry = ProcessRegistry::Instance();
  MutexLock lock(registry.lock);
  for (auto& entry : registry.clients) {
    // A run cut off here has no exit code; reporting 0 would read as
    // success to a caller that then discards what the program was for.
    entry.second->FailUnless(HasEnded);
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
  MutexLock lock(registry.lock);
  auto found = registry.clients.find(header.id);
  if (found == registry.clients.end()) return 0;
  // An ended run's id is free again.
  if (found->second->Apply(header.type, value, payload, payloadLength)) {
    registry.clients.erase(found);
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
    process->SetState(kStateFailed);
    return process;
  }
  if (!(options.flags & kFlagKeepInputAtWait) && EndsInPs1(options.arguments[0])) {
    process->SetEndInputAtWait(true);
  }
  const std::string payload = BuildStartPayload(options);
  {
    // The start is sent under the registry lock, so that the host's answer,
    // which may come at once on another thread, finds the client registered.
    ProcessRegistry& registry = ProcessRegistry::Instance();
    MutexLock lock(registry.lock);
    uint32_t id = 0;
    if (registry.closed || !NextFreeId(registry, id)) {
      process->SetState(kStateFailed);
      return process;
    }
    process->SetId(id);
    if (!SendProcessMessage(id, core::kProcessStart, options.flags, payload.data(),
                            payload.size())) {
      process->SetState(kStateFailed);
      return process;
    }
    registry.clients[id] = process;
  }
  AwaitStartAnswer(process, options.arguments[0]);
  return process;
}

bool ReadOutputLine(client& process, std::string& line, int channel) {
  if (channel != 0 && channel != 1) return false;
  return process.ReadLine(line, channel);
}

void WaitForExit(client& process) {
  // Sent without the client's lock: the host may be delivering output for
  // this client meanwhile, which needs it.
  if (process.TakeEndInputAtWait()) {
    SendProcessMessage(process.Id(), core::kProcessInput, 1, nullptr, 0);
  }
  process.WaitUntilNotRunning();
}

bool RunProcess(const std::vector<std::string>& arguments, const std::string& input,
                int32_t& exitCode, std::vector<std::string>& errorLines, std::string* output) {
  ProcessOptions options;
  options.arguments = arguments;
  std::shared_ptr<client> process = StartProcess(options);
  if (process->State() == kStateFailed) return false;
  process->SetEndInputAtWait(false);
  bool inputSent =
      SendProcessMessage(process->Id(), core::kProcessInput, 1, input.data(), input.size());
  // The host ends the program's input at a message shorter than the
  // maximum; input filling whole messages needs one more, empty.
  if (inputSent && !input.empty() && input.size() % kMaxPayloadBytes == 0) {
    inputSent = SendProcessMessage(process->Id(), core::kProcessInput, 1, nullptr, 0);
  }
  // Without its input the program would wait for the end of it, and its
  // caller with it, until Close: the run is given up unless it has ended.
  if (!inputSent && Abandon(process, IsExited)) {
    return false;
  }
  std::string line;
  while (ReadOutputLine(*process, line, 1)) errorLines.push_back(line);
  WaitForExit(*process);
  return process->TakeResult(exitCode, output);
}

}  // namespace ipc
}  // namespace hx
