#include "alertmod/platform/error_text.h"

#include <windows.h>

#include <cerrno>
#include <cstring>

#include "alertmod/platform/win32/system_error.h"

namespace hx {
namespace platform {
namespace {

struct ErrorPair {
  DWORD win32;
  int error;
};

// The Win32 codes the module's file calls can meet; the C runtime maps them
// the same way.
constexpr ErrorPair kErrorPairs[] = {
    {ERROR_FILE_NOT_FOUND, ENOENT},
    {ERROR_PATH_NOT_FOUND, ENOENT},
    {ERROR_INVALID_NAME, ENOENT},
    {ERROR_BAD_NETPATH, ENOENT},
    {ERROR_INVALID_DRIVE, ENOENT},
    {ERROR_ACCESS_DENIED, EACCES},
    {ERROR_SHARING_VIOLATION, EACCES},
    {ERROR_LOCK_VIOLATION, EACCES},
    {ERROR_WRITE_PROTECT, EACCES},
    {ERROR_FILE_EXISTS, EEXIST},
    {ERROR_ALREADY_EXISTS, EEXIST},
    {ERROR_DISK_FULL, ENOSPC},
    {ERROR_HANDLE_DISK_FULL, ENOSPC},
    {ERROR_DIRECTORY, ENOTDIR},
    {ERROR_DIR_NOT_EMPTY, ENOTEMPTY},
    {ERROR_TOO_MANY_OPEN_FILES, EMFILE},
    {ERROR_NOT_ENOUGH_MEMORY, ENOMEM},
    {ERROR_OUTOFMEMORY, ENOMEM},
    {ERROR_INVALID_HANDLE, EBADF},
    {ERROR_INVALID_PARAMETER, EINVAL},
    {ERROR_FILENAME_EXCED_RANGE, ENAMETOOLONG},
};

}  // namespace

std::string ErrorText(int error) {
  char buffer[256] = {0};
  if (strerror_s(buffer, sizeof(buffer), error) != 0) return "Unknown error";
  return buffer;
}

int ErrnoFromWin32(unsigned long win32Error) {
  for (const ErrorPair& pair : kErrorPairs) {
    if (pair.win32 == win32Error) return pair.error;
  }
  return EIO;
}

Status Win32Failure(const std::string& action, unsigned long win32Error) {
  return Status::FromErrno(action, ErrnoFromWin32(win32Error));
}

}  // namespace platform
}  // namespace hx
