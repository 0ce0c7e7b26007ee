#include "alertmod/weblink/http_get_client.h"

#include <algorithm>
#include <atomic>
#include <boost/asio/write.hpp>
#include <boost/system/system_error.hpp>
#include <cstddef>
#include <utility>

namespace hx {
namespace {

using boost::asio::ip::tcp;
using boost::system::error_code;
using boost::system::system_error;
using Deadline = std::chrono::steady_clock::time_point;

constexpr size_t kReadChunkBytes = 16384;

// Runs `io` until the operation begun by `start` completes or `deadline`
// passes. The client's synchronous contract is kept with asynchronous
// operations because only they can be abandoned: on expiry the socket is
// closed, the operation ends as aborted, and the result is timed_out.
template <typename Start>
error_code AwaitOperation(boost::asio::io_context& io, tcp::socket& socket, Deadline deadline,
                          Start start, size_t* transferred = nullptr) {
  bool done = false;
  error_code result;
  start([&done, &result, transferred](const error_code& ec, size_t bytes) {
    done = true;
    result = ec;
    if (transferred != nullptr) *transferred = bytes;
  });
  io.restart();
  io.run_until(deadline);
  if (done) return result;
  error_code ignored;
  socket.close(ignored);
  io.restart();
  io.run();
  return boost::asio::error::timed_out;
}

// The reply as it arrives on the connected socket, within the deadline.
class SocketReplyStream final : public IReplyStream {
 public:
  SocketReplyStream(boost::asio::io_context& io, tcp::socket& socket, Deadline deadline)
      : m_io(io), m_socket(socket), m_deadline(deadline) {}

  bool ReadSome(std::string& buffer, const char* operation) override {
    const size_t kept = buffer.size();
    buffer.resize(kept + kReadChunkBytes);
    size_t received = 0;
    error_code error = AwaitOperation(
        m_io, m_socket, m_deadline,
        [&](auto handler) {
          m_socket.async_read_some(boost::asio::buffer(&buffer[kept], kReadChunkBytes), handler);
        },
        &received);
    buffer.resize(kept + received);
    if (error == boost::asio::error::eof) return false;
    if (error) throw system_error(error, operation);
    return true;
  }

 private:
  boost::asio::io_context& m_io;
  tcp::socket& m_socket;
  Deadline m_deadline;
};

// The end of one connection attempt when `untried` addresses (this one
// included) are left: an equal share of the time remaining. An address that
// drops the request then leaves the later ones their turn, while the last
// one gets whatever is left, so that the exchange stays within its bound.
Deadline AttemptDeadline(Deadline exchangeDeadline, std::ptrdiff_t untried) {
  const auto now = std::chrono::steady_clock::now();
  if (untried <= 1 || exchangeDeadline <= now) return exchangeDeadline;
  return now + (exchangeDeadline - now) / untried;
}

// An IPv6 address configured without a port keeps its brackets, which name
// resolution does not accept.
std::string ResolvableHost(const std::string& host) {
  if (host.size() >= 2 && host.front() == '[' && host.back() == ']') {
    return host.substr(1, host.size() - 2);
  }
  return host;
}

}  // namespace

HttpGetClient::HttpGetClient(std::string host, std::string port, std::chrono::milliseconds timeout)
    : m_host(std::move(host)), m_port(std::move(port)), m_timeout(timeout) {}

HttpGetClient::~HttpGetClient() = default;

HttpGetClient::Endpoints HttpGetClient::Resolve() {
  tcp::resolver resolver(m_io);
  error_code error;
  auto results =
      resolver.resolve(ResolvableHost(m_host), m_port, tcp::resolver::address_configured, error);
  if (error) throw system_error(error, "resolve");
  Endpoints endpoints;
  for (const auto& entry : results) endpoints.push_back(entry.endpoint());
  return endpoints;
}

void HttpGetClient::Connect(tcp::socket& socket, const Endpoints& endpoints, Deadline deadline) {
  error_code error = boost::asio::error::host_not_found;
  for (auto it = endpoints.begin(); error && it != endpoints.end(); ++it) {
    if (socket.is_open()) {
      error_code closeError;
      socket.close(closeError);
      if (closeError) throw system_error(closeError, "close");
    }
    error = AwaitOperation(
        m_io, socket, AttemptDeadline(deadline, endpoints.end() - it), [&](auto handler) {
          socket.async_connect(*it, [handler](const error_code& ec) mutable { handler(ec, 0); });
        });
  }
  if (error) throw system_error(error, "Unable to connect to endpoint");
}

void HttpGetClient::SendRequest(tcp::socket& socket, const std::string& path, Deadline deadline) {
  const std::string request = "GET " + path + " HTTP/1.0\r\n" + "Host: " + m_host + "\r\n" +
                              "Accept: */*\r\n" + "Connection: close\r\n" + "\r\n";
  error_code error = AwaitOperation(m_io, socket, deadline, [&](auto handler) {
    boost::asio::async_write(socket, boost::asio::buffer(request), handler);
  });
  if (error) throw system_error(error, "write");
}

void HttpGetClient::Get(const std::string& path, HttpResponse& response) {
  Endpoints endpoints = Resolve();
  // The bound starts after name resolution, which cannot be abandoned and
  // has the system resolver's own limits.
  const Deadline deadline = std::chrono::steady_clock::now() + m_timeout;
  tcp::socket socket(m_io);
  Connect(socket, endpoints, deadline);
  SendRequest(socket, path, deadline);
  SocketReplyStream stream(m_io, socket, deadline);
  ReadHttpReply(stream, response);
}

}  // namespace hx
