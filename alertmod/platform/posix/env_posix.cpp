#include <ctime>

#include "alertmod/platform/env.h"
#include "alertmod/platform/file_system.h"
#include "alertmod/platform/utc_time.h"

namespace hx {
namespace platform {
namespace {

class PosixEnv final : public Env {
 public:
  uint32_t TickMs() override {
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    // The tick is the low 32 bits of the millisecond count; readers compare
    // differences, so the wrap does no harm.
    uint64_t ms =
        static_cast<uint64_t>(now.tv_sec) * 1000u + static_cast<uint64_t>(now.tv_nsec) / 1000000u;
    return static_cast<uint32_t>(ms);
  }
  int64_t WallSeconds() override { return static_cast<int64_t>(time(nullptr)); }

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
  return std::make_unique<PosixEnv>();
}

}  // namespace platform
}  // namespace hx
