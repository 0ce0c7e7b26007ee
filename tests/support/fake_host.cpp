#include "tests/support/fake_host.h"

#include <atomic>

namespace testsupport {
namespace {

std::atomic<FakeHost*> g_current{nullptr};

}  // namespace

FakeHost::FakeHost(int32_t logThreshold) : m_log(logThreshold, "", false) {
  g_current.store(this);
}

FakeHost::~FakeHost() {
  g_current.store(nullptr);
}

void FakeHost::SetHandler(uint32_t requestClass, Handler handler) {
  std::lock_guard<std::mutex> lock(m_mutex);
  m_handlers[requestClass] = std::move(handler);
}

std::vector<std::string> FakeHost::LogTexts(int32_t level) const {
  std::vector<std::string> texts;
  for (const refhost::LogLine& line : m_log.Lines()) {
    if (level < 0 || line.level == level) texts.push_back(line.text);
  }
  return texts;
}

int32_t FakeHost::Callback(hx::core::HostRequest* request, void*) {
  FakeHost* host = g_current.load();
  if (host == nullptr || request == nullptr) return -1;
  return host->Handle(*request);
}

int32_t FakeHost::Handle(hx::core::HostRequest& request) {
  m_requests.Add(request);
  if (request.requestClass == hx::core::kClassLog) {
    if (request.code == hx::core::kCodeLogLevelQuery) return m_log.Threshold();
    m_log.Write(request.requester, request.extValue,
                std::string(static_cast<const char*>(request.data), request.length));
    return 0;
  }
  Handler handler;
  {
    std::lock_guard<std::mutex> lock(m_mutex);
    auto found = m_handlers.find(request.requestClass);
    if (found != m_handlers.end()) handler = found->second;
  }
  return handler ? handler(request) : 0;
}

}  // namespace testsupport
