#include <chrono>

#include "alertmod/weblink/http_get_client.h"
#include "tests/support/hooks/hook_registry.h"

namespace testhooks {
namespace {

void SetWebRequestTimeoutMs(uint32_t timeoutMs) {
  hx::SetWebRequestTimeout(std::chrono::milliseconds(timeoutMs));
}

HookRegistrar g_webTimeout("SetWebRequestTimeoutMs", AsHook(&SetWebRequestTimeoutMs));

}  // namespace
}  // namespace testhooks
