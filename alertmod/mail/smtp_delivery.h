// Delivery of one message file through the transfer tool ("./curl"), which the
// host's process service runs for the module, server by server until one
// takes the message. The command line carries the envelope and the server;
// the account goes through the tool's standard input so that it never appears
// in a command line.
//
// Runs on the manager's worker thread and blocks it while the tool runs.
#ifndef ALERTMOD_MAIL_SMTP_DELIVERY_H_
#define ALERTMOD_MAIL_SMTP_DELIVERY_H_

#include <string>
#include <vector>

#include "alertmod/config/notify_types.h"
#include "alertmod/mail/mail_file.h"

namespace hx {

class NotifyHelper;

// Outcome of DeliverMailFile.
enum DeliveryResult : int {
  kDeliverySent = 0,       // one of the servers took the message
  kDeliveryRetryable = 1,  // all failed, and a failure may pass later
  kDeliveryDropped = 2,    // all failed for good, or there was no server
};

// The program name the host's process service maps to the transfer tool.
constexpr char kTransferTool[] = "./curl";

// Appends the tool's command line for sending `mail` through `server`.
void BuildTransferArguments(const MailFile& mail, const SmtpServer& server,
                            std::vector<std::string>& arguments);

// The tool's standard input for `server`: the account line when the server
// has a user name, else empty.
std::string TransferInput(const SmtpServer& server);

// Tries `servers` in order until one takes `mail`, logging every attempt.
// Exit codes 67 (login refused) and 26 (file unreadable) and a tool that
// cannot be started are not worth retrying; any other failure is.
DeliveryResult DeliverMailFile(const MailFile& mail, const std::vector<SmtpServer>& servers,
                               NotifyHelper& helper);

}  // namespace hx

#endif  // ALERTMOD_MAIL_SMTP_DELIVERY_H_
