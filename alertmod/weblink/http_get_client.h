// HttpGetClient: the small blocking HTTP/1.0 client that asks the recording
// system's web front end one question per message.
//
// A client lives for one use on one thread (the manager's worker). Get blocks
// that thread for one exchange: name resolution, connection, request and a
// reply read until the server closes the connection. Connection, request and
// reply together are bounded by the client's time-out, so a server that
// accepts and never answers cannot hold the worker; name resolution is
// bounded by the system resolver's own time-outs.
#ifndef ALERTMOD_WEBLINK_HTTP_GET_CLIENT_H_
#define ALERTMOD_WEBLINK_HTTP_GET_CLIENT_H_

#include <boost/asio/io_context.hpp>
#include <boost/asio/ip/tcp.hpp>
#include <chrono>
#include <string>
#include <vector>

#include "alertmod/weblink/http_reply.h"

namespace hx {

class HttpGetClient {
 public:
  using Endpoints = std::vector<boost::asio::ip::tcp::endpoint>;

  // `host` is a name or address (an IPv6 address may keep its brackets);
  // `port` is a service name or digits. `timeout` bounds each Get.
  HttpGetClient(std::string host, std::string port, std::chrono::milliseconds timeout);
  virtual ~HttpGetClient();
  HttpGetClient(const HttpGetClient&) = delete;
  HttpGetClient& operator=(const HttpGetClient&) = delete;

  // Sends "GET `path` HTTP/1.0" (path starts with "/", may carry a query) and
  // fills `response` with a reply of status 200. The resolved addresses are
  // tried in order until one takes the connection, each attempt within an
  // equal share of the time-out left, so that an address that drops the
  // request still leaves the later ones their turn.
  //
  // Throws boost::system::system_error when the server cannot be reached or
  // the transfer fails, its text naming the step: "resolve", "close",
  // "Unable to connect to endpoint", "write", "read_until" or "read"; a step
  // cut short by the time-out carries boost::asio::error::timed_out. Throws
  // std::runtime_error for an unusable reply (see ReadHttpReply).
  void Get(const std::string& path, HttpResponse& response);

 protected:
  // The addresses to try, in order. Resolves host and port for stream
  // sockets over TCP, limited to the address families configured on this
  // machine. Throws boost::system::system_error "resolve" on failure. Tests
  // override it to control the list of addresses.
  virtual Endpoints Resolve();

 private:
  using Deadline = std::chrono::steady_clock::time_point;

  void Connect(boost::asio::ip::tcp::socket& socket, const Endpoints& endpoints, Deadline deadline);
  void SendRequest(boost::asio::ip::tcp::socket& socket, const std::string& path,
                   Deadline deadline);

  std::string m_host;
  std::string m_port;
  std::chrono::milliseconds m_timeout;
  boost::asio::io_context m_io;
};

}  // namespace hx

#endif  // ALERTMOD_WEBLINK_HTTP_GET_CLIENT_H_
