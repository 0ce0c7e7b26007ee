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

#include "host/reference_host.h"
#include "tests/support/temp_dir.h"

namespace testsupport {

// Paths of the modules built beside the tests.
std::string TestingModulePath();
std::string ProductionModulePath();

// Time as the module sees it, driven by the test. Lives for the whole process
// because the module keeps a pointer to it.
class FakeClock {
 public:
  static FakeClock& Instance();

  // Points the module's clocks at this one; needs the library opened.
  void Install(refhost::ReferenceHost& host);
  void Reset(uint32_t tickMs, int64_t wallSeconds);
  // Moves the tick and the wall clock forward together.
  void Advance(std::chrono::milliseconds step);
  void SetTick(uint32_t tickMs) { m_tickMs.store(tickMs); }

  uint32_t TickMs() const { return m_tickMs.load(); }
  int64_t WallSeconds() const { return m_wallMs.load() / 1000; }

 private:
  FakeClock() = default;
  std::atomic<uint32_t> m_tickMs{0};
  std::atomic<int64_t> m_wallMs{0};
};

class ModuleHostTest : public ::testing::Test {
 protected:
  void SetUp() override;
  void TearDown() override;

  // The options of the host made by CreateHost(); tests may change them first.
  refhost::HostOptions& Options() { return m_options; }
  // Makes the host and opens the library, installing the fake clock and a
  // watchdog period of `watchdogPeriodMs` (0 keeps the default).
  refhost::ReferenceHost& CreateHost(uint32_t watchdogPeriodMs = 0);
  // CreateHost, then Load, Open and the lent threads. Fails the test on error.
  refhost::ReferenceHost& StartHost(uint32_t watchdogPeriodMs = 0);

  // Waits for a log line containing `fragment`.
  bool WaitForLog(const std::string& fragment,
                  std::chrono::milliseconds timeout = std::chrono::seconds(20));

  refhost::ReferenceHost& host() { return *m_host; }
  FakeClock& clock() { return FakeClock::Instance(); }
  const TempDir& dir() const { return *m_dir; }

 private:
  refhost::HostOptions m_options;
  std::unique_ptr<TempDir> m_dir;
  std::unique_ptr<ScopedChdir> m_chdir;
  std::unique_ptr<refhost::ReferenceHost> m_host;
};

}  // namespace testsupport

#endif  // ALERTMOD_TESTS_SUPPORT_HOST_FIXTURE_H_
