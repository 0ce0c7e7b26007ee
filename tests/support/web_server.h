// A scripted web server on a loopback address, standing in for the recording
// system's web front end. It answers each connection from a responder (raw
// reply bytes, possibly followed by silence), records every request's bytes,
// and closes the connection after its reply the way an HTTP/1.0 server does.
//
// The server runs on its own thread from construction to destruction. Its
// setters and Requests() may be called from any thread.
#ifndef ALERTMOD_TESTS_SUPPORT_WEB_SERVER_H_
#define ALERTMOD_TESTS_SUPPORT_WEB_SERVER_H_

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace testsupport {

class WebServer {
 public:
  // What a connection gets: `bytes`, then the server's end of the connection
  // closes, unless `hold` keeps it open and quiet until the server goes.
  struct Answer {
    std::string bytes;
    bool hold = false;
  };
  // Given the request's bytes (up to and including the empty line), the
  // answer. Runs on the server's thread.
  using Responder = std::function<Answer(const std::string& request)>;

  // Listens on `address` ("127.0.0.1", "::1", ...) at `port` (0: a free
  // port). Answers 404 until told otherwise. Throws when it cannot listen.
  explicit WebServer(const std::string& address = "127.0.0.1", uint16_t port = 0);
  ~WebServer();
  WebServer(const WebServer&) = delete;
  WebServer& operator=(const WebServer&) = delete;

  const std::string& address() const { return m_address; }
  uint16_t port() const { return m_port; }

  void SetResponder(Responder responder);
  // Every later connection gets exactly `reply`.
  void SetReply(std::string reply);
  // "/login.web?output=json" gets OkReply(json); other paths get 404.
  void SetLoginJson(std::string json);
  // Later connections are read and never answered.
  void SetSilent();
  // Later connections get `bytes` and then nothing more, never an end.
  void SetReplyAndHold(std::string bytes);

  // The bytes of each request received so far, in order of arrival.
  std::vector<std::string> Requests() const;

  // A status 200 reply carrying `body`, with its Content-Length.
  static std::string OkReply(const std::string& body);
  // The path of the request line of `request`; empty when there is none.
  static std::string RequestPath(const std::string& request);

 private:
  class Impl;
  std::unique_ptr<Impl> m_impl;
  std::string m_address;
  uint16_t m_port = 0;
};

}  // namespace testsupport

#endif  // ALERTMOD_TESTS_SUPPORT_WEB_SERVER_H_
