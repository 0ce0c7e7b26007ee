// The client of the host's program-execution service.
//
// The module does not create processes itself: it asks the host to start a
// program, feeds its standard input and receives its output and exit status
// as small binary messages. Load registers the service, IOCTL code 4 delivers
// the host's messages (on host threads), and Close shuts it down, releasing
// every waiter. Programs are started and waited for on the caller's thread.
//
// Lock order: the registry lock, then a client's lock.
#ifndef ALERTMOD_HOSTSVC_PROCESS_SERVICE_H_
#define ALERTMOD_HOSTSVC_PROCESS_SERVICE_H_

#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace hx {
namespace ipc {

// Sends one process message to the host; true when the host accepted it.
using SendFunction = bool (*)(const void* data, uint64_t length);

// Client states.
constexpr int32_t kStateStarting = 0;
constexpr int32_t kStateRunning = 1;
constexpr int32_t kStateExited = 2;
constexpr int32_t kStateFailed = -1;

struct ProcessOptions {
  std::vector<std::string> arguments;  // program first
  uint32_t flags = 2;
  std::string firstText;
  std::string secondText;
};

// One program run, shared between its caller and the registry.
class client {
 public:
  int32_t state = kStateStarting;
  uint32_t id = 0;
  int32_t value = 0;
  std::mutex lock;
  std::condition_variable condition;  // broadcast after every message
  std::string standardOutput;
  std::string standardError;
  bool endInputAtWait = false;
};

// Stores the module id and the send function. Called by Load; a new Load
// opens the service again after an earlier Close.
void RegisterProcessService(uint32_t moduleId, SendFunction send);

// Releases every waiter; later starts fail at once when `closed`.
void ShutdownProcessService(bool closed);

// Applies one message of the host. Returns 1 when it was applied, else 0.
int OnProcessMessage(const void* data, uint64_t length);

// Sends one logical message, cutting type 0 input into pieces that fit.
bool SendProcessMessage(uint32_t id, uint32_t type, uint32_t value, const void* data,
                        size_t length);

// Starts a program and waits until the host says it runs or failed. The
// returned client's state is never kStateStarting.
std::shared_ptr<client> StartProcess(const ProcessOptions& options);

// Takes the next line of standard output (channel 0) or standard error (1),
// waiting for it. False when the program has ended and nothing is left.
bool ReadOutputLine(client& process, std::string& line, int channel);

// Waits until the program is no longer running.
void WaitForExit(client& process);

// Runs a program with `input` on its standard input and collects its error
// output. False when it could not be started.
bool RunProcess(const std::vector<std::string>& arguments, const std::string& input,
                int32_t& exitCode, std::vector<std::string>& errorLines);

}  // namespace ipc
}  // namespace hx

#endif  // ALERTMOD_HOSTSVC_PROCESS_SERVICE_H_
