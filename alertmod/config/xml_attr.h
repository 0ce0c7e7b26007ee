// The module's one reader of integer attributes in XML documents, shared by
// every part that reads the host's documents or "notify.xml".
//
// An integer attribute is signed 32-bit decimal: optional spaces, an optional
// sign, one or more digits, optional spaces, and nothing else. A missing
// attribute, an empty one, any other character ("12abc", "0xC0000", "1.5")
// or a value outside the signed 32-bit range counts as absent. This is
// stricter than TinyXML's own QueryIntAttribute, which reads the leading
// digits of "12abc" as 12 and "0xC0000" as 0; a value the host did not mean
// as a number is never taken as one.
//
// Pure functions; any thread.
#ifndef ALERTMOD_CONFIG_XML_ATTR_H_
#define ALERTMOD_CONFIG_XML_ATTR_H_

#include <cstdint>
#include <optional>

class TiXmlElement;

namespace hx {

// The signed 32-bit decimal value of `text`, or nullopt when `text` is null
// or not such a number (see above).
std::optional<int32_t> ParseDecimalInt32(const char* text);

// The integer value of attribute `name` of `element`, or nullopt when the
// attribute is missing or not a signed 32-bit decimal number.
std::optional<int32_t> IntAttribute(const TiXmlElement& element, const char* name);

// The integer value of attribute `name` of `element`, or `fallback` when it
// is missing or not a number.
int32_t IntAttributeOr(const TiXmlElement& element, const char* name, int32_t fallback);

}  // namespace hx

#endif  // ALERTMOD_CONFIG_XML_ATTR_H_
