// The process's one NotifyManager, as the exports create it. The exports
// set it at Load, read it on every call and take it back at Unload; the
// testing module's hooks read it to reach the manager that the host is
// driving. Any thread may read it; the pointer stays valid only between
// Load and Unload.
#ifndef ALERTMOD_MANAGER_CURRENT_MANAGER_H_
#define ALERTMOD_MANAGER_CURRENT_MANAGER_H_

namespace hx {

class NotifyManager;

// The live manager, or null outside Load ... Unload.
NotifyManager* CurrentManager();

// Makes `manager` the live one. Called by the exports only.
void SetCurrentManager(NotifyManager* manager);

// Clears the live manager and returns what it was, so that exactly one
// caller gets to destroy it. Called by the exports only.
NotifyManager* TakeCurrentManager();

}  // namespace hx

#endif  // ALERTMOD_MANAGER_CURRENT_MANAGER_H_
