// The reading of one HTTP/1.0 reply: status line, header lines and a body that
// runs to the end of the connection.
//
// The reader knows nothing of sockets; it pulls bytes from an IReplyStream, so
// the same code serves the web server's connection and tests that feed bytes
// from memory. Pure functions on caller-owned objects; any thread.
#ifndef ALERTMOD_WEBLINK_HTTP_REPLY_H_
#define ALERTMOD_WEBLINK_HTTP_REPLY_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace hx {

// The most bytes a reply may have in all (status line, headers and body). The
// web server's answer is a short JSON document; anything near this size is a
// broken or hostile server, and holding it would starve the host of memory.
constexpr size_t kMaxReplyBytes = 16u << 20;

// The most room reserved ahead of the body for an announced Content-Length;
// the body may still grow past it up to kMaxReplyBytes.
constexpr size_t kMaxBodyReservation = 1u << 20;

struct HttpResponse {
  std::string version;               // first token of the status line, "HTTP/1.1"
  uint32_t statusCode = 0;           // second token
  std::string statusMessage;         // rest of the status line, leading blank and "\r" kept
  std::vector<std::string> headers;  // header lines, each with its trailing "\r"
  std::string body;                  // every byte after the empty line
};

// Where the reader gets its bytes from.
class IReplyStream {
 public:
  virtual ~IReplyStream() = default;
  // Appends at least one byte of the reply to `buffer`. Returns false at the
  // end of the stream. Any other failure, a time-out included, throws
  // boost::system::system_error whose text is `operation`.
  virtual bool ReadSome(std::string& buffer, const char* operation) = 0;
};

// Reads one reply from `stream` into `response`.
//
// Throws boost::system::system_error for a failing stream: "read_until" while
// the status line or headers are incomplete (end of stream included), "read"
// for the body. Throws std::runtime_error for a reply that is not usable:
// "Invalid Get response" (no HTTP status line), "Invalid response status
// code: <n>. Expecting 200", "Invalid Content-Length Value: <text>" (a length
// that does not fit 32 bits), or a reply larger than kMaxReplyBytes. A reply
// with another status than 200 is refused before its headers are read.
void ReadHttpReply(IReplyStream& stream, HttpResponse& response);

}  // namespace hx

#endif  // ALERTMOD_WEBLINK_HTTP_REPLY_H_
