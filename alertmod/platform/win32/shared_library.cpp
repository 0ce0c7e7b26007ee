#include "alertmod/platform/shared_library.h"

#include <windows.h>

namespace hx {
namespace platform {

std::string SharedLibraryFileName(const std::string& baseName, int major) {
  return baseName + "-" + std::to_string(major) + ".dll";
}

void* OpenSharedLibrary(const std::string& path) {
  // A path with a folder also finds the DLLs beside it that the library
  // needs, as FFmpeg's DLLs need each other.
  const bool hasFolder = path.find_first_of("/\\") != std::string::npos;
  HMODULE module =
      LoadLibraryExA(path.c_str(), nullptr, hasFolder ? LOAD_WITH_ALTERED_SEARCH_PATH : 0);
  if (module == nullptr) return nullptr;
  // Pinned, the library stays mapped after FreeLibrary, as the contract
  // says: FFmpeg's DLLs are not all safe to unload while the process runs.
  HMODULE pinned = nullptr;
  GetModuleHandleExA(GET_MODULE_HANDLE_EX_FLAG_FROM_ADDRESS | GET_MODULE_HANDLE_EX_FLAG_PIN,
                     reinterpret_cast<LPCSTR>(module), &pinned);
  return module;
}

void* FindSharedSymbol(void* handle, const char* name) {
  if (handle == nullptr || name == nullptr) return nullptr;
  return reinterpret_cast<void*>(GetProcAddress(static_cast<HMODULE>(handle), name));
}

void CloseSharedLibrary(void* handle) {
  if (handle != nullptr) FreeLibrary(static_cast<HMODULE>(handle));
}

}  // namespace platform
}  // namespace hx
