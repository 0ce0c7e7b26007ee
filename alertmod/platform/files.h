// The file-system calls behind durable saves: an exclusively created file,
// writes and syncs that report the system error number, an atomic replacing
// rename and the sync of a directory entry. Each function returns 0 on
// success or the errno value of the failed call; any thread.
#ifndef ALERTMOD_PLATFORM_FILES_H_
#define ALERTMOD_PLATFORM_FILES_H_

#include <cstddef>
#include <cstdint>
#include <string>

namespace hx {
namespace platform {

// Creates `path` for writing with mode 0644; fails with EEXIST when it exists.
// On success `fd` holds the open descriptor (close-on-exec).
int CreateExclusiveFile(const std::string& path, int& fd);

// Writes `size` bytes, continuing after partial writes and interruptions.
// `written` counts the bytes that went out, also on failure. A device that
// accepts nothing more ends the loop without an error: compare `written`.
int WriteFully(int fd, const void* data, size_t size, size_t& written);

// Forces the file's data and metadata to the storage device.
int SyncFile(int fd);

int CloseFile(int fd);

// Removes `path`; a missing file is no error.
int RemoveFile(const std::string& path);

// Renames `from` to `to`, atomically replacing an existing `to`.
int RenameReplacing(const std::string& from, const std::string& to);

// Forces the directory that holds `path` to the storage device, so that a
// rename into it survives a power loss.
int SyncParentDirectory(const std::string& path);

// True when `path` is a regular file (symbolic links followed) of at most
// `maxBytes` bytes.
bool IsRegularFileUpTo(const std::string& path, uint64_t maxBytes);

// Reads the whole file `path` into `content`.
int ReadWholeFile(const std::string& path, std::string* content);

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_FILES_H_
