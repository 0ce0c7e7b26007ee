#include "alertmod/platform/clock.h"

#include <windows.h>
// timeapi.h needs windows.h before it.
#include <timeapi.h>

#include <atomic>
#include <ctime>
#include <list>
#include <mutex>

namespace hx {
namespace platform {
namespace {

// A replacement is a function and its context. They are swapped as one
// pointer so that a reader never pairs a new function with an old context.
template <typename Fn>
struct Source {
  Fn fn;
  void* context;
};

std::atomic<const Source<TickSource>*> g_tickSource{nullptr};
std::atomic<const Source<WallSource>*> g_wallSource{nullptr};

// Replaced sources are kept for the life of the process: a reader on
// another thread may still be calling through an old one. Tests install a
// handful at most.
template <typename Fn>
const Source<Fn>* Keep(Fn fn, void* context) {
  static std::mutex mutex;
  static std::list<Source<Fn>> kept;
  std::lock_guard<std::mutex> lock(mutex);
  kept.push_back(Source<Fn>{fn, context});
  return &kept.back();
}

template <typename Fn>
void Install(std::atomic<const Source<Fn>*>& slot, Fn fn, void* context) {
  slot.store(fn ? Keep(fn, context) : nullptr, std::memory_order_release);
}

}  // namespace

uint32_t TickMs() {
  const Source<TickSource>* source = g_tickSource.load(std::memory_order_acquire);
  // timeGetTime is the 32-bit millisecond count since boot, wrapping as the
  // tick's contract says.
  return source ? source->fn(source->context) : static_cast<uint32_t>(timeGetTime());
}

int64_t WallSeconds() {
  const Source<WallSource>* source = g_wallSource.load(std::memory_order_acquire);
  return source ? source->fn(source->context) : static_cast<int64_t>(_time64(nullptr));
}

void SetTickSource(TickSource source, void* context) {
  Install(g_tickSource, source, context);
}

void SetWallSource(WallSource source, void* context) {
  Install(g_wallSource, source, context);
}

}  // namespace platform
}  // namespace hx
