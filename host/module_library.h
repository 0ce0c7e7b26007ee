// A loaded alert module: the shared library file and its seven entry points.
// Used by the reference host's own threads; the library stays loaded for the
// object's life.
#ifndef ALERTMOD_HOST_MODULE_LIBRARY_H_
#define ALERTMOD_HOST_MODULE_LIBRARY_H_

#include <memory>
#include <string>

#include "alertmod/host_records.h"

namespace refhost {

class ModuleLibrary {
 public:
  // Loads the library at `path` and resolves the seven entry points. Returns
  // null and fills `error` when the file or an entry point is missing.
  static std::unique_ptr<ModuleLibrary> Open(const std::string& path, std::string* error);
  ~ModuleLibrary();

  ModuleLibrary(const ModuleLibrary&) = delete;
  ModuleLibrary& operator=(const ModuleLibrary&) = delete;

  // Looks up any other symbol, such as the testing module's hook table;
  // null when it is absent.
  void* Symbol(const char* name) const;

  decltype(&::Load) load = nullptr;
  decltype(&::Unload) unload = nullptr;
  decltype(&::Open) open = nullptr;
  decltype(&::Close) close = nullptr;
  decltype(&::Read) read = nullptr;
  decltype(&::Write) write = nullptr;
  decltype(&::IOCTL) ioctl = nullptr;

 private:
  explicit ModuleLibrary(void* handle) : m_handle(handle) {}
  void* m_handle;
};

}  // namespace refhost

#endif  // ALERTMOD_HOST_MODULE_LIBRARY_H_
