#include "alertmod/platform/file_system.h"

#include <dirent.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <memory>

namespace hx {
namespace platform {
namespace {

Status ErrnoFailure(const char* action, const std::string& path, int error) {
  return Status::FromErrno(std::string(action) + " \"" + path + "\"", error);
}

bool IsDirectory(const std::string& path) {
  struct stat info {};
  return stat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

bool IsRegularEntry(const std::string& directory, const dirent& entry) {
  if (entry.d_type == DT_REG) return true;
  if (entry.d_type != DT_LNK && entry.d_type != DT_UNKNOWN) return false;
  struct stat info {};
  std::string path = directory + "/" + entry.d_name;
  return stat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode);
}

}  // namespace

Status AbsolutePath(const std::string& relative, std::string* absolute) {
  std::unique_ptr<char, void (*)(void*)> current(getcwd(nullptr, 0), &free);
  if (!current) return ErrnoFailure("cannot read the current directory for", relative, errno);
  std::string base(current.get());
  if (base.empty() || base.back() != '/') base += '/';
  *absolute = base + relative;
  return Status::OK();
}

Status MakeDirectory(const std::string& path) {
  if (mkdir(path.c_str(), 0777) == 0) return Status::OK();
  int error = errno;
  if (error == EEXIST && IsDirectory(path)) return Status::OK();
  return ErrnoFailure("cannot create directory", path, error == EEXIST ? ENOTDIR : error);
}

Status DeleteFile(const std::string& path) {
  if (unlink(path.c_str()) == 0 || errno == ENOENT) return Status::OK();
  return ErrnoFailure("cannot remove", path, errno);
}

Status ListRegularFiles(const std::string& directory, std::vector<std::string>* names) {
  std::unique_ptr<DIR, int (*)(DIR*)> dir(opendir(directory.c_str()), &closedir);
  if (!dir) return ErrnoFailure("cannot read directory", directory, errno);
  names->clear();
  for (;;) {
    errno = 0;
    const dirent* entry = readdir(dir.get());
    if (entry == nullptr) break;
    if (IsRegularEntry(directory, *entry)) names->emplace_back(entry->d_name);
  }
  if (errno != 0) return ErrnoFailure("cannot read directory", directory, errno);
  return Status::OK();
}

Status QueryFreeBytes(const std::string& directory, uint64_t* bytes) {
  struct statvfs volume {};
  if (statvfs(directory.c_str(), &volume) != 0) {
    return ErrnoFailure("cannot query the volume of", directory, errno);
  }
  uint64_t available = 0;
  // A product that does not fit is reported as "all bits set", the value a
  // volume without a known size gives.
  if (__builtin_mul_overflow(static_cast<uint64_t>(volume.f_bavail),
                             static_cast<uint64_t>(volume.f_frsize), &available)) {
    available = UINT64_MAX;
  }
  *bytes = available;
  return Status::OK();
}

}  // namespace platform
}  // namespace hx
