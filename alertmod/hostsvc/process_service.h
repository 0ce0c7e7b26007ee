// The client of the host's program-execution service.
//
// The module does not create processes itself: it asks the host to start a
// program, feeds its standard input and receives its output and exit status
// as small binary messages (a 16-byte little-endian header of length, id,
// type and value, then the payload; at most 65536 bytes). Load registers the
// service, IOCTL code 4 delivers the host's messages (on host threads), and
// Close shuts it down, releasing every waiter. Programs are started and
// waited for on the caller's thread; every function here is thread-safe.
//
// Lock order: the registry lock, then a client's lock.
#ifndef ALERTMOD_HOSTSVC_PROCESS_SERVICE_H_
#define ALERTMOD_HOSTSVC_PROCESS_SERVICE_H_

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "alertmod/host_records.h"
#include "alertmod/platform/env.h"
#include "alertmod/platform/mutex.h"
#include "alertmod/platform/thread_annotations.h"

namespace hx {
namespace ipc {

// Sends one process message to the host; true when the host accepted it.
using SendFunction = bool (*)(const void* data, uint64_t length);

// Client states.
constexpr int32_t kStateStarting = 0;
constexpr int32_t kStateRunning = 1;
constexpr int32_t kStateExited = 2;
constexpr int32_t kStateFailed = -1;

// Start flags; 8 and 16 (texts before the program) are in host_records.h.
constexpr uint32_t kFlagsDefault = 2;
constexpr uint32_t kFlagKeepInputAtWait = 4;  // no empty input at wait for ".ps1"

// Ids are the module id shifted left by 4 bits, OR a 20-bit counter.
constexpr uint32_t kIdCounterMask = 0xFFFFF;

struct ProcessOptions {
  std::vector<std::string> arguments;  // program first
  uint32_t flags = kFlagsDefault;
  std::string firstText;   // sent before the program when flag 8 is set
  std::string secondText;  // sent before the program when flag 16 is set
};

// One program run, shared between its caller and the registry. Its state
// and output change under its own lock, and every change wakes its waiters.
class client {
 public:
  int32_t State() const EXCLUDES(m_lock);
  uint32_t Id() const EXCLUDES(m_lock);
  // The process id the host reported at the start, or the exit code.
  int32_t Value() const EXCLUDES(m_lock);
  // Whether WaitForExit first ends the program's input (".ps1" programs).
  bool EndsInputAtWait() const EXCLUDES(m_lock);

  void SetState(int32_t state) EXCLUDES(m_lock);
  void SetId(uint32_t id) EXCLUDES(m_lock);
  void SetEndInputAtWait(bool end) EXCLUDES(m_lock);

  // Applies one of the host's messages to the run (output, running, failed
  // or exited), without its carriage returns. Returns true when the run
  // has ended.
  bool Apply(uint32_t type, int32_t value, const char* payload, size_t length) EXCLUDES(m_lock);
  // Marks the run failed unless `settled` says its state stands. Returns
  // whether it was marked.
  bool FailUnless(bool (*settled)(int32_t state)) EXCLUDES(m_lock);
  // Waits up to `timeout` while the state is `state`. Returns whether it
  // changed.
  bool WaitWhileIn(int32_t state, std::chrono::milliseconds timeout) EXCLUDES(m_lock);
  // As ReadOutputLine, for a valid channel.
  bool ReadLine(std::string& line, int channel) EXCLUDES(m_lock);
  // Whether the input is to be ended before waiting for the exit; the
  // answer is true once at most, and only while the program runs.
  bool TakeEndInputAtWait() EXCLUDES(m_lock);
  // Waits until the program is no longer running.
  void WaitUntilNotRunning() EXCLUDES(m_lock);
  // Hands over the unread standard output, when `output` is given. Returns
  // true with the exit code when the program ran to its end.
  bool TakeResult(int32_t& exitCode, std::string* output) EXCLUDES(m_lock);

 private:
  mutable Mutex m_lock;
  ConditionVariable m_changed;
  int32_t m_state GUARDED_BY(m_lock) = kStateStarting;
  uint32_t m_id GUARDED_BY(m_lock) = 0;
  int32_t m_value GUARDED_BY(m_lock) = 0;
  std::string m_standardOutput GUARDED_BY(m_lock);  // unread output of type 1
  std::string m_standardError GUARDED_BY(m_lock);   // unread output of type 2
  bool m_endInputAtWait GUARDED_BY(m_lock) = false;
};

// Stores the module id and the send function and opens the service. Called by
// Load; a new Load opens the service again after an earlier Close, since the
// library may stay loaded in between. `logTo`, when given, receives the
// service's own log lines. `env` gives the start-answer time-out and,
// when not 0, the process-id counter to go on from.
void RegisterProcessService(uint32_t moduleId, SendFunction send, core::HostCallbackFn logTo,
                            platform::Env& env);

// Ends every run the module still waits for: a running or starting client
// becomes failed (its result is unknown, and must not read as exit code 0)
// and is woken; the registry forgets all ids. Later starts fail at once when
// `closed`. Called by Close after the manager was told to stop.
void ShutdownProcessService(bool closed);

// Applies one message of the host. Returns 1 when it was applied; 0 for a
// message shorter than its header, of an unknown type or for an id that is not
// running. The payload is `length` - 16 bytes; carriage returns are removed.
int OnProcessMessage(const void* data, uint64_t length);

// Sends one logical message. Type 0 input is cut into messages of at most
// 65536 bytes (an empty one still sends a header); other types must fit in
// one. False when no send function is registered, a message of another type
// is too long, or the host refused a message (the rest is then not sent).
bool SendProcessMessage(uint32_t id, uint32_t type, uint32_t value, const void* data,
                        size_t length);

// Starts a program and waits until the host says it runs or failed. The
// returned client's state is never kStateStarting: kStateFailed when the
// arguments are empty, the service is closed, no id is free, the host refused
// the start or answered type 4, the service was shut down meanwhile, or the
// host left the start unanswered for the start-answer time-out (logged; the
// id is forgotten, so that a late answer is dropped).
std::shared_ptr<client> StartProcess(const ProcessOptions& options);

// Takes the next line of standard output (channel 0) or standard error (1),
// waiting for it; once the program has ended, the unterminated rest is the
// last line. False when the program has ended and nothing is left, and for
// any other channel.
bool ReadOutputLine(client& process, std::string& line, int channel);

// Ends the input of a ".ps1" program first, then waits until the program is no
// longer running.
void WaitForExit(client& process);

// Runs a program with `input` on its standard input (always ended, also when
// its length is a multiple of the message payload) and collects its error
// output as lines and, when `output` is given, its standard output. True with
// the exit code when the program ran to its end; false when it could not be
// started, when the host refused its input (the run is then given up: the
// program would wait for the end of its input) or when its run was cut off
// by Close.
bool RunProcess(const std::vector<std::string>& arguments, const std::string& input,
                int32_t& exitCode, std::vector<std::string>& errorLines,
                std::string* output = nullptr);

}  // namespace ipc
}  // namespace hx

#endif  // ALERTMOD_HOSTSVC_PROCESS_SERVICE_H_
