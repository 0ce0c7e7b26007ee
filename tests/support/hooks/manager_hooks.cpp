#include <memory>
#include <utility>

#include "alertmod/manager/current_manager.h"
#include "alertmod/manager/notify_manager.h"
#include "alertmod/manager/worker_job.h"
#include "alertmod/video/video_email_stream.h"
#include "tests/support/hooks/hook_registry.h"
#include "tests/support/module_hooks.h"

namespace testhooks {
namespace {

// No profile of a configuration has this id.
constexpr int32_t kMarkerProfileId = INT32_MIN;

CapturedVideoRecord RecordVideo(const hx::VideoSource& source) {
  CapturedVideoRecord record;
  record.sourceKey = source.sourceKey;
  record.name = source.name;
  const hx::CVideoEmailStream* stream = source.stream.get();
  if (stream == nullptr) return record;
  record.hasStream = true;
  record.done = stream->Done();
  record.codec = stream->Codec();
  record.width = stream->Width();
  record.height = stream->Height();
  record.frames = stream->FrameCount();
  record.bytes = stream->ByteCount();
  record.gops = stream->Gops().size();
  record.firstFrameMs = stream->FirstFrameMs();
  record.lastFrameMs = stream->LastFrameMs();
  record.triggerMs = stream->TriggerMs();
  return record;
}

WorkItemRecord RecordItem(const hx::NotifyWorkItem& item) {
  WorkItemRecord record;
  record.type = item.type;
  record.profileId = item.profile.id;
  record.profileDescription = item.profile.description;
  record.attach = item.profile.attach;
  record.preAlarmSeconds = item.profile.preAlarmSeconds;
  record.maxVideoSeconds = item.profile.maxVideoSeconds;
  record.sizeLimit = item.profile.sizeLimit;
  record.body = item.profile.body;
  record.servers = item.servers.size();
  record.eventTime = item.eventTime;
  record.milliseconds = item.milliseconds;
  record.sourceName = item.sourceName;
  record.sourceKey = item.sourceKey;
  record.eventType = item.eventType;
  record.webAddress = item.web.address;
  record.serial = item.serial;
  record.systemName = item.systemName;
  record.licensedMac = item.licensedMac;
  record.eventState = item.eventState;
  for (const hx::VideoSource& source : item.videoSources) {
    record.videoSources.push_back(RecordVideo(source));
  }
  return record;
}

// The module's own job, with every item shown to the test first.
class RecordingJob final : public hx::IWorkerJob {
 public:
  RecordingJob(std::unique_ptr<hx::IWorkerJob> inner, WorkItemRecorderFn recorder, void* context)
      : m_inner(std::move(inner)), m_recorder(recorder), m_context(context) {}

  void Start(const hx::WorkerSettings& settings) override { m_inner->Start(settings); }
  bool HasPendingRetries() const override { return m_inner->HasPendingRetries(); }
  void OnSettingsChanged(const hx::WorkerSettings& settings, bool configurationReplaced) override {
    m_inner->OnSettingsChanged(settings, configurationReplaced);
  }
  void Run(hx::NotifyWorkItem& item) override {
    if (item.profile.id == kMarkerProfileId) {
      WorkItemRecord marker;
      marker.marker = true;
      m_recorder(marker, m_context);
      return;
    }
    m_recorder(RecordItem(item), m_context);
    m_inner->Run(item);
  }
  void RetryPass() override { m_inner->RetryPass(); }
  void Stop() override { m_inner->Stop(); }

 private:
  std::unique_ptr<hx::IWorkerJob> m_inner;
  WorkItemRecorderFn m_recorder;
  void* m_context;
};

bool QueueMarker() {
  hx::NotifyManager* manager = hx::CurrentManager();
  if (manager == nullptr) return false;
  auto marker = std::make_shared<hx::NotifyWorkItem>(hx::kWorkItemNotification);
  marker->profile.id = kMarkerProfileId;
  manager->QueueWorkItem(std::move(marker), false);
  return true;
}

bool SetWorkItemRecorder(WorkItemRecorderFn recorder, void* context) {
  hx::NotifyManager* manager = hx::CurrentManager();
  if (manager == nullptr || recorder == nullptr) return false;
  hx::WorkerJobFactory inner = hx::DefaultWorkerJobFactory(manager->Callback(), manager->GetEnv());
  manager->SetWorkerJobFactory([inner, recorder, context] {
    return std::make_unique<RecordingJob>(inner(), recorder, context);
  });
  return true;
}

// A worker that lets every item go unsent, for measurements of the host-side
// paths without the cost of mail.
class DroppingJob final : public hx::IWorkerJob {
 public:
  void Start(const hx::WorkerSettings&) override {}
  bool HasPendingRetries() const override { return false; }
  void OnSettingsChanged(const hx::WorkerSettings&, bool) override {}
  void Run(hx::NotifyWorkItem&) override {}
  void RetryPass() override {}
  void Stop() override {}
};

bool SetWorkerDropsItems() {
  hx::NotifyManager* manager = hx::CurrentManager();
  if (manager == nullptr) return false;
  manager->SetWorkerJobFactory([] { return std::make_unique<DroppingJob>(); });
  return true;
}

void RecordWanted(const hx::NotifyManager& manager, ManagerStateRecord& state) {
  const hx::WantedVideo& wanted = manager.Wanted();
  state.videoSources.assign(wanted.Sources().begin(), wanted.Sources().end());
  for (const auto& link : wanted.Links()) state.links.emplace_back(link.first, link.second.ID);
  for (const auto& alias : manager.Aliases().Aliases()) {
    state.aliases.emplace_back(alias.first, alias.second.CameraVideoKey());
  }
  state.unresolvedAnalytics.assign(manager.Aliases().Unresolved().begin(),
                                   manager.Aliases().Unresolved().end());
}

bool GetManagerState(ManagerStateRecord& state) {
  hx::NotifyManager* manager = hx::CurrentManager();
  if (manager == nullptr) return false;
  state = ManagerStateRecord{};
  state.pending = manager->PendingCount();
  state.ready = manager->ReadyCount();
  state.queued = manager->QueuedCount();
  RecordWanted(*manager, state);
  manager->Video().StreamIds(&state.bufferedStreams);
  state.serverSerial = manager->Server().serial;
  state.systemName = manager->Server().systemName;
  state.videoBufferMaxBytes = manager->Video().MaxBytes();
  return true;
}

HookRegistrar g_recorder("SetWorkItemRecorder", AsHook(&SetWorkItemRecorder));
HookRegistrar g_marker("QueueMarker", AsHook(&QueueMarker));
HookRegistrar g_state("GetManagerState", AsHook(&GetManagerState));
HookRegistrar g_dropping("SetWorkerDropsItems", AsHook(&SetWorkerDropsItems));

}  // namespace
}  // namespace testhooks
