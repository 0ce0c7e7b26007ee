// Feeds arbitrary bytes to the web server reply reader, as a reply arriving
// in pieces whose size the first byte chooses, and to the login-reply scanner
// both through a successful reply and directly.
#include <boost/system/system_error.hpp>
#include <cstddef>
#include <cstdint>
#include <stdexcept>
#include <string>

#include "alertmod/weblink/http_reply.h"
#include "alertmod/weblink/login_reply.h"
#include "alertmod/weblink/testing/piecewise_reply_stream.h"

namespace {

constexpr char kSerial[] = "SN-1";
constexpr size_t kLargestPiece = 64;

void CheckLoginReply(const std::string& body) {
  hx::LoginReply login = hx::ParseLoginReply(body, kSerial);
  if (!login.accepted && !login.serverId.empty()) __builtin_trap();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  const size_t piece = data[0] % kLargestPiece + 1;
  const std::string reply(reinterpret_cast<const char*>(data) + 1, size - 1);
  hx::PiecewiseReplyStream stream(reply, piece);
  hx::HttpResponse response;
  try {
    hx::ReadHttpReply(stream, response);
    if (response.statusCode != 200 || response.version.compare(0, 5, "HTTP/") != 0) {
      __builtin_trap();
    }
    if (response.body.size() > reply.size()) __builtin_trap();
    CheckLoginReply(response.body);
  } catch (const boost::system::system_error&) {
  } catch (const std::runtime_error&) {
  }
  CheckLoginReply(reply);
  return 0;
}
