// NotifyHelper carries what the notification job keeps between work items:
// the profile status document it reports with, and the retry queue, which it
// serves as the queue's RetryDelivery. Its virtual operations are the job's
// seams to the host: status reports and program runs (the transfer tool).
//
// The worker creates one when it starts, after clearing the data directory,
// and is its only user.
#ifndef ALERTMOD_MAIL_NOTIFY_HELPER_H_
#define ALERTMOD_MAIL_NOTIFY_HELPER_H_

#include <cstdint>
#include <string>
#include <vector>

#include "alertmod/config/module_replies.h"
#include "alertmod/host_records.h"
#include "alertmod/mail/retry_queue.h"
#include "alertmod/platform/env.h"

namespace hx {

class NotifyHelper : public RetryDelivery {
 public:
  // `env` gives the clocks of the retry queue and the status reports; it
  // must outlive the helper.
  NotifyHelper(core::HostCallbackFn callback, platform::Env& env);
  ~NotifyHelper() override;

  NotifyHelper(const NotifyHelper&) = delete;
  NotifyHelper& operator=(const NotifyHelper&) = delete;

  // Tells the host the delivery status of a profile: 0 all sent, 1 otherwise.
  void ReportStatus(int32_t profileId, int32_t status) override;

  // Runs `arguments` through the host's process service with `input` on its
  // standard input; collects the exit code and the error output's lines.
  // False when the program could not be started.
  virtual bool RunProcess(const std::vector<std::string>& arguments, const std::string& input,
                          int32_t& exitCode, std::vector<std::string>& errorLines);

  // Delivers through DeliverMailFile, so through RunProcess.
  DeliveryResult Deliver(const MailFile& mail, const std::vector<SmtpServer>& servers) override;

  core::HostCallbackFn Callback() const override { return m_callback; }
  RetryQueue& Retries() { return m_retries; }
  platform::Env& GetEnv() const { return m_env; }

 private:
  core::HostCallbackFn m_callback;
  platform::Env& m_env;
  ProfileStatusDocument m_statusDocument;
  RetryQueue m_retries;
};

}  // namespace hx

#endif  // ALERTMOD_MAIL_NOTIFY_HELPER_H_
