// The test hooks of the testing build of the module. The testing module is
// the production module plus one more export, AlertmodTestHook(name), which
// returns the hook registered under `name` or null. This header gives the
// names and the function types; it includes nothing of the module.
#ifndef ALERTMOD_TESTS_SUPPORT_MODULE_HOOKS_H_
#define ALERTMOD_TESTS_SUPPORT_MODULE_HOOKS_H_

#include <cstdint>
#include <string>
#include <vector>

namespace testhooks {

// "SetTickSource": replaces the 32-bit millisecond tick (null restores).
using SetTickSourceFn = void (*)(uint32_t (*source)(void* context), void* context);
// "SetWallSource": replaces the wall clock in seconds (null restores).
using SetWallSourceFn = void (*)(int64_t (*source)(void* context), void* context);
// "SetWatchdogPeriodMs": the watchdog period of managers created afterwards.
using SetWatchdogPeriodMsFn = void (*)(uint32_t periodMs);
// "SetWebRequestTimeoutMs": the bound on one web server exchange of web
// links made afterwards.
using SetWebRequestTimeoutMsFn = void (*)(uint32_t timeoutMs);

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
// "SetLastProcessId": sets the last process id issued, so that the next start
// takes the id after it.
using SetLastProcessIdFn = void (*)(uint32_t id);

// "SetFreeBytesQuery": replaces the free-space query of the data volume;
// the query fills `bytes` and returns true, or returns false when the volume
// cannot be queried. Null restores the system's query.
using FreeBytesFn = bool (*)(void* context, uint64_t* bytes);
using SetFreeBytesQueryFn = void (*)(FreeBytesFn query, void* context);

}  // namespace testhooks

#endif  // ALERTMOD_TESTS_SUPPORT_MODULE_HOOKS_H_
