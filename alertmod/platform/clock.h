// The module's clocks: a 32-bit millisecond tick for frame arrival, throttling
// and retries, and wall-clock seconds for event times and deadlines.
//
// Both are process-wide and replaceable so that tests can drive time by hand.
// Any thread may read them; a replacement should be installed before the
// module starts work and must itself be safe to call from any thread.
#ifndef ALERTMOD_PLATFORM_CLOCK_H_
#define ALERTMOD_PLATFORM_CLOCK_H_

#include <cstdint>

namespace hx {
namespace platform {

// Milliseconds of the monotonic clock, truncated to 32 bits. Wraps after about
// 49.7 days; compare readings by their difference, never by size.
uint32_t TickMs();

// Seconds since 1970-01-01 UTC.
int64_t WallSeconds();

using TickSource = uint32_t (*)(void* context);
using WallSource = int64_t (*)(void* context);

// Replaces the tick source. A null `source` restores the system clock.
void SetTickSource(TickSource source, void* context);

// Replaces the wall-clock source. A null `source` restores the system clock.
void SetWallSource(WallSource source, void* context);

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_CLOCK_H_
