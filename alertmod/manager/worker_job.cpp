#include "alertmod/manager/worker_job.h"

#include "alertmod/mail/mail_file.h"
#include "alertmod/mail/notification_job.h"
#include "alertmod/mail/notify_file_stream.h"
#include "alertmod/mail/notify_helper.h"

namespace hx {
namespace {

// The notification job as the worker runs it: one NotifyHelper for the whole
// run, and a fresh file stream for every item and retry pass.
class NotificationWorkerJob final : public IWorkerJob {
 public:
  NotificationWorkerJob(core::HostCallbackFn callback, platform::Env& env)
      : m_callback(callback), m_env(env), m_writer(MakeAttachmentWriter(callback, env)) {}

  void Start(const WorkerSettings& settings) override {
    // Messages of an earlier run are never retried: their queue is gone.
    ClearDataDirectory(m_callback);
    m_helper = std::make_unique<NotifyHelper>(m_callback, m_env);
    m_settings = settings;
  }
  bool HasPendingRetries() const override { return m_helper && !m_helper->Retries().Empty(); }
  void OnSettingsChanged(const WorkerSettings& settings, bool configurationReplaced) override {
    if (configurationReplaced) {
      NotifyFileStreamImpl stream(m_callback, m_env);
      m_helper->Retries().Clear(*m_helper, stream);
    }
    m_settings = settings;
  }
  void Run(NotifyWorkItem& item) override {
    NotifyFileStreamImpl stream(m_callback, m_env);
    RunNotificationJob(item, *m_helper, stream, m_settings.maxRetryQueue, *m_writer);
  }
  void RetryPass() override {
    NotifyFileStreamImpl stream(m_callback, m_env);
    m_helper->Retries().RetryPass(*m_helper, stream, m_settings.maxRetrySeconds);
  }
  void Stop() override { m_helper.reset(); }

 private:
  core::HostCallbackFn m_callback;
  platform::Env& m_env;
  std::unique_ptr<IAttachmentWriter> m_writer;
  std::unique_ptr<NotifyHelper> m_helper;
  WorkerSettings m_settings;
};

}  // namespace

WorkerJobFactory DefaultWorkerJobFactory(core::HostCallbackFn callback, platform::Env& env) {
  return [callback, &env] { return std::make_unique<NotificationWorkerJob>(callback, env); };
}

}  // namespace hx
