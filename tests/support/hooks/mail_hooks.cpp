#include <atomic>
#include <list>

#include "alertmod/platform/file_system.h"
#include "tests/support/hooks/hook_registry.h"
#include "tests/support/module_hooks.h"

namespace testhooks {
namespace {

struct TestQuery {
  FreeBytesFn query;
  void* context;
};
std::atomic<TestQuery*> g_query{nullptr};

hx::platform::Status AskTest(void*, const std::string&, uint64_t* bytes) {
  TestQuery* query = g_query.load();
  if (query != nullptr && query->query(query->context, bytes)) {
    return hx::platform::Status::OK();
  }
  return hx::platform::Status::Failure("the test's volume cannot be queried");
}

void SetFreeBytesQuery(FreeBytesFn query, void* context) {
  if (query == nullptr) {
    hx::platform::SetFreeBytesQuery(nullptr, nullptr);
    return;
  }
  static std::list<TestQuery> kept;  // a reader may still use an older one
  kept.push_back(TestQuery{query, context});
  g_query.store(&kept.back());
  hx::platform::SetFreeBytesQuery(&AskTest, nullptr);
}

HookRegistrar g_freeBytes("SetFreeBytesQuery", AsHook(&SetFreeBytesQuery));

}  // namespace
}  // namespace testhooks
