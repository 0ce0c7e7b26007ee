#include "alertmod/manager/notify_manager.h"

#include <algorithm>
#include <atomic>
#include <cstdio>
#include <exception>

#include "alertmod/diag/log.h"
#include "alertmod/video/av_libs.h"

namespace hx {
namespace {

constexpr std::chrono::milliseconds kRetryPollInterval{100};

}  // namespace

void SNOTIFY_CALLBACK::OnReady() {
  m_manager->MoveToReady(this);
}

NotifyManager::NotifyManager(core::HostCallbackFn callback, platform::Env& env,
                             WorkerJobFactory jobFactory)
    : m_callback(callback),
      m_env(env),
      m_jobFactory(std::move(jobFactory)),
      m_watchdogPeriod(env.WatchdogPeriod()),
      m_configServices(MakeConfigServices(callback)),
      m_videoBuffer(callback, env) {
  GetLgr()->SetFileName("notifylog.txt");
  // The codec libraries are loaded while the host loads the module, so that
  // the first clip does not wait for them. Without them the module works on
  // and sends messages without clips. Their own warnings go to the host's
  // log rather than its standard error.
  av_init::Instance().RouteLogTo(callback);
}

NotifyManager::~NotifyManager() {
  av_init::Instance().RouteLogTo(nullptr);
  // A waiting notification and its captures hold each other (the item holds
  // the capture, the capture its completion); the item is let go here so
  // that the captures' frames go back to the host with the video buffer.
  for (const auto& callback : m_pending) callback->m_item.reset();
  for (const auto& callback : m_ready) callback->m_item.reset();
}

void NotifyManager::QueueWorkItem(std::shared_ptr<NotifyWorkItem> item, bool atFront) {
  {
    MutexLock lock(m_queueMutex);
    if (atFront) {
      m_workQueue.push_front(std::move(item));
    } else {
      m_workQueue.push_back(std::move(item));
    }
  }
  m_queueSignal.NotifyOne();
}

void NotifyManager::Stop() {
  QueueWorkItem(std::make_shared<NotifyWorkItem>(kWorkItemStop), true);
}

void NotifyManager::Shutdown() {
  Stop();
  MarkStopped();
}

size_t NotifyManager::QueuedCount() const {
  MutexLock lock(m_queueMutex);
  return m_workQueue.size();
}

void NotifyManager::PublishWorkerSettings(const WorkerSettings& settings,
                                          bool configurationReplaced) {
  MutexLock lock(m_queueMutex);
  m_workerSettings = settings;
  m_settingsChanged = true;
  // New limits alone arriving before the worker looks must not hide an
  // accepted configuration published before them.
  m_configReplaced = m_configReplaced || configurationReplaced;
}

bool NotifyManager::TakeSettingsChange(WorkerSettings* settings, bool* replaced) {
  MutexLock lock(m_queueMutex);
  *settings = m_workerSettings;
  *replaced = m_configReplaced;
  bool changed = m_settingsChanged;
  m_settingsChanged = false;
  m_configReplaced = false;
  return changed;
}

std::shared_ptr<NotifyWorkItem> NotifyManager::TakeItem(const IWorkerJob& job) {
  MutexLock lock(m_queueMutex);
  if (job.HasPendingRetries()) {
    // Retries must run even when no notification arrives, so the worker
    // polls; a new item still ends the wait at once.
    const auto deadline = std::chrono::steady_clock::now() + kRetryPollInterval;
    while (m_workQueue.empty() && m_queueSignal.WaitUntil(m_queueMutex, deadline)) {
    }
    if (m_workQueue.empty()) return nullptr;
  } else {
    while (m_workQueue.empty()) m_queueSignal.Wait(m_queueMutex);
  }
  std::shared_ptr<NotifyWorkItem> item = std::move(m_workQueue.front());
  m_workQueue.pop_front();
  return item;
}

void NotifyManager::RunItem(IWorkerJob& job, NotifyWorkItem& item) {
  // A failing job must not end the worker: the next item is still sent.
  try {
    job.Run(item);
  } catch (const std::exception& e) {
    LogToHost(core::kModuleId, m_callback, LogLevelError,
              "Notification for profile %s failed unexpectedly: %s",
              item.profile.description.c_str(), e.what());
  } catch (...) {
    LogToHost(core::kModuleId, m_callback, LogLevelError,
              "Notification for profile %s failed unexpectedly", item.profile.description.c_str());
  }
}

void NotifyManager::RunWorker() {
  {
    MutexLock lock(m_stopMutex);
    if (m_stopped) return;
  }
  // However the loop ends, the watchdog must learn that the worker is gone.
  struct StopMarker {
    NotifyManager* manager;
    ~StopMarker() { manager->MarkStopped(); }
  } marker{this};

  WorkerSettings settings;
  bool replaced = false;
  TakeSettingsChange(&settings, &replaced);
  std::unique_ptr<IWorkerJob> job = m_jobFactory();
  job->Start(settings);
  for (;;) {
    std::shared_ptr<NotifyWorkItem> item = TakeItem(*job);
    if (TakeSettingsChange(&settings, &replaced)) job->OnSettingsChanged(settings, replaced);
    if (!item) {
      job->RetryPass();
      continue;
    }
    if (item->type == kWorkItemStop) break;
    RunItem(*job, *item);
  }
  job->Stop();
}

void NotifyManager::MarkStopped() {
  {
    MutexLock lock(m_stopMutex);
    m_stopped = true;
  }
  m_stopSignal.NotifyAll();
}

void NotifyManager::RunWatchdog() {
  MutexLock lock(m_stopMutex);
  while (!m_stopped) {
    // A monotonic deadline: a change of the wall clock must not stop or
    // hurry the ticks.
    const auto deadline = std::chrono::steady_clock::now() + m_watchdogPeriod;
    while (!m_stopped && m_stopSignal.WaitUntil(m_stopMutex, deadline)) {
    }
    if (m_stopped) break;
    lock.Unlock();
    SendTick();
    lock.Lock();
  }
}

void NotifyManager::SendTick() {
  if (m_callback == nullptr) return;
  core::HostRequest tick =
      core::MakeHostRequest(core::kModuleId, core::kClassWatchdogTick, core::kCodeTick);
  int32_t result = m_callback(&tick, nullptr);
  if (result != 0) {
    fprintf(stderr, "Alertmod: watch dog event ret %d", result);
    fflush(stderr);
  }
}

void NotifyManager::OnTick() {
  int64_t now = m_env.WallSeconds();
  auto due = [now](const std::shared_ptr<SNOTIFY_CALLBACK>& c) { return c->m_deadline < now; };
  auto firstKept = std::stable_partition(m_pending.begin(), m_pending.end(), due);
  m_ready.insert(m_ready.end(), m_pending.begin(), firstKept);
  m_pending.erase(m_pending.begin(), firstKept);
  if (!m_ready.empty()) ReleaseReady();
}

void NotifyManager::MoveToReady(const SNOTIFY_CALLBACK* callback) {
  auto found = std::find_if(m_pending.begin(), m_pending.end(),
                            [callback](const auto& c) { return c.get() == callback; });
  if (found == m_pending.end()) return;
  m_ready.push_back(std::move(*found));
  m_pending.erase(found);
}

void NotifyManager::Park(std::shared_ptr<SNOTIFY_CALLBACK> callback) {
  m_pending.push_back(std::move(callback));
}

bool NotifyManager::Unpark(const SNOTIFY_CALLBACK* callback) {
  auto found = std::find_if(m_pending.begin(), m_pending.end(),
                            [callback](const auto& c) { return c.get() == callback; });
  if (found == m_pending.end()) return false;
  m_pending.erase(found);
  return true;
}

void NotifyManager::ReleaseReady() {
  while (!m_ready.empty()) {
    std::shared_ptr<SNOTIFY_CALLBACK> callback = m_ready.front();
    // Streams still collecting are closed with what they hold; their
    // completions find this notification no longer pending.
    for (VideoSource& source : callback->m_item->videoSources) {
      if (source.stream) source.stream->Finish();
    }
    QueueWorkItem(callback->m_item, false);
    m_ready.erase(m_ready.begin());
  }
}

}  // namespace hx
