// The records of the notification configuration: SMTP servers, profiles and
// the web server address. Plain values, copied into every work item so that
// the worker never reads the live configuration.
#ifndef ALERTMOD_CONFIG_NOTIFY_TYPES_H_
#define ALERTMOD_CONFIG_NOTIFY_TYPES_H_

#include <cstdint>
#include <string>
#include <vector>

namespace hx {

// Default message size limit of a profile: 10 MiB.
constexpr int64_t kDefaultSizeLimitBytes = 10485760;

struct SmtpServer {
  std::string description;
  std::string address;
  int32_t port = 25;
  int32_t useSsl = 0;  // 0 plain, 1 SMTPS, 2 STARTTLS required
  std::string username;
  std::string password;  // in clear
  // The stored, protected form of a password that could not be decrypted
  // (another host's key, damaged text). The server is used without a
  // password meanwhile, and the text is written back unchanged so that
  // nothing is lost. Empty normally.
  std::string unreadablePassword;
  // The protected form of the password that notify.xml holds for this
  // server, as read from it or last saved to it. A save during which the
  // host cannot protect the password writes this instead, so that the file
  // does not lose it. Empty when none is known.
  std::string storedPassword;
};

struct NotifyProfile {
  int32_t id = 0;
  bool attach = false;
  std::string description;
  int32_t throttleSeconds = 0;
  int32_t preAlarmSeconds = 0;
  int32_t maxVideoSeconds = 0;
  int64_t sizeLimit = kDefaultSizeLimitBytes;
  std::string from;
  std::string subject;
  std::vector<std::string> to;
  std::vector<std::string> cc;
  std::vector<std::string> bcc;
  std::string body;
  int32_t eventEdge = 0;  // 0 start, 1 end, 2 both
  bool hasPlaceholders = false;
};

struct WebServerAddress {
  std::string host;
  std::string port;
  std::string address;
  bool plainHost = true;
};

}  // namespace hx

#endif  // ALERTMOD_CONFIG_NOTIFY_TYPES_H_
