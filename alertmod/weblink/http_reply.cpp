#include "alertmod/weblink/http_reply.h"

#include <algorithm>
#include <boost/asio/error.hpp>
#include <boost/system/system_error.hpp>
#include <limits>
#include <stdexcept>

namespace hx {
namespace {

constexpr char kLineEnd[] = "\r\n";
constexpr char kHeaderEnd[] = "\r\n\r\n";
constexpr char kContentLengthField[] = "Content-Length: ";
constexpr size_t kContentLengthFieldSize = sizeof(kContentLengthField) - 1;
constexpr char kHttpPrefix[] = "HTTP/";
constexpr uint32_t kStatusOk = 200;

bool IsSpace(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\v' || c == '\f' || c == '\r';
}

// Digits from the start of `text` as an unsigned 32-bit number, stopping at
// the first other character. False when the number does not fit.
bool ParseLeadingDigits(const std::string& text, size_t& pos, uint32_t& value) {
  uint64_t total = 0;
  for (; pos < text.size() && text[pos] >= '0' && text[pos] <= '9'; ++pos) {
    total = total * 10 + static_cast<uint64_t>(text[pos] - '0');
    if (total > std::numeric_limits<uint32_t>::max()) return false;
  }
  value = static_cast<uint32_t>(total);
  return true;
}

void ThrowTooLarge() {
  throw std::runtime_error("Web server reply exceeds " + std::to_string(kMaxReplyBytes) + " bytes");
}

// The bytes received so far and how many of them the reader has used, the
// way an Asio stream buffer would hold them.
class ReplyReader final {
 public:
  explicit ReplyReader(IReplyStream& stream) : m_stream(stream) {}

  void ReadStatusLine(HttpResponse& response);
  uint32_t ReadHeaders(std::vector<std::string>& headers);
  void ReadBody(uint32_t announcedLength, std::string& body);

 private:
  void FillUntil(const std::string& delimiter, size_t searchFrom);
  bool TakeToken(std::string& token);
  bool TakeNumber(uint32_t& value);
  bool TakeLine(std::string& line);
  void SkipSpace();

  IReplyStream& m_stream;
  std::string m_data;
  size_t m_pos = 0;
};

void ReplyReader::FillUntil(const std::string& delimiter, size_t searchFrom) {
  while (m_data.find(delimiter, searchFrom) == std::string::npos) {
    // Only the tail can still begin a delimiter completed by the next bytes.
    if (m_data.size() >= delimiter.size()) {
      searchFrom = std::max(searchFrom, m_data.size() - (delimiter.size() - 1));
    }
    if (!m_stream.ReadSome(m_data, "read_until")) {
      throw boost::system::system_error(boost::asio::error::eof, "read_until");
    }
    if (m_data.size() > kMaxReplyBytes) ThrowTooLarge();
  }
}

void ReplyReader::SkipSpace() {
  while (m_pos < m_data.size() && IsSpace(m_data[m_pos])) ++m_pos;
}

bool ReplyReader::TakeToken(std::string& token) {
  SkipSpace();
  size_t start = m_pos;
  while (m_pos < m_data.size() && !IsSpace(m_data[m_pos])) ++m_pos;
  token.assign(m_data, start, m_pos - start);
  return !token.empty();
}

bool ReplyReader::TakeNumber(uint32_t& value) {
  SkipSpace();
  size_t start = m_pos;
  return ParseLeadingDigits(m_data, m_pos, value) && m_pos > start;
}

bool ReplyReader::TakeLine(std::string& line) {
  size_t end = m_data.find('\n', m_pos);
  if (end == std::string::npos) return false;
  line.assign(m_data, m_pos, end - m_pos);
  m_pos = end + 1;
  return true;
}

void ReplyReader::ReadStatusLine(HttpResponse& response) {
  FillUntil(kLineEnd, m_pos);
  bool complete = TakeToken(response.version) && TakeNumber(response.statusCode) &&
                  TakeLine(response.statusMessage);
  if (!complete || response.version.compare(0, sizeof(kHttpPrefix) - 1, kHttpPrefix) != 0) {
    throw std::runtime_error("Invalid Get response");
  }
  if (response.statusCode != kStatusOk) {
    throw std::runtime_error(
        "Invalid response status code: " + std::to_string(response.statusCode) + ". Expecting 200");
  }
}

// Returns the last announced Content-Length, 0 without one.
uint32_t ReplyReader::ReadHeaders(std::vector<std::string>& headers) {
  // The status line's own line end counts towards the empty line, so that a
  // reply without header lines is complete too.
  const size_t lineEndSize = sizeof(kLineEnd) - 1;
  bool afterLineEnd =
      m_pos >= lineEndSize && m_data.compare(m_pos - lineEndSize, lineEndSize, kLineEnd) == 0;
  FillUntil(kHeaderEnd, afterLineEnd ? m_pos - lineEndSize : m_pos);
  headers.clear();
  uint32_t announced = 0;
  std::string line;
  while (TakeLine(line) && line != "\r") {
    if (line.find(kContentLengthField) != std::string::npos) {
      // The value is read from a fixed offset, as the field name is expected
      // at the start of the line.
      std::string text = line.substr(kContentLengthFieldSize);
      size_t pos = 0;
      if (!ParseLeadingDigits(text, pos, announced)) {
        throw std::runtime_error("Invalid Content-Length Value: " + text);
      }
    }
    headers.push_back(line);
  }
  return announced;
}

void ReplyReader::ReadBody(uint32_t announcedLength, std::string& body) {
  body.clear();
  // The announced length only sizes the buffer; the body runs to the end of
  // the connection whatever it says.
  body.reserve(std::min<size_t>(announcedLength, kMaxBodyReservation));
  body.append(m_data, m_pos, std::string::npos);
  m_data.clear();
  m_pos = 0;
  while (m_stream.ReadSome(body, "read")) {
    if (body.size() > kMaxReplyBytes) ThrowTooLarge();
  }
}

}  // namespace

void ReadHttpReply(IReplyStream& stream, HttpResponse& response) {
  ReplyReader reader(stream);
  reader.ReadStatusLine(response);
  uint32_t announced = reader.ReadHeaders(response.headers);
  reader.ReadBody(announced, response.body);
}

}  // namespace hx
