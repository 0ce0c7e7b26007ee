// The fixture of tests that drive the module through the reference host: a
// fresh working directory per test, the testing build of the module, and a
// clock the test advances by hand.
#ifndef ALERTMOD_TESTS_SUPPORT_HOST_FIXTURE_H_
#define ALERTMOD_TESTS_SUPPORT_HOST_FIXTURE_H_

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstdint>
#include <memory>
#include <string>

#include "alertmod/platform/testing/manual_env.h"
#include "host/reference_host.h"
#include "tests/support/temp_dir.h"

namespace testsupport {

// Paths of the modules built beside the tests.
std::string TestingModulePath();
std::string ProductionModulePath();

// Time as the module sees it, driven by the test. Lives for the whole process
// because the module keeps a pointer to it.
class ModuleHostTest : public ::testing::Test {
 protected:
  void SetUp() override;
  void TearDown() override;

  // The options of the host made by CreateHost(); tests may change them first.
  refhost::HostOptions& Options() { return m_options; }
  // Makes the host and opens the library, installing the test's Env (the
  // manual clock, or what UseEnv gave) with a watchdog period of
  // `watchdogPeriodMs` (0 keeps the default).
  refhost::ReferenceHost& CreateHost(uint32_t watchdogPeriodMs = 0);
  // CreateHost, then Load, Open and the lent threads. Fails the test on error.
  refhost::ReferenceHost& StartHost(uint32_t watchdogPeriodMs = 0);

  // Waits for a log line containing `fragment`.
  bool WaitForLog(const std::string& fragment,
                  std::chrono::milliseconds timeout = std::chrono::seconds(20));

  // Makes `env` the module's Env instead of the manual clock; call before
  // CreateHost. `env` normally wraps clock() and must outlive the host.
  void UseEnv(hx::platform::Env* env) { m_env = env; }

  refhost::ReferenceHost& host() { return *m_host; }
  // The module's clocks, which move only when the test moves them (from
  // 2026-01-01 00:00:00 UTC).
  hx::platform::ManualEnv& clock() { return m_clock; }
  const TempDir& dir() const { return *m_dir; }

 private:
  void InstallEnv(hx::platform::Env* env);

  refhost::HostOptions m_options;
  hx::platform::ManualEnv m_clock;
  hx::platform::Env* m_env = &m_clock;
  std::unique_ptr<TempDir> m_dir;
  std::unique_ptr<ScopedChdir> m_chdir;
  std::unique_ptr<refhost::ReferenceHost> m_host;
};

}  // namespace testsupport

#endif  // ALERTMOD_TESTS_SUPPORT_HOST_FIXTURE_H_
