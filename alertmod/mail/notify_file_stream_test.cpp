#include "alertmod/mail/notify_file_stream.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <sstream>

#include "alertmod/platform/file_system.h"
#include "alertmod/platform/testing/manual_env.h"
#include "tests/support/fake_host.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace {

using testsupport::FileExists;
using testsupport::ReadFile;
using testsupport::WriteFile;

class NotifyFileStreamTest : public ::testing::Test {
 protected:
  testsupport::TempDir m_dir;
  testsupport::FakeHost m_host;
  platform::ManualEnv m_env;
  NotifyFileStreamImpl m_stream{m_host.callback(), m_env};
};

TEST_F(NotifyFileStreamTest, FreeBytes) {
  struct Case {
    bool ok;
    uint64_t bytes;
    uint64_t expected;
    bool logged;
  };
  const Case cases[] = {
      {true, 5, 5, false},
      {true, 0, 0, false},
      {true, UINT64_MAX, kUnknownFreeBytes, false},  // the volume knows no size
      {false, 0, kUnknownFreeBytes, true},
  };
  for (const Case& c : cases) {
    m_env.SetFreeBytes(c.bytes);
    m_env.FailFreeBytesQueries(!c.ok);
    size_t linesBefore = m_host.LogTexts().size();
    EXPECT_EQ(m_stream.FreeBytes(m_dir.path()), c.expected);
    EXPECT_EQ(m_host.LogTexts().size(), linesBefore + (c.logged ? 1 : 0));
  }
  EXPECT_EQ(m_host.LogTexts(25).back(),
            "Exception while query volume space: the test's volume cannot be queried");
}

TEST_F(NotifyFileStreamTest, FreeBytesOfTheRealVolume) {
  uint64_t bytes = m_stream.FreeBytes(m_dir.path());
  EXPECT_GT(bytes, 0u);
  EXPECT_TRUE(m_host.LogTexts().empty());
  EXPECT_EQ(m_stream.FreeBytes(m_dir.File("missing")), kUnknownFreeBytes);
  std::vector<std::string> lines = m_host.LogTexts(25);
  ASSERT_EQ(lines.size(), 1u);
  EXPECT_EQ(lines[0], "Exception while query volume space: cannot query the volume of \"" +
                          m_dir.File("missing") + "\": No such file or directory");
}

TEST_F(NotifyFileStreamTest, CreateDirectoryAndRemoveFile) {
  ASSERT_TRUE(WriteFile(m_dir.File("file"), "x"));
  EXPECT_TRUE(m_stream.CreateDirectory(m_dir.File("data")));
  EXPECT_TRUE(m_stream.CreateDirectory(m_dir.File("data")));  // already there
  EXPECT_FALSE(m_stream.CreateDirectory(m_dir.File("file")));
  EXPECT_FALSE(m_stream.CreateDirectory(m_dir.File("no/such")));
  EXPECT_TRUE(m_stream.RemoveFile(m_dir.File("file")));
  EXPECT_FALSE(FileExists(m_dir.File("file")));
  EXPECT_TRUE(m_stream.RemoveFile(m_dir.File("file")));  // already gone
  EXPECT_FALSE(m_stream.RemoveFile(m_dir.File("data")));
}

TEST_F(NotifyFileStreamTest, WritesChainAndCountBytes) {
  std::string path = m_dir.File("out");
  ASSERT_TRUE(WriteFile(path, "old content that must go"));
  ASSERT_TRUE(m_stream.Open(path, std::ios_base::binary | std::ios_base::trunc));
  std::stringbuf source(std::string("copied\0bytes", 12));
  std::stringbuf empty;
  m_stream.WriteText("a\r\n").WriteUInt(4294967295u).WriteString(std::string("\0z", 2));
  m_stream.WriteStream(&source).WriteStream(&empty).WriteStream(nullptr).WriteText(nullptr);
  EXPECT_TRUE(m_stream.IsGood());
  EXPECT_EQ(m_stream.Position(), 3u + 10u + 2u + 12u);
  m_stream.Close();
  EXPECT_FALSE(m_stream.Failed());
  EXPECT_EQ(ReadFile(path), std::string("a\r\n4294967295\0zcopied\0bytes", 27));
}

TEST_F(NotifyFileStreamTest, NothingIsWrittenAfterAFailure) {
  EXPECT_FALSE(m_stream.Open(m_dir.File("no/such/file"), std::ios_base::binary));
  EXPECT_TRUE(m_stream.Failed());
  m_stream.WriteText("x").WriteString("y").WriteUInt(1);
  EXPECT_EQ(m_stream.Position(), 0u);
  // A new open starts clean.
  ASSERT_TRUE(m_stream.Open(m_dir.File("good"), std::ios_base::binary));
  m_stream.WriteText("ok");
  m_stream.Close();
  EXPECT_FALSE(m_stream.Failed());
  EXPECT_EQ(ReadFile(m_dir.File("good")), "ok");
}

}  // namespace
}  // namespace hx
