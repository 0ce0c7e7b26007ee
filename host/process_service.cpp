#include "host/process_service.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/eventfd.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <thread>

extern char** environ;

namespace refhost {

namespace core = hx::core;

namespace {

constexpr size_t kMaxPayloadBytes = core::kProcessMessageMaxBytes - core::kProcessHeaderBytes;
// Reads of output left in the pipes after the program ended; bounds the
// drain when a leftover child of the program keeps writing.
constexpr int kMaxDrainReads = 64;

void CloseFd(int& fd) {
  if (fd >= 0) close(fd);
  fd = -1;
}

// The words of a start payload: optional texts (by flag), then the program
// and its arguments. Empty when there is no program.
std::vector<std::string> ParseStartCommand(uint32_t flags, const char* payload, size_t length) {
  std::vector<std::string> words;
  size_t begin = 0;
  for (size_t i = 0; i <= length; ++i) {
    if (i == length || payload[i] == '\0') {
      words.emplace_back(payload + begin, i - begin);
      begin = i + 1;
    }
  }
  size_t skipped = ((flags & core::kProcessFlagFirstText) ? 1 : 0) +
                   ((flags & core::kProcessFlagSecondText) ? 1 : 0);
  if (words.size() <= skipped || words[skipped].empty()) return {};
  return std::vector<std::string>(words.begin() + skipped, words.end());
}

// Starts `arguments` in a process group of its own, with `childFds` as its
// standard input, output and error and every other descriptor closed.
// Returns 0 or the error number of the failed start.
int Spawn(std::vector<std::string>& arguments, const int childFds[3], pid_t& pid) {
  std::vector<char*> argv;
  for (std::string& argument : arguments) argv.push_back(argument.data());
  argv.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  for (int i = 0; i < 3; ++i) posix_spawn_file_actions_adddup2(&actions, childFds[i], i);
  posix_spawn_file_actions_addclosefrom_np(&actions, 3);
  posix_spawnattr_t attributes;
  posix_spawnattr_init(&attributes);
  posix_spawnattr_setpgroup(&attributes, 0);
  sigset_t signals;
  sigemptyset(&signals);
  posix_spawnattr_setsigmask(&attributes, &signals);
  // The host's threads block or ignore signals the program expects to have.
  sigfillset(&signals);
  posix_spawnattr_setsigdefault(&attributes, &signals);
  posix_spawnattr_setflags(&attributes,
                           POSIX_SPAWN_SETPGROUP | POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
  int error = posix_spawnp(&pid, argv[0], &actions, &attributes, argv.data(), environ);
  posix_spawnattr_destroy(&attributes);
  posix_spawn_file_actions_destroy(&actions);
  return error;
}

void SetNonBlocking(int fd) {
  fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK);
}

// A write into a pipe whose reader is gone raises SIGPIPE in the writing
// thread; run threads block it and take the write's EPIPE instead.
void BlockBrokenPipeSignal() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGPIPE);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

void DiscardBrokenPipeSignal() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGPIPE);
  timespec none{};
  sigtimedwait(&signals, nullptr, &none);
}

int32_t ExitValue(int status) {
  if (WIFEXITED(status)) return WEXITSTATUS(status);
  if (WIFSIGNALED(status)) return 128 + WTERMSIG(status);
  return -1;
}

}  // namespace

struct ProcessService::Run {
  explicit Run(uint32_t runId) : id(runId) {}
  ~Run() {
    CloseFd(pidFd);
    CloseFd(wakeFd);
    CloseFd(stdinFd);
    CloseFd(stdoutFd);
    CloseFd(stderrFd);
  }

  const uint32_t id;
  pid_t pid = -1;
  int spawnError = 0;
  int pidFd = -1;   // readable once the program has ended
  int wakeFd = -1;  // signalled when input arrives
  int stdoutFd = -1;
  int stderrFd = -1;
  std::thread thread;
  std::atomic<bool> done{false};
  Mutex mutex;
  int stdinFd GUARDED_BY(mutex) = -1;
  // Taken from the module, not yet written to the program.
  std::string input GUARDED_BY(mutex);
  bool inputEnded GUARDED_BY(mutex) = false;
  bool reaped GUARDED_BY(mutex) = false;
};

ProcessService::ProcessService(std::string transferTool, DeliverFn deliver)
    : m_transferTool(std::move(transferTool)), m_deliver(std::move(deliver)) {}

ProcessService::~ProcessService() {
  Stop();
}

int32_t ProcessService::Handle(core::HostRequest& request) {
  if (request.data == nullptr || request.length < core::kProcessHeaderBytes ||
      request.length > core::kProcessMessageMaxBytes) {
    return -1;
  }
  core::ProcessMessageHeader header;
  memcpy(&header, request.data, sizeof(header));
  if (header.length != request.length) return -1;
  const char* payload = static_cast<const char*>(request.data) + core::kProcessHeaderBytes;
  size_t payloadLength = request.length - core::kProcessHeaderBytes;
  if (header.type == core::kProcessStart) {
    return Start(header.id, header.value, payload, payloadLength);
  }
  if (header.type == core::kProcessInput) {
    return Input(header.id, payload, payloadLength, request.length < core::kProcessMessageMaxBytes);
  }
  return -1;
}

int32_t ProcessService::Start(uint32_t id, uint32_t flags, const char* payload, size_t length) {
  ReapFinishedRuns();
  std::vector<std::string> arguments = ParseStartCommand(flags, payload, length);
  if (arguments.empty()) return -1;
  if (arguments[0] == kTransferToolName) arguments[0] = m_transferTool;

  MutexLock lock(m_mutex);
  if (m_stopping.load() || m_running.count(id) != 0) return -1;
  auto run = std::make_shared<Run>(id);
  Launch(*run, arguments);
  if (run->spawnError == 0) m_running[id] = run;
  m_runs.push_back(run);
  run->thread = std::thread([this, run] { Pump(run); });
  return 0;
}

void ProcessService::Launch(Run& run, std::vector<std::string>& arguments) {
  int pipes[3][2] = {{-1, -1}, {-1, -1}, {-1, -1}};
  for (auto& pipe : pipes) {
    if (pipe2(pipe, O_CLOEXEC) != 0 && run.spawnError == 0) run.spawnError = errno;
  }
  run.wakeFd = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  if (run.wakeFd < 0 && run.spawnError == 0) run.spawnError = errno;
  const int childFds[3] = {pipes[0][0], pipes[1][1], pipes[2][1]};
  if (run.spawnError == 0) run.spawnError = Spawn(arguments, childFds, run.pid);
  // The program has its own copies of its ends.
  CloseFd(pipes[0][0]);
  CloseFd(pipes[1][1]);
  CloseFd(pipes[2][1]);
  {
    MutexLock lock(run.mutex);
    run.stdinFd = pipes[0][1];
  }
  run.stdoutFd = pipes[1][0];
  run.stderrFd = pipes[2][0];
  // Without a process descriptor the run ends when both outputs close.
  if (run.spawnError == 0) run.pidFd = static_cast<int>(syscall(SYS_pidfd_open, run.pid, 0));
}

int32_t ProcessService::Input(uint32_t id, const char* payload, size_t length, bool last) {
  std::shared_ptr<Run> run;
  {
    MutexLock lock(m_mutex);
    auto found = m_running.find(id);
    if (found == m_running.end()) return 0;
    run = found->second;
  }
  {
    MutexLock lock(run->mutex);
    if (run->inputEnded) return 0;
    run->input.append(payload, length);
    run->inputEnded = last;
  }
  uint64_t one = 1;
  ssize_t ignored = write(run->wakeFd, &one, sizeof(one));
  (void)ignored;
  return 0;
}

void ProcessService::FeedInput(Run& run) {
  MutexLock lock(run.mutex);
  while (!run.input.empty() && run.stdinFd >= 0) {
    ssize_t n = write(run.stdinFd, run.input.data(), run.input.size());
    if (n > 0) {
      run.input.erase(0, static_cast<size_t>(n));
    } else if (n < 0 && errno == EINTR) {
      continue;
    } else if (n < 0 && errno == EAGAIN) {
      return;
    } else {
      // The program stopped reading: what it did not take is dropped.
      if (n < 0 && errno == EPIPE) DiscardBrokenPipeSignal();
      CloseFd(run.stdinFd);
      run.input.clear();
    }
  }
  if (run.input.empty() && run.inputEnded) CloseFd(run.stdinFd);
}

bool ProcessService::ForwardOutput(Run& run, int& fd, uint32_t type) {
  char buffer[kMaxPayloadBytes];
  ssize_t n = read(fd, buffer, sizeof(buffer));
  if (n > 0) {
    Deliver(run.id, type, 0, buffer, static_cast<size_t>(n));
    return true;
  }
  if (n == 0 || (errno != EAGAIN && errno != EINTR)) CloseFd(fd);
  return false;
}

// Waits for input to feed, output to forward and the end of the program.
// Without a process descriptor the end is seen when both outputs close.
void ProcessService::PumpUntilExit(Run& run) {
  for (;;) {
    int pendingInputFd = -1;
    {
      MutexLock lock(run.mutex);
      if (!run.input.empty()) pendingInputFd = run.stdinFd;
    }
    pollfd fds[5] = {{run.pidFd, POLLIN, 0},
                     {run.wakeFd, POLLIN, 0},
                     {run.stdoutFd, POLLIN, 0},
                     {run.stderrFd, POLLIN, 0},
                     {pendingInputFd, POLLOUT, 0}};
    if (poll(fds, 5, -1) < 0 && errno != EINTR) return;
    if (fds[1].revents != 0) {
      uint64_t count = 0;
      ssize_t ignored = read(run.wakeFd, &count, sizeof(count));
      (void)ignored;
    }
    FeedInput(run);
    if (fds[2].revents != 0) ForwardOutput(run, run.stdoutFd, core::kProcessOutput);
    if (fds[3].revents != 0) ForwardOutput(run, run.stderrFd, core::kProcessErrorOutput);
    if (fds[0].revents != 0) return;
    if (run.pidFd < 0 && run.stdoutFd < 0 && run.stderrFd < 0) return;
  }
}

void ProcessService::Pump(const std::shared_ptr<Run>& run) {
  if (run->spawnError != 0) {
    Finish(run, core::kProcessFailed, run->spawnError);
    return;
  }
  BlockBrokenPipeSignal();
  {
    MutexLock lock(run->mutex);
    SetNonBlocking(run->stdinFd);
  }
  SetNonBlocking(run->stdoutFd);
  SetNonBlocking(run->stderrFd);
  Deliver(run->id, core::kProcessRunning, run->pid, nullptr, 0);
  PumpUntilExit(*run);
  // Children the program left behind would keep its pipes open and outlive
  // the run. The program itself is not reaped yet, so its group id cannot
  // name anyone else.
  if (run->pidFd >= 0) kill(-run->pid, SIGKILL);
  // The program's last output is still in the pipes.
  for (int i = 0; i < kMaxDrainReads && run->stdoutFd >= 0; ++i) {
    if (!ForwardOutput(*run, run->stdoutFd, core::kProcessOutput)) break;
  }
  for (int i = 0; i < kMaxDrainReads && run->stderrFd >= 0; ++i) {
    if (!ForwardOutput(*run, run->stderrFd, core::kProcessErrorOutput)) break;
  }
  int status = 0;
  {
    MutexLock lock(run->mutex);
    while (waitpid(run->pid, &status, 0) < 0 && errno == EINTR) {
    }
    run->reaped = true;
    CloseFd(run->stdinFd);
  }
  Finish(run, core::kProcessExited, ExitValue(status));
}

void ProcessService::Finish(const std::shared_ptr<Run>& run, uint32_t type, int32_t value) {
  {
    // Forgotten before the module hears of the end, so that the id is free
    // again when the module reuses it.
    MutexLock lock(m_mutex);
    auto found = m_running.find(run->id);
    if (found != m_running.end() && found->second == run) m_running.erase(found);
  }
  Deliver(run->id, type, value, nullptr, 0);
  run->done.store(true);
}

void ProcessService::Deliver(uint32_t id, uint32_t type, int32_t value, const char* payload,
                             size_t length) {
  if (m_stopping.load()) return;
  std::vector<char> message(core::kProcessHeaderBytes + length);
  const core::ProcessMessageHeader header{static_cast<uint32_t>(message.size()), id, type,
                                          static_cast<uint32_t>(value)};
  memcpy(message.data(), &header, sizeof(header));
  if (length > 0) memcpy(message.data() + core::kProcessHeaderBytes, payload, length);
  m_deliver(message.data(), static_cast<uint32_t>(message.size()));
}

void ProcessService::ReapFinishedRuns() {
  std::vector<std::shared_ptr<Run>> finished;
  {
    MutexLock lock(m_mutex);
    for (auto it = m_runs.begin(); it != m_runs.end();) {
      if ((*it)->done.load()) {
        finished.push_back(*it);
        it = m_runs.erase(it);
      } else {
        ++it;
      }
    }
  }
  for (auto& run : finished) run->thread.join();
}

void ProcessService::Stop() {
  std::vector<std::shared_ptr<Run>> runs;
  {
    MutexLock lock(m_mutex);
    m_stopping.store(true);
    for (auto& entry : m_running) {
      Run& run = *entry.second;
      MutexLock runLock(run.mutex);
      // Until it is reaped the program's id cannot name another process.
      if (!run.reaped) kill(-run.pid, SIGKILL);
    }
    runs.swap(m_runs);
  }
  for (auto& run : runs) {
    if (run->thread.joinable()) run->thread.join();
  }
  m_stopping.store(false);
}

size_t ProcessService::ActiveRuns() {
  ReapFinishedRuns();
  MutexLock lock(m_mutex);
  return m_runs.size();
}

}  // namespace refhost
