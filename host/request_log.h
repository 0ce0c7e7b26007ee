// Every request the module made of the reference host, in arrival order, so
// that tests and the summary can inspect them. Thread-safe: the module calls
// the host from many threads at once.
#ifndef ALERTMOD_HOST_REQUEST_LOG_H_
#define ALERTMOD_HOST_REQUEST_LOG_H_

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "alertmod/host_records.h"

namespace refhost {

struct RecordedRequest {
  uint32_t requestClass = 0;
  uint32_t code = 0;
  uint32_t requester = 0;
  uint32_t length = 0;
  int32_t extValue = 0;
  uintptr_t dataPointer = 0;
  std::string bytes;  // a copy of the data the request carried
};

class RequestLog {
 public:
  using Predicate = std::function<bool(const std::vector<RecordedRequest>&)>;

  // Records `request`, copying its data unless it is a frame release (whose
  // data is a buffer handle, not bytes).
  void Add(const hx::core::HostRequest& request);

  std::vector<RecordedRequest> Snapshot() const;
  std::vector<RecordedRequest> OfClass(uint32_t requestClass) const;
  void Clear();

  // Waits until `predicate` holds for the recorded requests, at most
  // `timeout`. Returns whether it held. Wakes on every new request. The
  // predicate gets a copy and runs without the log's lock: it may read the
  // log, the host's other records, or files.
  bool WaitFor(const Predicate& predicate, std::chrono::milliseconds timeout) const;

 private:
  mutable std::mutex m_mutex;
  mutable std::condition_variable m_signal;
  std::vector<RecordedRequest> m_requests;
  uint64_t m_generation = 0;  // grows with every change
};

}  // namespace refhost

#endif  // ALERTMOD_HOST_REQUEST_LOG_H_
