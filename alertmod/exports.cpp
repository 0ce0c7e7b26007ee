// The seven entry points. They pick fields out of the host's records and
// dispatch to the one NotifyManager and to the process-service client. Nothing
// is thrown across them and every one returns 0.
#include <atomic>
#include <exception>

#include "alertmod/diag/log.h"
#include "alertmod/host_records.h"
#include "alertmod/hostsvc/process_service.h"
#include "alertmod/manager/current_manager.h"
#include "alertmod/manager/notify_manager.h"
#include "alertmod/manager/worker_job.h"

using hx::core::HostCallbackFn;
using hx::core::kModuleId;

namespace {

// The process-wide state of the loaded library, beside the one manager
// (hx::CurrentManager).
std::atomic<HostCallbackFn> g_hostCallback{nullptr};

bool SendProcessMessageToHost(const void* data, uint64_t length) {
  HostCallbackFn callback = g_hostCallback.load();
  if (callback == nullptr) return false;
  hx::core::HostRequest request = hx::core::MakeHostRequest(kModuleId, hx::core::kClassProcess, 0);
  request.length = static_cast<uint32_t>(length);
  request.data = const_cast<void*>(data);
  return callback(&request, nullptr) == 0;
}

// Runs `body` and keeps every exception inside the module, logging it.
template <typename Body>
int32_t Guarded(const char* entry, Body body) {
  try {
    body();
  } catch (const std::exception& e) {
    hx::LogToHost(kModuleId, g_hostCallback.load(), hx::LogLevelError,
                  "Unexpected failure in %s: %s", entry, e.what());
  } catch (...) {
    hx::LogToHost(kModuleId, g_hostCallback.load(), hx::LogLevelError, "Unexpected failure in %s",
                  entry);
  }
  return 0;
}

void FillLoadParmsOut(hx::core::LoadParmsOut* out) {
  out->moduleId = kModuleId;
  out->capabilityWord1 = hx::core::kCapabilityWord1;
  out->capabilityWord2 = hx::core::kCapabilityWord2;
  out->capabilityWord3 = hx::core::kCapabilityWord3;
  out->flag34 = 1;
  out->flag36 = 1;
  out->flag37 = 1;
}

void DispatchWrite(hx::NotifyManager& manager, const hx::core::WriteParmsIn& in,
                   hx::core::WriteParmsOut* out) {
  if (in.requestClass == hx::core::kWriteClassFrame) {
    bool kept = manager.OnFrame(in.source, in.frameType, in.payloadOffset, in.data, in.length);
    if (out != nullptr) out->frameKept = kept ? 1 : 0;
  } else if (in.source != kModuleId) {
    manager.OnAlarmDocument(in.data, in.length);
  } else if (in.requestClass == hx::core::kWriteClassTick) {
    manager.OnTick();
  }
}

// Runs `loop` of the live manager on a thread the host lends, which Unload
// waits for.
void RunLentThread(void (hx::NotifyManager::*loop)()) {
  hx::LentThreadScope lent;
  if (hx::NotifyManager* manager = hx::CurrentManager()) (manager->*loop)();
}

}  // namespace

extern "C" {

int32_t Load(hx::core::LoadParmsIn* in, hx::core::LoadParmsOut* out) {
  return Guarded("Load", [&] {
    if (in == nullptr) return;
    HostCallbackFn callback = in->callback;
    g_hostCallback.store(callback);
    if (hx::CurrentManager() == nullptr) {
      hx::platform::Env& env = hx::EnvForLoad();
      hx::SetCurrentManager(
          new hx::NotifyManager(callback, env, hx::DefaultWorkerJobFactory(callback, env)));
    }
    if (out != nullptr) FillLoadParmsOut(out);
    hx::ipc::RegisterProcessService(kModuleId, &SendProcessMessageToHost, callback,
                                    hx::EnvForLoad());
  });
}

int32_t Unload() {
  return Guarded("Unload", [] {
    hx::NotifyManager* manager = hx::TakeCurrentManager();
    if (manager == nullptr) return;
    // A host may unload without Close, or before the lent threads have
    // returned: they are stopped as Close stops them, and the manager they
    // run on is destroyed only once both have left it.
    manager->Shutdown();
    hx::ipc::ShutdownProcessService(true);
    hx::WaitForLentThreads();
    delete manager;
  });
}

int32_t Open() {
  return Guarded("Open", [] {
    if (hx::NotifyManager* manager = hx::CurrentManager()) manager->Open();
  });
}

int32_t Close() {
  return Guarded("Close", [] {
    hx::NotifyManager* manager = hx::CurrentManager();
    if (manager == nullptr) return;
    manager->Stop();
    hx::ipc::ShutdownProcessService(true);
  });
}

int32_t Read(hx::core::ReadParmsIn* in) {
  return Guarded("Read", [&] {
    if (in == nullptr || in->mode != hx::core::kReadModeWatchdog) return;
    RunLentThread(&hx::NotifyManager::RunWatchdog);
  });
}

int32_t Write(hx::core::WriteParmsIn* in, hx::core::WriteParmsOut* out) {
  return Guarded("Write", [&] {
    if (in == nullptr) return;
    hx::NotifyManager* manager = hx::CurrentManager();
    if (manager == nullptr) {
      // Without a manager no frame is kept; the host keeps its buffer.
      if (in->requestClass == hx::core::kWriteClassFrame && out != nullptr) out->frameKept = 0;
      return;
    }
    DispatchWrite(*manager, *in, out);
  });
}

int32_t IOCTL(hx::core::IoctlParmsIn* in) {
  return Guarded("IOCTL", [&] {
    if (in == nullptr) return;
    if (in->code == hx::core::kIoctlRunWorker) return RunLentThread(&hx::NotifyManager::RunWorker);
    hx::NotifyManager* manager = hx::CurrentManager();
    if (manager == nullptr) return;
    switch (in->code) {
      case hx::core::kIoctlHostDocument:
        manager->OnHostDocument(in->data, in->length);
        break;
      case hx::core::kIoctlProcessMessage:
        hx::ipc::OnProcessMessage(in->data, in->length);
        break;
      default:
        break;
    }
  });
}

}  // extern "C"
