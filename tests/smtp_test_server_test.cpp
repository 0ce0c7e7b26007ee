// The SMTP test server and the real curl agree: the other end-to-end tests
// rely on both, so a broken tool shows up here first and plainly.
#include <gtest/gtest.h>

#include <cstdlib>
#include <string>

#include "tests/support/smtp_server.h"
#include "tests/support/temp_dir.h"

namespace {

using testsupport::SmtpTestServer;

int Curl(const std::string& url, const std::string& file, const std::string& extra) {
  std::string command =
      "curl -sS --mail-from sender@example.com --mail-rcpt a@example.com "
      "--mail-rcpt b@example.com --insecure --connect-timeout 10 " +
      extra + " -T '" + file + "' '" + url + "' 2>/dev/null";
  int status = system(command.c_str());
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

TEST(SmtpTestServerTest, ReceivesExactBytesInEveryMode) {
  testsupport::TempDir dir;
  std::string message = "Subject: hi\r\n\r\nline one\nbase64 line\nlast\r\n";
  ASSERT_TRUE(testsupport::WriteFile(dir.File("mail"), message));
  struct Case {
    SmtpTestServer::Mode mode;
    const char* scheme;
    const char* extra;
  };
  const Case cases[] = {
      {SmtpTestServer::Mode::kPlain, "smtp", ""},
      {SmtpTestServer::Mode::kStartTls, "smtp", "--ssl-reqd"},
      {SmtpTestServer::Mode::kSmtps, "smtps", ""},
  };
  for (const Case& c : cases) {
    SmtpTestServer server(SmtpTestServer::Options{c.mode, "", "", 0});
    std::string url = std::string(c.scheme) + "://127.0.0.1:" + std::to_string(server.port());
    EXPECT_EQ(Curl(url, dir.File("mail"), c.extra), 0) << url;
    ASSERT_TRUE(server.WaitForMessages(1));
    auto mails = server.Messages();
    EXPECT_EQ(mails[0].data, message);
    EXPECT_EQ(mails[0].mailFrom, "sender@example.com");
    EXPECT_EQ(mails[0].rcptTos, (std::vector<std::string>{"a@example.com", "b@example.com"}));
    EXPECT_EQ(mails[0].tls, c.mode != SmtpTestServer::Mode::kPlain);
  }
}

TEST(SmtpTestServerTest, RefusedLoginIsCurlExitCode67) {
  testsupport::TempDir dir;
  ASSERT_TRUE(testsupport::WriteFile(dir.File("mail"), "Subject: x\r\n\r\nbody"));
  SmtpTestServer server(SmtpTestServer::Options{SmtpTestServer::Mode::kPlain, "user", "secret", 0});
  std::string url = "smtp://127.0.0.1:" + std::to_string(server.port());
  EXPECT_EQ(Curl(url, dir.File("mail"), "--user user:wrong"), 67);
  EXPECT_EQ(Curl(url, dir.File("mail"), "--user user:secret"), 0);
  ASSERT_TRUE(server.WaitForMessages(1));
  EXPECT_EQ(server.Messages()[0].login, "user");
}

TEST(SmtpTestServerTest, StopsAndStartsOnTheSamePortKeepingEarlierMessages) {
  testsupport::TempDir dir;
  ASSERT_TRUE(testsupport::WriteFile(dir.File("before"), "Subject: before\r\n\r\nbody\r\n"));
  ASSERT_TRUE(testsupport::WriteFile(dir.File("after"), "Subject: after\r\n\r\nbody\r\n"));
  SmtpTestServer server;
  int port = server.port();
  std::string url = "smtp://127.0.0.1:" + std::to_string(port);
  EXPECT_EQ(Curl(url, dir.File("before"), ""), 0);
  ASSERT_TRUE(server.WaitForMessages(1));
  server.Stop();
  EXPECT_EQ(Curl(url, dir.File("after"), ""), 7);  // connection refused
  server.Start();
  EXPECT_EQ(server.port(), port);
  EXPECT_EQ(Curl(url, dir.File("after"), ""), 0);
  ASSERT_TRUE(server.WaitForMessages(2));
  const auto mails = server.Messages();
  ASSERT_EQ(mails.size(), 2u);
  EXPECT_EQ(mails[0].data, "Subject: before\r\n\r\nbody\r\n");
  EXPECT_EQ(mails[1].data, "Subject: after\r\n\r\nbody\r\n");
}

}  // namespace
