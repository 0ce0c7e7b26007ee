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

void ModuleHostTest::SetUp() {
  m_dir = std::make_unique<TempDir>();
  m_chdir = std::make_unique<ScopedChdir>(m_dir->path());
  m_options.modulePath = TestingModulePath();
  m_options.echoLog = getenv("ALERTMOD_TEST_ECHO_LOG") != nullptr;
}

void ModuleHostTest::TearDown() {
  if (m_host) {
    // A later host in this process must not find this test's Env; the
    // loaded module keeps the one it was given until Unload.
    if (m_host->Hook("InstallEnv") != nullptr) InstallEnv(nullptr);
    m_host->Stop();
  }
  m_host.reset();
  m_chdir.reset();
  m_dir.reset();
}

refhost::ReferenceHost& ModuleHostTest::CreateHost(uint32_t watchdogPeriodMs) {
  m_host = std::make_unique<refhost::ReferenceHost>(m_options);
  std::string error;
  EXPECT_TRUE(m_host->OpenLibrary(&error)) << error;
  if (watchdogPeriodMs != 0) m_clock.SetWatchdogPeriod(std::chrono::milliseconds(watchdogPeriodMs));
  InstallEnv(m_env);
  return *m_host;
}

void ModuleHostTest::InstallEnv(hx::platform::Env* env) {
  auto install = reinterpret_cast<testhooks::InstallEnvFn>(m_host->Hook("InstallEnv"));
  ASSERT_NE(install, nullptr);
  install(env);
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
