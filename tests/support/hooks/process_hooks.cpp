#include "alertmod/hostsvc/process_service.h"
#include "tests/support/hooks/hook_registry.h"
#include "tests/support/module_hooks.h"

namespace testhooks {
namespace {

void RunProcess(const std::vector<std::string>& arguments, const std::string& input,
                ProcessRunResult& result) {
  result.ran =
      hx::ipc::RunProcess(arguments, input, result.exitCode, result.errorLines, &result.output);
}

HookRegistrar g_runProcess("RunProcess", AsHook(&RunProcess));

}  // namespace
}  // namespace testhooks
