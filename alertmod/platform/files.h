// Files of the module: an owned descriptor (File) and the whole-file calls
// behind durable saves, an atomic replacing rename and the sync of a
// directory entry. Every call reports a failure as a Status; nothing throws.
//
// A File belongs to one thread at a time. The free functions may be called
// from any thread.
#ifndef ALERTMOD_PLATFORM_FILES_H_
#define ALERTMOD_PLATFORM_FILES_H_

#include <cstddef>
#include <cstdint>
#include <string>

#include "alertmod/platform/status.h"

namespace hx {
namespace platform {

// An open file, or none. It is closed when the object goes; the result of
// that close is lost, so a writer that cares calls Close itself. Movable,
// not copyable: the descriptor always has exactly one owner.
class File {
 public:
  File() = default;
  ~File();
  File(File&& other) noexcept;
  File& operator=(File&& other) noexcept;
  File(const File&) = delete;
  File& operator=(const File&) = delete;

  // Creates `path` for writing with mode 0644 and puts it in `file`; fails,
  // leaving `file` unchanged, when `path` exists.
  static Status CreateNew(const std::string& path, File* file);
  // Opens `path` for writing, created (mode 0666 less the umask) or
  // truncated, or for appending to its end when `append` is true.
  static Status OpenForWriting(const std::string& path, bool append, File* file);
  // Opens the existing file `path` for reading.
  static Status OpenForReading(const std::string& path, File* file);

  bool is_open() const { return m_fd >= 0; }

  // Writes `size` bytes, continuing after partial writes and interruptions.
  // `*written` (when not null) counts the bytes that went out, also on
  // failure. A device that accepts nothing more ends the write early without
  // an error: compare `*written`.
  Status Write(const void* data, size_t size, size_t* written = nullptr);
  // Reads up to `count` bytes into `buffer`, fewer only at the end of the
  // file or on failure; `*read` counts them.
  Status Read(void* buffer, size_t count, size_t* read);
  // Forces the file's data and metadata to the storage device.
  Status Sync();
  // Closes the file. The descriptor is released even when this fails;
  // closing a File that is not open fails.
  Status Close();

 private:
  friend Status SyncParentDirectory(const std::string& path);

  File(int fd, std::string path) : m_fd(fd), m_path(std::move(path)) {}
  static Status Open(const std::string& path, int flags, int mode, File* file);

  int m_fd = -1;
  std::string m_path;  // for the texts of failures
};

// Renames `from` to `to`, atomically replacing an existing `to`.
Status RenameReplacing(const std::string& from, const std::string& to);

// Forces the directory that holds `path` to the storage device, so that a
// rename into it survives a power loss.
Status SyncParentDirectory(const std::string& path);

// True when `path` is a regular file (symbolic links followed) of at most
// `maxBytes` bytes.
bool IsRegularFileUpTo(const std::string& path, uint64_t maxBytes);

// Reads the whole file `path` into `content`.
Status ReadWholeFile(const std::string& path, std::string* content);

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_FILES_H_
