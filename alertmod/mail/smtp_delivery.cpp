#include "alertmod/mail/smtp_delivery.h"

#include "alertmod/diag/log.h"
#include "alertmod/mail/notify_helper.h"

namespace hx {
namespace {

constexpr int32_t kExitLoginDenied = 67;
constexpr int32_t kExitReadError = 26;

bool IsUnreserved(unsigned char c) {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '-' ||
         c == '.' || c == '_' || c == '~';
}

std::string PercentEncode(const std::string& text) {
  static const char kHex[] = "0123456789abcdef";
  std::string encoded;
  for (unsigned char c : text) {
    if (IsUnreserved(c)) {
      encoded.push_back(static_cast<char>(c));
    } else {
      encoded.push_back('%');
      encoded.push_back(kHex[c >> 4]);
      encoded.push_back(kHex[c & 0x0F]);
    }
  }
  return encoded;
}

// A quoted string of the tool's configuration syntax. Line breaks and tabs
// are written as escapes too: a raw line break would end the quoted value and
// let the rest of a password be read as further configuration lines.
std::string Quote(const std::string& text) {
  std::string quoted = "\"";
  for (char c : text) {
    switch (c) {
      case '"':
      case '\\':
        quoted.push_back('\\');
        quoted.push_back(c);
        break;
      case '\n':
        quoted += "\\n";
        break;
      case '\r':
        quoted += "\\r";
        break;
      case '\t':
        quoted += "\\t";
        break;
      default:
        quoted.push_back(c);
    }
  }
  quoted.push_back('"');
  return quoted;
}

// Runs the tool once; returns false when it could not be started.
bool TryServer(const MailFile& mail, const SmtpServer& server, NotifyHelper& helper,
               int32_t& exitCode) {
  std::vector<std::string> arguments;
  BuildTransferArguments(mail, server, arguments);
  std::vector<std::string> output;
  exitCode = 0;
  if (!helper.RunProcess(arguments, TransferInput(server), exitCode, output)) {
    LogToHost(core::kModuleId, helper.Callback(), LogLevelError,
              "Failed to execute curl smtp operation using server %s. (Profile Description: %s)",
              server.description.c_str(), mail.profileDescription.c_str());
    return false;
  }
  LogToHost(core::kModuleId, helper.Callback(), exitCode != 0 ? LogLevelWarning : LogLevelInfo,
            "Profile Description: %s. Notification attempt return code= %d",
            mail.profileDescription.c_str(), exitCode);
  if (exitCode != 0) {
    for (const std::string& line : output) {
      LogToHost(core::kModuleId, helper.Callback(), LogLevelInfo, "%s", line.c_str());
    }
  }
  return true;
}

}  // namespace

void BuildTransferArguments(const MailFile& mail, const SmtpServer& server,
                            std::vector<std::string>& arguments) {
  arguments.push_back(kTransferTool);
  arguments.push_back("--mail-from");
  arguments.push_back(mail.sender);
  for (const std::string& recipient : mail.recipients) {
    arguments.push_back("--mail-rcpt");
    arguments.push_back(recipient);
  }
  if (server.useSsl == 2) arguments.push_back("--ssl-reqd");
  arguments.insert(arguments.end(),
                   {"--insecure", "--connect-timeout", "60", "--config", "-", "-T", mail.path});
  std::string scheme = server.useSsl == 1 ? "smtps://" : "smtp://";
  arguments.push_back(scheme + PercentEncode(server.address) + ":" + std::to_string(server.port));
}

std::string TransferInput(const SmtpServer& server) {
  if (server.username.empty()) return std::string();
  return "user = " + Quote(server.username + ":" + server.password);
}

DeliveryResult DeliverMailFile(const MailFile& mail, const std::vector<SmtpServer>& servers,
                               NotifyHelper& helper) {
  bool retryable = false;
  for (const SmtpServer& server : servers) {
    int32_t exitCode = 0;
    if (!TryServer(mail, server, helper, exitCode)) continue;
    if (exitCode == 0) return kDeliverySent;
    if (exitCode != kExitLoginDenied && exitCode != kExitReadError) retryable = true;
  }
  if (retryable) return kDeliveryRetryable;
  LogToHost(core::kModuleId, helper.Callback(), LogLevelError,
            "Failed to send notification using profile %s.  This message will NOT be retried due "
            "to failure return codes 67 or 26 or due to failures to prepare or initiate email "
            "operation",
            mail.profileDescription.c_str());
  return kDeliveryDropped;
}

}  // namespace hx
