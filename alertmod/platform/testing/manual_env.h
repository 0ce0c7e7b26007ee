// ManualEnv: the Env of tests. Its clocks move only when the test moves them,
// its time limits are what the test sets, and everything else goes to the
// system's Env (or another target).
//
// Any thread may read it while the test thread moves it: every field is
// atomic, and the tick and the wall clock are each read whole.
#ifndef ALERTMOD_PLATFORM_TESTING_MANUAL_ENV_H_
#define ALERTMOD_PLATFORM_TESTING_MANUAL_ENV_H_

#include <atomic>
#include <chrono>
#include <cstdint>
#include <memory>
#include <string>

#include "alertmod/platform/env.h"

namespace hx {
namespace platform {

// The system's Env, made once for the whole test program.
inline Env* SystemEnvForTests() {
  static const std::unique_ptr<Env> env = NewSystemEnv();
  return env.get();
}

class ManualEnv : public EnvWrapper {
 public:
  // 2026-01-01 00:00:00 UTC, and a tick far from its wrap.
  static constexpr uint32_t kStartTickMs = 0x10000;
  static constexpr int64_t kStartWallSeconds = 1767225600;

  explicit ManualEnv(Env* target = SystemEnvForTests()) : EnvWrapper(target) {}

  // Sets both clocks.
  void Reset(uint32_t tickMs, int64_t wallSeconds) {
    m_tickMs.store(tickMs);
    m_wallMs.store(wallSeconds * 1000);
  }
  // Moves the tick and the wall clock forward together.
  void Advance(std::chrono::milliseconds step) {
    m_tickMs.fetch_add(static_cast<uint32_t>(step.count()));
    m_wallMs.fetch_add(step.count());
  }
  void SetTick(uint32_t tickMs) { m_tickMs.store(tickMs); }

  void SetWatchdogPeriod(std::chrono::milliseconds period) { m_watchdogMs.store(period.count()); }
  void SetWebExchangeTimeout(std::chrono::milliseconds timeout) { m_webMs.store(timeout.count()); }
  void SetProcessStartTimeout(std::chrono::milliseconds timeout) {
    m_startMs.store(timeout.count());
  }
  void SetInitialProcessIdCounter(uint32_t counter) { m_processIdCounter.store(counter); }

  // Every volume reports `bytes` free from now on, instead of what the
  // target says.
  void SetFreeBytes(uint64_t bytes) {
    m_freeBytes.store(bytes);
    m_freeBytesSet.store(true);
  }
  // Makes every free-space query fail (or work again).
  void FailFreeBytesQueries(bool fail) { m_freeBytesFail.store(fail); }

  uint32_t TickMs() override { return m_tickMs.load(); }
  int64_t WallSeconds() override { return m_wallMs.load() / 1000; }
  std::chrono::milliseconds WatchdogPeriod() override {
    return std::chrono::milliseconds(m_watchdogMs.load());
  }
  std::chrono::milliseconds WebExchangeTimeout() override {
    return std::chrono::milliseconds(m_webMs.load());
  }
  std::chrono::milliseconds ProcessStartTimeout() override {
    return std::chrono::milliseconds(m_startMs.load());
  }
  uint32_t InitialProcessIdCounter() override { return m_processIdCounter.load(); }
  Status FreeBytes(const std::string& directory, uint64_t* bytes) override {
    if (m_freeBytesFail.load()) return Status::Failure("the test's volume cannot be queried");
    if (!m_freeBytesSet.load()) return EnvWrapper::FreeBytes(directory, bytes);
    *bytes = m_freeBytes.load();
    return Status::OK();
  }

 private:
  std::atomic<uint32_t> m_tickMs{kStartTickMs};
  std::atomic<int64_t> m_wallMs{kStartWallSeconds * 1000};
  std::atomic<int64_t> m_watchdogMs{kDefaultWatchdogPeriod.count()};
  std::atomic<int64_t> m_webMs{kDefaultWebExchangeTimeout.count()};
  std::atomic<int64_t> m_startMs{kDefaultProcessStartTimeout.count()};
  std::atomic<uint32_t> m_processIdCounter{0};
  std::atomic<bool> m_freeBytesSet{false};
  std::atomic<bool> m_freeBytesFail{false};
  std::atomic<uint64_t> m_freeBytes{0};
};

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_TESTING_MANUAL_ENV_H_
