#include "host/request_log.h"

namespace refhost {

void RequestLog::Add(const hx::core::HostRequest& request) {
  RecordedRequest recorded;
  recorded.requestClass = request.requestClass;
  recorded.code = request.code;
  recorded.requester = request.requester;
  recorded.length = request.length;
  recorded.extValue = request.extValue;
  recorded.dataPointer = reinterpret_cast<uintptr_t>(request.data);
  if (request.data != nullptr && request.length > 0 &&
      request.requestClass != hx::core::kClassFrameRelease) {
    recorded.bytes.assign(static_cast<const char*>(request.data), request.length);
  }
  {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_requests.push_back(std::move(recorded));
    ++m_generation;
  }
  m_signal.notify_all();
}

std::vector<RecordedRequest> RequestLog::Snapshot() const {
  std::lock_guard<std::mutex> lock(m_mutex);
  return m_requests;
}

std::vector<RecordedRequest> RequestLog::OfClass(uint32_t requestClass) const {
  std::lock_guard<std::mutex> lock(m_mutex);
  std::vector<RecordedRequest> matching;
  for (const RecordedRequest& r : m_requests) {
    if (r.requestClass == requestClass) matching.push_back(r);
  }
  return matching;
}

void RequestLog::Clear() {
  std::lock_guard<std::mutex> lock(m_mutex);
  m_requests.clear();
  ++m_generation;
}

bool RequestLog::WaitFor(const Predicate& predicate, std::chrono::milliseconds timeout) const {
  // The predicate runs without the lock, on a copy, so that it may itself
  // read this log (or anything that records into it) without deadlocking.
  auto deadline = std::chrono::steady_clock::now() + timeout;
  std::unique_lock<std::mutex> lock(m_mutex);
  for (;;) {
    uint64_t seen = m_generation;
    std::vector<RecordedRequest> snapshot = m_requests;
    lock.unlock();
    if (predicate(snapshot)) return true;
    lock.lock();
    if (!m_signal.wait_until(lock, deadline, [&] { return m_generation != seen; })) {
      lock.unlock();
      return predicate(Snapshot());
    }
  }
}

}  // namespace refhost
