#include "alertmod/mail/smtp_probe.h"

#include <memory>
#include <string>

#include "alertmod/hostsvc/process_service.h"
#include "alertmod/mail/smtp_delivery.h"

namespace hx {
namespace {

constexpr char kSmtpsProtocol[] = "smtps";

// Reads the tool's whole standard output; returns once the tool has ended.
bool OutputMentions(ipc::client& process, const std::string& word) {
  bool found = false;
  std::string line;
  while (ipc::ReadOutputLine(process, line, 0)) {
    found = found || line.find(word) != std::string::npos;
  }
  return found;
}

}  // namespace

bool ProbeSmtps(NotifyCfg& config) {
  ipc::ProcessOptions options;
  options.arguments = {kTransferTool, "-V"};
  std::shared_ptr<ipc::client> process = ipc::StartProcess(options);
  bool available = false;
  if (process->State() != ipc::kStateFailed) {
    available = OutputMentions(*process, kSmtpsProtocol);
    ipc::WaitForExit(*process);
  }
  config.SetSmtpsAvailable(available);
  return available;
}

}  // namespace hx
