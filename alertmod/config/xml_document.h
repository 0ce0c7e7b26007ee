// Parsing of XML texts that come from outside the module (host documents,
// alarm documents, "notify.xml").
//
// TinyXML parses and frees element trees recursively, so a text nested some
// tens of thousands of levels deep exhausts the stack; and it looks up each
// new attribute among those of its element already read, so one start tag
// with tens of thousands of attributes takes seconds. ParseXmlDocument first
// walks the text the way TinyXML's parser will, without recursion, and
// refuses it when elements nest deeper than kMaxXmlNesting, when a start tag
// holds more than kMaxXmlAttributes attributes, or when the text ends inside
// markup.
//
// TinyXML then reads the text under its own default encoding rules: UTF-8
// after a byte order mark or a declaration that names no encoding or UTF-8,
// single bytes after one that names another encoding, and single bytes for
// character references without a declaration. A text that is not valid
// UTF-8 is read in the single-byte mode all the same: TinyXML's UTF-8 mode
// takes a malformed lead byte together with the bytes after it, which could
// shift its reading away from the walk or past the end of the text. So is a
// text holding U+FEFF, U+FFFE or U+FFFF after its byte order mark, which
// that mode drops from the start of a value.
//
// Pure functions; any thread.
#ifndef ALERTMOD_CONFIG_XML_DOCUMENT_H_
#define ALERTMOD_CONFIG_XML_DOCUMENT_H_

#include <cstddef>
#include <optional>
#include <string>

#include "alertmod/host_records.h"

class TiXmlDocument;

namespace hx {

// Deepest element nesting that ParseXmlDocument accepts. No document of the
// host comes anywhere near it.
constexpr size_t kMaxXmlNesting = 256;
// Most attributes that ParseXmlDocument accepts on one element. The host's
// elements carry a handful; below this TinyXML's lookup costs little.
constexpr size_t kMaxXmlAttributes = 512;

// The deepest element nesting of `text` (up to its first NUL byte) as
// TinyXML will build it, or at least that deep: the walk stops once `limit`
// is exceeded and returns a value above `limit`. nullopt when the text ends
// inside markup or breaks a rule TinyXML also enforces, when a tag holds a
// byte above 0x7F outside its quoted values, or when a start tag holds more
// than kMaxXmlAttributes attributes.
std::optional<size_t> XmlNestingDepth(const std::string& text, size_t limit);

// Whether `text`, up to its first NUL byte, is well-formed UTF-8: no stray
// continuation byte, no sequence cut short, no overlong form, no surrogate,
// nothing above U+10FFFF. Only such a text is read in TinyXML's UTF-8 mode.
bool IsValidUtf8(const std::string& text);

// Parses `text` into `document`. Returns false, with `document` left
// without nodes, when XmlNestingDepth refuses `text` or finds it deeper than
// kMaxXmlNesting, or when TinyXML reports a parse error. A refusal for too
// many attributes is logged as a warning through `callback` (when given).
bool ParseXmlDocument(const std::string& text, TiXmlDocument& document,
                      core::HostCallbackFn callback = nullptr);

}  // namespace hx

#endif  // ALERTMOD_CONFIG_XML_DOCUMENT_H_
