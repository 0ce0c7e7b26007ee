#include <windows.h>
// timeapi.h needs windows.h before it; windows.h names DeleteFile as a macro.
#include <timeapi.h>
#undef DeleteFile

#include <ctime>

#include "alertmod/platform/env.h"
#include "alertmod/platform/file_system.h"
#include "alertmod/platform/utc_time.h"

namespace hx {
namespace platform {
namespace {

class WindowsEnv final : public Env {
 public:
  // timeGetTime is the 32-bit millisecond count since boot; it wraps after
  // 49.7 days, as the tick's contract allows.
  uint32_t TickMs() override { return static_cast<uint32_t>(timeGetTime()); }
  int64_t WallSeconds() override { return static_cast<int64_t>(_time64(nullptr)); }

  Status NewExclusiveFile(const std::string& path, File* file) override {
    return File::CreateNew(path, file);
  }
  Status NewWritableFile(const std::string& path, bool append, File* file) override {
    return File::OpenForWriting(path, append, file);
  }
  Status NewReadableFile(const std::string& path, File* file) override {
    return File::OpenForReading(path, file);
  }
  Status RenameFile(const std::string& from, const std::string& to) override {
    return RenameReplacing(from, to);
  }
  Status RemoveFile(const std::string& path) override { return DeleteFile(path); }
  Status SyncParentDirectory(const std::string& path) override {
    return platform::SyncParentDirectory(path);
  }
  Status FreeBytes(const std::string& directory, uint64_t* bytes) override {
    return QueryFreeBytes(directory, bytes);
  }
  std::string TempDirectory() override { return TempDirectoryPath(); }

  std::chrono::milliseconds WatchdogPeriod() override { return kDefaultWatchdogPeriod; }
  std::chrono::milliseconds WebExchangeTimeout() override { return kDefaultWebExchangeTimeout; }
  std::chrono::milliseconds ProcessStartTimeout() override { return kDefaultProcessStartTimeout; }
  uint32_t InitialProcessIdCounter() override { return 0; }
};

}  // namespace

std::unique_ptr<Env> NewSystemEnv() {
  return std::make_unique<WindowsEnv>();
}

}  // namespace platform
}  // namespace hx
