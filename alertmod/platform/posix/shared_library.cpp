#include "alertmod/platform/shared_library.h"

#include <dlfcn.h>

namespace hx {
namespace platform {

std::string SharedLibraryFileName(const std::string& baseName, int major) {
  return "lib" + baseName + ".so." + std::to_string(major);
}

void* OpenSharedLibrary(const std::string& path) {
  // Local binding keeps the codec libraries' symbols out of the host's
  // namespace; binding now surfaces a broken library at load, not mid-clip.
  // A closed library stays mapped: libraries such as FFmpeg bring dozens of
  // dependencies that are not all safe to unmap while the process runs, and
  // memory they keep for the process's life would look lost once unmapped.
  return dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE);
}

void* FindSharedSymbol(void* handle, const char* name) {
  if (handle == nullptr || name == nullptr) return nullptr;
  return dlsym(handle, name);
}

void CloseSharedLibrary(void* handle) {
  if (handle != nullptr) dlclose(handle);
}

}  // namespace platform
}  // namespace hx
