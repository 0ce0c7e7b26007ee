#include "alertmod/manager/current_manager.h"

#include <atomic>

#include "alertmod/platform/mutex.h"
#include "alertmod/platform/thread_annotations.h"

namespace hx {
namespace {

std::atomic<NotifyManager*> g_current{nullptr};

Mutex g_lentMutex;
ConditionVariable g_lentLeft;
int g_lentInside GUARDED_BY(g_lentMutex) = 0;

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
  MutexLock lock(g_lentMutex);
  ++g_lentInside;
}

LentThreadScope::~LentThreadScope() {
  {
    MutexLock lock(g_lentMutex);
    --g_lentInside;
  }
  g_lentLeft.NotifyAll();
}

void WaitForLentThreads() {
  MutexLock lock(g_lentMutex);
  while (g_lentInside != 0) g_lentLeft.Wait(g_lentMutex);
}

}  // namespace hx
