#include <chrono>

#include "alertmod/manager/notify_manager.h"
#include "alertmod/platform/clock.h"
#include "tests/support/hooks/hook_registry.h"

namespace testhooks {
namespace {

void SetWatchdogPeriodMs(uint32_t periodMs) {
  hx::NotifyManager::SetWatchdogPeriod(std::chrono::milliseconds(periodMs));
}

HookRegistrar g_tick("SetTickSource", AsHook(&hx::platform::SetTickSource));
HookRegistrar g_wall("SetWallSource", AsHook(&hx::platform::SetWallSource));
HookRegistrar g_watchdog("SetWatchdogPeriodMs", AsHook(&SetWatchdogPeriodMs));

}  // namespace
}  // namespace testhooks
