// The throttle of the notification profiles: a profile with ThrottleSeconds
// notifies at most once per that many seconds, measured on the module's
// 32-bit millisecond tick. A change of the profile's ThrottleSeconds starts
// afresh.
//
// The manager owns one ThrottleTable and uses it on the host thread of Write
// only; it takes no lock. Entries live as long as the manager.
#ifndef ALERTMOD_MANAGER_THROTTLE_H_
#define ALERTMOD_MANAGER_THROTTLE_H_

#include <cstdint>
#include <map>

namespace hx {

class ThrottleTable {
 public:
  struct Entry {
    uint32_t throttleSeconds = 0;  // in force when the entry was written
    uint32_t lastAcceptedMs = 0;   // tick of the last accepted request
  };

  // Decides whether a request for profile `profileId`, whose ThrottleSeconds
  // is `throttleSeconds`, may notify at tick `nowMs`; an accepted request
  // becomes the profile's last. A rejected one changes nothing.
  bool Admit(int32_t profileId, int32_t throttleSeconds, uint32_t nowMs);

  const std::map<int32_t, Entry>& Entries() const { return m_entries; }

 private:
  std::map<int32_t, Entry> m_entries;
};

}  // namespace hx

#endif  // ALERTMOD_MANAGER_THROTTLE_H_
