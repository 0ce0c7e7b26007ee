// The process's live NotifyManager, as the exports created it. The exports
// set it at Load and clear it at Unload; the testing module's hooks read it
// to reach the manager that the host is driving. Any thread may read it; the
// pointer stays valid only between Load and Unload.
#ifndef ALERTMOD_MANAGER_CURRENT_MANAGER_H_
#define ALERTMOD_MANAGER_CURRENT_MANAGER_H_

namespace hx {

class NotifyManager;

// The live manager, or null outside Load ... Unload.
NotifyManager* CurrentManager();

// Called by the exports only.
void SetCurrentManager(NotifyManager* manager);

}  // namespace hx

#endif  // ALERTMOD_MANAGER_CURRENT_MANAGER_H_
