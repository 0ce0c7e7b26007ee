// The durable save on Windows, where a rename replaces an existing file only
// when asked to: a side file left by a crash must still replace the target.
#include <gtest/gtest.h>

#include <stdexcept>

#include "alertmod/config/durable_xml.h"
#include "alertmod/platform/testing/manual_env.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace {

// Without fork, the process "dies" by unwinding at the rename of the side
// file, which is complete by then; nothing of the save runs after it.
class CrashAtRenameEnv final : public platform::EnvWrapper {
 public:
  CrashAtRenameEnv() : EnvWrapper(platform::SystemEnvForTests()) {}
  platform::Status RenameFile(const std::string&, const std::string&) override {
    throw std::runtime_error("crash");
  }
};

TEST(DurableXmlWindowsTest, SideFileOfACrashBeforeTheRenameIsAdopted) {
  testsupport::TempDir dir;
  const std::string target = dir.File("notify.xml");
  ASSERT_TRUE(testsupport::WriteFile(target, "<Old />\n"));
  TiXmlDocument document;
  document.LinkEndChild(new TiXmlElement("New"));
  CrashAtRenameEnv crashing;
  EXPECT_THROW(SaveXmlDurably(crashing, document, target), std::runtime_error);
  ASSERT_EQ(testsupport::ReadFile(target), "<Old />\n");

  TiXmlDocument loaded;
  ASSERT_TRUE(LoadXmlDurably(*platform::SystemEnvForTests(), loaded, target));
  EXPECT_STREQ(loaded.RootElement()->Value(), "New");
  EXPECT_EQ(testsupport::ReadFile(target), "<New />\n");
  EXPECT_FALSE(testsupport::FileExists(target + ".pending"));
}

}  // namespace
}  // namespace hx
