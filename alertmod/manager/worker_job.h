// The work the manager's worker runs: one notification job per work item and
// a retry pass when failed messages wait. The manager owns one IWorkerJob per
// worker run and is its only caller, always on the worker thread.
#ifndef ALERTMOD_MANAGER_WORKER_JOB_H_
#define ALERTMOD_MANAGER_WORKER_JOB_H_

#include <cstdint>
#include <functional>
#include <memory>

#include "alertmod/config/notify_cfg.h"
#include "alertmod/host_records.h"
#include "alertmod/mail/notify_work_item.h"
#include "alertmod/platform/env.h"

namespace hx {

// The configuration values the worker needs between items.
struct WorkerSettings {
  int32_t maxRetrySeconds = kDefaultMaxRetrySeconds;
  int32_t maxRetryQueue = kDefaultMaxRetryQueue;
};

class IWorkerJob {
 public:
  virtual ~IWorkerJob() = default;
  // Called once when the worker starts, before any other call.
  virtual void Start(const WorkerSettings& settings) = 0;
  // True while failed messages wait for a retry; the worker then polls
  // instead of blocking on the queue.
  virtual bool HasPendingRetries() const = 0;
  // New settings arrived since the previous item. `configurationReplaced`
  // when an accepted configuration replaced the servers and profiles
  // meanwhile: the messages queued for retry belong to the old one and are
  // dropped. Otherwise (new limits alone) the queue stays.
  virtual void OnSettingsChanged(const WorkerSettings& settings, bool configurationReplaced) = 0;
  // Runs one notification. May block for as long as delivery takes.
  virtual void Run(NotifyWorkItem& item) = 0;
  // Offers the retry queue one attempt.
  virtual void RetryPass() = 0;
  // Called once when the worker leaves its loop.
  virtual void Stop() = 0;
};

using WorkerJobFactory = std::function<std::unique_ptr<IWorkerJob>()>;

// The job the module runs in production, reporting to the host through
// `callback`, with the clocks and files of `env` (which must outlive it).
WorkerJobFactory DefaultWorkerJobFactory(core::HostCallbackFn callback, platform::Env& env);

}  // namespace hx

#endif  // ALERTMOD_MANAGER_WORKER_JOB_H_
