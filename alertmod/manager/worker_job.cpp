#include "alertmod/manager/worker_job.h"

namespace hx {
namespace {

// Drops every item. Stands in until the notification job is wired.
class DroppingJob final : public IWorkerJob {
 public:
  void Start(const WorkerSettings&) override {}
  bool HasPendingRetries() const override { return false; }
  void OnConfigurationChanged(const WorkerSettings&) override {}
  void Run(NotifyWorkItem&) override {}
  void RetryPass() override {}
  void Stop() override {}
};

}  // namespace

WorkerJobFactory DefaultWorkerJobFactory(core::HostCallbackFn) {
  return [] { return std::make_unique<DroppingJob>(); };
}

}  // namespace hx
