#include <windows.h>
// timeapi.h needs windows.h before it; windows.h names DeleteFile as a macro.
#include <timeapi.h>
#undef DeleteFile

#include <ctime>

#include "alertmod/platform/system_env.h"

namespace hx {
namespace platform {
namespace {

class WindowsEnv final : public SystemEnv {
 public:
  // timeGetTime is the 32-bit millisecond count since boot; it wraps after
  // 49.7 days, as the tick's contract allows.
  uint32_t TickMs() override { return static_cast<uint32_t>(timeGetTime()); }
  int64_t WallSeconds() override { return static_cast<int64_t>(_time64(nullptr)); }
};

}  // namespace

std::unique_ptr<Env> NewSystemEnv() {
  return std::make_unique<WindowsEnv>();
}

}  // namespace platform
}  // namespace hx
