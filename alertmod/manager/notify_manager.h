// NotifyManager is the module's one central object. It owns the work queue
// that feeds the worker, the notifications that wait for their video, and
// (through the parts that fill it) the configuration, the host system
// catalogue, the video buffer and the throttle table.
//
// Threads. The host lends two threads: one runs RunWorker() and one runs
// RunWatchdog(); both stay inside until the manager stops. Every other call
// comes from host threads: Write and IOCTL code 2 arrive one at a time, so the
// pending list, the ready list and the other host-side state take no lock. The
// work queue and the stopped flag are guarded by their own locks, and
// QueueWorkItem() and Stop() may be called from any thread.
#ifndef ALERTMOD_MANAGER_NOTIFY_MANAGER_H_
#define ALERTMOD_MANAGER_NOTIFY_MANAGER_H_

#include <chrono>
#include <cstdint>
#include <deque>
#include <memory>
#include <string>
#include <vector>

#include "alertmod/config/notify_cfg.h"
#include "alertmod/host_records.h"
#include "alertmod/mail/notify_work_item.h"
#include "alertmod/manager/catalogue.h"
#include "alertmod/manager/source_aliases.h"
#include "alertmod/manager/stream_links.h"
#include "alertmod/manager/throttle.h"
#include "alertmod/manager/worker_job.h"
#include "alertmod/platform/env.h"
#include "alertmod/platform/mutex.h"
#include "alertmod/platform/thread_annotations.h"
#include "alertmod/video/notify_ready.h"
#include "alertmod/video/video_buffer.h"

class TiXmlDocument;
class TiXmlElement;

namespace hx {

class NotifyManager;

// A notification that waits for its video. The video capture holds it as an
// INotifyReady and may keep it longer than the pending list does.
struct SNOTIFY_CALLBACK final : public INotifyReady {
  SNOTIFY_CALLBACK(NotifyManager* manager, std::shared_ptr<NotifyWorkItem> item, int64_t deadline)
      : m_manager(manager), m_item(std::move(item)), m_deadline(deadline) {}

  // Moves this notification from the pending list to the ready list; does
  // nothing when it is no longer pending. The next ReleaseReady() queues it.
  void OnReady() override;

  NotifyManager* m_manager;
  std::shared_ptr<NotifyWorkItem> m_item;
  int64_t m_deadline;  // seconds since 1970
};

// What the alarm documents tell of the recording server, for the messages.
struct ServerIdentity {
  std::string serial;
  std::string systemName;   // the server's description
  std::string licensedMac;  // empty until the host reports it
};

struct CaptureContext;

class NotifyManager {
 public:
  // `callback` reaches the host; `env` gives the clocks, files and time
  // limits and must outlive the manager; `jobFactory` makes the job of each
  // worker run.
  NotifyManager(core::HostCallbackFn callback, platform::Env& env, WorkerJobFactory jobFactory);
  ~NotifyManager();

  NotifyManager(const NotifyManager&) = delete;
  NotifyManager& operator=(const NotifyManager&) = delete;

  // Puts `item` at the head of the work queue when `atFront`, else at the
  // tail, and wakes the worker. Any thread.
  void QueueWorkItem(std::shared_ptr<NotifyWorkItem> item, bool atFront) EXCLUDES(m_queueMutex);

  // Queues a stop item at the head. The worker finishes its current item and
  // then leaves its loop. Any thread; does not wait.
  void Stop();

  // Stop(), and lets the watchdog leave at once instead of after the worker,
  // which may never have been lent; a worker entered afterwards returns at
  // once. For Unload, after which no lent thread may stay. Any thread; does
  // not wait.
  void Shutdown();

  // The worker loop. Returns after the stop item, or at once when the worker
  // has stopped before.
  void RunWorker() EXCLUDES(m_queueMutex, m_stopMutex);

  // The watchdog loop: asks the host for a tick every period. Returns when the
  // worker has stopped.
  void RunWatchdog() EXCLUDES(m_stopMutex);

  // The host's answer to a tick: releases notifications whose deadline passed.
  void OnTick();

  // Queues every ready notification, finishing its capture streams first.
  void ReleaseReady();

  // Parks a notification in the pending list until its video is complete or
  // its deadline has passed. Host threads only.
  void Park(std::shared_ptr<SNOTIFY_CALLBACK> callback);

  // Host-thread entry points of the parts built on the manager.
  //
  // Loads "notify.xml" and posts the configuration.
  void Open();
  // Offers one frame of stream `streamId` (Write class 1) to the video
  // buffer when buffering is on and the stream is wanted and described.
  // Returns whether the frame was kept; a kept buffer is released to the
  // host when its last holder lets go, a refused one never.
  bool OnFrame(uint32_t streamId, uint8_t frameType, uint32_t payloadOffset, const void* data,
               uint32_t length);
  // Handles an alarm document of another module: the server's serial and
  // description, and every request addressed to this module. Any bytes give
  // a defined result; text that is not XML changes nothing.
  void OnAlarmDocument(const void* data, uint32_t length);
  // Handles a host system document (IOCTL code 2): catalogue, wanted video,
  // second reviewer mode, pre-alarm times, analytics aliases and
  // configuration updates. Any bytes give a defined result.
  void OnHostDocument(const void* data, uint32_t length);

  // Configuration commands, on the host threads of Open and IOCTL code 2.
  //
  // Saves the configuration to "notify.xml" (passwords protected) and posts
  // it to the host (passwords in clear). A failed save is logged; the
  // configuration is still posted.
  void PostConfig();
  // Applies the "Notify" element of a host document. False when the
  // configuration parser rejects it: nothing is saved, posted or reported,
  // and only the three limits it read before the rejection (an element
  // without "Servers" or "Profiles") take effect. Otherwise the new
  // configuration is saved and posted, and the profiles whose last delivery
  // result no longer applies are reported with status -1. A size limit of 0
  // turns video off: every buffered stream is dropped, its captures ended.
  bool ApplyConfigurationUpdate(const TiXmlDocument& document);
  // Applies the host's second reviewer setting (Trellan / Users /
  // SecondReviewer "Enabled"). Returns whether the mode changed; a change
  // is saved and posted, and turning the mode on clears every attach flag.
  bool ApplySecondReviewer(const TiXmlDocument& document);
  // The live configuration. Host threads only.
  const NotifyCfg& Config() const { return m_config; }

  // Hands new retry settings to the worker, which applies them before its next
  // item. `configurationReplaced` when they come with an accepted
  // configuration: the worker then also empties its retry queue. Any thread.
  void PublishWorkerSettings(const WorkerSettings& settings, bool configurationReplaced)
      EXCLUDES(m_queueMutex);

  core::HostCallbackFn Callback() const { return m_callback; }
  platform::Env& GetEnv() const { return m_env; }

  // Replaces the job factory; the next RunWorker uses it. Tests only, and
  // only before the worker is entered.
  void SetWorkerJobFactory(WorkerJobFactory factory) { m_jobFactory = std::move(factory); }

  // Read access for tests and the parts built on the manager. Host threads.
  size_t PendingCount() const { return m_pending.size(); }
  size_t ReadyCount() const { return m_ready.size(); }
  size_t QueuedCount() const EXCLUDES(m_queueMutex);
  const HostSystemCatalogue& Catalogue() const { return m_catalogue; }
  const WantedVideo& Wanted() const { return m_wanted; }
  const SourceAliases& Aliases() const { return m_aliases; }
  const VideoBuffer& Video() const { return m_videoBuffer; }
  const ThrottleTable& Throttle() const { return m_throttle; }
  const ServerIdentity& Server() const { return m_server; }

 private:
  friend struct SNOTIFY_CALLBACK;

  void MoveToReady(const SNOTIFY_CALLBACK* callback);
  bool Unpark(const SNOTIFY_CALLBACK* callback);
  void ReleasePendingOfSource(uint32_t key, bool alarmStarts);
  void HandleAlarmRequest(const TiXmlElement& request);
  void RaiseNotification(const std::shared_ptr<NotifyWorkItem>& item, const NotifyProfile& profile,
                         const TiXmlElement& request);
  CaptureContext MakeCaptureContext();
  void ApplyFullDocument(const TiXmlDocument& document, const TiXmlElement& trellan);
  void ApplyLimitChanges(const NotifyCfg& before);
  std::shared_ptr<NotifyWorkItem> TakeItem(const IWorkerJob& job) EXCLUDES(m_queueMutex);
  // Whether settings were published since the last call; `*replaced` tells
  // whether an accepted configuration came with them.
  bool TakeSettingsChange(WorkerSettings* settings, bool* replaced) EXCLUDES(m_queueMutex);
  void RunItem(IWorkerJob& job, NotifyWorkItem& item);
  void MarkStopped() EXCLUDES(m_stopMutex);
  void SendTick();
  void LoadConfig();
  void PublishConfigSettings(bool configurationReplaced);
  void SetVideoBufferLimit(int64_t bytes);
  static ConfigServices MakeConfigServices(core::HostCallbackFn callback);

  const core::HostCallbackFn m_callback;
  platform::Env& m_env;
  WorkerJobFactory m_jobFactory;
  const std::chrono::milliseconds m_watchdogPeriod;
  const ConfigServices m_configServices;

  NotifyCfg m_config;  // host threads only

  mutable Mutex m_queueMutex;
  ConditionVariable m_queueSignal;
  std::deque<std::shared_ptr<NotifyWorkItem>> m_workQueue GUARDED_BY(m_queueMutex);
  WorkerSettings m_workerSettings GUARDED_BY(m_queueMutex);
  bool m_settingsChanged GUARDED_BY(m_queueMutex) = false;
  bool m_configReplaced GUARDED_BY(m_queueMutex) = false;

  std::vector<std::shared_ptr<SNOTIFY_CALLBACK>> m_pending;
  std::vector<std::shared_ptr<SNOTIFY_CALLBACK>> m_ready;

  Mutex m_stopMutex;
  ConditionVariable m_stopSignal;
  bool m_stopped GUARDED_BY(m_stopMutex) = false;

  // Host-side state: Write and IOCTL code 2 only, one call at a time.
  ThrottleTable m_throttle;
  VideoBuffer m_videoBuffer;
  HostSystemCatalogue m_catalogue;
  WantedVideo m_wanted;  // the video source set and the source link map
  SourceAliases m_aliases;
  ServerIdentity m_server;
};

}  // namespace hx

#endif  // ALERTMOD_MANAGER_NOTIFY_MANAGER_H_
