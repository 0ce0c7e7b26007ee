#include "host/reference_host.h"

namespace refhost {
namespace {

// The host callback is a plain function pointer, so the loaded host is found
// through this one pointer.
std::atomic<ReferenceHost*> g_loadedHost{nullptr};

using TestHookLookup = void* (*)(const char* name);

}  // namespace

ReferenceHost::ReferenceHost(HostOptions options)
    : m_options(std::move(options)),
      m_log(m_options.logThreshold, m_options.logFile, m_options.echoLog),
      m_passwords(m_options.hostKeyFile),
      m_processes(m_options.transferTool, [this](const void* data, uint32_t length) {
        Ioctl(hx::core::kIoctlProcessMessage, data, length);
      }) {
  InstallDefaultHandlers();
}

ReferenceHost::~ReferenceHost() {
  Stop();
}

void ReferenceHost::InstallDefaultHandlers() {
  // Documents and status reports are only recorded; services that need more
  // replace these handlers.
  Handler accept = [](hx::core::HostRequest&) { return 0; };
  m_handlers[hx::core::kClassProfileStatus] = accept;
  m_handlers[hx::core::kClassDocument] = accept;
  m_handlers[hx::core::kClassFrameRelease] = [this](hx::core::HostRequest& request) {
    return m_frames.OnReleaseRequest(request);
  };
  m_handlers[hx::core::kClassProcess] = [this](hx::core::HostRequest& request) {
    return m_processes.Handle(request);
  };
  m_handlers[hx::core::kClassCrypto] = [this](hx::core::HostRequest& request) {
    return m_passwords.Handle(request);
  };
}

bool ReferenceHost::OpenLibrary(std::string* error) {
  if (m_module) return true;
  ReferenceHost* expected = nullptr;
  if (!g_loadedHost.compare_exchange_strong(expected, this)) {
    if (error != nullptr) *error = "another host has a module loaded";
    return false;
  }
  m_module = ModuleLibrary::Open(m_options.modulePath, error);
  if (!m_module) {
    g_loadedHost.store(nullptr);
    return false;
  }
  m_dispatcher = std::make_unique<Dispatcher>();
  return true;
}

bool ReferenceHost::LoadModule(std::string* error) {
  if (m_loaded) return true;
  if (!OpenLibrary(error)) return false;
  m_loadIn.callback = &ReferenceHost::Callback;
  m_module->load(&m_loadIn, &m_loadOut);
  m_loaded = true;
  return true;
}

void ReferenceHost::OpenModule() {
  if (!m_module) return;
  m_dispatcher->Call([this] { return m_module->open(); });
}

void ReferenceHost::LendThreads() {
  if (!m_module || m_worker.joinable()) return;
  m_worker = std::thread([this] {
    hx::core::IoctlParmsIn in{};
    in.code = hx::core::kIoctlRunWorker;
    m_module->ioctl(&in);
  });
  m_watchdog = std::thread([this] {
    hx::core::ReadParmsIn in{};
    in.mode = hx::core::kReadModeWatchdog;
    m_module->read(&in);
  });
}

bool ReferenceHost::Start(std::string* error) {
  if (!LoadModule(error)) return false;
  OpenModule();
  LendThreads();
  return true;
}

void ReferenceHost::CloseModule() {
  if (m_module) m_module->close();
}

void ReferenceHost::JoinThreads() {
  if (m_worker.joinable()) m_worker.join();
  if (m_watchdog.joinable()) m_watchdog.join();
}

void ReferenceHost::Stop() {
  if (!m_module) return;
  if (m_options.closeBeforeUnload) {
    CloseModule();
    JoinThreads();
  }
  m_dispatcher->Stop();
  // Programs still running are ended before the module goes away.
  m_processes.Stop();
  m_module->unload();
  // Unload has returned, so the lent threads must have left the module.
  JoinThreads();
  ReportFrameFaults();
  m_loaded = false;
  m_module.reset();
  m_dispatcher.reset();
  g_loadedHost.store(nullptr);
}

void ReferenceHost::ReportFrameFaults() {
  // After Unload the module holds no frame; anything not returned is lost.
  const std::string report = m_frames.FaultReport();
  if (!report.empty()) m_log.Write(0, kLogError, "host: " + report);
}

int32_t ReferenceHost::Write(const hx::core::WriteParmsIn& in, hx::core::WriteParmsOut* out) {
  if (!m_module) return 0;
  return m_dispatcher->Call([this, &in, out] {
    hx::core::WriteParmsIn copy = in;
    return m_module->write(&copy, out);
  });
}

void ReferenceHost::WriteDocument(const std::string& text, uint32_t sender) {
  hx::core::WriteParmsIn in{};
  in.length = static_cast<uint32_t>(text.size());
  in.data = text.data();
  in.source = sender;
  hx::core::WriteParmsOut out{};
  Write(in, &out);
}

int32_t ReferenceHost::Ioctl(uint32_t code, const void* data, uint32_t length) {
  if (!m_module) return 0;
  auto call = [this, code, data, length] {
    hx::core::IoctlParmsIn in{};
    in.code = code;
    in.data = data;
    in.length = length;
    return m_module->ioctl(&in);
  };
  if (code == hx::core::kIoctlHostDocument) return m_dispatcher->Call(call);
  return call();
}

void ReferenceHost::SendHostDocument(const std::string& text) {
  Ioctl(hx::core::kIoctlHostDocument, text.data(), static_cast<uint32_t>(text.size()));
}

void ReferenceHost::SendConfigurationUpdate(const std::string& notifyOrDocument) {
  SendHostDocument(ConfigurationUpdateDocument(notifyOrDocument));
}

void ReferenceHost::SetHandler(uint32_t requestClass, Handler handler) {
  std::lock_guard<std::mutex> lock(m_handlersMutex);
  m_handlers[requestClass] = std::move(handler);
}

void* ReferenceHost::Hook(const char* name) const {
  if (!m_module) return nullptr;
  auto lookup = reinterpret_cast<TestHookLookup>(m_module->Symbol("AlertmodTestHook"));
  return lookup ? lookup(name) : nullptr;
}

int32_t ReferenceHost::Callback(hx::core::HostRequest* request, void*) {
  ReferenceHost* host = g_loadedHost.load();
  if (host == nullptr || request == nullptr) return -1;
  return host->Handle(*request);
}

int32_t ReferenceHost::Handle(hx::core::HostRequest& request) {
  // What the host keeps of a request (configuration, status, log line) is
  // kept before the request log wakes its waiters, so that a waiter reading
  // it sees this request's part too.
  m_config.Record(request);
  const bool log = request.requestClass == hx::core::kClassLog;
  const int32_t logAnswer = log ? AnswerLog(request) : 0;
  if (m_options.recordRequests) m_requests.Add(request);
  if (log) return logAnswer;
  Handler handler;
  {
    std::lock_guard<std::mutex> lock(m_handlersMutex);
    auto found = m_handlers.find(request.requestClass);
    if (found != m_handlers.end()) handler = found->second;
  }
  if (handler) return handler(request);
  if (request.requestClass == hx::core::kClassWatchdogTick) return AnswerTick();
  return -1;
}

int32_t ReferenceHost::AnswerLog(const hx::core::HostRequest& request) {
  if (request.code == hx::core::kCodeLogLevelQuery) return m_log.Threshold();
  if (request.code != hx::core::kCodeLogWrite || request.data == nullptr) return -1;
  std::string text(static_cast<const char*>(request.data), request.length);
  m_log.Write(request.requester, request.extValue, text);
  return 0;
}

int32_t ReferenceHost::AnswerTick() {
  int32_t result = m_tickResult.load();
  if (result != 0) return result;
  // The answer is a separate Write from the dispatcher, never a call back
  // into the module inside its own tick request.
  m_dispatcher->Post([this] {
    hx::core::WriteParmsIn in{};
    in.source = hx::core::kModuleId;
    in.requestClass = hx::core::kWriteClassTick;
    hx::core::WriteParmsOut out{};
    m_module->write(&in, &out);
  });
  return 0;
}

}  // namespace refhost
