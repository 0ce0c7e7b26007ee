#include "alertmod/weblink/web_link.h"

#include <gtest/gtest.h>

#include "alertmod/diag/log.h"
#include "alertmod/util/base64.h"
#include "alertmod/weblink/http_get_client.h"
#include "tests/support/fake_host.h"
#include "tests/support/web_server.h"

namespace hx {
namespace {

using testsupport::FakeHost;
using testsupport::WebServer;

constexpr int64_t kEventTime = 1700000000;
constexpr char kSerial[] = "SN-1";
const std::vector<uint32_t> kCameras = {5, 7};
constexpr std::chrono::milliseconds kTimeout{10000};

WebServerAddress AddressOf(const WebServer& server) {
  WebServerAddress web;
  web.host = server.address();
  web.port = std::to_string(server.port());
  web.address = web.host + ":" + web.port;
  return web;
}

// The link's parts: everything before the fragment, and the decoded search.
struct Link {
  std::string prefix;
  std::string search;
};

Link SplitLink(const std::string& link) {
  size_t hash = link.find('#');
  if (hash == std::string::npos) return {link, ""};
  return {link.substr(0, hash + 1), Base64Decode(link.substr(hash + 1))};
}

TEST(WebLinkTest, EncodesTheSearchTheReplyAsksFor) {
  struct Case {
    const char* name;
    std::string reply;
    std::vector<uint32_t> cameras;
    std::string serverId;
    std::string search;
  };
  const Case cases[] = {
      {"item form", R"({"list":[{"id":"12","model":"NVR","serial":"SN-1"}]})", kCameras, "12",
       R"({"m":2,"sb":1,"sm":1,"st":1699999850000,"et":1700000150000,"items":[)"
       R"({"p":0,"s":12,"i":5,"t":"camera"},{"p":1,"s":12,"i":7,"t":"camera"}]})"},
      {"search form", R"({"list":[{"id":"abc","serial":"SN-1"}]})", kCameras, "abc",
       R"({"searchServerId":"abc","searchCameraIds":[5,7],"searchStart":1699999850000,)"
       R"("searchEnd":1700000150000,"mode":"search","quality":7,"size":100})"},
      {"signed camera keys",
       R"({"list":[{"id":"abc","serial":"SN-1"}]})",
       {0xFFFFFFFFu},
       "abc",
       R"({"searchServerId":"abc","searchCameraIds":[-1],"searchStart":1699999850000,)"
       R"("searchEnd":1700000150000,"mode":"search","quality":7,"size":100})"},
  };
  WebServer server;
  for (const Case& c : cases) {
    server.SetLoginJson(c.reply);
    FakeHost host;
    Link link = SplitLink(
        MakeWebLink(AddressOf(server), kSerial, kEventTime, c.cameras, host.callback(), kTimeout));
    EXPECT_EQ(link.prefix,
              "http://" + AddressOf(server).address + "/advanced.web?s=" + c.serverId + ";#")
        << c.name;
    EXPECT_EQ(link.search, c.search) << c.name;
    EXPECT_TRUE(host.LogTexts().empty()) << c.name;
  }
  for (const std::string& request : server.Requests()) {
    EXPECT_EQ(WebServer::RequestPath(request), "/login.web?output=json");
  }
}

TEST(WebLinkTest, LinkNamesTheConfiguredAddressAndPort) {
  // A loopback address of its own keeps the fixed port clear of other tests.
  WebServer server("127.0.80.80", 8080);
  server.SetLoginJson(R"({"list":[{"id":"3","serial":"SN-1"}]})");
  std::string link =
      MakeWebLink(AddressOf(server), kSerial, kEventTime, kCameras, nullptr, kTimeout);
  EXPECT_EQ(link.rfind("http://127.0.80.80:8080/advanced.web?s=3;#", 0), 0u) << link;
}

TEST(WebLinkTest, SaysWhyThereIsNoLink) {
  struct Case {
    const char* name;
    std::string reply;  // raw reply bytes
    std::vector<uint32_t> cameras;
    std::string text;
    int32_t level;
    std::string logged;  // "%a" stands for the server's address text
  };
  const Case cases[] = {
      {"no cameras",
       WebServer::OkReply(R"({"list":[{"id":"1","serial":"SN-1"}]})"),
       {},
       "[Connected to Web Server]",
       0,
       ""},
      {"numeric id", WebServer::OkReply(R"({"list":[{"id":1,"serial":"SN-1"}]})"), kCameras,
       "[Tamberlux System Not Found]", LogLevelWarning,
       "System with serial SN-1 not found on the web server 127.0.0.1"},
      {"no list", WebServer::OkReply(R"({"items":[{"id":"1","serial":"SN-1"}]})"), kCameras,
       "[Invalid Web Server Version]", LogLevelWarning,
       "Incompaitble web server version. No link will be generated"},
      {"no serials", WebServer::OkReply(R"({"list":[]})"), kCameras, "[Invalid Web Server Version]",
       LogLevelWarning, "Incompaitble web server version. No link will be generated"},
      {"redirect", "HTTP/1.0 302 Found\r\n\r\n", kCameras, "[Web Server Unreachable]",
       LogLevelError,
       "Unable to communicate with webserver at address %a. Error message: Invalid response "
       "status code: 302. Expecting 200"},
  };
  WebServer server;
  const WebServerAddress web = AddressOf(server);
  for (const Case& c : cases) {
    server.SetReply(c.reply);
    FakeHost host;
    EXPECT_EQ(MakeWebLink(web, kSerial, kEventTime, c.cameras, host.callback(), kTimeout), c.text)
        << c.name;
    std::vector<std::string> expected;
    if (!c.logged.empty()) {
      std::string line = c.logged;
      size_t at = line.find("%a");
      if (at != std::string::npos) line.replace(at, 2, web.address);
      expected.push_back(line);
    }
    EXPECT_EQ(host.LogTexts(c.level), expected) << c.name;
    EXPECT_EQ(host.LogTexts().size(), expected.size()) << c.name;
  }
}

TEST(WebLinkTest, UnreachableServerIsLoggedWithItsError) {
  WebServerAddress web;
  {
    WebServer gone;
    web = AddressOf(gone);
  }
  FakeHost host;
  EXPECT_EQ(MakeWebLink(web, kSerial, kEventTime, kCameras, host.callback(), kTimeout),
            "[Web Server Unreachable]");
  EXPECT_EQ(
      host.LogTexts(LogLevelError),
      std::vector<std::string>{"Unable to communicate with webserver at address " + web.address +
                               ". 111: Unable to connect to endpoint: Connection refused"});
}

// A server that takes the connection and never answers must not hold the
// worker: the exchange ends at the time-out like any unreachable server.
TEST(WebLinkTest, SilentServerEndsAtTheTimeout) {
  WebServer server;
  server.SetSilent();
  FakeHost host;
  auto start = std::chrono::steady_clock::now();
  EXPECT_EQ(MakeWebLink(AddressOf(server), kSerial, kEventTime, kCameras, host.callback(),
                        std::chrono::milliseconds(300)),
            "[Web Server Unreachable]");
  EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(3));
  EXPECT_EQ(host.LogTexts(LogLevelError),
            std::vector<std::string>{"Unable to communicate with webserver at address " +
                                     AddressOf(server).address +
                                     ". 110: read_until: Connection timed out"});
}

}  // namespace
}  // namespace hx
