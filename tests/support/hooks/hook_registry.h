// Registry of the testing module's hooks. Each hooks file registers its
// functions by name with a static HookRegistrar; the exported lookup finds
// them. Registration happens while the library loads, before any lookup.
#ifndef ALERTMOD_TESTS_SUPPORT_HOOKS_HOOK_REGISTRY_H_
#define ALERTMOD_TESTS_SUPPORT_HOOKS_HOOK_REGISTRY_H_

namespace testhooks {

class HookRegistrar {
 public:
  HookRegistrar(const char* name, void* hook);
};

template <typename Fn>
void* AsHook(Fn fn) {
  return reinterpret_cast<void*>(fn);
}

}  // namespace testhooks

#endif  // ALERTMOD_TESTS_SUPPORT_HOOKS_HOOK_REGISTRY_H_
