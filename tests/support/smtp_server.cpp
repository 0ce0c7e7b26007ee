#include "tests/support/smtp_server.h"

#include <arpa/inet.h>
#include <dirent.h>
#include <netinet/in.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <sstream>
#include <thread>

namespace testsupport {
namespace {

constexpr char kPython[] = "/usr/bin/python3";
constexpr char kPostfix[] = "/usr/sbin/postfix";
constexpr char kPostfixRelayScript[] = ALERTMOD_TEST_SUPPORT_DIR "/postfix_relay.sh";

// Starts `argv` with its standard output on a pipe; the child dies with us.
pid_t Spawn(const std::vector<std::string>& args, int* stdoutFd) {
  int fds[2];
  if (pipe(fds) != 0) return -1;
  std::vector<char*> argv;
  for (const std::string& a : args) argv.push_back(const_cast<char*>(a.c_str()));
  argv.push_back(nullptr);
  pid_t pid = fork();
  if (pid == 0) {
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    dup2(fds[1], STDOUT_FILENO);
    close(fds[0]);
    close(fds[1]);
    execv(argv[0], argv.data());
    _exit(127);
  }
  close(fds[1]);
  *stdoutFd = fds[0];
  return pid;
}

// Reads "PORT <n>" from the child's output; 0 when it does not come.
int ReadPort(int fd) {
  std::string text;
  auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
  while (text.find('\n') == std::string::npos && std::chrono::steady_clock::now() < deadline) {
    pollfd p{fd, POLLIN, 0};
    if (poll(&p, 1, 100) <= 0) continue;
    char buffer[256];
    ssize_t n = read(fd, buffer, sizeof(buffer));
    if (n <= 0) break;
    text.append(buffer, static_cast<size_t>(n));
  }
  int port = 0;
  return sscanf(text.c_str(), "PORT %d", &port) == 1 ? port : 0;
}

ReceivedMail ReadMail(const std::string& base) {
  ReceivedMail mail;
  mail.data = ReadFile(base + ".eml");
  std::istringstream env(ReadFile(base + ".env"));
  std::string line;
  while (std::getline(env, line)) {
    std::string key = line.substr(0, line.find(' '));
    std::string value = line.size() > key.size() ? line.substr(key.size() + 1) : "";
    if (key == "from") mail.mailFrom = value;
    if (key == "rcpt") mail.rcptTos.push_back(value);
    if (key == "login") mail.login = value;
    if (key == "tls") mail.tls = value == "1";
  }
  return mail;
}

}  // namespace

SmtpTestServer::SmtpTestServer(Options options) : m_options(std::move(options)) {
  if (m_options.mode != Mode::kPlain) {
    EXPECT_TRUE(MakeSelfSignedCertificate(m_dir.path(), &m_cert, &m_key))
        << "the openssl command is needed to make a test certificate";
  }
  m_port = m_options.port;
  Start();
}

SmtpTestServer::~SmtpTestServer() {
  Stop();
}

void SmtpTestServer::Start() {
  if (m_pid > 0) return;
  ASSERT_EQ(access(kPython, X_OK), 0) << kPython << " is needed for the SMTP test server";
  std::vector<std::string> args = {kPython,  ALERTMOD_TEST_SUPPORT_DIR "/smtp_server.py",
                                   "--dir",  m_dir.path(),
                                   "--port", std::to_string(m_port)};
  const char* modes[] = {"plain", "starttls", "smtps"};
  args.insert(args.end(), {"--mode", modes[static_cast<int>(m_options.mode)]});
  if (!m_cert.empty()) args.insert(args.end(), {"--cert", m_cert, "--key", m_key});
  if (!m_options.user.empty()) {
    args.insert(args.end(), {"--user", m_options.user, "--password", m_options.password});
  }
  int out = -1;
  m_pid = Spawn(args, &out);
  ASSERT_GT(m_pid, 0) << "cannot start the SMTP test server";
  int port = ReadPort(out);
  close(out);
  ASSERT_GT(port, 0) << "the SMTP test server did not start (is python3-aiosmtpd installed?)";
  m_port = port;
}

void SmtpTestServer::Stop() {
  if (m_pid <= 0) return;
  kill(m_pid, SIGKILL);
  int status = 0;
  waitpid(m_pid, &status, 0);
  m_pid = -1;
}

std::vector<ReceivedMail> SmtpTestServer::Messages() const {
  std::vector<ReceivedMail> mails;
  for (int n = 1;; ++n) {
    std::string base = m_dir.path() + "/" + std::to_string(n);
    if (!FileExists(base + ".eml")) break;
    mails.push_back(ReadMail(base));
  }
  return mails;
}

bool SmtpTestServer::WaitForMessages(size_t count, std::chrono::milliseconds timeout) const {
  auto deadline = std::chrono::steady_clock::now() + timeout;
  for (;;) {
    if (FileExists(m_dir.path() + "/" + std::to_string(count) + ".eml")) return true;
    if (std::chrono::steady_clock::now() >= deadline) return false;
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
  }
}

int SmtpTestServer::FreePort() {
  int fd = socket(AF_INET, SOCK_STREAM, 0);
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t length = sizeof(address);
  int port = 0;
  if (bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0 &&
      getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length) == 0) {
    port = ntohs(address.sin_port);
  }
  close(fd);
  return port;
}

PostfixRelay::PostfixRelay(int relayPort) : m_port(SmtpTestServer::FreePort()) {
  EXPECT_EQ(access(kPostfix, X_OK), 0) << kPostfix << " is needed (Debian package postfix)";
  std::string command = std::string(kPostfixRelayScript) + " start '" + m_dir.path() + "' " +
                        std::to_string(m_port) + " " + std::to_string(relayPort);
  EXPECT_EQ(system(command.c_str()), 0) << "Postfix did not start: " << command;
}

PostfixRelay::~PostfixRelay() {
  // Fails harmlessly when Postfix never started, which the constructor reported.
  system((std::string(kPostfixRelayScript) + " stop '" + m_dir.path() + "'").c_str());
}

bool MakeSelfSignedCertificate(const std::string& dir, std::string* cert, std::string* key) {
  *cert = dir + "/cert.pem";
  *key = dir + "/key.pem";
  std::string command =
      "openssl req -x509 -newkey rsa:2048 -nodes -days 2 -subj /CN=127.0.0.1"
      " -keyout '" +
      *key + "' -out '" + *cert + "' >/dev/null 2>&1";
  return system(command.c_str()) == 0;
}

}  // namespace testsupport
