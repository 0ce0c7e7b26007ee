#include "alertmod/hostsvc/process_service.h"

namespace hx {
namespace ipc {

void RegisterProcessService(uint32_t, SendFunction) {}

void ShutdownProcessService(bool) {}

int OnProcessMessage(const void*, uint64_t) { return 0; }

bool SendProcessMessage(uint32_t, uint32_t, uint32_t, const void*, size_t) { return false; }

std::shared_ptr<client> StartProcess(const ProcessOptions&) {
  auto process = std::make_shared<client>();
  process->state = kStateFailed;
  return process;
}

bool ReadOutputLine(client&, std::string&, int) { return false; }

void WaitForExit(client&) {}

bool RunProcess(const std::vector<std::string>&, const std::string&, int32_t&,
                std::vector<std::string>&) {
  return false;
}

}  // namespace ipc
}  // namespace hx
