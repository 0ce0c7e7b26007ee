// Turns a system error number into the system's own text for it. Any thread.
#ifndef ALERTMOD_PLATFORM_ERROR_TEXT_H_
#define ALERTMOD_PLATFORM_ERROR_TEXT_H_

#include <string>

namespace hx {
namespace platform {

// Returns strerror's text for `error`, thread-safely.
std::string ErrorText(int error);

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_ERROR_TEXT_H_
