#include "alertmod/config/credentials.h"

namespace hx {

std::optional<std::string> ProtectPassword(const std::string&, uint32_t, core::HostCallbackFn,
                                           const ErrorSink&) {
  return std::nullopt;
}

std::optional<std::string> UnprotectPassword(const std::string&, uint32_t, core::HostCallbackFn,
                                             const ErrorSink&) {
  return std::nullopt;
}

}  // namespace hx
