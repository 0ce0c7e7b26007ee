// The test hooks of the testing build of the module. The testing module is
// the production module plus one more export, AlertmodTestHook(name), which
// returns the hook registered under `name` or null. This header gives the
// names and the function types; it includes nothing of the module.
//
// The module's clocks, files and time limits are replaced as one Env
// ("InstallEnv"); the other hooks reach the live manager.
#ifndef ALERTMOD_TESTS_SUPPORT_MODULE_HOOKS_H_
#define ALERTMOD_TESTS_SUPPORT_MODULE_HOOKS_H_

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

namespace hx {
namespace platform {
class Env;
}  // namespace platform
}  // namespace hx

namespace testhooks {

// "InstallEnv": the Env of later Loads (clocks, files, time limits); null
// restores the system's. It must stay alive until Unload.
using InstallEnvFn = void (*)(hx::platform::Env* env);

// "ApplyConfigurationUpdate": parses `text` as a host document and applies it
// to the live manager as a configuration update. 1 accepted, 0 rejected by
// the configuration parser, -1 not applied (no manager, or not XML). Call it
// on the host's dispatcher thread, as IOCTL code 2 would be.
using ApplyConfigurationUpdateFn = int32_t (*)(const char* text, uint32_t length);
// "ApplySecondReviewer": the same for the second reviewer setting of a full
// document. 1 when the mode changed, 0 when not, -1 not applied.
using ApplySecondReviewerFn = int32_t (*)(const char* text, uint32_t length);

// What the "RunProcess" hook reports of one program run.
struct ProcessRunResult {
  bool ran = false;  // false: not started, or cut off by Close
  int32_t exitCode = -1;
  std::vector<std::string> errorLines;
  std::string output;
};
// "RunProcess": runs `arguments` with `input` through the module's
// process-service client, on the calling thread, and waits for the end.
using RunProcessFn = void (*)(const std::vector<std::string>& arguments, const std::string& input,
                              ProcessRunResult& result);

// What a recorded work item carries, as the worker receives it.
struct CapturedVideoRecord {
  uint32_t sourceKey = 0;
  std::string name;
  bool hasStream = false;  // the rest is set only with a stream
  bool done = false;
  uint32_t codec = 0;
  uint32_t width = 0;
  uint32_t height = 0;
  uint64_t frames = 0;
  uint64_t bytes = 0;
  uint64_t gops = 0;
  uint32_t firstFrameMs = 0;  // arrival ticks of the clip's first and last frames
  uint32_t lastFrameMs = 0;
  uint32_t triggerMs = 0;
};
struct WorkItemRecord {
  bool marker = false;  // queued by "QueueMarker"; nothing else is set
  uint32_t type = 0;
  int32_t profileId = 0;
  std::string profileDescription;
  bool attach = false;
  int32_t preAlarmSeconds = 0;
  int32_t maxVideoSeconds = 0;
  int64_t sizeLimit = 0;
  std::string body;
  size_t servers = 0;
  int64_t eventTime = 0;
  uint16_t milliseconds = 0;
  std::string sourceName;
  uint32_t sourceKey = 0;
  int32_t eventType = 0;
  std::string webAddress;
  std::string serial;
  std::string systemName;
  std::string licensedMac;
  std::string eventState;
  std::vector<CapturedVideoRecord> videoSources;
};
// Called on the worker thread with each item, before the notification job
// runs on it.
using WorkItemRecorderFn = void (*)(const WorkItemRecord& record, void* context);
// "SetWorkItemRecorder": makes the live manager's worker report every item to
// `recorder`. Call after Load and before the worker thread is lent. False
// without a manager.
using SetWorkItemRecorderFn = bool (*)(WorkItemRecorderFn recorder, void* context);

// "QueueMarker": queues a marker behind every item queued so far; the
// recorder receives it, in turn, as a record with `marker` set. Call on the
// host's dispatcher thread. False without a manager.
using QueueMarkerFn = bool (*)();

// "SetWorkerDropsItems": makes the live manager's worker drop every item
// unsent (for benchmarks). Call after Load and before the worker thread is
// lent. False without a manager.
using SetWorkerDropsItemsFn = bool (*)();

// The live manager's host-side state.
struct ManagerStateRecord {
  size_t pending = 0;
  size_t ready = 0;
  size_t queued = 0;
  std::vector<uint32_t> videoSources;                  // ascending
  std::vector<std::pair<uint32_t, int32_t>> links;     // source key -> linked stream ID
  std::vector<int32_t> bufferedStreams;                // streams the video buffer holds
  std::vector<std::pair<uint32_t, uint32_t>> aliases;  // analytics key -> camera key
  std::vector<uint32_t> unresolvedAnalytics;
  std::string serverSerial;
  std::string systemName;
  uint64_t videoBufferMaxBytes = 0;
};
// "GetManagerState": fills `state` from the live manager; false without one.
// Call on the host's dispatcher thread.
using GetManagerStateFn = bool (*)(ManagerStateRecord& state);

// "SetCodecLibraryDirectory": the directory the codec libraries are loaded
// from (empty: the system's search path); `reloadNow` loads them afresh at
// once. Call it while no clip is being written.
using SetCodecLibraryDirectoryFn = void (*)(const char* directory, bool reloadNow);

}  // namespace testhooks

#endif  // ALERTMOD_TESTS_SUPPORT_MODULE_HOOKS_H_
