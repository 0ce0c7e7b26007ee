#include "alertmod/platform/system_env.h"

#include "alertmod/platform/file_system.h"
#include "alertmod/platform/files.h"
#include "alertmod/platform/utc_time.h"

namespace hx {
namespace platform {

Status SystemEnv::NewExclusiveFile(const std::string& path, File* file) {
  return File::CreateNew(path, file);
}

Status SystemEnv::NewWritableFile(const std::string& path, bool append, File* file) {
  return File::OpenForWriting(path, append, file);
}

Status SystemEnv::NewReadableFile(const std::string& path, File* file) {
  return File::OpenForReading(path, file);
}

Status SystemEnv::RenameFile(const std::string& from, const std::string& to) {
  return RenameReplacing(from, to);
}

Status SystemEnv::RemoveFile(const std::string& path) {
  return DeleteFile(path);
}

Status SystemEnv::SyncParentDirectory(const std::string& path) {
  return platform::SyncParentDirectory(path);
}

Status SystemEnv::FreeBytes(const std::string& directory, uint64_t* bytes) {
  return QueryFreeBytes(directory, bytes);
}

std::string SystemEnv::TempDirectory() {
  return TempDirectoryPath();
}

}  // namespace platform
}  // namespace hx
