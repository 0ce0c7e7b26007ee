#include "alertmod/weblink/http_reply.h"

#include <gtest/gtest.h>

#include <boost/system/system_error.hpp>
#include <stdexcept>

#include "alertmod/weblink/testing/piecewise_reply_stream.h"

namespace hx {
namespace {

// The body, or the text of the failure.
std::string Read(const std::string& reply, size_t piece) {
  PiecewiseReplyStream stream(reply, piece);
  HttpResponse response;
  try {
    ReadHttpReply(stream, response);
  } catch (const std::exception& e) {
    return std::string("error: ") + e.what();
  }
  return response.body;
}

// However the reply is cut into pieces, it reads the same.
TEST(HttpReplyTest, PiecesDoNotMatter) {
  const std::string replies[] = {
      "HTTP/1.0 200 OK\r\n\r\n{\"list\":[]}",
      "HTTP/1.0 200 OK\r\nA: b\r\nContent-Length: 4\r\n\r\nbody\r\n\r\nmore",
      "HTTP/1.1 200 OK\r\n\r\n",
      "HTTP/1.0 404 Not Found\r\n\r\n",
      "HTTP/1.0 200 OK\r\nA: b\r\n",
  };
  const size_t wholeReply = 1 << 20;
  for (const std::string& reply : replies) {
    const std::string expected = Read(reply, wholeReply);
    for (size_t piece : {1, 2, 3, 7}) {
      EXPECT_EQ(Read(reply, piece), expected) << reply << " in pieces of " << piece;
    }
  }
  EXPECT_EQ(Read(replies[0], 1), "{\"list\":[]}");
  EXPECT_EQ(Read(replies[1], 1), "body\r\n\r\nmore");
}

TEST(HttpReplyTest, RefusesOversizedReplies) {
  const std::string tooLarge = "error: Web server reply exceeds 16777216 bytes";
  const std::string filler(kMaxReplyBytes, 'x');
  EXPECT_EQ(Read("HTTP/1.0 200 OK\r\n\r\n" + filler + "x", 65536), tooLarge);
  EXPECT_EQ(Read("HTTP/1.0 200 OK\r\nA: " + filler + "\r\n\r\n", 65536), tooLarge);
  EXPECT_EQ(Read("HTTP/1.0 200 OK\r\n\r\n" + filler, 65536), filler);
}

}  // namespace
}  // namespace hx
