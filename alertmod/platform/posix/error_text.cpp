#include "alertmod/platform/error_text.h"

#include <cstring>

namespace hx {
namespace platform {

std::string ErrorText(int error) {
  char buffer[256] = {0};
  // The GNU strerror_r may return a static text instead of filling the buffer.
  const char* text = strerror_r(error, buffer, sizeof(buffer));
  return text ? std::string(text) : std::string(buffer);
}

}  // namespace platform
}  // namespace hx
