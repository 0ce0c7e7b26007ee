#include "alertmod/manager/current_manager.h"
#include "tests/support/hooks/hook_registry.h"

namespace testhooks {
namespace {

HookRegistrar g_env("InstallEnv", AsHook(&hx::InstallEnvForLoad));

}  // namespace
}  // namespace testhooks
