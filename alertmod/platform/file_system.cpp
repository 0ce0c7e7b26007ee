#include "alertmod/platform/file_system.h"

#include <dirent.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <memory>
#include <mutex>

#include "alertmod/platform/error_text.h"
#include "alertmod/platform/files.h"

namespace hx {
namespace platform {
namespace {

// The replacement query and its context, read and written as one pair. A
// query of free space is rare enough for a lock.
struct FreeBytesSource {
  std::mutex mutex;
  FreeBytesQuery query = nullptr;
  void* context = nullptr;
};

FreeBytesSource& TheFreeBytesSource() {
  static FreeBytesSource source;
  return source;
}

FsStatus ErrnoFailure(const char* action, const std::string& path, int error) {
  return FsStatus::Failure(std::string(action) + " \"" + path + "\": " + ErrorText(error));
}

FsStatus SystemFreeBytes(const std::string& directory, uint64_t* bytes) {
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
  return FsStatus::Success();
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

FsStatus AbsolutePath(const std::string& relative, std::string* absolute) {
  std::unique_ptr<char, void (*)(void*)> current(getcwd(nullptr, 0), &free);
  if (!current) return ErrnoFailure("cannot read the current directory for", relative, errno);
  std::string base(current.get());
  if (base.empty() || base.back() != '/') base += '/';
  *absolute = base + relative;
  return FsStatus::Success();
}

FsStatus MakeDirectory(const std::string& path) {
  if (mkdir(path.c_str(), 0777) == 0) return FsStatus::Success();
  int error = errno;
  if (error == EEXIST && IsDirectory(path)) return FsStatus::Success();
  return ErrnoFailure("cannot create directory", path, error == EEXIST ? ENOTDIR : error);
}

FsStatus DeleteFile(const std::string& path) {
  int error = RemoveFile(path);
  return error == 0 ? FsStatus::Success() : ErrnoFailure("cannot remove", path, error);
}

FsStatus ListRegularFiles(const std::string& directory, std::vector<std::string>* names,
                          bool* exists) {
  *exists = true;
  std::unique_ptr<DIR, int (*)(DIR*)> dir(opendir(directory.c_str()), &closedir);
  if (!dir) {
    int error = errno;
    *exists = error != ENOENT;
    return ErrnoFailure("cannot read directory", directory, error);
  }
  names->clear();
  for (;;) {
    errno = 0;
    const dirent* entry = readdir(dir.get());
    if (entry == nullptr) break;
    if (IsRegularEntry(directory, *entry)) names->emplace_back(entry->d_name);
  }
  if (errno != 0) return ErrnoFailure("cannot read directory", directory, errno);
  return FsStatus::Success();
}

FsStatus QueryFreeBytes(const std::string& directory, uint64_t* bytes) {
  FreeBytesSource& source = TheFreeBytesSource();
  FreeBytesQuery query;
  void* context;
  {
    std::lock_guard<std::mutex> lock(source.mutex);
    query = source.query;
    context = source.context;
  }
  return query ? query(context, directory, bytes) : SystemFreeBytes(directory, bytes);
}

void SetFreeBytesQuery(FreeBytesQuery query, void* context) {
  FreeBytesSource& source = TheFreeBytesSource();
  std::lock_guard<std::mutex> lock(source.mutex);
  source.query = query;
  source.context = context;
}

}  // namespace platform
}  // namespace hx
