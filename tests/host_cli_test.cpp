// The alertmod-host program as a user runs it: its command line, validation
// of configuration files, test notifications, and scenarios played against a
// real SMTP server and real video feeds, judged by their summaries.
#include <gtest/gtest.h>

#include <sys/wait.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "tests/support/host_fixture.h"
#include "tests/support/smtp_server.h"
#include "tests/support/temp_dir.h"

namespace {

using testsupport::SmtpTestServer;
using testsupport::TempDir;

struct Outcome {
  int status = -1;
  std::string out;  // standard output
  std::string err;  // standard error
  std::string all() const { return "stdout:\n" + out + "\nstderr:\n" + err; }
};

std::string Quoted(const std::string& word) {
  std::string quoted = "'";
  for (char c : word) quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return quoted + "'";
}

// Runs alertmod-host with `words` in `dir`, with the module built beside it.
Outcome RunHost(const TempDir& dir, const std::vector<std::string>& words) {
  std::string command = "cd " + Quoted(dir.path()) + " && " + Quoted(ALERTMOD_HOST_PROGRAM) +
                        " --module " + Quoted(testsupport::ProductionModulePath());
  for (const std::string& word : words) command += " " + Quoted(word);
  command += " >" + Quoted(dir.File("host.out")) + " 2>" + Quoted(dir.File("host.err"));
  Outcome outcome;
  const int raw = std::system(command.c_str());
  outcome.status = WIFEXITED(raw) ? WEXITSTATUS(raw) : -1;
  outcome.out = testsupport::ReadFile(dir.File("host.out"));
  outcome.err = testsupport::ReadFile(dir.File("host.err"));
  return outcome;
}

bool Has(const std::string& text, const std::string& fragment) {
  return text.find(fragment) != std::string::npos;
}

std::string GoodConfiguration(int smtpPort) {
  return "<?xml ?><Trellan Delta=\"0\"><Notify ID=\"786432\"><Web address=\"\" /><Servers>"
         "<smtp description=\"local\" address=\"127.0.0.1\" port=\"" +
         std::to_string(smtpPort) +
         "\" UseSSL=\"0\" /></Servers><Profiles autoincrement=\"5\">"
         "<smtp ID=\"4\" attach=\"0\" description=\"Front door\" from=\"desk@example.com\" "
         "subject=\"Door\"><to>guard@example.com</to><body>Hello</body></smtp>"
         "</Profiles></Notify></Trellan>";
}

TEST(HostCliTest, HelpAndUsageErrors) {
  TempDir dir;
  const Outcome help = RunHost(dir, {"--help"});
  EXPECT_EQ(help.status, 0);
  for (const char* command : {"run SCENARIO", "validate FILE", "show-config", "test-profile ID",
                              "serve", "--workdir DIR"}) {
    EXPECT_TRUE(Has(help.out, command)) << command;
  }
  struct Case {
    std::vector<std::string> words;
    const char* error;
  };
  const Case cases[] = {
      {{}, "no command given"},
      {{"frobnicate"}, "unknown command \"frobnicate\""},
      {{"run"}, "run needs a scenario file"},
      {{"validate", "a.xml", "b.xml"}, "unexpected argument \"b.xml\""},
      {{"validate", "a.xml", "--seconds", "3"}, "--seconds is an option of serve, not of validate"},
      {{"validate", "a.xml", "--workdir", "w"}, "--workdir is an option of every command but"},
      {{"serve", "--log-level"}, "--log-level needs a value"},
      {{"serve", "--feed", "camera.mp4"}, "bad value for --feed"},
      {{"serve", "--quiet=yes"}, "--quiet takes no value"},
      {{"serve", "--colour"}, "unknown option --colour"},
      {{"test-profile", "front"}, "needs a profile number, not \"front\""},
      {{"validate", "missing.xml"}, "cannot read missing.xml"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.error);
    const Outcome outcome = RunHost(dir, c.words);
    EXPECT_EQ(outcome.status, 2) << outcome.all();
    EXPECT_TRUE(Has(outcome.err, c.error)) << outcome.all();
  }
}

TEST(HostCliTest, ScenarioFaultsAreListedWithTheirLinesAndNothingRuns) {
  TempDir dir;
  ASSERT_TRUE(testsupport::WriteFile(dir.File("bad.scn"),
                                     "camera Lobby\ncamera Lobby\n\nat 2 alarm start camera=Hall "
                                     "profile=1\n"));
  const Outcome outcome = RunHost(dir, {"run", "bad.scn"});
  EXPECT_EQ(outcome.status, 2) << outcome.all();
  EXPECT_TRUE(Has(outcome.err, "bad.scn:2: \"Lobby\" is defined twice")) << outcome.all();
  EXPECT_TRUE(Has(outcome.err, "bad.scn:4: unknown camera \"Hall\"")) << outcome.all();
  EXPECT_FALSE(Has(outcome.out, "Summary")) << outcome.all();
}

TEST(HostCliTest, ValidateReportsWhatTheModuleMadeOfAFile) {
  TempDir dir;
  struct Case {
    std::string file;
    int status;
    std::vector<std::string> expected;
  };
  std::string dropped = GoodConfiguration(2525);
  dropped.replace(dropped.find("<to>guard@example.com</to>"), 26, "<to></to>");
  const Case cases[] = {
      {GoodConfiguration(2525),
       0,
       {"config.xml: valid", "INFO  Loaded configuration from disk successfully",
        "\"local\" 127.0.0.1:2525, plain, no login", "4 \"Front door\": from desk@example.com"}},
      {dropped,
       1,
       {"config.xml: NOT VALID", "Profiles: 0",
        "Left out by the module:", "profile 4 \"Front door\" was left out"}},
      {"<Trellan><Notify ID=\"5\"/></Trellan>",
       1,
       {"config.xml: NOT VALID", "WARN  Either no configuration or an improper configuration",
        "goes on with its defaults"}},
      {"not xml at all <", 1, {"config.xml: NOT VALID"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.file);
    ASSERT_TRUE(testsupport::WriteFile(dir.File("config.xml"), c.file));
    const Outcome outcome = RunHost(dir, {"validate", "config.xml"});
    EXPECT_EQ(outcome.status, c.status) << outcome.all();
    for (const std::string& line : c.expected)
      EXPECT_TRUE(Has(outcome.out, line)) << line << "\n" << outcome.all();
    EXPECT_EQ(testsupport::ReadFile(dir.File("config.xml")), c.file) << "the file is left alone";
    EXPECT_FALSE(testsupport::FileExists(dir.File("notify.xml")));
  }
}

TEST(HostCliTest, TestProfileDeliversThroughARealSmtpServer) {
  SmtpTestServer smtp;
  TempDir dir;
  ASSERT_TRUE(testsupport::WriteFile(dir.File("notify.xml"), GoodConfiguration(smtp.port())));
  const Outcome unknown = RunHost(dir, {"test-profile", "9"});
  EXPECT_EQ(unknown.status, 1) << unknown.all();
  EXPECT_TRUE(Has(unknown.err, "has no profile 9 (profiles: 4)")) << unknown.all();

  const Outcome outcome = RunHost(dir, {"test-profile", "4", "--timeout", "30"});
  EXPECT_EQ(outcome.status, 0) << outcome.all();
  EXPECT_TRUE(Has(outcome.out, "Profile 4 \"Front door\": test notification delivered"))
      << outcome.all();
  ASSERT_TRUE(smtp.WaitForMessages(1));
  EXPECT_TRUE(Has(smtp.Messages()[0].data, "Testing Profile")) << smtp.Messages()[0].data;

  // With the server gone the summary's result is that of the test, with curl's reason.
  smtp.Stop();
  const Outcome failed = RunHost(dir, {"test-profile", "4", "--timeout", "30"});
  EXPECT_EQ(failed.status, 1) << failed.all();
  for (const char* line :
       {"Problem:         test notification for profile 4 not delivered: curl exit code 7, "
        "\"curl: (7) ",
        "Result:          FAILED", "Profile 4 \"Front door\": test notification FAILED"}) {
    EXPECT_TRUE(Has(failed.out, line)) << line << "\n" << failed.all();
  }
}

TEST(HostCliTest, ScenarioSendsATestNotificationAndSummarisesIt) {
  SmtpTestServer smtp;
  TempDir dir;
  ASSERT_TRUE(testsupport::WriteFile(
      dir.File("test.scn"),
      "system serial=S-1 name=\"Test server\"\n"
      "smtp local address=127.0.0.1 port=${SMTP_PORT}\n"
      "profile 2 \"Desk\" from=desk@example.com to=guard@example.com subject=\"{event type}\" \\\n"
      "    body=\"Hello from {system name}\"\n"
      "at 0.5 test 2\n"
      "at 0.5 wait reports=1 timeout=30\n"));
  const Outcome outcome = RunHost(
      dir, {"run", "test.scn", "--set", "SMTP_PORT=" + std::to_string(smtp.port()), "--quiet"});
  EXPECT_EQ(outcome.status, 0) << outcome.all();
  for (const char* line :
       {"Alarms sent:     0 starts, 0 ends, 1 test", "Status reports:  1 delivered, 0 failed",
        "profile 2 \"Desk\": delivered", "Deliveries:      1 attempt, 1 accepted by a server",
        "Frame buffers:   0 lent, 0 kept by the module, all returned", "Result:          OK"}) {
    EXPECT_TRUE(Has(outcome.out, line)) << line << "\n" << outcome.all();
  }
  EXPECT_TRUE(outcome.err.empty()) << "--quiet: " << outcome.err;
  ASSERT_TRUE(smtp.WaitForMessages(1));
  EXPECT_TRUE(Has(smtp.Messages()[0].data, "Subject: [Test Event Type]"))
      << smtp.Messages()[0].data;
}

TEST(HostCliTest, AnUnmetWaitFailsTheRun) {
  TempDir dir;
  ASSERT_TRUE(
      testsupport::WriteFile(dir.File("wait.scn"), "at 0 wait log=\"never\" timeout=0.5\n"));
  const Outcome outcome = RunHost(dir, {"run", "wait.scn"});
  EXPECT_EQ(outcome.status, 1) << outcome.all();
  EXPECT_TRUE(Has(outcome.out, "Problem:         line 1: no \"never\" within")) << outcome.all();
  EXPECT_TRUE(Has(outcome.out, "Result:          FAILED")) << outcome.all();
  EXPECT_TRUE(Has(outcome.err, "working directory")) << outcome.all();
}

// A short H.264 camera file made by the ffmpeg program: one key frame a
// second at 25 frames a second.
std::string MakeCameraFile(const TempDir& dir) {
  const std::string path = dir.File("camera.mp4");
  const std::string command =
      "ffmpeg -hide_banner -loglevel error -y -f lavfi -i testsrc2=size=320x240:rate=25 "
      "-t 6 -c:v libx264 -preset ultrafast -g 25 -bf 0 -pix_fmt yuv420p " +
      Quoted(path);
  if (std::system(command.c_str()) != 0) return std::string();
  return path;
}

TEST(HostCliTest, ScenarioWithACameraFeedMailsAClipAndReturnsEveryFrameBuffer) {
  SmtpTestServer smtp;
  TempDir dir;
  const std::string camera = MakeCameraFile(dir);
  ASSERT_FALSE(camera.empty()) << "the ffmpeg program is needed";
  ASSERT_TRUE(testsupport::WriteFile(
      dir.File("camera.scn"),
      "camera Lobby feed=camera.mp4\n"
      "event 7 camera=Lobby prealarm=1 notify=1\n"
      "smtp local address=127.0.0.1 port=${SMTP_PORT}\n"
      "profile 1 Lobby from=desk@example.com to=guard@example.com subject=\"{source}\" \\\n"
      "    attach=yes video-seconds=2\n"
      "at 2 alarm start event=7\n"
      "at 2 wait reports=1 timeout=30\n"));
  const Outcome outcome =
      RunHost(dir, {"run", "camera.scn", "--set", "SMTP_PORT=" + std::to_string(smtp.port())});
  EXPECT_EQ(outcome.status, 0) << outcome.all();
  for (const char* line :
       {"Alarms sent:     1 start, 0 ends, 0 tests", "Status reports:  1 delivered, 0 failed",
        "Attachments:     1 clip, 0 stills, 0 failed",
        "Lobby (stream 65792, H.264 320x240):", "all returned", "Result:          OK"}) {
    EXPECT_TRUE(Has(outcome.out, line)) << line << "\n" << outcome.all();
  }
  EXPECT_TRUE(
      Has(outcome.err, "HOST  alarm start, motion on Lobby, event 7 for profile 1 (line 6)"))
      << outcome.all();
  EXPECT_TRUE(Has(outcome.err, "event source (Lobby)")) << outcome.all();
  ASSERT_TRUE(smtp.WaitForMessages(1));
  EXPECT_TRUE(Has(smtp.Messages()[0].data, "Subject: Lobby")) << smtp.Messages()[0].data;
  EXPECT_TRUE(Has(smtp.Messages()[0].data, "video/quicktime")) << "the clip goes with the e-mail";
}

}  // namespace
