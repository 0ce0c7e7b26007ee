#include "alertmod/manager/notify_manager.h"

namespace hx {

void NotifyManager::Open() {}

}  // namespace hx
