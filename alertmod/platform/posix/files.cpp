#include "alertmod/platform/files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <utility>

namespace hx {
namespace platform {
namespace {

constexpr int kNewFileMode = 0644;
// The mode C stdio and the standard streams create files with.
constexpr int kStreamFileMode = 0666;
constexpr size_t kReadChunkBytes = 65536;

std::string Quoted(const std::string& path) {
  return "\"" + path + "\"";
}

}  // namespace

Status File::Open(const std::string& path, int flags, int mode, File* file) {
  int fd = open(path.c_str(), flags | O_CLOEXEC, mode);
  if (fd < 0) return Status::FromErrno("cannot open " + Quoted(path), errno);
  *file = File(fd, path);
  return Status::OK();
}

Status File::CreateNew(const std::string& path, File* file) {
  return Open(path, O_WRONLY | O_CREAT | O_EXCL, kNewFileMode, file);
}

Status File::OpenForWriting(const std::string& path, bool append, File* file) {
  const int position = append ? O_APPEND : O_TRUNC;
  return Open(path, O_WRONLY | O_CREAT | position, kStreamFileMode, file);
}

Status File::OpenForReading(const std::string& path, File* file) {
  return Open(path, O_RDONLY, 0, file);
}

Status File::Write(const void* data, size_t size, size_t* written) {
  const char* bytes = static_cast<const char*>(data);
  size_t done = 0;
  Status status;
  while (done < size) {
    ssize_t n = write(m_fd, bytes + done, size - done);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) {
      status = Status::FromErrno("cannot write " + Quoted(m_path), errno);
      break;
    }
    if (n == 0) break;
    done += static_cast<size_t>(n);
  }
  if (written != nullptr) *written = done;
  return status;
}

Status File::Read(void* buffer, size_t count, size_t* read) {
  char* bytes = static_cast<char*>(buffer);
  *read = 0;
  while (*read < count) {
    ssize_t n = ::read(m_fd, bytes + *read, count - *read);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return Status::FromErrno("cannot read " + Quoted(m_path), errno);
    if (n == 0) break;
    *read += static_cast<size_t>(n);
  }
  return Status::OK();
}

Status File::Sync() {
  if (fsync(m_fd) == 0) return Status::OK();
  return Status::FromErrno("cannot sync " + Quoted(m_path), errno);
}

Status File::Close() {
  // Linux releases the descriptor even when close reports an error, so a
  // retry after EINTR could close someone else's new descriptor.
  const int fd = std::exchange(m_fd, -1);
  if (close(fd) == 0) return Status::OK();
  return Status::FromErrno("cannot close " + Quoted(m_path), errno);
}

Status RenameReplacing(const std::string& from, const std::string& to) {
  if (rename(from.c_str(), to.c_str()) == 0) return Status::OK();
  return Status::FromErrno("cannot rename " + Quoted(from) + " to " + Quoted(to), errno);
}

Status SyncParentDirectory(const std::string& path) {
  std::string::size_type slash = path.find_last_of('/');
  std::string dir = slash == std::string::npos ? "." : slash == 0 ? "/" : path.substr(0, slash);
  File directory;
  Status status = File::Open(dir, O_RDONLY | O_DIRECTORY, 0, &directory);
  if (status.ok()) status = directory.Sync();
  return status;
}

bool IsRegularFileUpTo(const std::string& path, uint64_t maxBytes) {
  struct stat info {};
  return stat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode) &&
         static_cast<uint64_t>(info.st_size) <= maxBytes;
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
