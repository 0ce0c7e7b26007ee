#include "alertmod/manager/notify_manager.h"

namespace hx {

bool NotifyManager::OnFrame(uint32_t, uint8_t, uint32_t, const void*, uint32_t) { return false; }

void NotifyManager::OnAlarmDocument(const void*, uint32_t) {}

}  // namespace hx
