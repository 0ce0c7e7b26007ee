#include "alertmod/platform/local_time.h"

#include <time.h>

namespace hx {
namespace platform {

bool LocalFields(int64_t seconds, std::tm* fields) {
  const __time64_t value = static_cast<__time64_t>(seconds);
  std::tm local{};
  if (_localtime64_s(&local, &value) != 0) return false;
  *fields = local;
  return true;
}

}  // namespace platform
}  // namespace hx
