// SystemEnv: the part of the operating system's Env that is the same on every
// system. Each system's env_<system>.cpp derives its final Env from it and
// adds the clocks; everything else goes to the platform calls of files.h,
// file_system.h and utc_time.h, whose system halves sit beside it.
//
// Stateless; any thread.
#ifndef ALERTMOD_PLATFORM_SYSTEM_ENV_H_
#define ALERTMOD_PLATFORM_SYSTEM_ENV_H_

#include "alertmod/platform/env.h"

namespace hx {
namespace platform {

class SystemEnv : public Env {
 public:
  Status NewExclusiveFile(const std::string& path, File* file) override;
  Status NewWritableFile(const std::string& path, bool append, File* file) override;
  Status NewReadableFile(const std::string& path, File* file) override;
  Status RenameFile(const std::string& from, const std::string& to) override;
  Status RemoveFile(const std::string& path) override;
  Status SyncParentDirectory(const std::string& path) override;
  Status FreeBytes(const std::string& directory, uint64_t* bytes) override;
  std::string TempDirectory() override;

  std::chrono::milliseconds WatchdogPeriod() override { return kDefaultWatchdogPeriod; }
  std::chrono::milliseconds WebExchangeTimeout() override { return kDefaultWebExchangeTimeout; }
  std::chrono::milliseconds ProcessStartTimeout() override { return kDefaultProcessStartTimeout; }
  uint32_t InitialProcessIdCounter() override { return 0; }
};

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_SYSTEM_ENV_H_
