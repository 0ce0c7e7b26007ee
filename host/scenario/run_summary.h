// What one run of the reference host came to, and its printed summary: the
// alarms sent, the delivery status reports the module posted, deliveries and
// retries and attachments as the module logged them, the feeds, and the frame
// buffers (every one lent to the module must have come back).
//
// Plain data and pure functions; any thread.
#ifndef ALERTMOD_HOST_SCENARIO_RUN_SUMMARY_H_
#define ALERTMOD_HOST_SCENARIO_RUN_SUMMARY_H_

#include <cstdint>
#include <cstdio>
#include <map>
#include <string>
#include <vector>

#include "host/camera_feed.h"
#include "host/config_store.h"
#include "host/frame_pool.h"
#include "host/log_sink.h"

namespace refhost::scenario {

struct FeedReport {
  std::string label;
  uint32_t streamId = 0;
  FeedFormat format;
  FeedStats stats;
};

struct RunReport {
  size_t alarmStarts = 0;
  size_t alarmEnds = 0;
  size_t tests = 0;
  std::map<int32_t, std::string> profileNames;  // from the posted configuration
  std::vector<ProfileStatusReport> statuses;
  std::vector<LogLine> log;
  std::vector<FeedReport> feeds;
  FramePoolCounts frames;
  std::string frameFaults;            // FramePool::FaultReport()
  std::vector<std::string> failures;  // what went plainly wrong
};

// The facts the module's log tells about a run.
struct RunTally {
  int delivered = 0;    // status reports 0
  int failed = 0;       // status reports 1
  int reset = 0;        // status reports -1 (a configuration change)
  int attempts = 0;     // runs of the transfer tool for a message
  int accepted = 0;     // of which a server took the message
  int retryQueued = 0;  // messages put in the retry queue
  int retried = 0;      // retry attempts
  int retrySucceeded = 0;
  int discarded = 0;                // messages given up (queue limit, disk space, age)
  int dropped = 0;                  // failures that are not retried
  std::vector<std::string> clips;   // "path, preview ..., length ..."
  std::vector<std::string> stills;  // "path, sizeKB ..."
  std::vector<std::string> failedAttachments;
  int warnings = 0;
  int errors = 0;
};

RunTally TallyRun(const RunReport& report);

// Why a delivery failed, from the module's log: the transfer tool's exit code
// and its last error line when the tool ran and failed, otherwise the
// module's first error line. Empty when the log tells neither.
std::string DeliveryFailureReason(const RunReport& report);

// Profile number -> description, from a configuration document the module
// posted. Empty for a text that is not one.
std::map<int32_t, std::string> ProfileNames(const std::string& configuration);

// True when nothing went plainly wrong and every frame buffer came back
// exactly once.
bool RunSucceeded(const RunReport& report);

void PrintSummary(const RunReport& report, FILE* out);

}  // namespace refhost::scenario

#endif  // ALERTMOD_HOST_SCENARIO_RUN_SUMMARY_H_
