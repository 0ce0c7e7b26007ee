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
}

bool RequestLog::WaitFor(const Predicate& predicate, std::chrono::milliseconds timeout) const {
  std::unique_lock<std::mutex> lock(m_mutex);
  return m_signal.wait_for(lock, timeout, [&] { return predicate(m_requests); });
}

}  // namespace refhost
