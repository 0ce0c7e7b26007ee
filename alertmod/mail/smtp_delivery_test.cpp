#include "alertmod/mail/smtp_delivery.h"

#include <gtest/gtest.h>

#include "alertmod/diag/log.h"
#include "alertmod/mail/delivery_test_util.h"

namespace hx {
namespace {

using Args = std::vector<std::string>;

MailFile Mail() {
  MailFile mail;
  mail.sender = "s@example.com";
  mail.recipients = {"a@example.com", "b@example.com"};
  mail.path = "./data/notify-mail-3-100-250-0";
  mail.profileDescription = "Lobby";
  return mail;
}

SmtpServer Server(const std::string& address, int32_t port, int32_t useSsl) {
  SmtpServer server;
  server.description = "srv-" + address;
  server.address = address;
  server.port = port;
  server.useSsl = useSsl;
  return server;
}

TEST(TransferArgumentsTest, ExactCommandLines) {
  const Args head = {"./curl",        "--mail-from", "s@example.com", "--mail-rcpt",
                     "a@example.com", "--mail-rcpt", "b@example.com"};
  const Args tail = {"--insecure",
                     "--connect-timeout",
                     "60",
                     "--config",
                     "-",
                     "-T",
                     "./data/notify-mail-3-100-250-0"};
  struct Case {
    SmtpServer server;
    bool sslRequired;
    std::string url;
  };
  const Case cases[] = {
      {Server("mail.example.com", 587, 2), true, "smtp://mail.example.com:587"},
      {Server("mail.example.com", 465, 1), false, "smtps://mail.example.com:465"},
      {Server("10.0.0.1", 25, 0), false, "smtp://10.0.0.1:25"},
      {Server("[fe80::1]", 25, 7), false, "smtp://%5bfe80%3a%3a1%5d:25"},
      {Server("a b~_-.", 2525, 0), false, "smtp://a%20b~_-.:2525"},
  };
  for (const Case& c : cases) {
    Args expected = head;
    if (c.sslRequired) expected.push_back("--ssl-reqd");
    expected.insert(expected.end(), tail.begin(), tail.end());
    expected.push_back(c.url);
    Args actual;
    BuildTransferArguments(Mail(), c.server, actual);
    EXPECT_EQ(actual, expected) << c.url;
  }
}

TEST(TransferArgumentsTest, AccountGoesThroughStandardInputQuoted) {
  struct Case {
    std::string user;
    std::string password;
    std::string input;
  };
  const Case cases[] = {
      {"", "ignored", ""},
      {"bob", "", "user = \"bob:\""},
      {"bo\"b", "p\\w", "user = \"bo\\\"b:p\\\\w\""},
      // A line break must not end the quoted value and start a new option.
      {"bob", "pw\nurl = file:///etc/passwd", "user = \"bob:pw\\nurl = file:///etc/passwd\""},
      {"bob", "a\rb\tc", "user = \"bob:a\\rb\\tc\""},
  };
  for (const Case& c : cases) {
    SmtpServer server = Server("h", 25, 0);
    server.username = c.user;
    server.password = c.password;
    EXPECT_EQ(TransferInput(server), c.input);
    Args args;
    BuildTransferArguments(Mail(), server, args);
    for (const std::string& a : args) {
      if (!c.password.empty()) {
        EXPECT_EQ(a.find(c.password), std::string::npos);
      }
    }
  }
}

TEST(DeliverMailFileTest, ExitCodesDecideTheResult) {
  struct Case {
    std::deque<int32_t> exitCodes;
    size_t servers;
    DeliveryResult result;
    size_t attempts;
    bool notRetriedLine;
  };
  const Case cases[] = {
      {{0}, 2, kDeliverySent, 1, false},
      {{7, 0}, 2, kDeliverySent, 2, false},
      {{67, 26}, 2, kDeliveryDropped, 2, true},
      {{28}, 1, kDeliveryRetryable, 1, false},
      {{67, 28}, 2, kDeliveryRetryable, 2, false},
      {{kNotStarted}, 1, kDeliveryDropped, 1, true},
      {{kNotStarted, 7}, 2, kDeliveryRetryable, 2, false},
      {{}, 0, kDeliveryDropped, 0, true},
  };
  for (const Case& c : cases) {
    testsupport::FakeHost host;
    ScriptedHelper helper(host);
    helper.exitCodes = c.exitCodes;
    std::vector<SmtpServer> servers;
    for (size_t i = 0; i < c.servers; ++i)
      servers.push_back(Server("h" + std::to_string(i), 25, 0));
    EXPECT_EQ(DeliverMailFile(Mail(), servers, helper), c.result);
    EXPECT_EQ(helper.runs.size(), c.attempts);
    bool notRetried = false;
    for (const std::string& line : host.LogTexts(LogLevelError)) {
      notRetried |= line ==
                    "Failed to send notification using profile Lobby.  This message will NOT be "
                    "retried due to failure return codes 67 or 26 or due to failures to prepare "
                    "or initiate email operation";
    }
    EXPECT_EQ(notRetried, c.notRetriedLine);
  }
}

TEST(DeliverMailFileTest, LogsEveryAttemptAndTheToolsErrorOutput) {
  testsupport::FakeHost host;
  ScriptedHelper helper(host);
  helper.exitCodes = {kNotStarted, 7, 0};
  helper.output = {"curl: (7) Failed to connect"};
  std::vector<SmtpServer> servers = {Server("a", 25, 0), Server("b", 25, 0), Server("c", 25, 0)};
  ASSERT_EQ(DeliverMailFile(Mail(), servers, helper), kDeliverySent);
  EXPECT_EQ(
      host.LogTexts(LogLevelError),
      std::vector<std::string>{"Failed to execute curl smtp operation using server srv-a. (Profile "
                               "Description: Lobby)"});
  EXPECT_EQ(host.LogTexts(LogLevelWarning),
            std::vector<std::string>{"Profile Description: Lobby. Notification attempt return "
                                     "code= 7"});
  EXPECT_EQ(host.LogTexts(LogLevelInfo),
            (std::vector<std::string>{"curl: (7) Failed to connect",
                                      "Profile Description: Lobby. Notification attempt return "
                                      "code= 0"}));
}

}  // namespace
}  // namespace hx
