// Parsing of XML texts that come from outside the module (host documents,
// alarm documents, "notify.xml").
//
// TinyXML parses and frees element trees recursively, so a text nested some
// tens of thousands of levels deep exhausts the stack. ParseXmlDocument
// first walks the text the way TinyXML's parser will, without recursion,
// and refuses it when elements nest deeper than kMaxXmlNesting or the text
// ends inside markup. TinyXML then parses in its single-byte mode, so that a
// malformed UTF-8 sequence cannot shift its reading away from that walk;
// UTF-8 text passes through byte for byte all the same.
//
// Pure functions; any thread.
#ifndef ALERTMOD_CONFIG_XML_DOCUMENT_H_
#define ALERTMOD_CONFIG_XML_DOCUMENT_H_

#include <cstddef>
#include <optional>
#include <string>

class TiXmlDocument;

namespace hx {

// Deepest element nesting that ParseXmlDocument accepts. No document of the
// host comes anywhere near it.
constexpr size_t kMaxXmlNesting = 256;

// The deepest element nesting of `text` (up to its first NUL byte) as
// TinyXML will build it, or at least that deep: the walk stops once `limit`
// is exceeded and returns a value above `limit`. nullopt when the text ends
// inside markup or breaks a rule TinyXML also enforces, or when a tag holds
// a byte above 0x7F outside its quoted values.
std::optional<size_t> XmlNestingDepth(const std::string& text, size_t limit);

// Parses `text` into `document`. Returns false, with `document` left
// without nodes, when XmlNestingDepth refuses `text` or finds it deeper than
// kMaxXmlNesting, or when TinyXML reports a parse error.
bool ParseXmlDocument(const std::string& text, TiXmlDocument& document);

}  // namespace hx

#endif  // ALERTMOD_CONFIG_XML_DOCUMENT_H_
