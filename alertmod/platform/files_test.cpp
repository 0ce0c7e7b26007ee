#include "alertmod/platform/files.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <functional>

#include "alertmod/platform/file_system.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace platform {
namespace {

using testsupport::ReadFile;
using testsupport::WriteFile;

enum class Outcome { kOk, kNotFound, kNoSpace, kOtherFailure };

Outcome OutcomeOf(const Status& status) {
  if (status.ok()) return Outcome::kOk;
  if (status.IsNotFound()) return Outcome::kNotFound;
  return status.IsNoSpace() ? Outcome::kNoSpace : Outcome::kOtherFailure;
}

Status WriteAndSync(const std::string& path) {
  File file;
  Status status = File::OpenForWriting(path, false, &file);
  if (status.ok()) status = file.Write("data", 4);
  if (status.ok()) status = file.Sync();
  return status.ok() ? file.Close() : status;
}

TEST(FilesTest, CallsReportTheirOutcome) {
  testsupport::TempDir dir;
  ASSERT_TRUE(WriteFile(dir.File("a"), "new") && WriteFile(dir.File("b"), "old"));
  uint64_t bytes = 0;
  struct Case {
    const char* name;
    std::function<Status()> call;
    Outcome expected;
  };
  const Case cases[] = {
      {"rename over a file", [&] { return RenameReplacing(dir.File("a"), dir.File("b")); },
       Outcome::kOk},
      {"rename into a missing directory",
       [&] { return RenameReplacing(dir.File("b"), dir.File("no/b")); }, Outcome::kNotFound},
      {"write and sync a file", [&] { return WriteAndSync(dir.File("c")); }, Outcome::kOk},
      {"write to a full device", [&] { return WriteAndSync("/dev/full"); }, Outcome::kNoSpace},
      {"sync a directory entry", [&] { return SyncParentDirectory(dir.File("c")); }, Outcome::kOk},
      {"sync a missing directory", [&] { return SyncParentDirectory(dir.File("no/c")); },
       Outcome::kNotFound},
      {"free space", [&] { return QueryFreeBytes(dir.path(), &bytes); }, Outcome::kOk},
      {"free space of a missing path", [&] { return QueryFreeBytes(dir.File("no"), &bytes); },
       Outcome::kNotFound},
  };
  for (const Case& c : cases) {
    Status status = c.call();
    EXPECT_EQ(OutcomeOf(status), c.expected) << c.name << ": " << status.message();
    EXPECT_EQ(status.message().empty(), status.ok()) << c.name;
  }
  EXPECT_EQ(ReadFile(dir.File("b")), "new");
  EXPECT_EQ(ReadFile(dir.File("c")), "data");
  EXPECT_GT(bytes, 0u);
}

size_t OpenDescriptors() {
  size_t count = 0;
  for (auto it = std::filesystem::directory_iterator("/proc/self/fd"); it != decltype(it)(); ++it) {
    ++count;
  }
  return count;
}

TEST(FilesTest, AMovedFileIsClosedOnceByItsLastOwner) {
  testsupport::TempDir dir;
  const size_t before = OpenDescriptors();
  File first;
  ASSERT_TRUE(File::OpenForWriting(dir.File("first"), false, &first).ok());
  {
    File moved(std::move(first));
    EXPECT_FALSE(first.is_open());
    File second;
    ASSERT_TRUE(File::OpenForWriting(dir.File("second"), false, &second).ok());
    second = std::move(moved);  // closes "second"
    EXPECT_EQ(OpenDescriptors(), before + 1);
    EXPECT_TRUE(second.Write("x", 1).ok());
  }
  EXPECT_EQ(OpenDescriptors(), before);
  EXPECT_FALSE(first.Close().ok());  // nothing left to close
  EXPECT_EQ(ReadFile(dir.File("first")), "x");
}

}  // namespace
}  // namespace platform
}  // namespace hx
