#include <ctime>

#include "alertmod/platform/system_env.h"

namespace hx {
namespace platform {
namespace {

class PosixEnv final : public SystemEnv {
 public:
  uint32_t TickMs() override {
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    // The tick is the low 32 bits of the millisecond count; readers compare
    // differences, so the wrap does no harm.
    uint64_t ms =
        static_cast<uint64_t>(now.tv_sec) * 1000u + static_cast<uint64_t>(now.tv_nsec) / 1000000u;
    return static_cast<uint32_t>(ms);
  }
  int64_t WallSeconds() override { return static_cast<int64_t>(time(nullptr)); }
};

}  // namespace

std::unique_ptr<Env> NewSystemEnv() {
  return std::make_unique<PosixEnv>();
}

}  // namespace platform
}  // namespace hx
