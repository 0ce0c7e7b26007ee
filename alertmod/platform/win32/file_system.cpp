#include "alertmod/platform/file_system.h"

#include <windows.h>
// windows.h names DeleteFile as a macro for DeleteFileA.
#undef DeleteFile

#include <cerrno>

#include "alertmod/platform/win32/system_error.h"

namespace hx {
namespace platform {
namespace {

Status Failure(const char* action, const std::string& path, DWORD error) {
  return Win32Failure(std::string(action) + " \"" + path + "\"", error);
}

bool IsDirectory(const std::string& path) {
  const DWORD attributes = GetFileAttributesA(path.c_str());
  return attributes != INVALID_FILE_ATTRIBUTES && (attributes & FILE_ATTRIBUTE_DIRECTORY);
}

bool IsRegularEntry(const WIN32_FIND_DATAA& entry) {
  return (entry.dwFileAttributes & (FILE_ATTRIBUTE_DIRECTORY | FILE_ATTRIBUTE_DEVICE)) == 0;
}

}  // namespace

Status AbsolutePath(const std::string& relative, std::string* absolute) {
  char buffer[MAX_PATH + 1];
  const DWORD length = GetCurrentDirectoryA(sizeof(buffer), buffer);
  if (length == 0 || length > sizeof(buffer)) {
    return Failure("cannot read the current directory for", relative, GetLastError());
  }
  // Joined with a slash, as the module's own paths are; Windows takes both.
  std::string base(buffer, length);
  if (base.back() != '\\' && base.back() != '/') base += '/';
  *absolute = base + relative;
  return Status::OK();
}

Status MakeDirectory(const std::string& path) {
  if (CreateDirectoryA(path.c_str(), nullptr)) return Status::OK();
  const DWORD error = GetLastError();
  if (error == ERROR_ALREADY_EXISTS && IsDirectory(path)) return Status::OK();
  if (error == ERROR_ALREADY_EXISTS) {
    return Status::FromErrno("cannot create directory \"" + path + "\"", ENOTDIR);
  }
  return Failure("cannot create directory", path, error);
}

Status DeleteFile(const std::string& path) {
  if (DeleteFileA(path.c_str())) return Status::OK();
  const DWORD error = GetLastError();
  if (error == ERROR_FILE_NOT_FOUND || error == ERROR_PATH_NOT_FOUND) return Status::OK();
  return Failure("cannot remove", path, error);
}

Status ListRegularFiles(const std::string& directory, std::vector<std::string>* names) {
  WIN32_FIND_DATAA entry{};
  HANDLE find = FindFirstFileA((directory + "\\*").c_str(), &entry);
  if (find == INVALID_HANDLE_VALUE) {
    const DWORD error = GetLastError();
    // Windows finds no entries "in" a file; POSIX names that ENOTDIR, which
    // callers must not take for a missing directory.
    if (GetFileAttributesA(directory.c_str()) != INVALID_FILE_ATTRIBUTES &&
        !IsDirectory(directory)) {
      return Status::FromErrno("cannot read directory \"" + directory + "\"", ENOTDIR);
    }
    return Failure("cannot read directory", directory, error);
  }
  names->clear();
  do {
    if (IsRegularEntry(entry)) names->emplace_back(entry.cFileName);
  } while (FindNextFileA(find, &entry));
  const DWORD error = GetLastError();
  FindClose(find);
  if (error != ERROR_NO_MORE_FILES) return Failure("cannot read directory", directory, error);
  return Status::OK();
}

Status QueryFreeBytes(const std::string& directory, uint64_t* bytes) {
  // The first figure is what the calling user may still use, quotas
  // included.
  ULARGE_INTEGER available{};
  if (!GetDiskFreeSpaceExA(directory.c_str(), &available, nullptr, nullptr)) {
    return Failure("cannot query the volume of", directory, GetLastError());
  }
  *bytes = available.QuadPart;
  return Status::OK();
}

}  // namespace platform
}  // namespace hx
