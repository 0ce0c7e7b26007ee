#include "tests/support/web_server.h"

#include <boost/asio.hpp>
#include <list>
#include <mutex>
#include <thread>

namespace testsupport {

using boost::asio::ip::tcp;
using boost::system::error_code;

namespace {

const char kNotFound[] = "HTTP/1.0 404 Not Found\r\nContent-Length: 0\r\n\r\n";

// One accepted connection; it keeps itself alive through its handlers.
class Connection : public std::enable_shared_from_this<Connection> {
 public:
  explicit Connection(tcp::socket socket) : m_socket(std::move(socket)) {}
  tcp::socket& socket() { return m_socket; }
  boost::asio::streambuf& input() { return m_input; }

  // Sends `reply`; unless `hold`, then closes our side and waits for the
  // client to close its own, so that the reply is never cut off by a reset.
  void Answer(std::string reply, bool hold) {
    auto self = shared_from_this();
    m_reply = std::move(reply);
    boost::asio::async_write(m_socket, boost::asio::buffer(m_reply),
                             [self, hold](const error_code& ec, size_t) {
                               if (ec || hold) return;
                               error_code ignored;
                               self->m_socket.shutdown(tcp::socket::shutdown_send, ignored);
                               self->DrainUntilClosed();
                             });
  }

 private:
  void DrainUntilClosed() {
    auto self = shared_from_this();
    m_socket.async_read_some(boost::asio::buffer(m_drain), [self](const error_code& ec, size_t) {
      if (!ec) self->DrainUntilClosed();
    });
  }

  tcp::socket m_socket;
  boost::asio::streambuf m_input;
  std::string m_reply;
  char m_drain[512];
};

}  // namespace

class WebServer::Impl {
 public:
  Impl(const std::string& address, uint16_t port)
      : m_acceptor(m_io, tcp::endpoint(boost::asio::ip::make_address(address), port)) {
    m_responder = [](const std::string&) { return Answer{kNotFound}; };
    Accept();
    m_thread = std::thread([this] { m_io.run(); });
  }

  ~Impl() {
    m_io.stop();
    m_thread.join();
  }

  uint16_t port() const { return m_acceptor.local_endpoint().port(); }

  void SetResponder(Responder responder) {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_responder = std::move(responder);
  }

  std::vector<std::string> Requests() const {
    std::lock_guard<std::mutex> lock(m_mutex);
    return m_requests;
  }

 private:
  void Accept() {
    m_acceptor.async_accept([this](const error_code& ec, tcp::socket socket) {
      if (ec) return;
      ReadRequest(std::make_shared<Connection>(std::move(socket)));
      Accept();
    });
  }

  void ReadRequest(std::shared_ptr<Connection> connection) {
    boost::asio::async_read_until(connection->socket(), connection->input(), "\r\n\r\n",
                                  [this, connection](const error_code& ec, size_t) {
                                    if (ec) return;
                                    auto data = connection->input().data();
                                    std::string request(boost::asio::buffers_begin(data),
                                                        boost::asio::buffers_end(data));
                                    Answer answer = Record(request);
                                    // A held connection is kept here; only the server's thread uses
                                    // the list.
                                    if (answer.hold) m_held.push_back(connection);
                                    connection->Answer(std::move(answer.bytes), answer.hold);
                                  });
  }

  Answer Record(const std::string& request) {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_requests.push_back(request);
    return m_responder(request);
  }

  boost::asio::io_context m_io;
  tcp::acceptor m_acceptor;
  std::list<std::shared_ptr<Connection>> m_held;
  mutable std::mutex m_mutex;
  Responder m_responder;
  std::vector<std::string> m_requests;
  std::thread m_thread;
};

WebServer::WebServer(const std::string& address, uint16_t port)
    : m_impl(std::make_unique<Impl>(address, port)), m_address(address), m_port(m_impl->port()) {}

WebServer::~WebServer() = default;

void WebServer::SetResponder(Responder responder) {
  m_impl->SetResponder(std::move(responder));
}

void WebServer::SetReply(std::string reply) {
  SetResponder([reply](const std::string&) { return Answer{reply}; });
}

void WebServer::SetLoginJson(std::string json) {
  SetResponder([json](const std::string& request) {
    return Answer{RequestPath(request) == "/login.web?output=json" ? OkReply(json)
                                                                   : std::string(kNotFound)};
  });
}

void WebServer::SetSilent() {
  SetResponder([](const std::string&) { return Answer{"", true}; });
}

void WebServer::SetReplyAndHold(std::string bytes) {
  SetResponder([bytes](const std::string&) { return Answer{bytes, true}; });
}

std::vector<std::string> WebServer::Requests() const {
  return m_impl->Requests();
}

std::string WebServer::OkReply(const std::string& body) {
  return "HTTP/1.0 200 OK\r\nContent-Type: application/json\r\nContent-Length: " +
         std::to_string(body.size()) + "\r\n\r\n" + body;
}

std::string WebServer::RequestPath(const std::string& request) {
  size_t start = request.find(' ');
  if (start == std::string::npos) return {};
  size_t end = request.find(' ', start + 1);
  if (end == std::string::npos) return {};
  return request.substr(start + 1, end - start - 1);
}

}  // namespace testsupport
