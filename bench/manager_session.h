// A reference host with the testing module for benchmarks of the manager's
// host-side paths: a fresh working directory with the given "notify.xml", a
// worker that drops its items (so mail costs nothing and no queue grows), a
// tick the benchmark sets, and Write calls made inline on the host's
// dispatcher thread.
#ifndef ALERTMOD_BENCH_MANAGER_SESSION_H_
#define ALERTMOD_BENCH_MANAGER_SESSION_H_

#include <unistd.h>

#include <atomic>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>

#include "alertmod/platform/testing/manual_env.h"
#include "host/reference_host.h"
#include "tests/support/module_hooks.h"

namespace benchsupport {

class ManagerSession {
 public:
  // Starts the host; Ready() tells whether it worked.
  explicit ManagerSession(const std::string& notifyFile) {
    char pattern[] = "/tmp/alertmod-bench-XXXXXX";
    if (mkdtemp(pattern) == nullptr) return;
    m_dir = pattern;
    m_previous = std::filesystem::current_path();
    std::filesystem::current_path(m_dir);
    std::ofstream(m_dir + "/notify.xml") << notifyFile;
    refhost::HostOptions options;
    options.modulePath = ALERTMOD_TESTING_MODULE_PATH;
    options.echoLog = false;
    options.recordRequests = false;
    options.logThreshold = 50;  // the host keeps every line it is sent
    m_host = std::make_unique<refhost::ReferenceHost>(options);
    std::string error;
    if (!m_host->OpenLibrary(&error)) return;
    auto installEnv = reinterpret_cast<testhooks::InstallEnvFn>(m_host->Hook("InstallEnv"));
    if (installEnv == nullptr) return;
    installEnv(&m_env);
    if (!m_host->LoadModule(&error)) return;
    auto drop =
        reinterpret_cast<testhooks::SetWorkerDropsItemsFn>(m_host->Hook("SetWorkerDropsItems"));
    if (drop == nullptr || !drop()) return;
    m_host->OpenModule();
    m_host->LendThreads();
    m_ready = true;
  }
  ~ManagerSession() {
    if (m_host) {
      m_host->Stop();
      auto installEnv = reinterpret_cast<testhooks::InstallEnvFn>(m_host->Hook("InstallEnv"));
      if (installEnv != nullptr) installEnv(nullptr);
      m_host.reset();
    }
    if (!m_dir.empty()) {
      std::filesystem::current_path(m_previous);
      std::filesystem::remove_all(m_dir);
    }
  }

  bool Ready() const { return m_ready; }
  refhost::ReferenceHost& Host() { return *m_host; }
  void AdvanceTick(uint32_t ms) { m_env.Advance(std::chrono::milliseconds(ms)); }

  // Runs `body` on the dispatcher thread, where the host's Write calls go
  // straight into the module.
  template <typename Body>
  void OnDispatcher(Body body) {
    m_host->GetDispatcher().Call([&] {
      body();
      return 0;
    });
  }

 private:
  bool m_ready = false;
  std::string m_dir;
  std::filesystem::path m_previous;
  std::unique_ptr<refhost::ReferenceHost> m_host;
  hx::platform::ManualEnv m_env;
};

}  // namespace benchsupport

#endif  // ALERTMOD_BENCH_MANAGER_SESSION_H_
