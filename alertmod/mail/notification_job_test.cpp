#include "alertmod/mail/notification_job.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <regex>

#include "alertmod/diag/log.h"
#include "alertmod/mail/delivery_test_util.h"
#include "alertmod/mail/mail_file.h"
#include "alertmod/video/av_libs.h"
#include "alertmod/video/video_email_stream.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace {

constexpr uint64_t kMiB = 1048576;

// Writes a file of the clip's byte count for every attachment, remembering
// what it was asked to write and what the job found on disk at the end.
class RecordingWriter final : public IAttachmentWriter {
 public:
  bool WriteVideo(const VideoSource& source, const std::string& path) override {
    return Write(*source.stream, path);
  }
  bool WriteJpeg(const CVideoEmailStream& stream, const std::string& path) override {
    return Write(stream, path);
  }
  // How a write ends: the clip's bytes, a failure, success claimed without
  // a file (as without the codec libraries), or an empty file.
  enum class Mode { kWrite, kFail, kNoFile, kEmptyFile };
  std::vector<std::string> paths;
  Mode mode = Mode::kWrite;

 private:
  bool Write(const CVideoEmailStream& stream, const std::string& path) {
    paths.push_back(path);
    if (mode == Mode::kFail) return false;
    if (mode == Mode::kNoFile) return true;
    size_t bytes = mode == Mode::kEmptyFile ? 0 : stream.ByteCount();
    return testsupport::WriteFile(path, std::string(bytes, 'v'));
  }
};

// A finished clip of `codec` with frames of `frameBytes` bytes arriving at
// the given milliseconds; the first frame is a key frame.
std::shared_ptr<CVideoEmailStream> Clip(uint32_t codec, std::vector<uint32_t> arrivals,
                                        uint32_t frameBytes, uint32_t triggerMs) {
  static std::vector<std::unique_ptr<std::string>> buffers;  // outlive the clips
  StreamFormat format;
  format.width = 640;
  format.height = 480;
  format.codec = codec;
  auto clip = std::make_shared<CVideoEmailStream>(format, 1ull << 40, triggerMs, 1u << 30, nullptr);
  for (size_t i = 0; i < arrivals.size(); ++i) {
    buffers.push_back(std::make_unique<std::string>(frameBytes, 'f'));
    VideoFrame frame;
    frame.arrivalMs = arrivals[i];
    frame.frameType = i == 0 ? kKeyFrameType : 0;
    frame.data = std::make_shared<FrameData>(nullptr, buffers.back()->data(), frameBytes);
    clip->OfferFrame(frame);
  }
  clip->Finish();
  return clip;
}

class NotificationJobTest : public ::testing::Test {
 protected:
  NotificationJobTest()
      : m_chdir(m_dir.path()), m_helper(m_host), m_stream(m_host.callback(), m_env) {
    m_item.profile.id = 3;
    m_item.profile.description = "Lobby";
    m_item.profile.from = "alarm@example.com";
    m_item.profile.to = {"guard@example.com"};
    m_item.profile.subject = "Motion";
    m_item.profile.body = "Look";
    m_item.profile.attach = true;
    m_item.profile.sizeLimit = 10 * kMiB;
    m_item.servers = {SmtpServer{}};
    m_item.eventTime = 1767225600;
  }
  void AddSource(const std::string& name, std::shared_ptr<CVideoEmailStream> stream) {
    m_item.videoSources.push_back(VideoSource{1, name, std::move(stream)});
  }
  void Run() { RunNotificationJob(m_item, m_helper, m_stream, 100, m_writer); }
  std::vector<std::string> DataFiles() {
    std::vector<std::string> names;
    platform::ListRegularFiles(DataDirectory(), &names);
    return names;
  }
  // The message file handed to the transfer tool in run `run`.
  std::string SentPath(size_t run) {
    const auto& args = m_helper.runs.at(run);
    return args[args.size() - 2];
  }

  testsupport::TempDir m_dir;
  testsupport::ScopedChdir m_chdir;
  testsupport::FakeHost m_host;
  platform::ManualEnv m_env;
  ScriptedHelper m_helper;
  NotifyFileStreamImpl m_stream;
  RecordingWriter m_writer;
  NotifyWorkItem m_item{kWorkItemNotification};
};

TEST_F(NotificationJobTest, PlainMessageIsSentAndRemoved) {
  m_item.profile.attach = false;
  AddSource("Lobby", Clip(5, {0, 40}, 100, 0));
  Run();
  EXPECT_EQ(m_helper.runs.size(), 1u);
  EXPECT_TRUE(m_writer.paths.empty());
  EXPECT_EQ(m_helper.statuses, (std::vector<std::pair<int32_t, int32_t>>{{3, 0}}));
  EXPECT_TRUE(DataFiles().empty());
  // A whole date with a numeric zone, whatever the C runtime's strftime knows.
  ASSERT_EQ(m_helper.messages.size(), 1u);
  EXPECT_TRUE(std::regex_search(m_helper.messages[0],
                                std::regex("(^|\n)Date: [A-Z][a-z]{2}, [0-9]{2} [A-Z][a-z]{2} "
                                           "[0-9]{4} [0-9]{2}:[0-9]{2}:[0-9]{2} [+-][0-9]{4} \\(")))
      << m_helper.messages[0];
}

TEST_F(NotificationJobTest, AttachmentNamesAndExtensions) {
  struct Case {
    std::string name;
    uint32_t codec;
    std::string file;
  };
  const Case cases[] = {
      {"Lobby/Door", 5, "Lobby_Door.mov"},
      {"a?b<c>d\\e:f*g|h\"i", 4, "a_b_c_d_e_f_g_h_i.mov"},
      {"Gate", 6, "Gate.mp4"},
      {"Still", 0, "Still.jpg"},
      {"", 5, "default.mov"},
      {std::string("tab\there\x01", 9), 5, "tab_here_.mov"},
  };
  for (const Case& c : cases) {
    m_item.videoSources.clear();
    m_writer.paths.clear();
    AddSource(c.name, Clip(c.codec, {0, 40}, 100, 0));
    Run();
    ASSERT_EQ(m_writer.paths.size(), 1u);
    EXPECT_EQ(m_writer.paths[0], DataDirectory() + "/" + c.file);
  }
  EXPECT_TRUE(DataFiles().empty()) << "attachment files are removed after the job";
}

TEST_F(NotificationJobTest, SameNameSharesOneFile) {
  AddSource("Lobby/Door", Clip(5, {0, 40}, 100, 0));
  AddSource("Lobby:Door", Clip(5, {0, 40}, 200, 0));
  Run();
  ASSERT_EQ(m_writer.paths.size(), 2u);
  EXPECT_EQ(m_writer.paths[0], m_writer.paths[1]);
}

TEST_F(NotificationJobTest, UnpreparedAttachmentLeavesALineInTheBody) {
  AddSource("Empty", std::make_shared<CVideoEmailStream>(StreamFormat{}, 1000, 0, 1000, nullptr));
  m_writer.mode = RecordingWriter::Mode::kFail;
  AddSource("Broken", Clip(5, {0, 40}, 100, 0));
  Run();
  ASSERT_EQ(m_helper.runs.size(), 1u);
  EXPECT_NE(m_helper.messages[0].find(
                "Look\r\n- Failed to prepare video attachment for source: \"Empty\", "
                "\r\n- Failed to prepare video attachment for source: \"Broken\", \r\n--"),
            std::string::npos)
      << m_helper.messages[0];
  EXPECT_EQ(m_helper.messages[0].find("Content-Disposition"), std::string::npos);
  EXPECT_TRUE(m_host.Log().Contains("Failed to prepare video attachment for source: \"Empty\", "));
  EXPECT_TRUE(m_host.Log().Contains("Failed to prepare video attachment for source: \"Broken\", "));
  EXPECT_EQ(m_writer.paths.size(), 1u) << "a clip without frames is not even written";
}

// Without the codec libraries (on Windows: no avcodec-59.dll and its kin
// where the module looks) the mail still goes, without its clip.
TEST_F(NotificationJobTest, MissingCodecLibrariesLeaveTheClipOut) {
  av_init::Instance().SetLibraryDirectory(m_dir.File("no-codecs"));
  av_init::Instance().Reload();
  AddSource("Lobby", Clip(5, {0, 40}, 100, 0));
  RunNotificationJob(m_item, m_helper, m_stream, 100,
                     *MakeAttachmentWriter(m_host.callback(), m_env));
  av_init::Instance().SetLibraryDirectory("");
  ASSERT_EQ(m_helper.messages.size(), 1u);
  EXPECT_NE(m_helper.messages[0].find("- Failed to prepare video attachment for source: "
                                      "\"Lobby\", "),
            std::string::npos)
      << m_helper.messages[0];
  EXPECT_EQ(m_helper.messages[0].find("Content-Disposition"), std::string::npos);
}

TEST_F(NotificationJobTest, AWriterThatLeavesNoBytesAttachesNothing) {
  for (RecordingWriter::Mode mode :
       {RecordingWriter::Mode::kNoFile, RecordingWriter::Mode::kEmptyFile}) {
    m_helper.messages.clear();
    m_writer.mode = mode;
    m_item.videoSources.clear();
    AddSource("Lobby", Clip(5, {0, 40}, 100, 0));
    Run();
    ASSERT_EQ(m_helper.messages.size(), 1u);
    EXPECT_NE(m_helper.messages[0].find("- Failed to prepare video attachment for source: "
                                        "\"Lobby\", "),
              std::string::npos)
        << m_helper.messages[0];
    EXPECT_EQ(m_helper.messages[0].find("Content-Disposition"), std::string::npos);
  }
}

TEST_F(NotificationJobTest, AttachmentLineDescribesTheClip) {
  // 3 s of video, 1 s of it before the trigger, one frame every 500 ms.
  AddSource("Lobby", Clip(5, {1000, 1500, 2000, 2500, 3000, 3500, 4000}, 2048, 2000));
  Run();
  std::vector<std::string> lines = m_host.LogTexts(LogLevelInfo);
  std::string expected = "Attachment " + DataDirectory() +
                         "/Lobby.mov, preview 1.000, length 3.000, frames 7, Gop size 7, fps 2, "
                         "sizeKB 14";
  EXPECT_NE(std::find(lines.begin(), lines.end(), expected), lines.end());
}

TEST_F(NotificationJobTest, OneFrameClipCountsOneMillisecond) {
  AddSource("Lobby", Clip(5, {5000}, 100, 5000));
  Run();
  EXPECT_TRUE(m_host.Log().Contains(", length 0.001, frames 1, Gop size 1, fps 2000, sizeKB 0"));
}

TEST_F(NotificationJobTest, LargeAttachmentsAreSplitIntoParts) {
  AddSource("a", Clip(5, {0}, 6 * kMiB, 0));
  AddSource("b", Clip(5, {0}, 6 * kMiB, 0));
  AddSource("c", Clip(5, {0}, 3 * kMiB, 0));
  Run();
  ASSERT_EQ(m_helper.runs.size(), 2u);
  EXPECT_NE(SentPath(0).find("-Part-1-of-2"), std::string::npos);
  EXPECT_NE(SentPath(1).find("-Part-2-of-2"), std::string::npos);
  const char* const attached[] = {"filename=\"a.mov\"", "filename=\"b.mov\"", "filename=\"c.mov\""};
  const size_t inPart[] = {0, 1, 1};
  for (size_t i = 0; i < 3; ++i) {
    for (size_t part = 0; part < 2; ++part) {
      EXPECT_EQ(m_helper.messages[part].find(attached[i]) != std::string::npos, inPart[i] == part)
          << attached[i] << " in part " << part + 1;
    }
  }
  EXPECT_EQ(m_helper.statuses.back(), std::make_pair(3, 0));
}

TEST_F(NotificationJobTest, RetryableFailuresQueueEveryPart) {
  AddSource("a", Clip(5, {0}, 6 * kMiB, 0));
  AddSource("b", Clip(5, {0}, 6 * kMiB, 0));
  m_helper.exitCodes = {7, 7};
  Run();
  EXPECT_EQ(m_helper.Retries().Size(), 2u);
  EXPECT_EQ(m_helper.statuses, (std::vector<std::pair<int32_t, int32_t>>{{3, 1}}));
  std::vector<std::string> files = DataFiles();
  EXPECT_EQ(files.size(), 2u) << "only the queued message files stay";
  for (const std::string& f : files) EXPECT_EQ(f.rfind("notify-mail-", 0), 0u) << f;
  EXPECT_EQ(m_host.LogTexts(LogLevelError).size(), 2u);
}

TEST_F(NotificationJobTest, NoDataDirectoryReportsFailure) {
  testsupport::WriteFile("data", "a file where the directory should be");
  DataDirectory();
  Run();
  EXPECT_TRUE(m_helper.runs.empty());
  EXPECT_EQ(m_helper.statuses, (std::vector<std::pair<int32_t, int32_t>>{{3, 1}}));
  EXPECT_TRUE(m_host.Log().Contains("Unable to create data directory: \""));
}

TEST_F(NotificationJobTest, SequenceRestartsWhenTheQueueIsEmpty) {
  m_item.profile.attach = false;
  m_helper.exitCodes = {7, 0, 0};
  Run();  // queued: sequence 1
  Run();  // sent while one waits: the sequence stays
  EXPECT_EQ(m_helper.Retries().Sequence(), 1u);
  m_helper.Retries().Clear(m_helper, m_stream);
  Run();  // sent with nothing waiting: the sequence starts again
  EXPECT_EQ(m_helper.Retries().Sequence(), 0u);
  const std::string name = "./data/notify-mail-3-1767225600-0-";
  EXPECT_EQ(SentPath(0), name + "0");
  EXPECT_EQ(SentPath(1), name + "1");
  EXPECT_EQ(SentPath(2), name + "1");
}

}  // namespace
}  // namespace hx
