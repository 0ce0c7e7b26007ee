// ReferenceHost plays the recording server for one loaded alert module: it
// answers the module's requests (log, watchdog tick, documents and the
// services added beside it), lends the worker and watchdog threads, and makes
// every Write and IOCTL code 2 call from its one dispatcher thread.
//
// One ReferenceHost may have a module loaded at a time in a process, because
// the host callback is a plain function pointer. Its public methods may be
// called from any thread; request handlers run on whichever module thread made
// the request and must be thread-safe.
#ifndef ALERTMOD_HOST_REFERENCE_HOST_H_
#define ALERTMOD_HOST_REFERENCE_HOST_H_

#include <atomic>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "alertmod/host_records.h"
#include "host/config_store.h"
#include "host/dispatcher.h"
#include "host/frame_pool.h"
#include "host/log_sink.h"
#include "host/module_library.h"
#include "host/password_service.h"
#include "host/process_service.h"
#include "host/request_log.h"

namespace refhost {

struct HostOptions {
  std::string modulePath;
  int32_t logThreshold = kLogInfo;
  std::string logFile;                      // empty: standard error
  bool echoLog = true;                      // write log lines as they come
  bool recordRequests = true;               // keep every request in Requests()
  std::string transferTool = "curl";        // what "./curl" runs: a path or a name on PATH
  std::string hostKeyFile = "hostkey.bin";  // password key, relative to the working directory
  // false: Stop skips Close and calls Unload while the lent threads may still
  // be inside the module, as a careless host would (for tests).
  bool closeBeforeUnload = true;
};

class ReferenceHost {
 public:
  // Answers one request of one class. Runs on the requesting module thread.
  using Handler = std::function<int32_t(hx::core::HostRequest& request)>;

  explicit ReferenceHost(HostOptions options);
  ~ReferenceHost();  // Stop()

  ReferenceHost(const ReferenceHost&) = delete;
  ReferenceHost& operator=(const ReferenceHost&) = delete;

  // Loads the module file without calling into it, so that a test can set
  // the testing module's hooks first. False with `error` filled when the file
  // cannot be loaded or another host has a module loaded.
  bool OpenLibrary(std::string* error);
  // OpenLibrary when needed, then Load.
  bool LoadModule(std::string* error);
  // Calls Open on the dispatcher.
  void OpenModule();
  // Lends the worker (IOCTL code 1) and watchdog (Read mode 0) threads.
  void LendThreads();
  // LoadModule, OpenModule and LendThreads.
  bool Start(std::string* error);
  // Calls Close, which makes the module's lent threads return.
  void CloseModule();
  // Waits for the lent threads to return.
  void JoinThreads();
  // Close, join the lent threads, drain the dispatcher, Unload. Idempotent.
  // Without closeBeforeUnload the threads are joined after Unload.
  void Stop();

  // Write from the dispatcher. Returns the module's result and fills `out`.
  int32_t Write(const hx::core::WriteParmsIn& in, hx::core::WriteParmsOut* out);
  // Writes an XML document as if another module with id `sender` sent it.
  void WriteDocument(const std::string& text, uint32_t sender);
  // IOCTL from the calling thread (codes other than 2) or the dispatcher (2).
  int32_t Ioctl(uint32_t code, const void* data, uint32_t length);
  // IOCTL code 2 with `text` from the dispatcher.
  void SendHostDocument(const std::string& text);
  // Sends a configuration update (IOCTL code 2): a "Notify" element, which
  // is wrapped in "Trellan" with Delta 1, or a whole "Trellan" document.
  void SendConfigurationUpdate(const std::string& notifyOrDocument);

  // Replaces the answer to one request class. Install before the module
  // makes such requests.
  void SetHandler(uint32_t requestClass, Handler handler);
  // The result returned for watchdog ticks; a non-zero one is not answered.
  void SetTickResult(int32_t result) { m_tickResult.store(result); }

  // A hook of the testing module, or null for the production module.
  void* Hook(const char* name) const;

  RequestLog& Requests() { return m_requests; }
  LogSink& Log() { return m_log; }
  // The frame buffers lent to the module; the class 0x200 handler returns them.
  FramePool& Frames() { return m_frames; }
  // The configuration, module description and status reports the module
  // posted.
  ConfigStore& Config() { return m_config; }
  Dispatcher& GetDispatcher() { return *m_dispatcher; }
  const hx::core::LoadParmsOut& LoadOut() const { return m_loadOut; }
  bool Loaded() const { return m_module != nullptr; }

 private:
  static int32_t Callback(hx::core::HostRequest* request, void* reserved);
  int32_t Handle(hx::core::HostRequest& request);
  int32_t AnswerLog(const hx::core::HostRequest& request);
  int32_t AnswerTick();
  void InstallDefaultHandlers();
  void ReportFrameFaults();

  HostOptions m_options;
  LogSink m_log;
  RequestLog m_requests;
  FramePool m_frames;
  ConfigStore m_config;
  std::unique_ptr<ModuleLibrary> m_module;
  bool m_loaded = false;
  std::unique_ptr<Dispatcher> m_dispatcher;
  hx::core::LoadParmsIn m_loadIn{};
  hx::core::LoadParmsOut m_loadOut{};
  std::thread m_worker;
  std::thread m_watchdog;
  std::atomic<int32_t> m_tickResult{0};
  mutable std::mutex m_handlersMutex;
  std::map<uint32_t, Handler> m_handlers;
  PasswordService m_passwords;
  // Last, so that its run threads end before anything they call goes.
  ProcessService m_processes;
};

}  // namespace refhost

#endif  // ALERTMOD_HOST_REFERENCE_HOST_H_
