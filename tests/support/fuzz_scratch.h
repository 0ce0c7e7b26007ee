// A working directory of its own for a fuzz target whose code saves files
// (the manager saves "notify.xml" in the working directory). Call it from
// LLVMFuzzerInitialize: it makes a scratch directory (in memory when /dev/shm
// exists), removed at exit, moves into it, and rewrites the relative paths
// among the fuzzer's arguments, adding an artifact prefix, so that corpus
// directories and crash files still refer to the caller's directory.
#ifndef ALERTMOD_TESTS_SUPPORT_FUZZ_SCRATCH_H_
#define ALERTMOD_TESTS_SUPPORT_FUZZ_SCRATCH_H_

#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <string>
#include <vector>

namespace testsupport {

inline void MoveToFuzzScratchDirectory(int* argc, char*** argv, const std::string& name) {
  static std::vector<std::string> args;
  static std::vector<char*> pointers;
  static std::string scratch;
  std::error_code error;
  const std::string origin = std::filesystem::current_path(error).string();
  if (error) return;
  bool artifactPrefix = false;
  for (int i = 0; i < *argc; ++i) {
    std::string arg = (*argv)[i];
    artifactPrefix = artifactPrefix || arg.rfind("-artifact_prefix=", 0) == 0;
    if (i > 0 && !arg.empty() && arg[0] != '-' && arg[0] != '/') arg = origin + "/" + arg;
    args.push_back(arg);
  }
  if (!artifactPrefix) args.push_back("-artifact_prefix=" + origin + "/");
  for (std::string& arg : args) pointers.push_back(arg.data());
  pointers.push_back(nullptr);
  for (const char* base : {"/dev/shm", "/tmp"}) {
    scratch = std::string(base) + "/" + name + ".XXXXXX";
    if (mkdtemp(scratch.data()) != nullptr && chdir(scratch.c_str()) == 0) {
      std::atexit([] {
        std::error_code ignored;
        std::filesystem::remove_all(scratch, ignored);
      });
      break;
    }
  }
  *argc = static_cast<int>(args.size());
  *argv = pointers.data();
}

}  // namespace testsupport

#endif  // ALERTMOD_TESTS_SUPPORT_FUZZ_SCRATCH_H_
