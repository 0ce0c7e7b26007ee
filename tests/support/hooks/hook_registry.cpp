#include "tests/support/hooks/hook_registry.h"

#include <map>
#include <string>

namespace testhooks {
namespace {

std::map<std::string, void*>& Registry() {
  static std::map<std::string, void*> registry;
  return registry;
}

}  // namespace

HookRegistrar::HookRegistrar(const char* name, void* hook) {
  Registry()[name] = hook;
}

}  // namespace testhooks

extern "C" __attribute__((visibility("default"))) void* AlertmodTestHook(const char* name) {
  if (name == nullptr) return nullptr;
  auto& registry = testhooks::Registry();
  auto found = registry.find(name);
  return found == registry.end() ? nullptr : found->second;
}
