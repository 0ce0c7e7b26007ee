#include "alertmod/weblink/http_get_client.h"

#include <gtest/gtest.h>

#include <boost/asio/error.hpp>
#include <boost/system/system_error.hpp>
#include <functional>
#include <stdexcept>

#include "tests/support/web_server.h"

namespace hx {
namespace {

using boost::asio::ip::tcp;
using testsupport::WebServer;

constexpr char kLoginPath[] = "/login.web?output=json";
constexpr std::chrono::milliseconds kShortTimeout{300};

// What Get did: the reply, or the kind and text of its failure.
struct Outcome {
  enum Kind { kOk, kSystemError, kRuntimeError } kind = kOk;
  std::string text;
  boost::system::error_code code;
  HttpResponse response;
};

Outcome Attempt(const std::function<void(HttpResponse&)>& get) {
  Outcome outcome;
  try {
    get(outcome.response);
  } catch (const boost::system::system_error& e) {
    outcome = Outcome{Outcome::kSystemError, e.what(), e.code(), {}};
  } catch (const std::runtime_error& e) {
    outcome = Outcome{Outcome::kRuntimeError, e.what(), {}, {}};
  }
  return outcome;
}

Outcome GetFrom(const std::string& host, uint16_t port,
                std::chrono::milliseconds timeout = std::chrono::seconds(10)) {
  HttpGetClient client(host, std::to_string(port), timeout);
  return Attempt([&](HttpResponse& response) { client.Get(kLoginPath, response); });
}

// A client that tries the given addresses instead of resolving its host.
class FixedAddressClient final : public HttpGetClient {
 public:
  FixedAddressClient(Endpoints endpoints)
      : HttpGetClient("localhost", "80", kShortTimeout), m_endpoints(std::move(endpoints)) {}

 protected:
  Endpoints Resolve() override { return m_endpoints; }

 private:
  Endpoints m_endpoints;
};

// A port on which nothing listens on either loopback address.
uint16_t RefusingPort() {
  WebServer probe;
  return probe.port();
}

TEST(HttpGetClientTest, ReadsRepliesAndRefusesBadOnes) {
  const std::string bigBody(100000, 'x');
  struct Case {
    const char* name;
    std::string reply;
    Outcome::Kind kind;
    std::string text;  // body, or the failure's text
  };
  const Case cases[] = {
      {"ok", WebServer::OkReply("{\"list\":[]}"), Outcome::kOk, "{\"list\":[]}"},
      {"no length", "HTTP/1.0 200 OK\r\nServer: t\r\n\r\n" + bigBody, Outcome::kOk, bigBody},
      {"no header lines", "HTTP/1.0 200 OK\r\n\r\n{}", Outcome::kOk, "{}"},
      {"short length", "HTTP/1.0 200 OK\r\nContent-Length: 3\r\n\r\n" + bigBody, Outcome::kOk,
       bigBody},
      {"largest length", "HTTP/1.0 200 OK\r\nContent-Length: 4294967295\r\n\r\nab", Outcome::kOk,
       "ab"},
      {"redirect", "HTTP/1.0 302 Found\r\nLocation: /x\r\n\r\nbody", Outcome::kRuntimeError,
       "Invalid response status code: 302. Expecting 200"},
      {"not http", "<html>hello</html>\r\n\r\n", Outcome::kRuntimeError, "Invalid Get response"},
      {"bad version", "HTTX/1.0 200 OK\r\n\r\n", Outcome::kRuntimeError, "Invalid Get response"},
      {"no code", "HTTP/1.0 OK\r\n\r\n", Outcome::kRuntimeError, "Invalid Get response"},
      {"overflowing length", "HTTP/1.0 200 OK\r\nContent-Length: 4294967296\r\n\r\nab",
       Outcome::kRuntimeError, "Invalid Content-Length Value: 4294967296\r"},
      {"headers cut off", "HTTP/1.0 200 OK\r\nServer: t\r\n", Outcome::kSystemError,
       "read_until: End of file"},
      {"nothing", "", Outcome::kSystemError, "read_until: End of file"},
  };
  WebServer server;
  for (const Case& c : cases) {
    server.SetReply(c.reply);
    Outcome outcome = GetFrom("127.0.0.1", server.port());
    EXPECT_EQ(outcome.kind, c.kind) << c.name << ": " << outcome.text;
    EXPECT_EQ(outcome.kind == Outcome::kOk ? outcome.response.body : outcome.text, c.text)
        << c.name;
  }
}

TEST(HttpGetClientTest, KeepsStatusLineAndHeaderLines) {
  WebServer server;
  server.SetReply("HTTP/1.1 200 Fine\r\nA: 1\r\nContent-Length: 2\r\n\r\nhi");
  Outcome outcome = GetFrom("127.0.0.1", server.port());
  ASSERT_EQ(outcome.kind, Outcome::kOk) << outcome.text;
  EXPECT_EQ(outcome.response.version, "HTTP/1.1");
  EXPECT_EQ(outcome.response.statusCode, 200u);
  EXPECT_EQ(outcome.response.statusMessage, " Fine\r");
  EXPECT_EQ(outcome.response.headers, (std::vector<std::string>{"A: 1\r", "Content-Length: 2\r"}));
}

TEST(HttpGetClientTest, SendsExactlyTheRequest) {
  WebServer server;
  server.SetLoginJson("{}");
  ASSERT_EQ(GetFrom("127.0.0.1", server.port()).kind, Outcome::kOk);
  ASSERT_EQ(server.Requests().size(), 1u);
  EXPECT_EQ(server.Requests()[0],
            "GET /login.web?output=json HTTP/1.0\r\nHost: 127.0.0.1\r\nAccept: */*\r\n"
            "Connection: close\r\n\r\n");
}

TEST(HttpGetClientTest, ReachesBracketedIpv6Address) {
  WebServer server("::1");
  server.SetLoginJson("{}");
  Outcome outcome = GetFrom("[::1]", server.port());
  ASSERT_EQ(outcome.kind, Outcome::kOk) << outcome.text;
  EXPECT_NE(server.Requests().at(0).find("\r\nHost: [::1]\r\n"), std::string::npos);
}

TEST(HttpGetClientTest, UnknownNameFailsToResolve) {
  Outcome outcome = GetFrom("no-such-host.invalid", 80);
  EXPECT_EQ(outcome.kind, Outcome::kSystemError);
  EXPECT_EQ(outcome.text.rfind("resolve: ", 0), 0u) << outcome.text;
}

// A listener that never accepts, its queue already full, drops a connection
// request: the attempt runs into the time-out.
TEST(HttpGetClientTest, TriesEachAddressInTurn) {
  WebServer server("127.0.0.1");
  server.SetLoginJson("{}");
  const auto loopback6 = boost::asio::ip::make_address("::1");
  const auto loopback4 = boost::asio::ip::make_address("127.0.0.1");
  boost::asio::io_context io;
  tcp::acceptor full(io, tcp::endpoint(loopback4, 0), false);
  full.listen(0);
  std::vector<tcp::socket> queued;
  // The requests go out when the operations start; `io` never runs them on.
  for (int i = 0; i < 4; ++i) {
    queued.emplace_back(io);
    queued.back().async_connect(full.local_endpoint(), [](const boost::system::error_code&) {});
  }
  struct Case {
    const char* name;
    HttpGetClient::Endpoints endpoints;
    boost::system::error_code code;  // success when clear
  };
  const Case cases[] = {
      {"first refuses", {{loopback6, server.port()}, {loopback4, server.port()}}, {}},
      {"first drops", {full.local_endpoint(), {loopback4, server.port()}}, {}},
      {"all refuse",
       {{loopback6, server.port()}, {loopback4, RefusingPort()}},
       boost::asio::error::connection_refused},
      {"only one, dropping", {full.local_endpoint()}, boost::asio::error::timed_out},
      {"none", {}, boost::asio::error::host_not_found},
  };
  for (const Case& c : cases) {
    FixedAddressClient client(c.endpoints);
    Outcome outcome = Attempt([&](HttpResponse& response) { client.Get(kLoginPath, response); });
    EXPECT_EQ(outcome.code, c.code) << c.name << ": " << outcome.text;
    if (c.code) {
      EXPECT_EQ(outcome.text.rfind("Unable to connect to endpoint: ", 0), 0u) << outcome.text;
    }
  }
}

// Whatever families "localhost" has here, a server on any one of them is
// found, the others refusing.
TEST(HttpGetClientTest, ReachesLocalhostOnEachFamily) {
  boost::asio::io_context io;
  tcp::resolver resolver(io);
  auto results = resolver.resolve("localhost", "0", tcp::resolver::address_configured);
  ASSERT_FALSE(results.empty());
  for (const auto& entry : results) {
    WebServer server(entry.endpoint().address().to_string());
    server.SetLoginJson("{}");
    Outcome outcome = GetFrom("localhost", server.port());
    EXPECT_EQ(outcome.kind, Outcome::kOk) << server.address() << ": " << outcome.text;
  }
}

TEST(HttpGetClientTest, SilentServerTimesOut) {
  struct Case {
    const char* name;
    std::string sent;  // what the server sends before it falls silent
    const char* text;
  };
  const Case cases[] = {
      {"nothing", "", "read_until: Connection timed out"},
      {"half a status line", "HTTP/1.0 2", "read_until: Connection timed out"},
      {"headers", "HTTP/1.0 200 OK\r\n\r\n{\"li", "read: Connection timed out"},
  };
  WebServer server;
  for (const Case& c : cases) {
    server.SetReplyAndHold(c.sent);
    auto start = std::chrono::steady_clock::now();
    Outcome outcome = GetFrom("127.0.0.1", server.port(), kShortTimeout);
    auto elapsed = std::chrono::steady_clock::now() - start;
    EXPECT_EQ(outcome.code, boost::asio::error::timed_out) << c.name << ": " << outcome.text;
    EXPECT_EQ(outcome.text, c.text) << c.name;
    EXPECT_GE(elapsed, kShortTimeout) << c.name;
    EXPECT_LT(elapsed, kShortTimeout * 10) << c.name;
  }
}

}  // namespace
}  // namespace hx
