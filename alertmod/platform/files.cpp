#include "alertmod/platform/files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

namespace hx {
namespace platform {

int CreateExclusiveFile(const std::string& path, int& fd) {
  fd = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0644);
  return fd < 0 ? errno : 0;
}

int WriteFully(int fd, const void* data, size_t size, size_t& written) {
  written = 0;
  const char* bytes = static_cast<const char*>(data);
  while (written < size) {
    ssize_t n = write(fd, bytes + written, size - written);
    if (n < 0) {
      if (errno == EINTR) continue;
      return errno;
    }
    if (n == 0) break;
    written += static_cast<size_t>(n);
  }
  return 0;
}

int SyncFile(int fd) {
  return fsync(fd) == 0 ? 0 : errno;
}

int CloseFile(int fd) {
  // Linux releases the descriptor even when close reports an error, so a
  // retry after EINTR could close someone else's new descriptor.
  return close(fd) == 0 ? 0 : errno;
}

int RemoveFile(const std::string& path) {
  if (unlink(path.c_str()) == 0 || errno == ENOENT) return 0;
  return errno;
}

int RenameReplacing(const std::string& from, const std::string& to) {
  return rename(from.c_str(), to.c_str()) == 0 ? 0 : errno;
}

int SyncParentDirectory(const std::string& path) {
  std::string::size_type slash = path.find_last_of('/');
  std::string dir = slash == std::string::npos ? "." : slash == 0 ? "/" : path.substr(0, slash);
  int fd = open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) return errno;
  int error = fsync(fd) == 0 ? 0 : errno;
  close(fd);
  return error;
}

bool IsRegularFileUpTo(const std::string& path, uint64_t maxBytes) {
  struct stat info {};
  return stat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode) &&
         static_cast<uint64_t>(info.st_size) <= maxBytes;
}

int ReadWholeFile(const std::string& path, std::string* content) {
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return errno;
  content->clear();
  char buffer[65536];
  for (;;) {
    ssize_t n = read(fd, buffer, sizeof(buffer));
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) {
      int error = n < 0 ? errno : 0;
      close(fd);
      return error;
    }
    content->append(buffer, static_cast<size_t>(n));
  }
}

}  // namespace platform
}  // namespace hx
