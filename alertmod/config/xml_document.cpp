#include "alertmod/config/xml_document.h"

#include <tinyxml.h>

#include <algorithm>
#include <cstring>

#include "alertmod/diag/log.h"

namespace hx {
namespace {

constexpr char kByteOrderMark[] = "\xEF\xBB\xBF";
// TinyXML steps a few bytes past the end of some unterminated constructs;
// the walk refuses those, and these spare NUL bytes keep any such step
// inside the buffer all the same.
constexpr size_t kSpareNulBytes = 8;

bool IsSpace(unsigned char c) {
  return c == ' ' || (c >= '\t' && c <= '\r');
}
bool IsAsciiLetter(unsigned char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}
bool IsDigit(unsigned char c) {
  return c >= '0' && c <= '9';
}
// TinyXML takes every byte from 127 up as a letter.
bool IsNameStart(unsigned char c) {
  return c >= 127 || IsAsciiLetter(c) || c == '_';
}
bool IsNameChar(unsigned char c) {
  return IsNameStart(c) || IsDigit(c) || c == '-' || c == '.' || c == ':';
}

// Walks a text as TinyXML's parser reads it, keeping only the nesting depth
// and counting the attributes of each start tag. Wherever the two could read
// a byte differently the walk gives up, so the depth it reports is never
// below the one TinyXML builds.
class NestingWalk final {
 public:
  explicit NestingWalk(const std::string& text)
      : m_text(text.c_str()), m_length(std::strlen(text.c_str())) {}

  std::optional<size_t> Run(size_t limit);
  // Whether Run gave up at a start tag with more than kMaxXmlAttributes.
  bool TooManyAttributes() const { return m_tooManyAttributes; }

 private:
  enum class Tag { kBroken, kEmpty, kOpen };

  bool AtEnd() const { return m_pos >= m_length; }
  unsigned char Peek(size_t ahead = 0) const {
    return m_pos + ahead < m_length ? static_cast<unsigned char>(m_text[m_pos + ahead]) : 0;
  }
  bool StartsWith(const char* prefix, bool ignoreCase = false) const;
  void SkipSpace() {
    while (!AtEnd() && IsSpace(Peek())) ++m_pos;
  }
  bool SkipPast(const char* terminator);
  bool SkipName();
  bool SkipAttribute();
  bool SkipDeclaration();
  Tag SkipStartTag();

  const char* m_text;
  size_t m_length;
  size_t m_pos = 0;
  bool m_tooManyAttributes = false;
};

std::optional<size_t> NestingWalk::Run(size_t limit) {
  size_t depth = 0;
  size_t deepest = 0;
  while (deepest <= limit) {
    SkipSpace();
    if (AtEnd()) {
      return depth == 0 ? std::optional<size_t>(deepest) : std::nullopt;
    }
    bool complete = true;
    if (Peek() != '<') {
      // Text inside an element. Outside one TinyXML stops reading here (or,
      // under some locales, takes a high byte for white space and goes on);
      // walking on can only find more.
      complete = SkipPast("<");
      if (!complete && depth == 0) {
        return deepest;
      }
      m_pos -= complete ? 1 : 0;
    } else if (depth > 0 && StartsWith("</")) {
      complete = SkipPast(">");
      --depth;
    } else if (StartsWith("<?xml", true)) {
      complete = SkipDeclaration();
    } else if (StartsWith("<!--")) {
      complete = SkipPast("-->");
    } else if (StartsWith("<![CDATA[")) {
      complete = SkipPast("]]>");
    } else if (StartsWith("<!") || !IsNameStart(Peek(1))) {
      complete = SkipPast(">");
    } else {
      deepest = std::max(deepest, depth + 1);
      const Tag tag = SkipStartTag();
      complete = tag != Tag::kBroken;
      depth += tag == Tag::kOpen ? 1 : 0;
    }
    if (!complete) {
      return std::nullopt;
    }
  }
  return deepest;
}

bool NestingWalk::StartsWith(const char* prefix, bool ignoreCase) const {
  for (size_t i = 0; prefix[i] != '\0'; ++i) {
    unsigned char c = Peek(i);
    if (ignoreCase && c >= 'A' && c <= 'Z') c = static_cast<unsigned char>(c - 'A' + 'a');
    if (c != static_cast<unsigned char>(prefix[i])) return false;
  }
  return true;
}

bool NestingWalk::SkipPast(const char* terminator) {
  const char* end = std::search(m_text + m_pos, m_text + m_length, terminator,
                                terminator + std::strlen(terminator));
  if (end == m_text + m_length) {
    return false;
  }
  m_pos = static_cast<size_t>(end - m_text) + std::strlen(terminator);
  return true;
}

// Names of the host's documents are ASCII; a byte above 0x7F in markup could
// be white space to TinyXML under some locale (and its UTF-8 mode skips a
// byte order mark anywhere), so the walk stops there.
bool NestingWalk::SkipName() {
  if (!IsNameStart(Peek())) {
    return false;
  }
  for (; !AtEnd() && IsNameChar(Peek()); ++m_pos) {
    if (Peek() > 127) return false;
  }
  return true;
}

bool NestingWalk::SkipAttribute() {
  if (!SkipName()) return false;
  SkipSpace();
  if (Peek() != '=') return false;
  ++m_pos;
  SkipSpace();
  const unsigned char quote = Peek();
  if (quote == '"' || quote == '\'') {
    ++m_pos;
    const char terminator[] = {static_cast<char>(quote), '\0'};
    return SkipPast(terminator);
  }
  // TinyXML reads an unquoted value up to white space, "/" or ">", and
  // refuses a quote inside it.
  for (; !AtEnd() && !IsSpace(Peek()) && Peek() != '/' && Peek() != '>'; ++m_pos) {
    if (Peek() == '"' || Peek() == '\'' || Peek() > 127) return false;
  }
  return !AtEnd();
}

NestingWalk::Tag NestingWalk::SkipStartTag() {
  ++m_pos;  // "<"
  if (!SkipName()) return Tag::kBroken;
  for (size_t attributes = 0;; ++attributes) {
    if (attributes > kMaxXmlAttributes) {
      m_tooManyAttributes = true;
      return Tag::kBroken;
    }
    SkipSpace();
    if (AtEnd()) return Tag::kBroken;
    if (Peek() == '/') {
      if (Peek(1) != '>') return Tag::kBroken;
      m_pos += 2;
      return Tag::kEmpty;
    }
    if (Peek() == '>') {
      ++m_pos;
      return Tag::kOpen;
    }
    if (!SkipAttribute()) return Tag::kBroken;
  }
}

// "<?xml" with its version, encoding and standalone attributes; anything else
// up to white space or ">" is passed over, as TinyXML does.
bool NestingWalk::SkipDeclaration() {
  m_pos += 5;
  while (!AtEnd()) {
    if (Peek() == '>') {
      ++m_pos;
      return true;
    }
    SkipSpace();
    if (StartsWith("version", true) || StartsWith("encoding", true) ||
        StartsWith("standalone", true)) {
      if (!SkipAttribute()) return false;
      continue;
    }
    for (; !AtEnd() && Peek() != '>' && !IsSpace(Peek()); ++m_pos) {
      if (Peek() > 127) return false;
    }
  }
  return false;
}

// TinyXML's UTF-8 mode skips U+FEFF, U+FFFE and U+FFFF wherever it skips
// white space, so such a character at the start of a value would vanish: a
// recipient list holding only one, read back from notify.xml, would lose
// its profile.
bool HasSkippedMark(const std::string& text) {
  static const char* const kMarks[] = {"\xEF\xBB\xBF", "\xEF\xBF\xBE", "\xEF\xBF\xBF"};
  for (const char* mark : kMarks) {
    if (text.find(mark) != std::string::npos) return true;
  }
  return false;
}

// TinyXML's own choice for a text (TIXML_DEFAULT_ENCODING: a byte order mark
// means UTF-8, and so does a declaration naming no encoding or UTF-8), except
// that a text which is not UTF-8, or holds a mark that mode skips, is read
// byte by byte.
TiXmlEncoding EncodingOf(const std::string& text, bool byteOrderMark) {
  if (!IsValidUtf8(text) || HasSkippedMark(text)) return TIXML_ENCODING_LEGACY;
  return byteOrderMark ? TIXML_ENCODING_UTF8 : TIXML_DEFAULT_ENCODING;
}

}  // namespace

bool IsValidUtf8(const std::string& text) {
  const auto* p = reinterpret_cast<const unsigned char*>(text.c_str());
  while (*p != 0) {
    const unsigned char lead = *p++;
    if (lead < 0x80) continue;
    size_t continuations = 0;
    // The range of the first continuation byte; the others lie in 80..BF.
    unsigned char low = 0x80;
    unsigned char high = 0xBF;
    if (lead >= 0xC2 && lead <= 0xDF) {
      continuations = 1;
    } else if (lead >= 0xE0 && lead <= 0xEF) {
      continuations = 2;
      low = lead == 0xE0 ? 0xA0 : low;
      high = lead == 0xED ? 0x9F : high;
    } else if (lead >= 0xF0 && lead <= 0xF4) {
      continuations = 3;
      low = lead == 0xF0 ? 0x90 : low;
      high = lead == 0xF4 ? 0x8F : high;
    } else {
      return false;
    }
    for (size_t i = 0; i < continuations; ++i, ++p) {
      if (*p < (i == 0 ? low : 0x80) || *p > (i == 0 ? high : 0xBF)) return false;
    }
  }
  return true;
}

std::optional<size_t> XmlNestingDepth(const std::string& text, size_t limit) {
  return NestingWalk(text).Run(limit);
}

bool ParseXmlDocument(const std::string& text, TiXmlDocument& document,
                      core::HostCallbackFn callback) {
  document.Clear();
  // The walk and the single-byte mode do not skip a byte order mark; the
  // encoding it stands for is passed to TinyXML instead.
  const bool byteOrderMark = text.compare(0, 3, kByteOrderMark) == 0;
  std::string padded(text, byteOrderMark ? 3 : 0);
  NestingWalk walk(padded);
  const std::optional<size_t> depth = walk.Run(kMaxXmlNesting);
  if (walk.TooManyAttributes()) {
    LogToHost(core::kModuleId, callback, LogLevelWarning,
              "An XML document was refused: one of its elements has more than %zu attributes.",
              kMaxXmlAttributes);
  }
  if (!depth || *depth > kMaxXmlNesting) {
    return false;
  }
  const TiXmlEncoding encoding = EncodingOf(padded, byteOrderMark);
  padded.append(kSpareNulBytes, '\0');
  document.Parse(padded.c_str(), nullptr, encoding);
  if (document.Error()) {
    document.Clear();
    return false;
  }
  return true;
}

}  // namespace hx
