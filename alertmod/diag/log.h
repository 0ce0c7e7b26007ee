// The module's two logging facilities.
//
// LogToHost formats a message and hands it to the host's log through the host
// callback, after asking the host for its current threshold. It keeps all
// state on the caller's stack and may be called from any thread at once.
//
// hx::ILgr is a process-wide append-only text file with a lock, reached through
// GetLgr(). A writer locks Mutex(), writes whole lines through Stream() and
// unlocks; Stream() and SetFileName() take no lock themselves.
#ifndef ALERTMOD_DIAG_LOG_H_
#define ALERTMOD_DIAG_LOG_H_

#include <cstdint>
#include <memory>
#include <mutex>
#include <ostream>
#include <string>

#include "alertmod/host_records.h"
#include "alertmod/platform/file_streambuf.h"
#include "alertmod/platform/files.h"

namespace hx {

constexpr int32_t LogLevelInfo = 25;
constexpr int32_t LogLevelWarning = 50;
constexpr int32_t LogLevelError = 75;

// Longest text sent to the host; longer messages are cut to this length.
constexpr int kMaxLogTextLength = 2047;

// Formats `format` printf-style and sends it at `level` under `source`.
// Returns the callback's result for the write, or 0 when nothing was sent: no
// callback, level below the host's threshold, or an empty or failed format.
int32_t LogToHost(uint32_t source, core::HostCallbackFn callback, int32_t level, const char* format,
                  ...) __attribute__((format(printf, 4, 5)));

class ILgr {
 public:
  virtual ~ILgr() = default;
  // The lock that serialises writers of whole lines.
  virtual std::mutex& Mutex() = 0;
  // The file stream, opened in append mode on first use and reopened once
  // when it is in a failed state. Returned whatever its state.
  virtual std::ostream& Stream() = 0;
  // Names the file; an open file is closed and the next Stream() reopens.
  virtual void SetFileName(const char* name) = 0;
};

class LogImpl final : public ILgr {
 public:
  LogImpl();
  ~LogImpl() override;

  std::mutex& Mutex() override { return m_mutex; }
  std::ostream& Stream() override;
  void SetFileName(const char* name) override;

 private:
  void OpenStream();
  void CloseStream();

  std::mutex m_mutex;
  platform::File m_file;
  platform::FileStreamBuf m_buffer{&m_file};
  std::ostream m_stream{&m_buffer};
  std::string m_fileName;
};

// Returns the process-wide file logger, creating it on the first call.
std::shared_ptr<ILgr> GetLgr();

}  // namespace hx

#endif  // ALERTMOD_DIAG_LOG_H_
