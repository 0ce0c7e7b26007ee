#include "alertmod/manager/current_manager.h"

#include <atomic>

#include "alertmod/platform/mutex.h"
#include "alertmod/platform/thread_annotations.h"

namespace hx {
namespace {

std::atomic<NotifyManager*> g_current{nullptr};
std::atomic<platform::Env*> g_installedEnv{nullptr};

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

platform::Env& EnvForLoad() {
  if (platform::Env* installed = g_installedEnv.load()) return *installed;
  // Made at the first Load and kept until the library goes: the manager,
  // the process service and the worker's job all hold on to it.
  static const std::unique_ptr<platform::Env> system = platform::NewSystemEnv();
  return *system;
}

void InstallEnvForLoad(platform::Env* env) {
  g_installedEnv.store(env);
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
