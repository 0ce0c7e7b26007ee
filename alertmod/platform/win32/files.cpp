#include "alertmod/platform/files.h"

#include <fcntl.h>
#include <io.h>
#include <windows.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "alertmod/platform/win32/system_error.h"

namespace hx {
namespace platform {
namespace {

constexpr size_t kReadChunkBytes = 65536;
// The most one WriteFile or ReadFile call moves.
constexpr size_t kMaxCallBytes = 1u << 30;

std::string Quoted(const std::string& path) {
  return "\"" + path + "\"";
}

// What CreateFileA needs for the POSIX-style `flags` the File calls pass.
struct CreateArguments {
  DWORD access;
  DWORD disposition;
  DWORD attributes;
};

CreateArguments ArgumentsFor(int flags) {
  CreateArguments arguments{GENERIC_READ, OPEN_EXISTING, FILE_ATTRIBUTE_NORMAL};
  if ((flags & (O_WRONLY | O_RDWR)) == 0) return arguments;
  // Appending handles may only add at the end, which keeps concurrent
  // appends whole, as O_APPEND does.
  arguments.access = (flags & O_APPEND) ? FILE_APPEND_DATA : GENERIC_WRITE;
  if ((flags & (O_CREAT | O_EXCL)) == (O_CREAT | O_EXCL)) {
    arguments.disposition = CREATE_NEW;
  } else if (flags & O_CREAT) {
    arguments.disposition = (flags & O_TRUNC) ? CREATE_ALWAYS : OPEN_ALWAYS;
  }
  // Written data goes through the cache to the disk before the call
  // returns, so that a durable save does not hinge on Sync alone.
  arguments.attributes |= FILE_FLAG_WRITE_THROUGH;
  return arguments;
}

HANDLE HandleOf(int fd) {
  return reinterpret_cast<HANDLE>(_get_osfhandle(fd));
}

}  // namespace

Status File::Open(const std::string& path, int flags, int /*mode*/, File* file) {
  const CreateArguments arguments = ArgumentsFor(flags);
  // Other handles may read, write, rename and delete the file meanwhile, as
  // on POSIX systems.
  const DWORD share = FILE_SHARE_READ | FILE_SHARE_WRITE | FILE_SHARE_DELETE;
  HANDLE handle = CreateFileA(path.c_str(), arguments.access, share, nullptr, arguments.disposition,
                              arguments.attributes, nullptr);
  if (handle == INVALID_HANDLE_VALUE)
    return Win32Failure("cannot open " + Quoted(path), GetLastError());
  // The C runtime's descriptor owns the handle from here on.
  const int fd = _open_osfhandle(reinterpret_cast<intptr_t>(handle), _O_BINARY);
  if (fd < 0) {
    CloseHandle(handle);
    return Status::FromErrno("cannot open " + Quoted(path), EMFILE);
  }
  *file = File(fd, path);
  return Status::OK();
}

Status File::CreateNew(const std::string& path, File* file) {
  return Open(path, O_WRONLY | O_CREAT | O_EXCL, 0, file);
}

Status File::OpenForWriting(const std::string& path, bool append, File* file) {
  const int position = append ? O_APPEND : O_TRUNC;
  return Open(path, O_WRONLY | O_CREAT | position, 0, file);
}

Status File::OpenForReading(const std::string& path, File* file) {
  return Open(path, O_RDONLY, 0, file);
}

Status File::Write(const void* data, size_t size, size_t* written) {
  const char* bytes = static_cast<const char*>(data);
  size_t done = 0;
  Status status;
  while (done < size) {
    DWORD n = 0;
    const DWORD ask = static_cast<DWORD>(std::min(size - done, kMaxCallBytes));
    if (!WriteFile(HandleOf(m_fd), bytes + done, ask, &n, nullptr)) {
      status = Win32Failure("cannot write " + Quoted(m_path), GetLastError());
      break;
    }
    if (n == 0) break;
    done += n;
  }
  if (written != nullptr) *written = done;
  return status;
}

Status File::Read(void* buffer, size_t count, size_t* read) {
  char* bytes = static_cast<char*>(buffer);
  *read = 0;
  while (*read < count) {
    DWORD n = 0;
    const DWORD ask = static_cast<DWORD>(std::min(count - *read, kMaxCallBytes));
    if (!ReadFile(HandleOf(m_fd), bytes + *read, ask, &n, nullptr)) {
      return Win32Failure("cannot read " + Quoted(m_path), GetLastError());
    }
    if (n == 0) break;
    *read += n;
  }
  return Status::OK();
}

Status File::Sync() {
  if (FlushFileBuffers(HandleOf(m_fd))) return Status::OK();
  return Win32Failure("cannot sync " + Quoted(m_path), GetLastError());
}

Status File::Close() {
  const int fd = std::exchange(m_fd, -1);
  if (_close(fd) == 0) return Status::OK();
  return Status::FromErrno("cannot close " + Quoted(m_path), errno);
}

Status RenameReplacing(const std::string& from, const std::string& to) {
  // Write-through: the call returns once the new name is on the disk, which
  // is what syncing the directory achieves on POSIX systems.
  if (MoveFileExA(from.c_str(), to.c_str(), MOVEFILE_REPLACE_EXISTING | MOVEFILE_WRITE_THROUGH)) {
    return Status::OK();
  }
  return Win32Failure("cannot rename " + Quoted(from) + " to " + Quoted(to), GetLastError());
}

Status SyncParentDirectory(const std::string& path) {
  // Windows has no handle on a directory's entries to flush; the
  // write-through rename has already put the entry on the disk. What is
  // left is to report a directory that is not there.
  const std::string::size_type slash = path.find_last_of("/\\");
  const std::string dir = slash == std::string::npos ? "." : path.substr(0, slash + 1);
  const DWORD attributes = GetFileAttributesA(dir.c_str());
  if (attributes == INVALID_FILE_ATTRIBUTES) {
    return Win32Failure("cannot sync " + Quoted(dir), GetLastError());
  }
  if ((attributes & FILE_ATTRIBUTE_DIRECTORY) == 0) {
    return Status::FromErrno("cannot sync " + Quoted(dir), ENOTDIR);
  }
  return Status::OK();
}

bool IsRegularFileUpTo(const std::string& path, uint64_t maxBytes) {
  WIN32_FILE_ATTRIBUTE_DATA info{};
  if (!GetFileAttributesExA(path.c_str(), GetFileExInfoStandard, &info)) return false;
  if (info.dwFileAttributes & (FILE_ATTRIBUTE_DIRECTORY | FILE_ATTRIBUTE_DEVICE)) return false;
  const uint64_t size = (static_cast<uint64_t>(info.nFileSizeHigh) << 32) | info.nFileSizeLow;
  return size <= maxBytes;
}

Status ReadWholeFile(const std::string& path, std::string* content) {
  File file;
  Status status = File::OpenForReading(path, &file);
  content->clear();
  char buffer[kReadChunkBytes];
  size_t read = kReadChunkBytes;
  while (status.ok() && read == kReadChunkBytes) {
    status = file.Read(buffer, sizeof(buffer), &read);
    content->append(buffer, read);
  }
  return status;
}

}  // namespace platform
}  // namespace hx
