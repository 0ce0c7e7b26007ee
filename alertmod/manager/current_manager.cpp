#include "alertmod/manager/current_manager.h"

#include <atomic>
#include <condition_variable>
#include <mutex>

namespace hx {
namespace {

std::atomic<NotifyManager*> g_current{nullptr};

std::mutex g_lentMutex;
std::condition_variable g_lentLeft;
int g_lentInside = 0;  // guarded by g_lentMutex

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

LentThreadScope::LentThreadScope() {
  std::lock_guard<std::mutex> lock(g_lentMutex);
  ++g_lentInside;
}

LentThreadScope::~LentThreadScope() {
  {
    std::lock_guard<std::mutex> lock(g_lentMutex);
    --g_lentInside;
  }
  g_lentLeft.notify_all();
}

void WaitForLentThreads() {
  std::unique_lock<std::mutex> lock(g_lentMutex);
  g_lentLeft.wait(lock, [] { return g_lentInside == 0; });
}

}  // namespace hx
