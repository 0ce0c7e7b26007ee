#include "host/scenario/scenario_directive.h"

#include <cctype>
#include <cerrno>
#include <cstdlib>
#include <cstring>

namespace refhost::scenario {

bool ParseInteger(const std::string& text, int64_t* value) {
  if (text.empty() || std::isspace(static_cast<unsigned char>(text[0]))) return false;
  const bool negative = text[0] == '-';
  const char* digits = text.c_str() + (negative ? 1 : 0);
  const bool hex = std::strncmp(digits, "0x", 2) == 0 || std::strncmp(digits, "0X", 2) == 0;
  if (hex) digits += 2;
  if (*digits == '\0' || *digits == '-' || *digits == '+') return false;
  char* end = nullptr;
  errno = 0;
  const unsigned long long magnitude = std::strtoull(digits, &end, hex ? 16 : 10);
  if (errno != 0 || *end != '\0') return false;
  if (magnitude > (negative ? 0x8000000000000000ull : 0x7FFFFFFFFFFFFFFFull)) return false;
  *value = negative ? static_cast<int64_t>(0 - magnitude) : static_cast<int64_t>(magnitude);
  return true;
}

Directive::Directive(const std::vector<Token>& words, size_t skip) {
  m_name = words.empty() ? std::string() : words[0].value;
  for (size_t i = 1; i < words.size(); ++i) {
    const Token& token = words[i];
    if (token.key.empty()) {
      if (i >= 1 + skip) m_words.push_back(token.value);
      continue;
    }
    if (Find(token.key.c_str()) != nullptr) {
      Fault("attribute " + token.key + " is given twice");
      continue;
    }
    m_attributes.push_back(Attribute{token.key, token.value, false});
  }
}

Directive::Attribute* Directive::Find(const char* key) {
  for (Attribute& attribute : m_attributes) {
    if (attribute.key == key) return &attribute;
  }
  return nullptr;
}

const Directive::Attribute* Directive::Find(const char* key) const {
  return const_cast<Directive*>(this)->Find(key);
}

std::optional<std::string> Directive::Word(size_t index, const char* what) {
  if (index < m_words.size()) return m_words[index];
  Fault(std::string("missing ") + what);
  return std::nullopt;
}

std::optional<int32_t> Directive::CheckedInteger(const std::string& text, const std::string& what,
                                                 int64_t min, int64_t max) {
  int64_t value = 0;
  if (!ParseInteger(text, &value)) {
    Fault(what + " must be a number, not \"" + text + "\"");
    return std::nullopt;
  }
  if (value < min || value > max) {
    Fault(what + " must lie between " + std::to_string(min) + " and " + std::to_string(max) +
          ", not " + text);
    return std::nullopt;
  }
  return static_cast<int32_t>(value);
}

std::optional<int32_t> Directive::IntegerWord(size_t index, const char* what, int64_t min,
                                              int64_t max) {
  std::optional<std::string> word = Word(index, what);
  if (!word) return std::nullopt;
  return CheckedInteger(*word, what, min, max);
}

bool Directive::Has(const char* key) const {
  return Find(key) != nullptr;
}

std::optional<std::string> Directive::Text(const char* key) {
  Attribute* attribute = Find(key);
  if (attribute == nullptr) return std::nullopt;
  attribute->used = true;
  return attribute->value;
}

std::optional<int32_t> Directive::Integer(const char* key, int64_t min, int64_t max) {
  std::optional<std::string> text = Text(key);
  if (!text) return std::nullopt;
  return CheckedInteger(*text, key, min, max);
}

std::optional<bool> Directive::Flag(const char* key) {
  std::optional<std::string> text = Text(key);
  if (!text) return std::nullopt;
  for (const char* yes : {"yes", "1", "true", "on"}) {
    if (*text == yes) return true;
  }
  for (const char* no : {"no", "0", "false", "off"}) {
    if (*text == no) return false;
  }
  Fault(std::string(key) + " must be yes or no, not \"" + *text + "\"");
  return std::nullopt;
}

std::vector<std::string> Directive::List(const char* key) {
  std::vector<std::string> items;
  std::optional<std::string> text = Text(key);
  if (!text) return items;
  size_t start = 0;
  for (;;) {
    const size_t comma = text->find(',', start);
    items.push_back(text->substr(start, comma == std::string::npos ? comma : comma - start));
    if (items.back().empty()) {
      Fault(std::string(key) + " has an empty entry");
      items.pop_back();
    }
    if (comma == std::string::npos) return items;
    start = comma + 1;
  }
}

std::vector<int32_t> Directive::IntegerList(const char* key, int64_t min, int64_t max) {
  std::vector<int32_t> numbers;
  for (const std::string& item : List(key)) {
    if (std::optional<int32_t> number = CheckedInteger(item, key, min, max)) {
      numbers.push_back(*number);
    }
  }
  return numbers;
}

void Directive::Finish(size_t words) {
  for (const Attribute& attribute : m_attributes) {
    if (!attribute.used) Fault("unknown attribute " + attribute.key + " for " + m_name);
  }
  if (m_words.size() > words) Fault("unexpected \"" + m_words[words] + "\"");
}

}  // namespace refhost::scenario
