#include "alertmod/manager/notify_manager.h"

namespace hx {

void NotifyManager::OnHostDocument(const void*, uint32_t) {}

}  // namespace hx
