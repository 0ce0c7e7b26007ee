// Alarm to inbox with video: a camera feed from a real H.264 file, an alarm
// document, the clip muxed with the real codec libraries, the message sent by
// the real curl to a real SMTP server, and the attachment taken out of the
// received message and played by ffprobe. Also the link into the web front
// end, and what a message carries when the codec libraries are incomplete.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <regex>
#include <sstream>
#include <string>

#include "alertmod/host_records.h"
#include "host/camera_feed.h"
#include "host/system_description.h"
#include "tests/support/host_fixture.h"
#include "tests/support/module_hooks.h"
#include "tests/support/smtp_server.h"
#include "tests/support/web_server.h"

namespace {

using namespace std::chrono_literals;
using testsupport::SmtpTestServer;

constexpr int32_t kPlugin = 0x10000;
constexpr int32_t kEvent = 7;
constexpr uint32_t kFrameMs = 40;  // 25 frames a second
constexpr char kSerial[] = "SN-1001";

std::string Capture(const std::string& command) {
  std::string output;
  FILE* pipe = popen(command.c_str(), "r");
  if (pipe == nullptr) return output;
  char buffer[4096];
  size_t n;
  while ((n = fread(buffer, 1, sizeof(buffer), pipe)) > 0) output.append(buffer, n);
  pclose(pipe);
  return output;
}

std::string Base64Decode(const std::string& text) {
  std::string file = testing::TempDir() + "/fragment.b64";
  testsupport::WriteFile(file, text);
  return Capture("base64 -d '" + file + "'");
}

class ClipEmailTest : public testsupport::ModuleHostTest {
 protected:
  // A camera's stream: H.264 without B-frames, a key frame every second.
  void SetUp() override {
    ModuleHostTest::SetUp();
    m_video = dir().File("lobby.mp4");
    MakeVideo(0);
  }

  void MakeVideo(int bframes) {
    std::string command =
        "ffmpeg -nostdin -v error -y -f lavfi -i testsrc=size=320x240:rate=25 -frames:v 250 "
        "-c:v libx264 -bf " +
        std::to_string(bframes) +
        " -pix_fmt yuv420p -x264-params keyint=25:min-keyint=25:scenecut=0 '" + m_video + "'";
    ASSERT_EQ(std::system(command.c_str()), 0) << "ffmpeg is needed: " << command;
  }

  void Start(const std::string& body, const std::string& webAddress) {
    std::string notify =
        "<?xml ?><Trellan Delta=\"0\"><Notify ID=\"786432\"><Web address=\"" + webAddress +
        "\" /><Servers><smtp description=\"local\" address=\"127.0.0.1\" port=\"" +
        std::to_string(m_smtp.port()) +
        "\" UseSSL=\"0\" /></Servers><Profiles autoincrement=\"2\"><smtp ID=\"1\" attach=\"1\" "
        "description=\"Lobby motion\" ThrottleSeconds=\"0\" from=\"alarm@example.com\" "
        "subject=\"Motion on {source}\" MaxVideoSeconds=\"4\" EventEdge=\"0\"><to>guard@example."
        "com</to><body>" +
        body + "</body></smtp></Profiles></Notify></Trellan>";
    ASSERT_TRUE(testsupport::WriteFile("notify.xml", notify));
    StartHost();
    refhost::SystemDescription system;
    refhost::CameraDescription camera;
    camera.name = "Lobby";
    refhost::StreamDescription stream;
    stream.width = 320;
    stream.height = 240;
    camera.streams.push_back(stream);
    system.cameras.push_back(camera);
    refhost::EventDescription event;
    event.id = kEvent;
    event.preAlarmSeconds = 2;
    event.source = refhost::EventSourceRef::Camera(kPlugin, 1, 0);
    event.notifyProfiles = {1};
    system.events.push_back(event);
    host().SendHostDocument(refhost::BuildSystemDocument(system));
  }

  // Plays the file as the camera's stream on the test's clock, sending a
  // motion alarm at frame `alarmFrame`.
  void PlayWithAlarmAt(uint64_t alarmFrame) {
    refhost::FeedOptions options;
    options.path = m_video;
    options.streamId = refhost::HostStreamId(kPlugin, 1, 0, 0);
    options.realTime = false;
    options.observer = [&](const refhost::FrameHeader& header, const uint8_t*) {
      clock().Advance(std::chrono::milliseconds(kFrameMs));
      if (header.sequence == alarmFrame) SendAlarm();
    };
    refhost::CameraFeed feed(host(), host().Frames(), options);
    std::string error;
    ASSERT_TRUE(feed.Run(&error)) << error;
  }

  void SendAlarm() {
    refhost::AlarmDocument alarm;
    alarm.serverSerial = kSerial;
    refhost::AlarmRequest request;
    request.profile = 1;
    request.action = kEvent;
    request.time = clock().WallSeconds();
    refhost::AlarmRequest::Source source;
    source.type = 2;  // motion
    request.source = source;
    alarm.requests.push_back(std::move(request));
    host().WriteDocument(refhost::BuildAlarmDocument(alarm), 0x10000);
  }

  // Splits the `index`th received message into files; returns the script's
  // listing (subject and attachments).
  std::string Unpack(size_t index) {
    std::string out = dir().File("mail" + std::to_string(index));
    mkdir(out.c_str(), 0755);
    std::string message = out + "/message.eml";
    testsupport::WriteFile(message, m_smtp.Messages().at(index).data);
    return Capture("/usr/bin/python3 " ALERTMOD_TEST_SUPPORT_DIR "/mail_parts.py '" + message +
                   "' '" + out + "'");
  }

  void SetCodecDirectory(const std::string& directory, bool reloadNow) {
    auto set = reinterpret_cast<testhooks::SetCodecLibraryDirectoryFn>(
        host().Hook("SetCodecLibraryDirectory"));
    ASSERT_NE(set, nullptr);
    host().GetDispatcher().Call([&] {
      set(directory.c_str(), reloadNow);
      return 0;
    });
  }

  // A directory of links to the system's codec libraries; `swresample`
  // replaces the resampling library's link (empty: no such file).
  std::string LibraryDirectory(const std::string& name, const std::string& swresample) {
    std::string path = dir().File(name);
    mkdir(path.c_str(), 0755);
    for (const char* lib : {"libavcodec.so.59", "libavformat.so.59", "libavutil.so.57",
                            "libavfilter.so.8", "libswresample.so.4"}) {
      std::string target = std::string(FFMPEG_LIBDIR) + "/" + lib;
      if (std::string(lib) == "libswresample.so.4") target = swresample;
      if (!target.empty()) {
        EXPECT_EQ(symlink(target.c_str(), (path + "/" + lib).c_str()), 0);
      }
    }
    return path;
  }

  SmtpTestServer m_smtp;
  std::string m_video;
};

TEST_F(ClipEmailTest, TheReceivedClipPlaysForTheCapturedSpan) {
  Start("See the clip.", "");
  PlayWithAlarmAt(100);
  ASSERT_TRUE(m_smtp.WaitForMessages(1, 60s));
  std::string listing = Unpack(0);
  EXPECT_NE(listing.find("subject Motion on Lobby"), std::string::npos) << listing;
  EXPECT_NE(listing.find("attachment Lobby.mov video/quicktime"), std::string::npos) << listing;

  // The module's own account of the clip: about 2 s before the alarm, 4 s
  // in all.
  std::smatch line;
  std::string log;
  for (const auto& l : host().Log().Lines()) log += l.text + "\n";
  ASSERT_TRUE(std::regex_search(
      log, line, std::regex("Lobby\\.mov, preview ([0-9.]+), length ([0-9.]+), frames ([0-9]+)")))
      << log;
  double preview = std::stod(line[1]), length = std::stod(line[2]);
  EXPECT_NEAR(preview, 2.0, 1.0);
  EXPECT_NEAR(length, 4.0, 1.0);

  std::string clip = dir().File("mail0/Lobby.mov");
  double played = std::stod(
      "0" + Capture("ffprobe -v error -show_entries format=duration -of csv=p=0 '" + clip + "'"));
  EXPECT_NEAR(played, length, 1.0) << "within one GOP of the captured span";
  EXPECT_EQ(Capture("ffprobe -v error -select_streams v:0 -show_entries stream=codec_name -of "
                    "csv=p=0 '" +
                    clip + "'"),
            "h264\n");
  EXPECT_EQ(Capture("ffmpeg -nostdin -v error -i '" + clip + "' -f null - 2>&1"), "");
  host().Stop();
  EXPECT_EQ(host().Frames().Counts().outstanding, 0u);
}

TEST_F(ClipEmailTest, ACameraSendingBFramesGivesAClipShownInDisplayOrder) {
  MakeVideo(2);
  Start("See the clip.", "");
  PlayWithAlarmAt(100);
  ASSERT_TRUE(m_smtp.WaitForMessages(1, 60s));
  Unpack(0);
  std::string clip = dir().File("mail0/Lobby.mov");
  std::istringstream shown(Capture(
      "ffprobe -v error -select_streams v:0 -show_entries frame=pts -of csv=p=0 '" + clip + "'"));
  std::vector<long long> times;
  for (std::string line; std::getline(shown, line);) times.push_back(std::stoll(line));
  EXPECT_GT(times.size(), 75u);
  for (size_t i = 1; i < times.size(); ++i) ASSERT_LT(times[i - 1], times[i]) << i;
  EXPECT_EQ(Capture("ffmpeg -nostdin -v error -i '" + clip + "' -f null - 2>&1"), "");
}

TEST_F(ClipEmailTest, TheWebLinkPointsAtTheCamerasAroundTheEvent) {
  testsupport::WebServer web;
  web.SetLoginJson(std::string("{\"list\":[{\"serial\":\"") + kSerial +
                   "\",\"id\":\"srv-7\",\"model\":\"NVR\"}]}");
  Start("Watch: {weblink}", "127.0.0.1:" + std::to_string(web.port()));
  PlayWithAlarmAt(100);
  ASSERT_TRUE(m_smtp.WaitForMessages(1, 60s));
  Unpack(0);
  std::string body = testsupport::ReadFile(dir().File("mail0/body.txt"));
  std::smatch link;
  ASSERT_TRUE(std::regex_search(body, link,
                                std::regex("http://127\\.0\\.0\\.1:" + std::to_string(web.port()) +
                                           "/advanced\\.web\\?s=srv-7;#([A-Za-z0-9+/=]+)")))
      << body;
  std::string request = Base64Decode(link[1]);
  uint32_t key = refhost::HostStreamId(kPlugin, 1, 0, 0);
  EXPECT_NE(request.find("\"i\":" + std::to_string(key) + ",\"t\":\"camera\""), std::string::npos)
      << request;
  EXPECT_NE(request.find("{\"m\":2,\"sb\":1,\"sm\":1,\"st\":"), std::string::npos) << request;
  ASSERT_FALSE(web.Requests().empty());
  EXPECT_EQ(testsupport::WebServer::RequestPath(web.Requests()[0]), "/login.web?output=json");
}

TEST_F(ClipEmailTest, IncompleteCodecLibrariesSendTheMessageWithoutAClip) {
  struct Case {
    const char* name;
    std::string swresample;
  };
  const Case cases[] = {
      {"missing", ""},
      {"lacking", STUB_AV_LACKING},
  };
  Start("See the clip.", "");
  size_t received = 0;
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    SetCodecDirectory(LibraryDirectory(c.name, c.swresample), /*reloadNow=*/true);
    PlayWithAlarmAt(100);
    ASSERT_TRUE(m_smtp.WaitForMessages(++received, 60s));
    std::string listing = Unpack(received - 1);
    EXPECT_EQ(listing.find("attachment"), std::string::npos) << listing;
    std::string body =
        testsupport::ReadFile(dir().File("mail" + std::to_string(received - 1) + "/body.txt"));
    EXPECT_NE(body.find("- Failed to prepare video attachment for source: \"Lobby\", "),
              std::string::npos)
        << body;
  }
  // A complete set again: the clip writer reloads the libraries by itself.
  SetCodecDirectory(
      LibraryDirectory("complete", std::string(FFMPEG_LIBDIR) + "/libswresample.so.4"),
      /*reloadNow=*/false);
  PlayWithAlarmAt(100);
  ASSERT_TRUE(m_smtp.WaitForMessages(++received, 60s));
  EXPECT_NE(Unpack(received - 1).find("attachment Lobby.mov"), std::string::npos);
  host().Stop();
  EXPECT_EQ(host().Frames().Counts().outstanding, 0u);
}

}  // namespace
