#include "alertmod/video/av_libs.h"

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <limits.h>
#include <stdlib.h>
#include <unistd.h>

#include <cstdint>
#include <fstream>
#include <map>
#include <sstream>
#include <string>

#include "alertmod/platform/testing/manual_env.h"
#include "alertmod/video/clip_writer.h"
#include "alertmod/video/testing/clip_media.h"
#include "tests/support/fake_host.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace {

const char* const kLibraryFiles[] = {"libavcodec.so.59", "libavformat.so.59", "libavutil.so.57",
                                     "libavfilter.so.8", "libswresample.so.4"};

std::string RealPath(const char* path) {
  char resolved[PATH_MAX];
  return realpath(path, resolved) != nullptr ? resolved : "";
}

// The file a resolved function is mapped from, links followed. Read from
// the process's mappings rather than the loader, which keeps the first name
// a library was opened under even after that name is gone.
std::string FileOf(const void* function) {
  const auto address = reinterpret_cast<uintptr_t>(function);
  std::ifstream maps("/proc/self/maps");
  std::string line;
  while (function != nullptr && std::getline(maps, line)) {
    std::istringstream fields(line);
    std::string range, perms, offset, device, inode, path;
    fields >> range >> perms >> offset >> device >> inode >> path;
    const size_t dash = range.find('-');
    const uintptr_t begin = std::stoull(range.substr(0, dash), nullptr, 16);
    const uintptr_t end = std::stoull(range.substr(dash + 1), nullptr, 16);
    if (address >= begin && address < end) return path;
  }
  return "";
}

// A directory of links to the codec libraries the system loads, one link
// per library file, with `replacements` (file name to target) applied and
// an empty target meaning "no such file".
class LibraryDirectory {
 public:
  LibraryDirectory() {
    av_init& system = av_init::Instance();
    EXPECT_TRUE(system.AllLoaded()) << "the codec libraries must be installed";
    m_targets[kLibraryFiles[0]] = FileOf(reinterpret_cast<void*>(system.avcodec_version));
    m_targets[kLibraryFiles[1]] = FileOf(reinterpret_cast<void*>(system.avformat_version));
    m_targets[kLibraryFiles[2]] = FileOf(reinterpret_cast<void*>(system.avutil_version));
    m_targets[kLibraryFiles[3]] = FileOf(reinterpret_cast<void*>(system.avfilter_version));
    m_targets[kLibraryFiles[4]] = FileOf(reinterpret_cast<void*>(system.swresample_version));
  }

  // Points `file` at `target`; an empty target removes it.
  void Set(const std::string& file, const std::string& target) {
    unlink(m_dir.File(file).c_str());
    if (!target.empty()) {
      EXPECT_EQ(symlink(target.c_str(), m_dir.File(file).c_str()), 0);
    }
  }
  void LinkAll() {
    for (const auto& entry : m_targets) Set(entry.first, entry.second);
  }
  void LinkAllTo(const std::string& target) {
    for (const auto& entry : m_targets) Set(entry.first, target);
  }
  const std::string& RealTarget(const std::string& file) { return m_targets[file]; }
  const std::string& path() const { return m_dir.path(); }

 private:
  testsupport::TempDir m_dir;
  std::map<std::string, std::string> m_targets;
};

int StubRegisterCalls(int which) {
  void* stub = dlopen(STUB_AV_COMPLETE, RTLD_NOW | RTLD_NOLOAD);
  if (stub == nullptr) return -1;
  auto calls = reinterpret_cast<int (*)(int)>(dlsym(stub, "stub_register_calls"));
  const int result = calls ? calls(which) : -1;
  dlclose(stub);
  return result;
}

TEST(CodecLibrariesTest, SystemLibrariesLoadCompletely) {
  av_init& libs = av_init::Instance();
  ASSERT_TRUE(libs.AllLoaded());
  EXPECT_EQ(static_cast<AVCodecLib&>(libs).LoadedFile(), "libavcodec.so.59");
  EXPECT_EQ(static_cast<SWResampleLib&>(libs).LoadedFile(), "libswresample.so.4");
  EXPECT_EQ(libs.avcodec_version() >> 16, static_cast<unsigned>(LIBAVCODEC_VERSION_MAJOR));
  EXPECT_NE(libs.av_guess_format(nullptr, "clip.mov", nullptr), nullptr);
}

TEST(CodecLibrariesTest, OldRegistrationFunctionsAreCalledOncePerCompletedLoad) {
  LibraryDirectory dir;
  dir.LinkAllTo(STUB_AV_COMPLETE);
  av_init libs(dir.path());
  ASSERT_TRUE(libs.AllLoaded());
  EXPECT_EQ(StubRegisterCalls(0), 1);
  EXPECT_EQ(StubRegisterCalls(1), 1);
  EXPECT_TRUE(libs.LoadAll());  // already complete: nothing runs again
  EXPECT_EQ(StubRegisterCalls(0), 1);
}

// Mended: files of other releases were opened first and, once opened, stayed
// mapped for the life of the process; one that reported the expected version
// under another release's name was even used.
TEST(CodecLibrariesTest, OnlyTheFileOfTheBuiltMajorIsOpened) {
  LibraryDirectory dir;
  dir.LinkAll();
  const std::string built = "libavcodec.so." + std::to_string(LIBAVCODEC_VERSION_MAJOR);
  dir.Set("libavcodec.so." + std::to_string(LIBAVCODEC_VERSION_MAJOR + 1), STUB_AV_COMPLETE);
  av_init libs(dir.path());
  ASSERT_TRUE(libs.AllLoaded());
  EXPECT_EQ(static_cast<AVCodecLib&>(libs).LoadedFile(), dir.path() + "/" + built);
  EXPECT_EQ(FileOf(reinterpret_cast<void*>(libs.avcodec_version)), dir.RealTarget(built));
}

TEST(CodecLibrariesTest, IncompleteSetsCountAsNotLoaded) {
  struct Case {
    const char* name;
    std::string swresampleTarget;
    bool swresampleHasModule;
  };
  const Case cases[] = {
      {"resampling library missing", "", false},
      {"resampling library lacks a symbol", STUB_AV_LACKING, true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    LibraryDirectory dir;
    dir.LinkAll();
    dir.Set("libswresample.so.4", c.swresampleTarget);
    av_init libs(dir.path());
    EXPECT_FALSE(libs.AllLoaded());
    EXPECT_FALSE(libs.LoadAll());
    SWResampleLib& resample = libs;
    EXPECT_EQ(resample.HasModule(), c.swresampleHasModule);
    EXPECT_FALSE(resample.IsResolved());
    EXPECT_EQ(libs.swr_get_delay, nullptr);
    // The others are complete and stay loaded.
    EXPECT_TRUE(static_cast<AVCodecLib&>(libs).IsResolved());
    EXPECT_NE(libs.avformat_write_header, nullptr);
  }
}

TEST(CodecLibrariesTest, ReloadRetriesEveryLibrary) {
  LibraryDirectory first;
  first.LinkAllTo(STUB_AV_COMPLETE);
  first.Set("libswresample.so.4", "");
  av_init libs(first.path());
  ASSERT_FALSE(libs.AllLoaded());
  EXPECT_EQ(FileOf(reinterpret_cast<void*>(libs.avcodec_version)), RealPath(STUB_AV_COMPLETE));

  // A library once loaded stays mapped under its name, so the retry is seen
  // through a second directory: the codec library had loaded, and is loaded
  // afresh from there all the same.
  LibraryDirectory second;
  second.LinkAllTo(STUB_AV_COMPLETE);
  second.Set("libavcodec.so.59", STUB_AV_LACKING);
  libs.SetLibraryDirectory(second.path());
  EXPECT_TRUE(libs.Reload());
  EXPECT_TRUE(libs.AllLoaded());
  EXPECT_EQ(FileOf(reinterpret_cast<void*>(libs.avcodec_version)), RealPath(STUB_AV_LACKING));
}

TEST(CodecLibrariesTest, UnloadClearsEveryPointer) {
  LibraryDirectory dir;
  dir.LinkAll();
  av_init libs(dir.path());
  ASSERT_TRUE(libs.AllLoaded());
  static_cast<AVFormatLib&>(libs).Unload();
  EXPECT_FALSE(libs.AllLoaded());
  EXPECT_EQ(libs.avformat_alloc_context, nullptr);
  EXPECT_EQ(static_cast<AVFormatLib&>(libs).LoadedFile(), "");
  EXPECT_TRUE(libs.LoadAll());
  EXPECT_NE(libs.avformat_alloc_context, nullptr);
}

TEST(CodecLibrariesTest, EmptyDirectoryLoadsNothing) {
  testsupport::TempDir empty;
  av_init libs(empty.path());
  EXPECT_FALSE(libs.AllLoaded());
  EXPECT_FALSE(libs.Reload());
  EXPECT_FALSE(static_cast<AVCodecLib&>(libs).HasModule());
  EXPECT_EQ(libs.avcodec_find_decoder, nullptr);
}

// Clips through a set of libraries in a directory of the test's making.
class ClipLibrariesTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_TRUE(cliptest::HaveFfmpegTools()) << "ffmpeg and ffprobe needed";
    m_frames = cliptest::MakeFrames(m_recipe, m_media.path());
    ASSERT_EQ(m_frames.size(), m_recipe.frames);
    m_clip = std::make_unique<cliptest::HostClip>(m_recipe, m_frames, "HEADER", 1000, 40);
  }

  bool WriteClip(av_init& libs, const std::string& path) {
    return WriteVideoAttachment(1, m_clip->Stream(), path, m_host.callback(),
                                *platform::SystemEnvForTests(), libs);
  }

  const cliptest::MediaRecipe m_recipe{kCodecH264, 320, 240, 10, 5};
  testsupport::TempDir m_media;
  testsupport::FakeHost m_host;
  std::vector<cliptest::MediaFrame> m_frames;
  std::unique_ptr<cliptest::HostClip> m_clip;
};

TEST_F(ClipLibrariesTest, NoClipWithoutTheWholeSet) {
  struct Case {
    const char* name;
    std::string swresampleTarget;
  };
  const Case cases[] = {{"missing", ""}, {"lacking", STUB_AV_LACKING}};
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    LibraryDirectory dir;
    dir.LinkAll();
    dir.Set("libswresample.so.4", c.swresampleTarget);
    av_init libs(dir.path());
    const std::string path = m_media.File(std::string(c.name) + ".mov");
    EXPECT_TRUE(WriteClip(libs, path));
    EXPECT_FALSE(testsupport::FileExists(path));
  }
}

TEST_F(ClipLibrariesTest, ClipAfterAFailedStartReloadsTheSet) {
  LibraryDirectory dir;
  dir.LinkAll();
  dir.Set("libswresample.so.4", "");
  av_init libs(dir.path());
  ASSERT_FALSE(libs.AllLoaded());
  dir.Set("libswresample.so.4", dir.RealTarget("libswresample.so.4"));  // installed since
  const std::string path = m_media.File("reloaded.mov");
  EXPECT_TRUE(WriteClip(libs, path));
  EXPECT_TRUE(libs.AllLoaded());
  EXPECT_EQ(cliptest::Probe(path).at("nb_read_packets"), "10");
  EXPECT_EQ(cliptest::DecodeErrors(path), "");
}

}  // namespace
}  // namespace hx
