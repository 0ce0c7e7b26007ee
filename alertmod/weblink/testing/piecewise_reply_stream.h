// A web server reply held in memory that arrives in pieces of a fixed size,
// for tests and the fuzz target of the reply reader. One thread.
#ifndef ALERTMOD_WEBLINK_TESTING_PIECEWISE_REPLY_STREAM_H_
#define ALERTMOD_WEBLINK_TESTING_PIECEWISE_REPLY_STREAM_H_

#include <algorithm>
#include <string>
#include <utility>

#include "alertmod/weblink/http_reply.h"

namespace hx {

class PiecewiseReplyStream final : public IReplyStream {
 public:
  // `piece` must be at least 1.
  PiecewiseReplyStream(std::string bytes, size_t piece)
      : m_bytes(std::move(bytes)), m_piece(piece) {}

  bool ReadSome(std::string& buffer, const char*) override {
    if (m_pos == m_bytes.size()) return false;
    size_t count = std::min(m_piece, m_bytes.size() - m_pos);
    buffer.append(m_bytes, m_pos, count);
    m_pos += count;
    return true;
  }

 private:
  std::string m_bytes;
  size_t m_piece;
  size_t m_pos = 0;
};

}  // namespace hx

#endif  // ALERTMOD_WEBLINK_TESTING_PIECEWISE_REPLY_STREAM_H_
