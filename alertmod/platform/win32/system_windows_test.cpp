// The Windows calls behind the platform layer, as the module relies on them.
#include <gtest/gtest.h>
#include <windows.h>
// timeapi.h needs windows.h before it.
#include <timeapi.h>

#include "alertmod/platform/env.h"
#include "alertmod/platform/shared_library.h"
#include "alertmod/platform/utc_time.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace platform {
namespace {

// The tick is timeGetTime's own 32-bit count, so it wraps with it after 49.7
// days; the unsigned differences below hold across that wrap too.
TEST(WindowsSystemTest, TickIsTimeGetTime) {
  std::unique_ptr<Env> env = NewSystemEnv();
  const DWORD before = timeGetTime();
  const uint32_t tick = env->TickMs();
  const DWORD after = timeGetTime();
  EXPECT_LE(static_cast<uint32_t>(tick - before), static_cast<uint32_t>(after - before));
}

TEST(WindowsSystemTest, TempDirectoryIsGetTempPath) {
  testsupport::TempDir dir;
  char saved[MAX_PATH + 1] = {0};
  const bool hadTmp = GetEnvironmentVariableA("TMP", saved, sizeof(saved)) > 0;
  for (const std::string& tmp : {dir.path(), dir.path() + "\\"}) {
    ASSERT_TRUE(SetEnvironmentVariableA("TMP", tmp.c_str()));
    EXPECT_EQ(NewSystemEnv()->TempDirectory(), dir.path() + "\\") << tmp;
  }
  SetEnvironmentVariableA("TMP", hadTmp ? saved : nullptr);
}

TEST(WindowsSystemTest, CodecLibrariesAreDllsOfTheirMajor) {
  testsupport::TempDir dir;
  EXPECT_EQ(SharedLibraryFileName("avcodec", 59), "avcodec-59.dll");
  EXPECT_EQ(OpenSharedLibrary(dir.path() + "\\avcodec-59.dll"), nullptr);
  void* kernel = OpenSharedLibrary("kernel32.dll");
  ASSERT_NE(kernel, nullptr);
  EXPECT_NE(FindSharedSymbol(kernel, "GetTempPathA"), nullptr);
  EXPECT_EQ(FindSharedSymbol(kernel, "NoSuchSymbol"), nullptr);
  CloseSharedLibrary(kernel);
}

}  // namespace
}  // namespace platform
}  // namespace hx
