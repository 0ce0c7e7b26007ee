// A stand-in for the host callback in unit tests that link the module's
// static libraries directly. It records every request, answers the log
// threshold query, keeps log lines, and lets a test answer any request class.
// One FakeHost may exist at a time; its callback is safe from any thread.
// It keeps its own small records, so that unit tests need no reference host.
#ifndef ALERTMOD_TESTS_SUPPORT_FAKE_HOST_H_
#define ALERTMOD_TESTS_SUPPORT_FAKE_HOST_H_

#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "alertmod/host_records.h"

namespace testsupport {

// A request as the fake host received it; `bytes` copies its data unless it
// is a frame release, whose data is a buffer handle (`dataPointer`).
struct RecordedRequest {
  uint32_t requestClass = 0;
  uint32_t code = 0;
  uint32_t requester = 0;
  uint32_t length = 0;
  int32_t extValue = 0;
  uintptr_t dataPointer = 0;
  std::string bytes;
};

// The requests received, in arrival order. Thread-safe.
class RequestRecord {
 public:
  void Add(const hx::core::HostRequest& request);
  std::vector<RecordedRequest> Snapshot() const;
  std::vector<RecordedRequest> OfClass(uint32_t requestClass) const;
  void Clear();

 private:
  mutable std::mutex m_mutex;
  std::vector<RecordedRequest> m_requests;
};

struct LogLine {
  uint32_t source = 0;
  int32_t level = 0;
  std::string text;
};

// The module's log lines, in arrival order. Thread-safe.
class LogRecord {
 public:
  void Write(uint32_t source, int32_t level, const std::string& text);
  std::vector<LogLine> Lines() const;
  // True when some line contains `fragment`.
  bool Contains(const std::string& fragment) const;

 private:
  mutable std::mutex m_mutex;
  std::vector<LogLine> m_lines;
};

class FakeHost {
 public:
  using Handler = std::function<int32_t(hx::core::HostRequest& request)>;

  explicit FakeHost(int32_t logThreshold = 25);
  ~FakeHost();
  FakeHost(const FakeHost&) = delete;
  FakeHost& operator=(const FakeHost&) = delete;

  hx::core::HostCallbackFn callback() const { return &FakeHost::Callback; }

  // Answers requests of `requestClass` (other than log) with `handler`;
  // unhandled classes are answered with 0.
  void SetHandler(uint32_t requestClass, Handler handler);

  RequestRecord& Requests() { return m_requests; }
  LogRecord& Log() { return m_log; }
  // Texts of the kept log lines, optionally only those of `level`.
  std::vector<std::string> LogTexts(int32_t level = -1) const;

 private:
  static int32_t Callback(hx::core::HostRequest* request, void* reserved);
  int32_t Handle(hx::core::HostRequest& request);

  const int32_t m_logThreshold;
  RequestRecord m_requests;
  LogRecord m_log;
  std::mutex m_mutex;
  std::map<uint32_t, Handler> m_handlers;
};

}  // namespace testsupport

#endif  // ALERTMOD_TESTS_SUPPORT_FAKE_HOST_H_
