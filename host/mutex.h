// A mutex, its scoped lock and a condition variable that the compiler's lock
// checks understand. std::mutex carries no thread-safety annotations in
// libstdc++, so members guarded by one could not be checked; these wrappers
// add them and cost nothing over the standard types.
//
// The reference host's copy of the module's types, for the same reason as
// host/thread_annotations.h. The types are as thread-safe as the standard
// ones they wrap.
#ifndef ALERTMOD_HOST_MUTEX_H_
#define ALERTMOD_HOST_MUTEX_H_

#include <chrono>
#include <condition_variable>
#include <mutex>

#include "host/thread_annotations.h"

namespace refhost {

class CAPABILITY("mutex") Mutex {
 public:
  Mutex() = default;
  Mutex(const Mutex&) = delete;
  Mutex& operator=(const Mutex&) = delete;

  // Blocks until the calling thread holds the mutex. Not recursive.
  void Lock() ACQUIRE() { m_mutex.lock(); }
  // Requires that the calling thread holds the mutex.
  void Unlock() RELEASE() { m_mutex.unlock(); }

 private:
  friend class ConditionVariable;
  std::mutex m_mutex;
};

// Holds `mutex` from its construction to its end, except between an Unlock
// and the next Lock.
class SCOPED_CAPABILITY MutexLock {
 public:
  explicit MutexLock(Mutex& mutex) ACQUIRE(mutex) : m_mutex(mutex) { m_mutex.Lock(); }
  ~MutexLock() RELEASE() {
    if (m_held) m_mutex.Unlock();
  }
  MutexLock(const MutexLock&) = delete;
  MutexLock& operator=(const MutexLock&) = delete;

  // Lets go of the mutex for a while; requires that this lock holds it.
  void Unlock() RELEASE() {
    m_held = false;
    m_mutex.Unlock();
  }
  // Takes the mutex again after Unlock.
  void Lock() ACQUIRE() {
    m_mutex.Lock();
    m_held = true;
  }

 private:
  Mutex& m_mutex;
  bool m_held = true;
};

// Waits on a Mutex the caller holds. Wake-ups may be spurious, so a caller
// waits in a loop on the condition it needs, which the checks then see read
// under the lock.
class ConditionVariable {
 public:
  // Lets go of `mutex` until notified, then takes it again.
  void Wait(Mutex& mutex) REQUIRES(mutex) {
    std::unique_lock<std::mutex> lock(mutex.m_mutex, std::adopt_lock);
    m_condition.wait(lock);
    lock.release();
  }

  // As Wait, but returns false, holding `mutex` again, once `deadline` has
  // passed on the monotonic clock.
  bool WaitUntil(Mutex& mutex, std::chrono::steady_clock::time_point deadline) REQUIRES(mutex) {
    std::unique_lock<std::mutex> lock(mutex.m_mutex, std::adopt_lock);
    const bool notified = m_condition.wait_until(lock, deadline) == std::cv_status::no_timeout;
    lock.release();
    return notified;
  }

  void NotifyOne() { m_condition.notify_one(); }
  void NotifyAll() { m_condition.notify_all(); }

 private:
  std::condition_variable m_condition;
};

}  // namespace refhost

#endif  // ALERTMOD_HOST_MUTEX_H_
