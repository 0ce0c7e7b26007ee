// A stand-in for the host callback in unit tests that link the module's
// static libraries directly. It records every request, answers the log
// threshold query, keeps log lines, and lets a test answer any request class.
// One FakeHost may exist at a time; its callback is safe from any thread.
#ifndef ALERTMOD_TESTS_SUPPORT_FAKE_HOST_H_
#define ALERTMOD_TESTS_SUPPORT_FAKE_HOST_H_

#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "alertmod/host_records.h"
#include "host/log_sink.h"
#include "host/request_log.h"

namespace testsupport {

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

  refhost::RequestLog& Requests() { return m_requests; }
  refhost::LogSink& Log() { return m_log; }
  // Texts of the kept log lines, optionally only those of `level`.
  std::vector<std::string> LogTexts(int32_t level = -1) const;

 private:
  static int32_t Callback(hx::core::HostRequest* request, void* reserved);
  int32_t Handle(hx::core::HostRequest& request);

  refhost::RequestLog m_requests;
  refhost::LogSink m_log;
  std::mutex m_mutex;
  std::map<uint32_t, Handler> m_handlers;
};

}  // namespace testsupport

#endif  // ALERTMOD_TESTS_SUPPORT_FAKE_HOST_H_
