#include "alertmod/weblink/login_reply.h"

namespace hx {
namespace {

constexpr size_t kMinReplySize = 6;
constexpr char kListKey[] = "\"list\"";
constexpr char kIdKey[] = "\"id\"";
constexpr char kModelKey[] = "\"model\"";
constexpr char kSerialKey[] = "\"serial\"";

template <size_t N>
constexpr size_t KeySize(const char (&)[N]) {
  return N - 1;
}

// Walks the list array between its "[" and the body's last "]", tracking the
// nesting of objects and the keys of the list's own objects.
class LoginScanner final {
 public:
  LoginScanner(const std::string& body, const std::string& serial, size_t end)
      : m_body(body), m_serial(serial), m_end(end) {}

  // Scans from `begin`; false when the reply must be rejected.
  bool Scan(size_t begin);
  LoginReply Result() const;

 private:
  bool ScanString(size_t& pos);
  bool ScanId(size_t value, size_t& pos);
  bool ScanSerial(size_t value, size_t& pos);
  void ScanModel(size_t value, size_t& pos);
  bool KeyAt(size_t pos, const char* key, size_t size) const;
  size_t ValueStart(size_t afterKey) const;
  size_t StringEnd(size_t open) const;
  void SkipString(size_t open, size_t& pos) const;

  const std::string& m_body;
  const std::string& m_serial;
  const size_t m_end;
  int m_depth = 0;
  std::string m_currentId;
  bool m_itemForm = false;
  bool m_serialSeen = false;
  bool m_matched = false;
  bool m_done = false;
};

bool LoginScanner::Scan(size_t begin) {
  size_t pos = begin;
  while (pos < m_end && !m_done) {
    const char c = m_body[pos];
    if (c == '{') {
      if (m_depth == 0) m_currentId.clear();
      ++m_depth;
      ++pos;
    } else if (c == '}') {
      if (m_depth == 1 && m_matched) {
        m_done = true;
        break;
      }
      --m_depth;
      ++pos;
    } else if (c == '"') {
      if (!ScanString(pos)) return false;
    } else {
      ++pos;
    }
  }
  return m_serialSeen;
}

LoginReply LoginScanner::Result() const {
  LoginReply reply;
  reply.accepted = true;
  reply.itemForm = m_itemForm;
  if (m_done) reply.serverId = m_currentId;
  return reply;
}

bool LoginScanner::ScanString(size_t& pos) {
  if (m_depth == 1) {
    if (KeyAt(pos, kIdKey, KeySize(kIdKey))) {
      return ScanId(ValueStart(pos + KeySize(kIdKey)), pos);
    }
    if (KeyAt(pos, kModelKey, KeySize(kModelKey))) {
      ScanModel(ValueStart(pos + KeySize(kModelKey)), pos);
      return true;
    }
    if (KeyAt(pos, kSerialKey, KeySize(kSerialKey))) {
      return ScanSerial(ValueStart(pos + KeySize(kSerialKey)), pos);
    }
  }
  // Any other string is passed over whole: a brace in a camera name must not
  // change the nesting.
  SkipString(pos, pos);
  return true;
}

bool LoginScanner::ScanId(size_t value, size_t& pos) {
  pos = value;
  // A value that is not a string is left to the main scan (it may be an
  // object whose braces count).
  if (value >= m_end || m_body[value] != '"') return true;
  size_t close = StringEnd(value);
  if (close == std::string::npos) return false;
  m_currentId.assign(m_body, value + 1, close - value - 1);
  pos = close + 1;
  return true;
}

void LoginScanner::ScanModel(size_t value, size_t& pos) {
  pos = value;
  if (value >= m_end || m_body[value] != '"') return;
  m_itemForm = true;
  SkipString(value, pos);
}

bool LoginScanner::ScanSerial(size_t value, size_t& pos) {
  pos = value;
  if (value >= m_end || m_body[value] != '"') return true;
  m_serialSeen = true;
  size_t close = StringEnd(value);
  if (close == std::string::npos) return false;
  if (m_body.compare(value + 1, close - value - 1, m_serial) == 0) {
    m_matched = true;
    if (!m_currentId.empty() && m_itemForm) m_done = true;
  }
  pos = close + 1;
  return true;
}

bool LoginScanner::KeyAt(size_t pos, const char* key, size_t size) const {
  return pos + size <= m_end && m_body.compare(pos, size, key) == 0;
}

size_t LoginScanner::ValueStart(size_t afterKey) const {
  size_t pos = afterKey;
  while (pos < m_end && (m_body[pos] == ' ' || m_body[pos] == ':')) ++pos;
  return pos;
}

// The closing quote of the string opened at `open`, before the end of the
// list; npos when there is none. Escaped quotes do not close it.
size_t LoginScanner::StringEnd(size_t open) const {
  for (size_t pos = open + 1; pos < m_end; ++pos) {
    if (m_body[pos] == '\\') {
      ++pos;
    } else if (m_body[pos] == '"') {
      return pos;
    }
  }
  return std::string::npos;
}

// Moves `pos` past the string opened at `open`; an unterminated string runs
// to the end of the list.
void LoginScanner::SkipString(size_t open, size_t& pos) const {
  size_t close = StringEnd(open);
  pos = close == std::string::npos ? m_end : close + 1;
}

}  // namespace

LoginReply ParseLoginReply(const std::string& body, const std::string& serial) {
  if (body.size() < kMinReplySize) return {};
  size_t list = body.find(kListKey);
  if (list == std::string::npos) return {};
  size_t open = body.find('[', list + KeySize(kListKey));
  size_t close = body.rfind(']');
  if (open == std::string::npos || close == std::string::npos || close <= open) return {};
  LoginScanner scanner(body, serial, close);
  if (!scanner.Scan(open + 1)) return {};
  return scanner.Result();
}

}  // namespace hx
