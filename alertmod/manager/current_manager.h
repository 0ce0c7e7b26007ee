// The process's one NotifyManager, as the exports create it. The exports
// set it at Load, read it on every call and take it back at Unload; the
// testing module's hooks read it to reach the manager that the host is
// driving. Any thread may read it; the pointer stays valid only between
// Load and Unload.
#ifndef ALERTMOD_MANAGER_CURRENT_MANAGER_H_
#define ALERTMOD_MANAGER_CURRENT_MANAGER_H_

#include "alertmod/platform/env.h"

namespace hx {

class NotifyManager;

// The live manager, or null outside Load ... Unload.
NotifyManager* CurrentManager();

// Makes `manager` the live one. Called by the exports only.
void SetCurrentManager(NotifyManager* manager);

// Clears the live manager and returns what it was, so that exactly one
// caller gets to destroy it. Called by the exports only.
NotifyManager* TakeCurrentManager();

// The Env that Load gives the manager it creates and the process service:
// the operating system's, unless the testing build installed another.
platform::Env& EnvForLoad();

// Makes `env` the Env of later Loads; null restores the system's. Only the
// testing build calls it, before Load; `env` must outlive the module's use
// of it (until Unload).
void InstallEnvForLoad(platform::Env* env);

// Marks, for its lifetime, a lent thread (worker or watchdog) inside the
// module. It must begin before that thread reads CurrentManager(): then
// either Unload sees the thread and waits for it, or the thread finds no
// manager.
class LentThreadScope {
 public:
  LentThreadScope();
  ~LentThreadScope();
  LentThreadScope(const LentThreadScope&) = delete;
  LentThreadScope& operator=(const LentThreadScope&) = delete;
};

// Returns once no LentThreadScope is alive. Called by Unload after it took
// the manager and told it to stop, before the manager is destroyed.
void WaitForLentThreads();

}  // namespace hx

#endif  // ALERTMOD_MANAGER_CURRENT_MANAGER_H_
