#include "host/module_library.h"

#include <dlfcn.h>

namespace refhost {
namespace {

template <typename Fn>
bool Resolve(void* handle, const char* name, Fn* target, std::string* error) {
  *target = reinterpret_cast<Fn>(dlsym(handle, name));
  if (*target == nullptr && error != nullptr) *error = std::string("missing entry point ") + name;
  return *target != nullptr;
}

}  // namespace

std::unique_ptr<ModuleLibrary> ModuleLibrary::Open(const std::string& path, std::string* error) {
  void* handle = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
  if (handle == nullptr) {
    if (error != nullptr) *error = dlerror();
    return nullptr;
  }
  std::unique_ptr<ModuleLibrary> module(new ModuleLibrary(handle));
  bool ok = Resolve(handle, "Load", &module->load, error) &&
            Resolve(handle, "Unload", &module->unload, error) &&
            Resolve(handle, "Open", &module->open, error) &&
            Resolve(handle, "Close", &module->close, error) &&
            Resolve(handle, "Read", &module->read, error) &&
            Resolve(handle, "Write", &module->write, error) &&
            Resolve(handle, "IOCTL", &module->ioctl, error);
  if (!ok) return nullptr;
  return module;
}

ModuleLibrary::~ModuleLibrary() {
  dlclose(m_handle);
}

void* ModuleLibrary::Symbol(const char* name) const {
  return dlsym(m_handle, name);
}

}  // namespace refhost
