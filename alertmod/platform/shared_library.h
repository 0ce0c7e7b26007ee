// Run-time loading of shared libraries by file name and lookup of their
// symbols, for the codec libraries that the module uses without linking them.
//
// Any thread may call these; the dynamic loader serialises them itself.
#ifndef ALERTMOD_PLATFORM_SHARED_LIBRARY_H_
#define ALERTMOD_PLATFORM_SHARED_LIBRARY_H_

#include <string>

namespace hx {
namespace platform {

// The file name of major version `major` of the library `baseName`:
// "lib<baseName>.so.<major>" on Linux, "<baseName>-<major>.dll" on Windows.
std::string SharedLibraryFileName(const std::string& baseName, int major);

// Loads the library `path` with every symbol bound now and kept local. A
// name without a slash is looked up along the system's search path. Returns
// the library's handle, or null when it cannot be loaded.
void* OpenSharedLibrary(const std::string& path);

// The address of the symbol `name` in the library `handle`, or null when it
// has no such symbol or `handle` is null.
void* FindSharedSymbol(void* handle, const char* name);

// Releases a handle from OpenSharedLibrary; a null handle is ignored. The
// library stays mapped for the rest of the process, so opening the same path
// again gives the same library, even if its file has changed since.
void CloseSharedLibrary(void* handle);

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_SHARED_LIBRARY_H_
