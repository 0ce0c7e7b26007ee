// E-mail end to end: alarm documents through Write, the module's job on the
// worker, the real curl run by the reference host's process service, and a
// real SMTP server. Time is the test's: retries follow the replaced tick.
#include <gtest/gtest.h>

#include <dirent.h>
#include <sys/stat.h>

#include <atomic>
#include <cstring>
#include <regex>
#include <string>
#include <thread>
#include <vector>

#include "alertmod/host_records.h"
#include "host/system_description.h"
#include "tests/support/host_fixture.h"
#include "tests/support/module_hooks.h"
#include "tests/support/smtp_server.h"

namespace {

using namespace std::chrono_literals;
using testsupport::SmtpTestServer;

constexpr int32_t kProfile = 3;
constexpr uint32_t kAlarmSender = 0x10000;

struct ServerSetting {
  ServerSetting(std::string description, int port, int useSsl = 0, std::string user = "",
                std::string password = "")
      : description(std::move(description)),
        port(port),
        useSsl(useSsl),
        user(std::move(user)),
        password(std::move(password)) {}
  std::string description;
  int port;
  int useSsl;
  std::string user;
  std::string password;
};

struct ProfileSetting {
  std::string subject = "Alarm";
  std::string body = "Something happened.";
  std::string from = "Alarm Desk &lt;alarm@example.com&gt;";
  std::vector<std::string> to = {"guard@example.com", "chief@example.com"};
  std::vector<std::string> bcc;
};

std::string ConfigurationText(const std::vector<ServerSetting>& servers,
                              const ProfileSetting& profile, int maxRetryQueue,
                              int maxRetrySeconds) {
  std::string xml = "<?xml ?><Trellan Delta=\"0\"><Notify ID=\"786432\" MaxRetrySeconds=\"" +
                    std::to_string(maxRetrySeconds) + "\" MaxRetryQueue=\"" +
                    std::to_string(maxRetryQueue) +
                    "\" EmailSizeLimitMB=\"10\"><Web address=\"\" />"
                    "<Servers>";
  for (const ServerSetting& s : servers) {
    xml += "<smtp description=\"" + s.description + "\" address=\"127.0.0.1\" port=\"" +
           std::to_string(s.port) + "\" UseSSL=\"" + std::to_string(s.useSsl) + "\">";
    if (!s.user.empty()) {
      xml += "<Authentication username=\"" + s.user + "\" password=\"" + s.password + "\" />";
    }
    xml += "</smtp>";
  }
  xml += "</Servers><Profiles autoincrement=\"10\"><smtp ID=\"" + std::to_string(kProfile) +
         "\" attach=\"0\" description=\"Front door\" ThrottleSeconds=\"0\" from=\"" + profile.from +
         "\" subject=\"" + profile.subject + "\" MaxVideoSeconds=\"0\" EventEdge=\"2\">";
  for (const std::string& to : profile.to) xml += "<to>" + to + "</to>";
  for (const std::string& bcc : profile.bcc) xml += "<bcc>" + bcc + "</bcc>";
  xml += "<body>" + profile.body + "</body></smtp></Profiles></Notify></Trellan>";
  return xml;
}

class EmailDeliveryTest : public testsupport::ModuleHostTest {
 protected:
  void Start(const std::vector<ServerSetting>& servers, const ProfileSetting& profile = {},
             int maxRetryQueue = 100, int maxRetrySeconds = 172800) {
    ASSERT_TRUE(testsupport::WriteFile(
        "notify.xml", ConfigurationText(servers, profile, maxRetryQueue, maxRetrySeconds)));
    Options().transferTool = CopyingTransferTool();
    clock().SetFreeBytes(uint64_t{1} << 40);
    CreateHost();
    std::string error;
    ASSERT_TRUE(host().Start(&error)) << error;
  }

  // A transfer tool that keeps a copy of each message file, then runs curl.
  std::string CopyingTransferTool() {
    std::string copies = dir().File("sent");
    testsupport::WriteFile(dir().File("copy-then-curl"),
                           "#!/bin/sh\nprev=\nfor a in \"$@\"; do\n"
                           "  if [ \"$prev\" = -T ]; then mkdir -p '" +
                               copies + "' && cp \"$a\" '" + copies +
                               "/'; fi\n  prev=$a\ndone\nexec curl \"$@\"\n");
    chmod(dir().File("copy-then-curl").c_str(), 0755);
    return dir().File("copy-then-curl");
  }

  void SendTestAlarm() {
    refhost::AlarmDocument alarm;
    refhost::AlarmRequest request;
    request.profile = kProfile;
    request.message = "Testing Profile";
    request.time = clock().WallSeconds();
    alarm.requests.push_back(request);
    host().WriteDocument(refhost::BuildAlarmDocument(alarm), kAlarmSender);
  }

  // Status reports for the profile, in order.
  std::vector<int> Statuses() {
    std::vector<int> statuses;
    std::regex report("ID=\"" + std::to_string(kProfile) + "\" Status=\"(-?[0-9]+)\"");
    for (const auto& r : host().Requests().OfClass(hx::core::kClassProfileStatus)) {
      std::smatch match;
      if (std::regex_search(r.bytes, match, report)) statuses.push_back(std::stoi(match[1]));
    }
    return statuses;
  }
  bool WaitForStatuses(size_t count) {
    return host().Requests().WaitFor([&](const auto&) { return Statuses().size() >= count; }, 60s);
  }

  // The command lines the module asked the host to run.
  std::vector<std::vector<std::string>> Started() {
    std::vector<std::vector<std::string>> commands;
    for (const auto& r : host().Requests().OfClass(hx::core::kClassProcess)) {
      hx::core::ProcessMessageHeader header{};
      if (r.bytes.size() < hx::core::kProcessHeaderBytes) continue;
      memcpy(&header, r.bytes.data(), sizeof(header));
      if (header.type != hx::core::kProcessStart) continue;
      std::vector<std::string> args;
      std::string payload = r.bytes.substr(hx::core::kProcessHeaderBytes);
      size_t start = 0;
      for (size_t end; (end = payload.find('\0', start)) != std::string::npos; start = end + 1) {
        args.push_back(payload.substr(start, end - start));
      }
      args.push_back(payload.substr(start));
      commands.push_back(args);
    }
    return commands;
  }

  // The names in `directory`.
  static std::vector<std::string> Files(const std::string& directory) {
    std::vector<std::string> names;
    if (DIR* d = opendir(directory.c_str())) {
      while (dirent* e = readdir(d)) {
        if (e->d_name[0] != '.') names.push_back(e->d_name);
      }
      closedir(d);
    }
    return names;
  }
  std::vector<std::string> DataFiles() { return Files("data"); }
  // Waits until the data directory is empty. The module removes its files
  // without a request to the host, so this looks every few milliseconds.
  bool WaitForNoDataFiles() {
    const auto deadline = std::chrono::steady_clock::now() + 10s;
    while (!DataFiles().empty()) {
      if (std::chrono::steady_clock::now() > deadline) return false;
      std::this_thread::sleep_for(10ms);
    }
    return true;
  }
  // Moves the module's clock on in steps until `done` holds, giving the
  // worker (which polls its retry queue in real time) a moment after each
  // step. The exact schedule is the retry queue's unit tests' business; here
  // it only has to be kept in order.
  template <typename Done>
  bool AdvanceUntil(std::chrono::milliseconds step, Done done, int maxSteps = 40) {
    for (int i = 0; i < maxSteps; ++i) {
      clock().Advance(step);
      if (host().Requests().WaitFor([&](const auto&) { return done(); }, 500ms)) return true;
    }
    return false;
  }
  bool AdvanceUntilLog(std::chrono::milliseconds step, const std::string& fragment) {
    return AdvanceUntil(step, [&] { return host().Log().Contains(fragment); });
  }
};

TEST_F(EmailDeliveryTest, PlainSmtpDeliversTheComposedFileUnchanged) {
  SmtpTestServer smtp;
  ProfileSetting profile;
  profile.subject = "{event type} on {source}";
  profile.bcc = {"audit@example.com"};
  Start({{"local", smtp.port()}}, profile);
  SendTestAlarm();
  ASSERT_TRUE(smtp.WaitForMessages(1));
  ASSERT_TRUE(WaitForStatuses(1));
  EXPECT_EQ(Statuses(), std::vector<int>{0});

  auto mail = smtp.Messages()[0];
  std::vector<std::string> copies = Files(dir().File("sent"));
  ASSERT_EQ(copies.size(), 1u);
  // SMTP ends the message data with a line break, which curl adds when the
  // file does not end with one; every other byte arrives as composed.
  std::string composed = testsupport::ReadFile(dir().File("sent/" + copies[0]));
  EXPECT_EQ(mail.data, composed + "\r\n");
  EXPECT_EQ(mail.mailFrom, "alarm@example.com");
  EXPECT_EQ(mail.rcptTos, (std::vector<std::string>{"guard@example.com", "chief@example.com",
                                                    "audit@example.com"}));
  EXPECT_NE(mail.data.find("Subject: [Test Event Type] on [Test Event Source]\r\n"),
            std::string::npos);
  EXPECT_NE(mail.data.find("Testing Profile\r\nSomething happened."), std::string::npos);
  EXPECT_TRUE(DataFiles().empty()) << "the delivered message file is removed";
}

TEST_F(EmailDeliveryTest, TransportSecurityModes) {
  struct Case {
    SmtpTestServer::Mode mode;
    int useSsl;
  };
  for (Case c : {Case{SmtpTestServer::Mode::kStartTls, 2}, Case{SmtpTestServer::Mode::kSmtps, 1}}) {
    SCOPED_TRACE(c.useSsl);
    SmtpTestServer smtp(SmtpTestServer::Options{c.mode, "", "", 0});
    Start({{"tls", smtp.port(), c.useSsl}});
    SendTestAlarm();
    ASSERT_TRUE(smtp.WaitForMessages(1));
    EXPECT_TRUE(smtp.Messages()[0].tls);
    host().Stop();
  }
}

TEST_F(EmailDeliveryTest, AuthenticationAndThePasswordNeverOnACommandLine) {
  SmtpTestServer smtp(SmtpTestServer::Options{SmtpTestServer::Mode::kPlain, "desk", "s3cr\"et", 0});
  Start({{"good", smtp.port(), 0, "desk", "s3cr&quot;et"}});
  SendTestAlarm();
  ASSERT_TRUE(smtp.WaitForMessages(1));
  EXPECT_EQ(smtp.Messages()[0].login, "desk");
  ASSERT_TRUE(WaitForStatuses(1));
  for (const auto& command : Started()) {
    for (const std::string& arg : command) EXPECT_EQ(arg.find("s3cr"), std::string::npos) << arg;
  }
}

TEST_F(EmailDeliveryTest, RefusedLoginIsDroppedNotRetried) {
  SmtpTestServer smtp(SmtpTestServer::Options{SmtpTestServer::Mode::kPlain, "desk", "right", 0});
  Start({{"wrong", smtp.port(), 0, "desk", "wrong"}});
  SendTestAlarm();
  ASSERT_TRUE(WaitForStatuses(1));
  EXPECT_EQ(Statuses(), std::vector<int>{1});
  EXPECT_TRUE(host().Log().Contains("Notification attempt return code= 67"));
  EXPECT_TRUE(host().Log().Contains("This message will NOT be retried"));
  EXPECT_TRUE(DataFiles().empty());
  EXPECT_TRUE(smtp.Messages().empty());
}

TEST_F(EmailDeliveryTest, FailoverToTheSecondServer) {
  SmtpTestServer smtp;
  Start({{"closed", SmtpTestServer::FreePort()}, {"open", smtp.port()}});
  SendTestAlarm();
  ASSERT_TRUE(smtp.WaitForMessages(1));
  ASSERT_TRUE(WaitForStatuses(1));
  EXPECT_EQ(Statuses(), std::vector<int>{0});
  EXPECT_TRUE(
      host().Log().Contains("Profile Description: Front door. Notification attempt return "
                            "code= 7"));
  EXPECT_TRUE(
      host().Log().Contains("Profile Description: Front door. Notification attempt return "
                            "code= 0"));
  EXPECT_EQ(Started().size(), 3u) << "the probe and two attempts";
}

TEST_F(EmailDeliveryTest, ServerDownThenUpIsRetriedOnTheBackoffScheduleThroughARejectedUpdate) {
  SmtpTestServer smtp;
  smtp.Stop();
  Start({{"later", smtp.port()}});
  SendTestAlarm();
  ASSERT_TRUE(WaitForLog("This message will be retried"));
  ASSERT_TRUE(WaitForStatuses(1));
  EXPECT_EQ(Statuses(), std::vector<int>{1});
  EXPECT_EQ(DataFiles().size(), 1u);

  // Not before the first back-off of a minute.
  clock().Advance(59s);
  EXPECT_FALSE(WaitForLog("Retrying failed notification for file", 500ms));
  ASSERT_TRUE(AdvanceUntilLog(1s, "Retrying failed notification for file"));
  ASSERT_TRUE(host().Requests().WaitFor([&](const auto&) { return Started().size() >= 3; },
                                        30s));  // probe, send, retry
  // An update without "Profiles" is rejected: it changes a limit, not the queue.
  host().SendConfigurationUpdate("<Notify ID=\"786432\" MaxRetryQueue=\"50\"><Servers/></Notify>");
  smtp.Start();
  ASSERT_TRUE(AdvanceUntil(30s, [&] { return !smtp.Messages().empty(); }));
  ASSERT_TRUE(WaitForStatuses(2));
  EXPECT_EQ(Statuses(), (std::vector<int>{1, 0}));
  EXPECT_TRUE(WaitForLog("suceeded."));
  EXPECT_TRUE(WaitForNoDataFiles());
}

TEST_F(EmailDeliveryTest, QueueLimitDropsTheOldestMessage) {
  Start({{"down", SmtpTestServer::FreePort()}}, {}, /*maxRetryQueue=*/2);
  for (int i = 0; i < 3; ++i) {
    SendTestAlarm();
    ASSERT_TRUE(WaitForStatuses(i + 1));
  }
  EXPECT_TRUE(host().Log().Contains("Maximum failed message queue limit of 2 is exceeded."));
  EXPECT_TRUE(host().Log().Contains("Message for profile Front door will be discarded"));
  EXPECT_EQ(DataFiles().size(), 2u);
}

TEST_F(EmailDeliveryTest, LowDiskSpacePurgesAndDiscards) {
  ProfileSetting big;
  big.body = std::string(6000, 'x');  // large enough to be worth purging
  Start({{"down", SmtpTestServer::FreePort()}}, big);
  SendTestAlarm();
  ASSERT_TRUE(WaitForStatuses(1));
  EXPECT_EQ(DataFiles().size(), 1u);
  clock().SetFreeBytes(90ull << 20);
  SendTestAlarm();
  ASSERT_TRUE(WaitForStatuses(2));
  EXPECT_TRUE(
      host().Log().Contains("Available bytes 94371840 are less than threshold of "
                            "104857600. Attempting to purge failed notifications"));
  EXPECT_TRUE(host().Log().Contains("Minimum free space threshold exceeded."));
  EXPECT_TRUE(
      host().Log().Contains("Unable to free up space by removing items from notification "
                            "retry queue."));
  EXPECT_TRUE(DataFiles().empty());
}

TEST_F(EmailDeliveryTest, RetryWindowRunsOut) {
  Start({{"down", SmtpTestServer::FreePort()}}, {}, 100, /*maxRetrySeconds=*/90);
  SendTestAlarm();
  ASSERT_TRUE(WaitForStatuses(1));
  ASSERT_TRUE(AdvanceUntilLog(30s, "Retrying failed notification for file"));
  EXPECT_FALSE(host().Log().Contains("Retry timeout reached")) << "still inside the window";
  ASSERT_TRUE(AdvanceUntilLog(30s, "Retry timeout reached for notification file"));
  EXPECT_TRUE(WaitForNoDataFiles());
}

TEST_F(EmailDeliveryTest, ConfigurationChangeClearsTheQueue) {
  Start({{"down", SmtpTestServer::FreePort()}});
  SendTestAlarm();
  ASSERT_TRUE(WaitForStatuses(1));
  ASSERT_EQ(DataFiles().size(), 1u);
  std::string update = ConfigurationText({{"other", SmtpTestServer::FreePort()}}, {}, 100, 172800);
  update.replace(update.find("Delta=\"0\""), 9, "Delta=\"1\"");
  host().SendConfigurationUpdate(update);
  ASSERT_TRUE(
      WaitForLog("Clearing retry notifications queue. 1 failed notifications will be "
                 "discarded"));
  EXPECT_TRUE(WaitForNoDataFiles()) << "the files go after that line";
}

}  // namespace
