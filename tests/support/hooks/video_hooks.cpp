#include "alertmod/video/av_libs.h"
#include "tests/support/hooks/hook_registry.h"

namespace testhooks {
namespace {

// Points the module's codec libraries at `directory` (empty: the system's
// search path). With `reloadNow` they are loaded afresh at once; otherwise
// the clip writer reloads them when it finds the set incomplete.
void SetCodecLibraryDirectory(const char* directory, bool reloadNow) {
  hx::av_init& libs = hx::av_init::Instance();
  libs.SetLibraryDirectory(directory != nullptr ? directory : "");
  if (reloadNow) libs.Reload();
}

HookRegistrar g_codecDirectory("SetCodecLibraryDirectory", AsHook(&SetCodecLibraryDirectory));

}  // namespace
}  // namespace testhooks
