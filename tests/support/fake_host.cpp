#include "tests/support/fake_host.h"

#include <atomic>

namespace testsupport {
namespace {

std::atomic<FakeHost*> g_current{nullptr};

}  // namespace

void RequestRecord::Add(const hx::core::HostRequest& request) {
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
  std::lock_guard<std::mutex> lock(m_mutex);
  m_requests.push_back(std::move(recorded));
}

std::vector<RecordedRequest> RequestRecord::Snapshot() const {
  std::lock_guard<std::mutex> lock(m_mutex);
  return m_requests;
}

std::vector<RecordedRequest> RequestRecord::OfClass(uint32_t requestClass) const {
  std::vector<RecordedRequest> matching;
  for (RecordedRequest& request : Snapshot()) {
    if (request.requestClass == requestClass) matching.push_back(std::move(request));
  }
  return matching;
}

void RequestRecord::Clear() {
  std::lock_guard<std::mutex> lock(m_mutex);
  m_requests.clear();
}

void LogRecord::Write(uint32_t source, int32_t level, const std::string& text) {
  std::lock_guard<std::mutex> lock(m_mutex);
  m_lines.push_back(LogLine{source, level, text});
}

std::vector<LogLine> LogRecord::Lines() const {
  std::lock_guard<std::mutex> lock(m_mutex);
  return m_lines;
}

bool LogRecord::Contains(const std::string& fragment) const {
  for (const LogLine& line : Lines()) {
    if (line.text.find(fragment) != std::string::npos) return true;
  }
  return false;
}

FakeHost::FakeHost(int32_t logThreshold) : m_logThreshold(logThreshold) {
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
  for (const LogLine& line : m_log.Lines()) {
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
    if (request.code == hx::core::kCodeLogLevelQuery) return m_logThreshold;
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
