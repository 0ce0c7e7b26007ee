#include "alertmod/diag/log.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <string>

#include "tests/support/fake_host.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace {

using testsupport::FakeHost;

size_t CountCode(FakeHost& host, uint32_t code) {
  size_t n = 0;
  for (const auto& r : host.Requests().Snapshot()) n += r.code == code ? 1 : 0;
  return n;
}

TEST(LogToHostTest, HonoursTheHostThresholdForEveryMessage) {
  struct Case {
    int32_t threshold;
    int32_t level;
    bool written;
  };
  const Case cases[] = {
      {50, LogLevelInfo, false}, {50, LogLevelWarning, true}, {50, LogLevelError, true},
      {25, LogLevelInfo, true},  {76, LogLevelError, false},
  };
  for (const Case& c : cases) {
    FakeHost host(c.threshold);
    int32_t result = LogToHost(core::kModuleId, host.callback(), c.level, "line %d", 7);
    EXPECT_EQ(CountCode(host, core::kCodeLogLevelQuery), 1u);
    EXPECT_EQ(CountCode(host, core::kCodeLogWrite), c.written ? 1u : 0u);
    EXPECT_EQ(result, 0);
  }
}

TEST(LogToHostTest, WriteRequestCarriesLevelSourceAndText) {
  FakeHost host;
  LogToHost(core::kClipWriterLogSource, host.callback(), LogLevelError, "gap is %d", 1600);
  auto requests = host.Requests().Snapshot();
  ASSERT_EQ(requests.size(), 2u);
  const auto& write = requests[1];
  EXPECT_EQ(write.requestClass, core::kClassLog);
  EXPECT_EQ(write.requester, core::kClipWriterLogSource);
  EXPECT_EQ(write.extValue, LogLevelError);
  EXPECT_EQ(write.bytes, "gap is 1600");
  EXPECT_EQ(write.length, 11u);
}

TEST(LogToHostTest, CutsLongTextsAt2047Characters) {
  struct Case {
    size_t length;
    size_t sent;
  };
  for (Case c : {Case{2046, 2046}, Case{2047, 2047}, Case{2048, 2047}, Case{3000, 2047}}) {
    FakeHost host;
    std::string text(c.length, 'x');
    text.back() = 'y';
    LogToHost(core::kModuleId, host.callback(), LogLevelError, "%s", text.c_str());
    auto lines = host.LogTexts();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].size(), c.sent);
    EXPECT_EQ(lines[0], text.substr(0, c.sent));
  }
}

TEST(LogToHostTest, SendsNothingForEmptyTextOrMissingCallback) {
  FakeHost host;
  EXPECT_EQ(LogToHost(core::kModuleId, host.callback(), LogLevelError, "%s", ""), 0);
  EXPECT_EQ(CountCode(host, core::kCodeLogLevelQuery), 1u);
  EXPECT_EQ(CountCode(host, core::kCodeLogWrite), 0u);
  EXPECT_EQ(LogToHost(core::kModuleId, nullptr, LogLevelError, "text"), 0);
}

TEST(FileLoggerTest, AppendsToTheNamedFileOnly) {
  testsupport::TempDir dir;
  testsupport::ScopedChdir chdir(dir.path());
  ASSERT_TRUE(testsupport::WriteFile("notifylog.txt", "earlier\n"));
  LogImpl logger;
  logger.SetFileName("notifylog.txt");
  {
    std::lock_guard<std::mutex> lock(logger.Mutex());
    logger.Stream() << "first line\n";
    logger.Stream().flush();
  }
  EXPECT_EQ(testsupport::ReadFile("notifylog.txt"), "earlier\nfirst line\n");
  EXPECT_FALSE(testsupport::FileExists("debugsrvlog.txt"));

  logger.SetFileName("other.txt");
  logger.Stream() << "second\n";
  logger.Stream().flush();
  EXPECT_EQ(testsupport::ReadFile("other.txt"), "second\n");
}

TEST(FileLoggerTest, ReopensAfterAFailedOpen) {
  testsupport::TempDir dir;
  testsupport::ScopedChdir chdir(dir.path());
  LogImpl logger;
  logger.SetFileName("missing-dir/log.txt");
  EXPECT_FALSE(logger.Stream().good());
  // The same name is tried again at the next request, once it can be opened.
  ASSERT_TRUE(std::filesystem::create_directory("missing-dir"));
  logger.Stream() << "ok\n";
  logger.Stream().flush();
  EXPECT_TRUE(logger.Stream().good());
  EXPECT_EQ(testsupport::ReadFile("missing-dir/log.txt"), "ok\n");
}

TEST(FileLoggerTest, ReopensAStreamThatFailedAWrite) {
  LogImpl logger;
  logger.SetFileName("/dev/full");
  logger.Stream() << "lost\n";
  logger.Stream().flush();
  // The failed flush left the open stream bad; the next request reopens it.
  EXPECT_TRUE(logger.Stream().good());
}

TEST(FileLoggerTest, IsOneProcessWideObject) {
  EXPECT_EQ(GetLgr().get(), GetLgr().get());
}

}  // namespace
}  // namespace hx
