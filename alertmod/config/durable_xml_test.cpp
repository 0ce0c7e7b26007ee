#include "alertmod/config/durable_xml.h"

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <csignal>
#include <thread>

#include "alertmod/platform/testing/manual_env.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace {

using testsupport::FileExists;
using testsupport::ReadFile;
using testsupport::TempDir;
using testsupport::WriteFile;

// Calls `before` with the side file's name ahead of each rename, while the
// save holds the name: after the side file is complete, before it counts.
class RenameWatchingEnv final : public platform::EnvWrapper {
 public:
  explicit RenameWatchingEnv(void (*before)(const std::string&))
      : EnvWrapper(platform::SystemEnvForTests()), m_before(before) {}
  platform::Status RenameFile(const std::string& from, const std::string& to) override {
    m_before(from);
    return EnvWrapper::RenameFile(from, to);
  }

 private:
  void (*const m_before)(const std::string&);
};

platform::Env* g_env = platform::SystemEnvForTests();

const char kOldText[] = "<?xml version=\"1.0\" ?>\n<Trellan>\n    <Old />\n</Trellan>\n";

// A configuration-like document whose content names `marker`.
TiXmlDocument MakeDocument(const std::string& marker) {
  TiXmlDocument document;
  document.LinkEndChild(new TiXmlDeclaration("1.0", "", ""));
  auto* root = new TiXmlElement("Trellan");
  auto* notify = new TiXmlElement("Notify");
  notify->SetAttribute("ID", 786432);
  auto* name = new TiXmlElement("Name");
  name->LinkEndChild(new TiXmlText(marker));
  notify->LinkEndChild(name);
  notify->LinkEndChild(new TiXmlElement("Servers"));
  root->LinkEndChild(notify);
  document.LinkEndChild(root);
  return document;
}

std::string Printed(const std::string& marker) {
  return "<?xml version=\"1.0\" ?>\n<Trellan>\n    <Notify ID=\"786432\">\n        <Name>" +
         marker + "</Name>\n        <Servers />\n    </Notify>\n</Trellan>\n";
}

// Runs `body` in a forked child and returns its wait status.
template <typename Body>
int InChild(Body body) {
  pid_t pid = fork();
  if (pid == 0) {
    body();
    _exit(0);
  }
  int status = 0;
  waitpid(pid, &status, 0);
  return status;
}

TEST(DurableXmlTest, SavePrintsIndentedWithLineFeedsAndLeavesNoSideFile) {
  TempDir dir;
  const std::string target = dir.File("notify.xml");
  ASSERT_TRUE(WriteFile(target, kOldText));
  std::string error;
  ASSERT_TRUE(SaveXmlDurably(*g_env, MakeDocument("a"), target, &error)) << error;
  EXPECT_EQ(ReadFile(target), Printed("a"));
  EXPECT_FALSE(FileExists(target + ".pending"));
  struct stat info {};
  ASSERT_EQ(stat(target.c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 0777, 0644u);
}

TEST(DurableXmlTest, FailedSavesLeaveTheTargetAlone) {
  struct Case {
    const char* name;
    void (*prepare)(const std::string& target);
    const char* probe;  // a file whose content must survive, relative to the target
    std::string probeText;
    std::string expectedError;
    bool sideFileKept;
  };
  const Case cases[] = {
      // The side file's name is taken by a directory: it can be neither
      // removed nor created.
      {"side name is a directory",
       [](const std::string& target) {
         WriteFile(target, kOldText);
         mkdir((target + ".pending").c_str(), 0755);
         WriteFile(target + ".pending/keep", "x");
       },
       "", kOldText, "create error 17", false},
      // The target is a directory holding a file: the rename fails and the
      // complete side file stays for the next load.
      {"target is a directory",
       [](const std::string& target) {
         mkdir(target.c_str(), 0755);
         WriteFile(target + "/keep", "x");
       },
       "/keep", "x", "Failed to rename .xml.pending to .xml file 21 - Is a directory", true},
  };
  for (const Case& c : cases) {
    TempDir dir;
    const std::string target = dir.File("notify.xml");
    c.prepare(target);
    std::string error;
    EXPECT_FALSE(SaveXmlDurably(*g_env, MakeDocument("new"), target, &error)) << c.name;
    EXPECT_EQ(error, c.expectedError) << c.name;
    EXPECT_EQ(ReadFile(target + c.probe), c.probeText) << c.name;
    EXPECT_EQ(ReadFile(target + ".pending") == Printed("new"), c.sideFileKept) << c.name;
  }
}

TEST(DurableXmlTest, SaveIntoMissingDirectoryCreatesNothing) {
  TempDir dir;
  std::string error;
  EXPECT_FALSE(SaveXmlDurably(*g_env, MakeDocument("a"), dir.File("missing/notify.xml"), &error));
  EXPECT_EQ(error, "create error 2");
  EXPECT_FALSE(FileExists(dir.File("missing")));
}

TEST(DurableXmlTest, WriteErrorRemovesTheSideFile) {
  TempDir dir;
  const std::string target = dir.File("notify.xml");
  ASSERT_TRUE(WriteFile(target, kOldText));
  // A file-size limit makes the write fail part way with EFBIG; the limit is
  // set in a child so that it binds nothing else.
  int pipeFds[2];
  ASSERT_EQ(pipe(pipeFds), 0);
  int status = InChild([&] {
    signal(SIGXFSZ, SIG_IGN);
    rlimit limit{20, 20};
    setrlimit(RLIMIT_FSIZE, &limit);
    std::string error;
    bool saved = SaveXmlDurably(*g_env, MakeDocument("new"), target, &error);
    std::string report = (saved ? "saved " : "failed ") + error;
    ssize_t ignored = write(pipeFds[1], report.data(), report.size());
    (void)ignored;
  });
  close(pipeFds[1]);
  char buffer[256] = {0};
  ssize_t n = read(pipeFds[0], buffer, sizeof(buffer) - 1);
  close(pipeFds[0]);
  ASSERT_TRUE(WIFEXITED(status));
  EXPECT_EQ(std::string(buffer, n > 0 ? n : 0), "failed write error 27");
  EXPECT_EQ(ReadFile(target), kOldText);
  EXPECT_FALSE(FileExists(target + ".pending"));
}

TEST(DurableXmlTest, CrashBeforeRenameIsAdoptedByTheNextLoad) {
  TempDir dir;
  const std::string target = dir.File("notify.xml");
  ASSERT_TRUE(WriteFile(target, kOldText));
  int status = InChild([&] {
    RenameWatchingEnv crashing([](const std::string&) { raise(SIGKILL); });
    SaveXmlDurably(crashing, MakeDocument("crashed"), target);
  });
  ASSERT_TRUE(WIFSIGNALED(status));
  ASSERT_EQ(WTERMSIG(status), SIGKILL);
  EXPECT_EQ(ReadFile(target), kOldText);
  EXPECT_EQ(ReadFile(target + ".pending"), Printed("crashed"));

  TiXmlDocument loaded;
  ASSERT_TRUE(LoadXmlDurably(*g_env, loaded, target));
  EXPECT_STREQ(
      loaded.RootElement()->FirstChildElement("Notify")->FirstChildElement("Name")->GetText(),
      "crashed");
  EXPECT_EQ(ReadFile(target), Printed("crashed"));
  EXPECT_FALSE(FileExists(target + ".pending"));
}

TEST(DurableXmlTest, IncompleteSideFilesAreIgnored) {
  const char* sideTexts[] = {
      "<?xml version=\"1.0\" ?>\n<Trellan>\n    <Notify ID=\"78",  // cut inside an element
      "<?xml version=\"1.0\" ?>\n",                                // cut after the declaration
      "",                                                          // cut before anything
  };
  for (const char* sideText : sideTexts) {
    TempDir dir;
    const std::string target = dir.File("notify.xml");
    ASSERT_TRUE(WriteFile(target, kOldText));
    ASSERT_TRUE(WriteFile(target + ".pending", sideText));
    TiXmlDocument loaded;
    ASSERT_TRUE(LoadXmlDurably(*g_env, loaded, target)) << sideText;
    ASSERT_NE(loaded.RootElement(), nullptr) << sideText;
    EXPECT_NE(loaded.RootElement()->FirstChildElement("Old"), nullptr) << sideText;
    EXPECT_EQ(ReadFile(target), kOldText);

    // The next save replaces the stale side file and then the target.
    std::string error;
    ASSERT_TRUE(SaveXmlDurably(*g_env, MakeDocument("next"), target, &error)) << error;
    EXPECT_EQ(ReadFile(target), Printed("next"));
    EXPECT_FALSE(FileExists(target + ".pending"));
  }
}

TEST(DurableXmlTest, LoadFailsForMissingOrMalformedFiles) {
  TempDir dir;
  TiXmlDocument document;
  EXPECT_FALSE(LoadXmlDurably(*g_env, document, dir.File("notify.xml")));
  ASSERT_TRUE(WriteFile(dir.File("notify.xml"), "<Trellan><Notify></Trellan>"));
  EXPECT_FALSE(LoadXmlDurably(*g_env, document, dir.File("notify.xml")));
}

TEST(DurableXmlTest, DirectoriesInPlaceOfTheFilesAreNotRead) {
  // A directory reports an enormous size; reading it whole would exhaust
  // memory instead of failing.
  TempDir dir;
  ASSERT_EQ(mkdir(dir.File("notify.xml.pending").c_str(), 0755), 0);
  ASSERT_TRUE(WriteFile(dir.File("notify.xml"), "<Trellan Delta=\"0\" />"));
  TiXmlDocument document;
  EXPECT_TRUE(LoadXmlDurably(*g_env, document, dir.File("notify.xml")));
  ASSERT_EQ(mkdir(dir.File("other.xml").c_str(), 0755), 0);
  EXPECT_FALSE(LoadXmlDurably(*g_env, document, dir.File("other.xml")));
}

// Saves of one name from two threads must not meet inside the guard: each
// would otherwise remove or fail to create the other's side file.
std::atomic<int> g_insideSave{0};
std::atomic<int> g_mostInsideSave{0};

void CountOverlap(const std::string&) {
  int inside = ++g_insideSave;
  int most = g_mostInsideSave.load();
  while (inside > most && !g_mostInsideSave.compare_exchange_weak(most, inside)) {
  }
  std::this_thread::yield();
  --g_insideSave;
}

TEST(DurableXmlTest, SavesOfOneNameAreSerialized) {
  TempDir dir;
  const std::string target = dir.File("notify.xml");
  RenameWatchingEnv counting(&CountOverlap);
  std::atomic<int> failures{0};
  auto saveMany = [&](const std::string& marker) {
    TiXmlDocument document = MakeDocument(marker);
    for (int i = 0; i < 40; ++i) {
      std::string error;
      if (!SaveXmlDurably(counting, document, target, &error)) ++failures;
      TiXmlDocument loaded;
      if (!LoadXmlDurably(*g_env, loaded, target)) ++failures;
    }
  };
  std::thread first(saveMany, "first");
  std::thread second(saveMany, "second");
  first.join();
  second.join();
  EXPECT_EQ(failures.load(), 0);
  EXPECT_EQ(g_mostInsideSave.load(), 1);
  std::string text = ReadFile(target);
  EXPECT_TRUE(text == Printed("first") || text == Printed("second")) << text;
  EXPECT_FALSE(FileExists(target + ".pending"));
}

}  // namespace
}  // namespace hx
