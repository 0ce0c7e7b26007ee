#include "alertmod/platform/local_time.h"

namespace hx {
namespace platform {

bool LocalFields(int64_t seconds, std::tm* fields) {
  time_t value = static_cast<time_t>(seconds);
  std::tm local{};
  if (localtime_r(&value, &local) == nullptr) return false;
  *fields = local;
  return true;
}

}  // namespace platform
}  // namespace hx
