// One short program run through the reference host's process service and the
// module's client (start, 100 bytes of input, its output and exit, every
// message delivered), against spawning and reaping the same program directly.
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <memory>
#include <string>
#include <vector>

#include "host/reference_host.h"
#include "tests/support/module_hooks.h"
#include "tests/support/temp_dir.h"

extern char** environ;

namespace {

const std::string kInput(100, 'x');

// A host with the testing module started in a fresh working directory.
class HostSession {
 public:
  HostSession() : m_chdir(m_dir.path()) {
    refhost::HostOptions options;
    options.modulePath = ALERTMOD_TESTING_MODULE_PATH;
    options.echoLog = false;
    options.recordRequests = false;
    m_host = std::make_unique<refhost::ReferenceHost>(options);
    std::string error;
    if (m_host->Start(&error)) {
      m_run = reinterpret_cast<testhooks::RunProcessFn>(m_host->Hook("RunProcess"));
    }
  }
  testhooks::RunProcessFn run() const { return m_run; }

 private:
  // Destroyed in reverse: the host stops before the directory goes.
  testsupport::TempDir m_dir;
  testsupport::ScopedChdir m_chdir;
  std::unique_ptr<refhost::ReferenceHost> m_host;
  testhooks::RunProcessFn m_run = nullptr;
};

void BM_HostRoundTrip(benchmark::State& state) {
  HostSession session;
  if (session.run() == nullptr) {
    state.SkipWithError("the host did not start the testing module");
    return;
  }
  const std::vector<std::string> arguments = {"/bin/cat"};
  for (auto _ : state) {
    testhooks::ProcessRunResult result;
    session.run()(arguments, kInput, result);
    if (!result.ran || result.output != kInput) state.SkipWithError("wrong round trip");
    benchmark::DoNotOptimize(result);
  }
}
BENCHMARK(BM_HostRoundTrip)->Unit(benchmark::kMicrosecond)->UseRealTime();

// The baseline: the same program with pipes, spawned and reaped directly.
std::string SpawnAndWait(const std::string& input) {
  int in[2], out[2];
  if (pipe2(in, O_CLOEXEC) != 0 || pipe2(out, O_CLOEXEC) != 0) return "";
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, in[0], 0);
  posix_spawn_file_actions_adddup2(&actions, out[1], 1);
  char program[] = "/bin/cat";
  char* argv[] = {program, nullptr};
  pid_t pid = -1;
  int error = posix_spawn(&pid, program, &actions, nullptr, argv, environ);
  posix_spawn_file_actions_destroy(&actions);
  close(in[0]);
  close(out[1]);
  std::string output;
  if (error == 0) {
    ssize_t ignored = write(in[1], input.data(), input.size());
    (void)ignored;
    close(in[1]);
    char buffer[4096];
    for (ssize_t n; (n = read(out[0], buffer, sizeof(buffer))) > 0;) output.append(buffer, n);
    waitpid(pid, nullptr, 0);
  } else {
    close(in[1]);
  }
  close(out[0]);
  return output;
}

void BM_DirectSpawnAndWait(benchmark::State& state) {
  for (auto _ : state) {
    std::string output = SpawnAndWait(kInput);
    if (output != kInput) state.SkipWithError("wrong round trip");
    benchmark::DoNotOptimize(output);
  }
}
BENCHMARK(BM_DirectSpawnAndWait)->Unit(benchmark::kMicrosecond)->UseRealTime();

}  // namespace

BENCHMARK_MAIN();
