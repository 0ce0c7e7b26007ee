// Faults around delivery, through the reference host with the testing module,
// the real curl and a real SMTP server, with a camera whose frames the
// notifications capture: the SMTP server away for a while, the transfer tool
// missing, a host that refuses process messages, a full disk, a mail server
// that refuses bare line feeds, configuration updates while a slow delivery
// runs, and Close in the middle of a delivery that does not end by itself.
//
// Whatever happens, the module keeps what its design keeps (failed messages
// queued for retry and delivered later), gives every notification a status,
// returns every frame buffer, and leaves no program of the transfer tool
// behind. Time is the test's: retries follow the replaced clock.
#include <gtest/gtest.h>

#include <dirent.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <memory>
#include <regex>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "alertmod/host_records.h"
#include "host/process_service.h"
#include "host/system_description.h"
#include "tests/manager_fixture.h"
#include "tests/support/module_hooks.h"
#include "tests/support/smtp_server.h"
#include "tests/support/temp_dir.h"

namespace {

using namespace std::chrono_literals;
using testsupport::SmtpTestServer;

constexpr int32_t kPlainProfile = 3;
constexpr int32_t kVideoProfile = 4;
constexpr int32_t kEncoders = 0x10000;
constexpr int32_t kCameraEvent = 7;
const uint32_t kCameraStream = refhost::HostStreamId(kEncoders, 1, 0, 0);
constexpr uint32_t kFrameHeaderBytes = 32;  // before the still in a pushed frame

std::string NotifyFile(int port) {
  return "<?xml ?><Trellan Delta=\"0\"><Notify ID=\"786432\" MaxRetrySeconds=\"172800\" "
         "MaxRetryQueue=\"100\" EmailSizeLimitMB=\"10\"><Servers><smtp description=\"local\" "
         "address=\"127.0.0.1\" port=\"" +
         std::to_string(port) +
         "\" UseSSL=\"0\" /></Servers><Profiles autoincrement=\"10\">"
         "<smtp ID=\"3\" attach=\"0\" description=\"Front door\" ThrottleSeconds=\"0\" "
         "from=\"desk@example.com\" subject=\"Door\" MaxVideoSeconds=\"0\" EventEdge=\"0\">"
         "<to>guard@example.com</to><body>Door opened.</body></smtp>"
         "<smtp ID=\"4\" attach=\"1\" description=\"Lobby camera\" ThrottleSeconds=\"0\" "
         "from=\"desk@example.com\" subject=\"Motion\" MaxVideoSeconds=\"0\" EventEdge=\"0\">"
         "<to>guard@example.com</to><body>Motion in the lobby.&#x0A;.&#x0A;Look at the "
         "still.</body></smtp>"
         "</Profiles></Notify></Trellan>";
}

// The free space the module sees on its data volume, set by the test.
class FaultInjectionTest : public managertest::ManagerHostTest {
 protected:
  // A transfer tool that records its process id, runs `before` (shell
  // commands) and then curl. The capability probe ("-V") goes to curl at once.
  std::string ToolScript(const std::string& before = "", const std::string& run = "curl") {
    const std::string path = dir().File("transfer-tool");
    testsupport::WriteFile(path,
                           "#!/bin/sh\nif [ \"$1\" = -V ]; then exec curl \"$@\"; fi\n"
                           "echo $$ >> '" +
                               dir().File("tool-pids") + "'\n" + before + "\nexec " + run +
                               " \"$@\"\n");
    chmod(path.c_str(), 0755);
    return path;
  }

  // Writes "notify.xml" for one server on `port`, makes the host with
  // `transferTool`, lets `prepare` change it before Open, starts it and
  // describes a camera whose alarms notify the video profile.
  void Start(int port, const std::string& transferTool,
             const std::function<void(refhost::ReferenceHost&)>& prepare = {}) {
    ASSERT_TRUE(testsupport::WriteFile("notify.xml", NotifyFile(port)));
    Options().transferTool = transferTool;
    clock().SetFreeBytes(uint64_t{1} << 40);
    CreateHost();
    if (prepare) prepare(host());
    std::string error;
    ASSERT_TRUE(host().Start(&error)) << error;
    refhost::SystemDescription system;
    system.cameras = {
        {"Lobby",
         kEncoders,
         1,
         0,
         {refhost::StreamDescription{0, refhost::kStandardJpeg, 320, 240, std::nullopt}}}};
    system.events = {
        {kCameraEvent, 0, refhost::EventSourceRef::Camera(kEncoders, 1, 0), {kVideoProfile}}};
    SendSystem(system);
  }

  // A camera alarm for the video profile after some JPEG frames holding
  // stills of `stillBytes`, and one for the plain profile.
  void AlarmWithVideo(uint32_t stillBytes = 3000 - kFrameHeaderBytes) {
    PushFrames(kCameraStream, 5, 1, 40, kFrameHeaderBytes + stillBytes);
    refhost::AlarmDocument alarm;
    refhost::AlarmRequest request;
    request.profile = kVideoProfile;
    request.action = kCameraEvent;
    request.time = clock().WallSeconds();
    alarm.requests.push_back(std::move(request));
    SendAlarm(alarm);
  }
  void PlainAlarm() { SendAlarm(kPlainProfile, 1); }

  size_t CountStatus(int status) {
    size_t count = 0;
    for (const auto& report : host().Config().StatusReports()) {
      count += report.status == status ? 1 : 0;
    }
    return count;
  }
  bool WaitForStatus(int status, size_t count, std::chrono::milliseconds timeout = 60s) {
    return host().Requests().WaitFor([&](const auto&) { return CountStatus(status) >= count; },
                                     timeout);
  }

  // Message files waiting in the data directory.
  std::vector<std::string> MessageFiles() {
    std::vector<std::string> names;
    if (DIR* d = opendir("data")) {
      while (dirent* e = readdir(d)) {
        if (std::string(e->d_name).rfind("notify-mail-", 0) == 0) names.push_back(e->d_name);
      }
      closedir(d);
    }
    return names;
  }

  // Python's email package's reading of the message file `name`: the
  // listing of mail_parts.py, which writes the text part and the attachments
  // into the directory `name`.parts.
  std::string MailParts(const std::string& name) {
    const std::string parts = dir().File(name + ".parts");
    mkdir(parts.c_str(), 0755);
    const std::string command = "/usr/bin/python3 " ALERTMOD_TEST_SUPPORT_DIR "/mail_parts.py '" +
                                dir().File(name) + "' '" + parts + "' >'" + parts + "/listing'";
    EXPECT_EQ(system(command.c_str()), 0) << command;
    return testsupport::ReadFile(parts + "/listing");
  }

  // Waits until `done` holds, looking every few milliseconds: what it reads
  // (files of the transfer tool) comes with no request to the host.
  static bool PollUntil(const std::function<bool()>& done, std::chrono::milliseconds timeout) {
    const auto deadline = std::chrono::steady_clock::now() + timeout;
    while (!done()) {
      if (std::chrono::steady_clock::now() > deadline) return false;
      std::this_thread::sleep_for(10ms);
    }
    return true;
  }
  bool ToolStarted() {
    return PollUntil([&] { return testsupport::FileExists(dir().File("tool-pids")); }, 30s);
  }

  // Moves the clock on in steps until `done` holds; the worker polls its
  // retry queue in real time, so each step gets a moment.
  bool AdvanceUntil(std::chrono::milliseconds step, const std::function<bool()>& done) {
    for (int i = 0; i < 40; ++i) {
      clock().Advance(step);
      if (host().Requests().WaitFor([&](const auto&) { return done(); }, 500ms)) return true;
    }
    return false;
  }

  // Stops the host; every frame buffer must be back and every program the
  // transfer tool started must be gone (reaped, not a zombie).
  void ExpectNothingLeftBehind() {
    ExpectFramesReturned();
    std::istringstream pids(testsupport::ReadFile(dir().File("tool-pids")));
    for (int pid; pids >> pid;) {
      EXPECT_EQ(kill(pid, 0), -1) << "transfer tool process " << pid << " left behind";
      EXPECT_EQ(errno, ESRCH);
    }
  }
};

TEST_F(FaultInjectionTest, SmtpDownQueuesAndDeliversWhenItIsBack) {
  SmtpTestServer smtp;
  smtp.Stop();
  Start(smtp.port(), ToolScript());
  AlarmWithVideo();
  PlainAlarm();
  PlainAlarm();
  ASSERT_TRUE(WaitForStatus(1, 3));
  EXPECT_EQ(MessageFiles().size(), 3u) << "failed messages are kept for retry";
  EXPECT_TRUE(
      host().Log().Contains("Failed to send notification using profile Lobby camera.  "
                            "This message will be retried"));

  smtp.Start();
  ASSERT_TRUE(AdvanceUntil(30s, [&] { return smtp.Messages().size() >= 3; }));
  ASSERT_TRUE(WaitForStatus(0, 3));
  EXPECT_TRUE(PollUntil([&] { return MessageFiles().empty(); }, 10s));
  size_t withStill = 0;
  for (const auto& mail : smtp.Messages()) {
    withStill += mail.data.find(".jpg") != std::string::npos ? 1 : 0;
  }
  EXPECT_EQ(withStill, 1u);
  ExpectNothingLeftBehind();
}

TEST_F(FaultInjectionTest, MissingTransferToolFailsEachMessageCleanly) {
  SmtpTestServer smtp;
  Start(smtp.port(), dir().File("no-such-dir/curl"));
  AlarmWithVideo();
  PlainAlarm();
  ASSERT_TRUE(WaitForStatus(1, 2, 30s));
  for (const char* profile : {"Front door", "Lobby camera"}) {
    EXPECT_TRUE(host().Log().Contains(
        std::string("Failed to execute curl smtp operation using server local. (Profile "
                    "Description: ") +
        profile + ")"));
    EXPECT_TRUE(host().Log().Contains(
        std::string("Failed to send notification using profile ") + profile +
        ".  This message will NOT be retried due to failure return codes 67 or 26 or due to "
        "failures to prepare or initiate email operation"));
  }
  EXPECT_FALSE(host().Log().Contains("This message will be retried"));
  EXPECT_TRUE(MessageFiles().empty());
  EXPECT_TRUE(smtp.Messages().empty());
  ExpectNothingLeftBehind();
}

// The host refuses every process message, takes the start and then refuses
// the program's input, which the transfer tool waits for, or takes the start
// and never answers it, not even the capability probe's at Open. Either way
// the delivery fails (at once, or when the answer is overdue) and the next
// notification is still handled.
TEST_F(FaultInjectionTest, HostRefusingProcessMessages) {
  enum StartHandling { kStartRefused, kInputRefused, kStartSwallowed };
  for (StartHandling handling : {kStartRefused, kInputRefused, kStartSwallowed}) {
    SCOPED_TRACE(handling);
    SmtpTestServer smtp;
    std::unique_ptr<refhost::ProcessService> service;
    clock().SetProcessStartTimeout(std::chrono::milliseconds(300));
    Start(smtp.port(), ToolScript(), [&](refhost::ReferenceHost& host) {
      service = std::make_unique<refhost::ProcessService>(
          ToolScript(), [&host](const void* data, uint32_t length) {
            host.Ioctl(hx::core::kIoctlProcessMessage, data, length);
          });
      host.SetHandler(hx::core::kClassProcess, [&, handling](hx::core::HostRequest& r) {
        hx::core::ProcessMessageHeader header{};
        if (r.data == nullptr || r.length < sizeof(header)) return -1;
        memcpy(&header, r.data, sizeof(header));
        if (header.type != hx::core::kProcessStart || handling == kStartRefused) return -1;
        return handling == kInputRefused ? service->Handle(r) : 0;
      });
    });
    PlainAlarm();
    AlarmWithVideo();
    ASSERT_TRUE(WaitForStatus(1, 2, 30s));
    EXPECT_TRUE(
        host().Log().Contains("Failed to execute curl smtp operation using server local. "
                              "(Profile Description: Front door)"));
    EXPECT_EQ(host().Log().Contains("The host did not answer the start of ./curl within 300 ms"),
              handling == kStartSwallowed);
    EXPECT_TRUE(MessageFiles().empty());
    service->Stop();
    ExpectNothingLeftBehind();
  }
}

TEST_F(FaultInjectionTest, FullDiskDiscardsFailuresInsteadOfQueueingThem) {
  SmtpTestServer smtp;
  smtp.Stop();
  Start(smtp.port(), ToolScript());
  PlainAlarm();
  ASSERT_TRUE(WaitForStatus(1, 1));
  ASSERT_EQ(MessageFiles().size(), 1u);

  // The volume fills up while the next message is written (it takes the next
  // sequence number): nothing of it stays behind.
  ASSERT_EQ(symlink("/dev/full", "data/notify-mail-3-0-0-1"), 0);
  PlainAlarm();
  ASSERT_TRUE(WaitForStatus(1, 2));
  EXPECT_TRUE(host().Log().Contains(
      "Failed to prepare email notification file. (Profile Description: Front door)"));
  EXPECT_EQ(MessageFiles().size(), 1u) << "the message cut short is removed";

  clock().SetFreeBytes(0);
  AlarmWithVideo();
  ASSERT_TRUE(WaitForStatus(1, 3));
  EXPECT_TRUE(
      host().Log().Contains("Available bytes 0 are less than threshold of 104857600. "
                            "Attempting to purge failed notifications"));
  EXPECT_TRUE(
      host().Log().Contains("Unable to free up space by removing items from "
                            "notification retry queue. Message ("));
  EXPECT_EQ(MessageFiles().size(), 1u) << "the small queued message is kept, the new one dropped";

  // A volume that cannot be queried counts as having room.
  clock().SetFreeBytes(uint64_t{1} << 40);
  clock().FailFreeBytesQueries(true);
  PlainAlarm();
  ASSERT_TRUE(WaitForStatus(1, 4));
  EXPECT_TRUE(host().Log().Contains("Exception while query volume space: "));
  EXPECT_EQ(MessageFiles().size(), 2u);

  smtp.Start();
  ASSERT_TRUE(AdvanceUntil(30s, [&] { return smtp.Messages().size() >= 2; }));
  ASSERT_TRUE(WaitForStatus(0, 2));
  EXPECT_TRUE(PollUntil([&] { return MessageFiles().empty(); }, 10s));
  ExpectNothingLeftBehind();
}

// A mail server hardened against SMTP smuggling takes nothing but CR LF as a
// line end. Postfix so configured relays a message with a 1 MiB still and a
// body typed with LF line breaks, one line holding a single dot, and what
// arrives reads as what the module composed.
TEST_F(FaultInjectionTest, MailServerRefusingBareLineFeeds) {
  SmtpTestServer smtp;
  testsupport::PostfixRelay postfix(smtp.port());
  const std::string sent = dir().File("sent.eml");
  Start(postfix.port(),
        ToolScript("for a; do [ \"$p\" = -T ] && cp \"$a\" '" + sent + "'; p=$a; done"));
  constexpr uint32_t kStillBytes = 1048576;
  AlarmWithVideo(kStillBytes);
  ASSERT_TRUE(smtp.WaitForMessages(1));
  ASSERT_TRUE(testsupport::WriteFile(dir().File("received.eml"), smtp.Messages()[0].data));
  const std::string listing = MailParts("received.eml");
  EXPECT_EQ(listing, "subject Motion\nattachment Lobby.jpg image/jpeg " +
                         std::to_string(kStillBytes) + "\n");
  EXPECT_EQ(listing, MailParts("sent.eml"));
  EXPECT_EQ(testsupport::ReadFile(dir().File("received.eml.parts/body.txt")),
            "Motion in the lobby.\n.\nLook at the still.");
  EXPECT_TRUE(testsupport::ReadFile(dir().File("received.eml.parts/Lobby.jpg")) ==
              testsupport::ReadFile(dir().File("sent.eml.parts/Lobby.jpg")));
  ExpectNothingLeftBehind();
}

TEST_F(FaultInjectionTest, ConfigurationUpdatesDuringSlowDeliveries) {
  SmtpTestServer smtp;
  Start(smtp.port(), ToolScript("sleep 0.2"));
  constexpr size_t kAlarms = 4;
  AlarmWithVideo();
  for (size_t i = 1; i < kAlarms; ++i) PlainAlarm();
  ASSERT_TRUE(ToolStarted());
  for (int i = 0; i < 12; ++i) {
    std::string update = NotifyFile(smtp.port());
    update = std::regex_replace(update, std::regex("Delta=\"0\""), "Delta=\"1\"");
    update = std::regex_replace(update, std::regex("MaxRetryQueue=\"100\""),
                                "MaxRetryQueue=\"" + std::to_string(20 + i) + "\"");
    host().SendConfigurationUpdate(update);
    AlarmWithVideo();  // frames keep coming while the worker is busy
    std::this_thread::sleep_for(100ms);
  }
  ASSERT_TRUE(smtp.WaitForMessages(kAlarms + 12, 90s));
  ASSERT_TRUE(WaitForStatus(0, kAlarms + 12, 30s));
  EXPECT_EQ(CountStatus(1), 0u);
  EXPECT_NE(host().Config().Configuration().find("MaxRetryQueue=\"31\""), std::string::npos);
  ExpectNothingLeftBehind();
}

// The host stops while both lent threads are inside the module, with Close
// first, or with Unload alone, which must stop and wait for them as Close
// would before it frees what they use.
TEST_F(FaultInjectionTest, StopDuringADeliveryThatDoesNotEnd) {
  for (bool closeBeforeUnload : {true, false}) {
    SCOPED_TRACE(closeBeforeUnload ? "Close, then Unload" : "Unload alone");
    SmtpTestServer smtp;
    Options().closeBeforeUnload = closeBeforeUnload;
    Start(smtp.port(), ToolScript("", "sleep 600 #"));
    AlarmWithVideo();
    ASSERT_TRUE(ToolStarted());
    const auto start = std::chrono::steady_clock::now();
    ExpectNothingLeftBehind();
    EXPECT_LT(std::chrono::steady_clock::now() - start, 5s) << "the worker was released";
    EXPECT_TRUE(
        host().Log().Contains("Failed to execute curl smtp operation using server local. "
                              "(Profile Description: Lobby camera)"));
    remove(dir().File("tool-pids").c_str());
  }
}

}  // namespace
