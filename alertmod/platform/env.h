// Env: everything the module asks of the world around it, in one object that
// is handed down from Load: the clocks, the files of the durable writer and
// of the message store, the free space of a volume, the temporary directory,
// and the time limits that tests shorten.
//
// NewSystemEnv gives the operating system's implementation. A test builds
// its own Env, usually an EnvWrapper over the system's that overrides the
// one call it needs to control, and passes it where the system's would go.
//
// Every method may be called from any thread at any time; an implementation
// must be safe for that. The module keeps a reference to its Env from Load
// to Unload, so an Env must outlive every component it was given to.
#ifndef ALERTMOD_PLATFORM_ENV_H_
#define ALERTMOD_PLATFORM_ENV_H_

#include <chrono>
#include <cstdint>
#include <memory>
#include <string>

#include "alertmod/platform/files.h"
#include "alertmod/platform/status.h"

namespace hx {
namespace platform {

// How long the manager's watchdog sleeps between two passes.
constexpr std::chrono::milliseconds kDefaultWatchdogPeriod{10000};
// The bound on one exchange with the recording system's web server.
constexpr std::chrono::milliseconds kDefaultWebExchangeTimeout{10000};
// How long a program start waits for the host's answer.
constexpr std::chrono::milliseconds kDefaultProcessStartTimeout{30000};

class Env {
 public:
  Env() = default;
  virtual ~Env() = default;
  Env(const Env&) = delete;
  Env& operator=(const Env&) = delete;

  // Milliseconds of the monotonic clock, truncated to 32 bits. Wraps after
  // about 49.7 days; compare readings by their difference, never by size.
  virtual uint32_t TickMs() = 0;

  // Seconds since 1970-01-01 UTC.
  virtual int64_t WallSeconds() = 0;

  // Creates `path` for writing and puts it in `file`; fails, leaving `file`
  // unchanged, when `path` exists.
  virtual Status NewExclusiveFile(const std::string& path, File* file) = 0;

  // Opens `path` for writing, created or truncated, or for appending to its
  // end when `append` is true.
  virtual Status NewWritableFile(const std::string& path, bool append, File* file) = 0;

  // Opens the existing file `path` for reading.
  virtual Status NewReadableFile(const std::string& path, File* file) = 0;

  // Renames `from` to `to`, atomically replacing an existing `to`.
  virtual Status RenameFile(const std::string& from, const std::string& to) = 0;

  // Removes the file `path`; a file that is already gone is no error.
  virtual Status RemoveFile(const std::string& path) = 0;

  // Forces the directory that holds `path` to the storage device, so that
  // a rename into it survives a power loss.
  virtual Status SyncParentDirectory(const std::string& path) = 0;

  // Bytes available to an unprivileged caller on the volume of `directory`.
  // Fails when the volume cannot be queried; `bytes` is then unchanged.
  virtual Status FreeBytes(const std::string& directory, uint64_t* bytes) = 0;

  // The directory for temporary files, ending in a path separator.
  virtual std::string TempDirectory() = 0;

  // The watchdog period of managers created afterwards.
  virtual std::chrono::milliseconds WatchdogPeriod() = 0;

  // The bound on one web exchange (connection, request and reply) of web
  // clients created afterwards.
  virtual std::chrono::milliseconds WebExchangeTimeout() = 0;

  // How long a program start waits for the host's answer before the program
  // counts as not started.
  virtual std::chrono::milliseconds ProcessStartTimeout() = 0;

  // The process-id counter's value when the process service is registered:
  // the next program started takes the id after it. 0 (the system's value)
  // leaves the counter where the last run of the service left it.
  virtual uint32_t InitialProcessIdCounter() = 0;
};

// The operating system's Env. Each call makes a new one; they share no state.
std::unique_ptr<Env> NewSystemEnv();

// An Env that forwards every call to another, so that a subclass overrides
// only what it changes. The target must outlive the wrapper.
class EnvWrapper : public Env {
 public:
  explicit EnvWrapper(Env* target) : m_target(target) {}

  Env* target() const { return m_target; }

  uint32_t TickMs() override { return m_target->TickMs(); }
  int64_t WallSeconds() override { return m_target->WallSeconds(); }
  Status NewExclusiveFile(const std::string& path, File* file) override {
    return m_target->NewExclusiveFile(path, file);
  }
  Status NewWritableFile(const std::string& path, bool append, File* file) override {
    return m_target->NewWritableFile(path, append, file);
  }
  Status NewReadableFile(const std::string& path, File* file) override {
    return m_target->NewReadableFile(path, file);
  }
  Status RenameFile(const std::string& from, const std::string& to) override {
    return m_target->RenameFile(from, to);
  }
  Status RemoveFile(const std::string& path) override { return m_target->RemoveFile(path); }
  Status SyncParentDirectory(const std::string& path) override {
    return m_target->SyncParentDirectory(path);
  }
  Status FreeBytes(const std::string& directory, uint64_t* bytes) override {
    return m_target->FreeBytes(directory, bytes);
  }
  std::string TempDirectory() override { return m_target->TempDirectory(); }
  std::chrono::milliseconds WatchdogPeriod() override { return m_target->WatchdogPeriod(); }
  std::chrono::milliseconds WebExchangeTimeout() override { return m_target->WebExchangeTimeout(); }
  std::chrono::milliseconds ProcessStartTimeout() override {
    return m_target->ProcessStartTimeout();
  }
  uint32_t InitialProcessIdCounter() override { return m_target->InitialProcessIdCounter(); }

 private:
  Env* const m_target;
};

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_ENV_H_
