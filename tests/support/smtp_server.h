// A real SMTP server for tests: Debian's aiosmtpd, started as a child process
// on 127.0.0.1 with a free port. Plain, STARTTLS-required or SMTPS, with or
// without AUTH. Each message it accepts is kept as the exact bytes received
// and its envelope. Fails the test loudly when /usr/bin/python3 or aiosmtpd is
// missing. Use from the test's thread.
#ifndef ALERTMOD_TESTS_SUPPORT_SMTP_SERVER_H_
#define ALERTMOD_TESTS_SUPPORT_SMTP_SERVER_H_

#include <sys/types.h>

#include <chrono>
#include <string>
#include <vector>

#include "tests/support/temp_dir.h"

namespace testsupport {

struct ReceivedMail {
  std::string data;  // the message bytes as received
  std::string mailFrom;
  std::vector<std::string> rcptTos;
  std::string login;  // the AUTH user, empty without AUTH
  bool tls = false;
};

class SmtpTestServer {
 public:
  enum class Mode { kPlain, kStartTls, kSmtps };
  struct Options {
    Mode mode = Mode::kPlain;
    std::string user;  // AUTH is required when not empty
    std::string password;
    int port = 0;  // 0: a free port
  };

  explicit SmtpTestServer(Options options);
  SmtpTestServer() : SmtpTestServer(Options{}) {}
  ~SmtpTestServer();
  SmtpTestServer(const SmtpTestServer&) = delete;
  SmtpTestServer& operator=(const SmtpTestServer&) = delete;

  // The port it listens on; stays the same across Stop() and Start().
  int port() const { return m_port; }
  bool running() const { return m_pid > 0; }

  // Ends the server process; connections are refused afterwards.
  void Stop();
  // Starts it again on the same port, keeping the messages received so far.
  void Start();

  // The messages received so far, in order.
  std::vector<ReceivedMail> Messages() const;
  // Waits until at least `count` messages arrived. Polls the output directory,
  // since the server is another process.
  bool WaitForMessages(size_t count,
                       std::chrono::milliseconds timeout = std::chrono::seconds(30)) const;

  // A TCP port on 127.0.0.1 that nothing listens on at the moment.
  static int FreePort();

 private:
  Options m_options;
  TempDir m_dir;
  std::string m_cert;
  std::string m_key;
  int m_port = 0;
  pid_t m_pid = -1;
};

// A real Postfix hardened against SMTP smuggling (a line not ended by CR LF
// is refused), started as a private instance under a temporary directory on
// a free port of 127.0.0.1, relaying every message it accepts to
// 127.0.0.1:`relayPort`. Needs root and Debian's postfix; fails the test
// loudly without them. Stopped when destroyed, also after a failure.
class PostfixRelay {
 public:
  explicit PostfixRelay(int relayPort);
  ~PostfixRelay();
  PostfixRelay(const PostfixRelay&) = delete;
  PostfixRelay& operator=(const PostfixRelay&) = delete;

  int port() const { return m_port; }

 private:
  TempDir m_dir;
  int m_port = 0;
};

// Makes a self-signed certificate for 127.0.0.1 with the openssl command in
// `dir`. False when openssl fails.
bool MakeSelfSignedCertificate(const std::string& dir, std::string* cert, std::string* key);

}  // namespace testsupport

#endif  // ALERTMOD_TESTS_SUPPORT_SMTP_SERVER_H_
