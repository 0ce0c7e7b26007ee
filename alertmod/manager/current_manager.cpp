#include "alertmod/manager/current_manager.h"

#include <atomic>

namespace hx {
namespace {

std::atomic<NotifyManager*> g_current{nullptr};

}  // namespace

NotifyManager* CurrentManager() {
  return g_current.load();
}

void SetCurrentManager(NotifyManager* manager) {
  g_current.store(manager);
}

NotifyManager* TakeCurrentManager() {
  return g_current.exchange(nullptr);
}

}  // namespace hx
