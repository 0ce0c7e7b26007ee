// The directory and volume calls of the message store: absolute paths,
// directory creation and listing, file removal and the free space of a volume.
//
// Every call reports a failure as a Status; nothing throws. All calls may be
// made from any thread. Module code asks its Env for the free space, so that
// a test can simulate a full disk.
#ifndef ALERTMOD_PLATFORM_FILE_SYSTEM_H_
#define ALERTMOD_PLATFORM_FILE_SYSTEM_H_

#include <cstdint>
#include <string>
#include <vector>

#include "alertmod/platform/status.h"

namespace hx {
namespace platform {

// `relative` joined to the current directory. Fails when the current
// directory cannot be read; `absolute` is then left unchanged.
Status AbsolutePath(const std::string& relative, std::string* absolute);

// Creates the directory `path` (one level). Succeeds when it was created or
// already is a directory; fails when it cannot be made or a non-directory has
// that name.
Status MakeDirectory(const std::string& path);

// Removes the file `path`; a file that is already gone is no error.
Status DeleteFile(const std::string& path);

// The names of the regular files in `directory` (symbolic links followed),
// in no particular order. Fails when the directory cannot be read
// (IsNotFound when it does not exist).
Status ListRegularFiles(const std::string& directory, std::vector<std::string>* names);

// Bytes available to an unprivileged caller on the volume of `directory`.
// Fails when the volume cannot be queried; `bytes` is then unchanged.
Status QueryFreeBytes(const std::string& directory, uint64_t* bytes);

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_FILE_SYSTEM_H_
