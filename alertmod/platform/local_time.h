// The machine's local time, in the time zone the process has (TZ or the
// system's zone). Any thread.
#ifndef ALERTMOD_PLATFORM_LOCAL_TIME_H_
#define ALERTMOD_PLATFORM_LOCAL_TIME_H_

#include <cstdint>
#include <ctime>

namespace hx {
namespace platform {

// Breaks `seconds` since 1970-01-01 UTC into local calendar fields (tm
// conventions). Returns false, leaving `fields` unchanged, when the time
// cannot be represented.
bool LocalFields(int64_t seconds, std::tm* fields);

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_LOCAL_TIME_H_
