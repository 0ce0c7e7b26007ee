// The file operations of the notification job: one output file written at a
// time (message files), plus the directory, removal and free-space calls that
// the job and the retry queue make on the data directory.
//
// The worker creates one stream per job or retry pass and is its only user;
// a stream is never shared between threads. Tests substitute the interface, or
// only the free-space query (through the Env the stream is given).
#ifndef ALERTMOD_MAIL_NOTIFY_FILE_STREAM_H_
#define ALERTMOD_MAIL_NOTIFY_FILE_STREAM_H_

#include <cstdint>
#include <ios>
#include <streambuf>
#include <string>

#include "alertmod/host_records.h"
#include "alertmod/platform/env.h"
#include "alertmod/platform/files.h"

namespace hx {

// Free space reported when the volume cannot be queried: one byte above the
// retry queue's floor, so that nothing is purged on a guess.
constexpr uint64_t kUnknownFreeBytes = 104857601;

class INotifyFileStream {
 public:
  virtual ~INotifyFileStream() = default;
  // Closes any open file and opens `path` for writing with `mode` plus
  // output; the file is created or truncated, or appended to when `mode`
  // holds app. Clears an earlier error state.
  // Returns true when the stream is good afterwards.
  virtual bool Open(const std::string& path, std::ios_base::openmode mode) = 0;
  // Closes the file, writing out what is buffered. A failed close (or closing
  // a stream with no open file) sets the fail state.
  virtual void Close() = 0;
  // No error flag is set.
  virtual bool IsGood() const = 0;
  // The fail or bad flag is set.
  virtual bool Failed() const = 0;
  // The write operations do nothing once the stream is in an error state and
  // return the stream itself so that calls chain.
  // Copies what `buffer` has to give, to its end.
  virtual INotifyFileStream& WriteStream(std::streambuf* buffer) = 0;
  // `value` in decimal.
  virtual INotifyFileStream& WriteUInt(uint32_t value) = 0;
  // A NUL-terminated text; a null pointer writes nothing.
  virtual INotifyFileStream& WriteText(const char* text) = 0;
  // Every byte of `text`, NUL bytes included.
  virtual INotifyFileStream& WriteString(const std::string& text) = 0;
  // Bytes written to the open file so far; 0 when there is no open file or
  // the stream has failed.
  virtual uint64_t Position() = 0;
  // Bytes available to the caller on the volume of `directory`. When the query
  // fails (logged), or the volume reports no size, returns kUnknownFreeBytes.
  virtual uint64_t FreeBytes(const std::string& directory) = 0;
  // True when `directory` was created or already exists; false on a
  // file-system error.
  virtual bool CreateDirectory(const std::string& directory) = 0;
  // Removes the file `path`; false on a file-system error. A file that is
  // already gone is no error.
  virtual bool RemoveFile(const std::string& path) = 0;
};

// The stream the worker uses, writing through a platform::File with a buffer
// of its own, so that the many short writes of a message cost few system
// calls. A failed write of the buffer puts the stream in its error state.
// Log lines (a failed free-space query) go to the host through `callback`.
// Files are opened, removed and measured through `env`, which must outlive
// the stream.
class NotifyFileStreamImpl final : public INotifyFileStream {
 public:
  NotifyFileStreamImpl(core::HostCallbackFn callback, platform::Env& env);
  ~NotifyFileStreamImpl() override;
  NotifyFileStreamImpl(const NotifyFileStreamImpl&) = delete;
  NotifyFileStreamImpl& operator=(const NotifyFileStreamImpl&) = delete;

  bool Open(const std::string& path, std::ios_base::openmode mode) override;
  void Close() override;
  bool IsGood() const override;
  bool Failed() const override;
  INotifyFileStream& WriteStream(std::streambuf* buffer) override;
  INotifyFileStream& WriteUInt(uint32_t value) override;
  INotifyFileStream& WriteText(const char* text) override;
  INotifyFileStream& WriteString(const std::string& text) override;
  uint64_t Position() override;
  uint64_t FreeBytes(const std::string& directory) override;
  bool CreateDirectory(const std::string& directory) override;
  bool RemoveFile(const std::string& path) override;

 private:
  // Adds `size` bytes to the buffer, writing it out when it is full.
  void Append(const char* data, size_t size);
  // Writes the buffer out; a failure sets the error state.
  void Flush();

  core::HostCallbackFn m_callback;
  platform::Env& m_env;
  platform::File m_file;
  std::string m_buffer;
  uint64_t m_flushedBytes = 0;
  bool m_failed = false;
};

}  // namespace hx

#endif  // ALERTMOD_MAIL_NOTIFY_FILE_STREAM_H_
