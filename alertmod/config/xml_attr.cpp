#include "alertmod/config/xml_attr.h"

#include <tinyxml.h>

namespace hx {
namespace {

bool IsSpace(char c) {
  return c == ' ' || c == '\t' || c == '\r' || c == '\n';
}
bool IsDigit(char c) {
  return c >= '0' && c <= '9';
}

}  // namespace

std::optional<int32_t> ParseDecimalInt32(const char* text) {
  if (text == nullptr) {
    return std::nullopt;
  }
  const char* p = text;
  while (IsSpace(*p)) ++p;
  bool negative = false;
  if (*p == '+' || *p == '-') {
    negative = *p == '-';
    ++p;
  }
  if (!IsDigit(*p)) {
    return std::nullopt;
  }
  // Accumulated in 64 bits and checked per digit, so no input can overflow;
  // the negative limit is one larger than the positive one.
  const int64_t limit = negative ? INT64_C(2147483648) : INT64_C(2147483647);
  int64_t magnitude = 0;
  for (; IsDigit(*p); ++p) {
    magnitude = magnitude * 10 + (*p - '0');
    if (magnitude > limit) {
      return std::nullopt;
    }
  }
  while (IsSpace(*p)) ++p;
  if (*p != '\0') {
    return std::nullopt;
  }
  return static_cast<int32_t>(negative ? -magnitude : magnitude);
}

std::optional<int32_t> IntAttribute(const TiXmlElement& element, const char* name) {
  return ParseDecimalInt32(element.Attribute(name));
}

int32_t IntAttributeOr(const TiXmlElement& element, const char* name, int32_t fallback) {
  return IntAttribute(element, name).value_or(fallback);
}

}  // namespace hx
