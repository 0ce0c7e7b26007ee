// The reference host's process service (request class 0x2000): it runs
// programs for the module and talks to it in process messages (a 16-byte
// little-endian header of length, id, type and value, then the payload).
//
// A start message (type 6) spawns the program with pipes, in the host's
// working directory and in a process group of its own; the name "./curl"
// runs the configured transfer tool. Input messages (type 0) go to the
// program's standard input, which is closed after one shorter than the
// 65536-byte maximum. Each run has one thread of the host that answers
// "running" (3) or "failed" (4, value errno), forwards standard output (1) and
// standard error (2) in pieces, and ends the run with one exit message (5,
// value the exit code, or 128 + signal). Answers go to the module through
// the deliver function from that thread, never inside the module's request.
//
// Handle() may be called from any thread; Stop() from one host thread.
#ifndef ALERTMOD_HOST_PROCESS_SERVICE_H_
#define ALERTMOD_HOST_PROCESS_SERVICE_H_

#include <sys/types.h>

#include <atomic>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "alertmod/host_records.h"
#include "host/mutex.h"
#include "host/thread_annotations.h"

namespace refhost {

// The program name that stands for the transfer tool.
constexpr char kTransferToolName[] = "./curl";

class ProcessService {
 public:
  // Hands one message to the module (IOCTL code 4) from the calling thread.
  using DeliverFn = std::function<void(const void* data, uint32_t length)>;

  // `transferTool` replaces "./curl": a path, or a name searched on PATH.
  ProcessService(std::string transferTool, DeliverFn deliver);
  ~ProcessService();  // Stop()

  ProcessService(const ProcessService&) = delete;
  ProcessService& operator=(const ProcessService&) = delete;

  // Answers one request of class 0x2000: 0 when taken, -1 for a malformed
  // message, an unknown type, a start with no program or for an id that is
  // still running, and every start while stopping. Input for an id that no
  // longer runs is dropped with 0, as a closed pipe would drop it.
  int32_t Handle(hx::core::HostRequest& request);

  // Kills every running program with its process group, waits for the run
  // threads and reaps the programs; nothing is delivered while it runs. The
  // service takes new starts afterwards.
  void Stop();

  // Runs whose threads have not ended yet.
  size_t ActiveRuns();

 private:
  struct Run;

  int32_t Start(uint32_t id, uint32_t flags, const char* payload, size_t length);
  int32_t Input(uint32_t id, const char* payload, size_t length, bool last);
  // Creates the pipes and spawns the program; failures go to spawnError.
  void Launch(Run& run, std::vector<std::string>& arguments);
  void Pump(const std::shared_ptr<Run>& run);
  // Writes what the pipe takes of the pending input; closes the program's
  // input once the module ended it or the program stopped reading.
  void FeedInput(Run& run);
  void PumpUntilExit(Run& run);
  // Forwards one read of `fd`; false at its end or when nothing was there.
  bool ForwardOutput(Run& run, int& fd, uint32_t type);
  void Finish(const std::shared_ptr<Run>& run, uint32_t type, int32_t value);
  void Deliver(uint32_t id, uint32_t type, int32_t value, const char* payload, size_t length);
  void ReapFinishedRuns();

  std::string m_transferTool;
  DeliverFn m_deliver;
  Mutex m_mutex;  // held while a program is spawned
  std::atomic<bool> m_stopping{false};
  // By id, until the program ends.
  std::map<uint32_t, std::shared_ptr<Run>> m_running GUARDED_BY(m_mutex);
  // Until their threads are joined.
  std::vector<std::shared_ptr<Run>> m_runs GUARDED_BY(m_mutex);
};

}  // namespace refhost

#endif  // ALERTMOD_HOST_PROCESS_SERVICE_H_
