// The durable save on Windows, where a rename replaces an existing file only
// when asked to: a side file left by a crash must still replace the target.
#include <gtest/gtest.h>

#include <stdexcept>

#include "alertmod/config/durable_xml.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace {

TEST(DurableXmlWindowsTest, SideFileOfACrashBeforeTheRenameIsAdopted) {
  testsupport::TempDir dir;
  const std::string target = dir.File("notify.xml");
  ASSERT_TRUE(testsupport::WriteFile(target, "<Old />\n"));
  TiXmlDocument document;
  document.LinkEndChild(new TiXmlElement("New"));
  // Without fork, the process "dies" by unwinding from the point between the
  // side file's sync and its rename; nothing of the save runs after it.
  SetSideFileSyncedHook([](const std::string&) { throw std::runtime_error("crash"); });
  EXPECT_THROW(SaveXmlDurably(document, target), std::runtime_error);
  SetSideFileSyncedHook(nullptr);
  ASSERT_EQ(testsupport::ReadFile(target), "<Old />\n");

  TiXmlDocument loaded;
  ASSERT_TRUE(LoadXmlDurably(loaded, target));
  EXPECT_STREQ(loaded.RootElement()->Value(), "New");
  EXPECT_EQ(testsupport::ReadFile(target), "<New />\n");
  EXPECT_FALSE(testsupport::FileExists(target + ".pending"));
}

}  // namespace
}  // namespace hx
