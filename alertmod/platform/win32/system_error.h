// Windows only: the errno value a Win32 error code (GetLastError) stands for,
// so that a Status reads the same on both systems and callers keep asking
// IsNotFound and IsNoSpace. Pure function; any thread.
#ifndef ALERTMOD_PLATFORM_WIN32_SYSTEM_ERROR_H_
#define ALERTMOD_PLATFORM_WIN32_SYSTEM_ERROR_H_

#include <string>

#include "alertmod/platform/status.h"

namespace hx {
namespace platform {

// The errno value for `win32Error`; EIO for a code without a closer match.
int ErrnoFromWin32(unsigned long win32Error);

// A failed Win32 call: `action` with its object, and GetLastError's code.
Status Win32Failure(const std::string& action, unsigned long win32Error);

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_WIN32_SYSTEM_ERROR_H_
