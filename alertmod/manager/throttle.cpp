#include "alertmod/manager/throttle.h"

namespace hx {

bool ThrottleTable::Admit(int32_t profileId, int32_t throttleSeconds, uint32_t nowMs) {
  const uint32_t seconds = static_cast<uint32_t>(throttleSeconds);
  auto found = m_entries.find(profileId);
  if (found == m_entries.end() || found->second.throttleSeconds != seconds) {
    m_entries[profileId] = Entry{seconds, nowMs};
    return true;
  }
  Entry& entry = found->second;
  if (entry.throttleSeconds == 0) return true;
  // The tick wraps every 49.7 days, so only the difference counts. Read as
  // signed it is negative once more than 24.8 days have passed; the tick
  // never runs backwards, so that means long ago, not too recent.
  const int32_t elapsed = static_cast<int32_t>(nowMs - entry.lastAcceptedMs);
  const int32_t interval = static_cast<int32_t>(seconds * 1000u);
  if (elapsed >= 0 && elapsed < interval) return false;
  entry.lastAcceptedMs = nowMs;
  return true;
}

}  // namespace hx
