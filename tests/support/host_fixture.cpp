#include "tests/support/host_fixture.h"

#include <thread>

#include "tests/support/module_hooks.h"

namespace testsupport {

std::string TestingModulePath() {
  return ALERTMOD_TESTING_MODULE_PATH;
}
std::string ProductionModulePath() {
  return ALERTMOD_MODULE_PATH;
}

FakeClock& FakeClock::Instance() {
  static FakeClock* clock = new FakeClock();
  return *clock;
}

void FakeClock::Install(refhost::ReferenceHost& host) {
  auto setTick = reinterpret_cast<testhooks::SetTickSourceFn>(host.Hook("SetTickSource"));
  auto setWall = reinterpret_cast<testhooks::SetWallSourceFn>(host.Hook("SetWallSource"));
  ASSERT_NE(setTick, nullptr);
  ASSERT_NE(setWall, nullptr);
  setTick([](void* c) { return static_cast<FakeClock*>(c)->TickMs(); }, this);
  setWall([](void* c) { return static_cast<FakeClock*>(c)->WallSeconds(); }, this);
}

void FakeClock::Reset(uint32_t tickMs, int64_t wallSeconds) {
  m_tickMs.store(tickMs);
  m_wallMs.store(wallSeconds * 1000);
}

void FakeClock::Advance(std::chrono::milliseconds step) {
  m_tickMs.fetch_add(static_cast<uint32_t>(step.count()));
  m_wallMs.fetch_add(step.count());
}

void ModuleHostTest::SetUp() {
  m_dir = std::make_unique<TempDir>();
  m_chdir = std::make_unique<ScopedChdir>(m_dir->path());
  m_options.modulePath = TestingModulePath();
  m_options.echoLog = getenv("ALERTMOD_TEST_ECHO_LOG") != nullptr;
  FakeClock::Instance().Reset(0x10000, 1767225600);  // 2026-01-01 00:00:00 UTC
}

void ModuleHostTest::TearDown() {
  if (m_host) m_host->Stop();
  m_host.reset();
  m_chdir.reset();
  m_dir.reset();
}

refhost::ReferenceHost& ModuleHostTest::CreateHost(uint32_t watchdogPeriodMs) {
  m_host = std::make_unique<refhost::ReferenceHost>(m_options);
  std::string error;
  EXPECT_TRUE(m_host->OpenLibrary(&error)) << error;
  FakeClock::Instance().Install(*m_host);
  auto setPeriod =
      reinterpret_cast<testhooks::SetWatchdogPeriodMsFn>(m_host->Hook("SetWatchdogPeriodMs"));
  EXPECT_NE(setPeriod, nullptr);
  if (setPeriod != nullptr) setPeriod(watchdogPeriodMs == 0 ? 10000 : watchdogPeriodMs);
  return *m_host;
}

refhost::ReferenceHost& ModuleHostTest::StartHost(uint32_t watchdogPeriodMs) {
  CreateHost(watchdogPeriodMs);
  std::string error;
  EXPECT_TRUE(m_host->Start(&error)) << error;
  return *m_host;
}

bool ModuleHostTest::WaitForLog(const std::string& fragment, std::chrono::milliseconds timeout) {
  return m_host->Requests().WaitFor([&](const auto&) { return m_host->Log().Contains(fragment); },
                                    timeout);
}

}  // namespace testsupport

#if defined(__has_feature)
#if __has_feature(thread_sanitizer)
// libstdc++ fills the narrow() cache of std::ctype<char> lazily and without
// a lock: the first use of a character by std::regex (the module's address
// reader on the worker, a test's own patterns on the test thread) writes the
// byte that another thread may be reading, always with the same value. The
// library is not built for the sanitizer, so only this inline cache shows.
extern "C" const char* __tsan_default_suppressions() {
  return "race:std::ctype<char>::narrow\n";
}
#endif
#endif
