#include "alertmod/mail/notify_helper.h"

#include "alertmod/hostsvc/process_service.h"
#include "alertmod/mail/smtp_delivery.h"

namespace hx {

NotifyHelper::NotifyHelper(core::HostCallbackFn callback, platform::Env& env)
    : m_callback(callback), m_env(env), m_retries(env) {}

NotifyHelper::~NotifyHelper() = default;

void NotifyHelper::ReportStatus(int32_t profileId, int32_t status) {
  ReportProfileStatus(m_statusDocument, profileId, status, m_env.WallSeconds(), m_callback);
}

DeliveryResult NotifyHelper::Deliver(const MailFile& mail, const std::vector<SmtpServer>& servers) {
  return DeliverMailFile(mail, servers, *this);
}

bool NotifyHelper::RunProcess(const std::vector<std::string>& arguments, const std::string& input,
                              int32_t& exitCode, std::vector<std::string>& errorLines) {
  return ipc::RunProcess(arguments, input, exitCode, errorLines);
}

}  // namespace hx
