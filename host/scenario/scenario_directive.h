// One line of a scenario as the parser reads it: the directive's name, its
// plain words in order and its key=value attributes. The accessors convert
// and check values and note every fault; Finish() adds a fault for each
// attribute nobody asked for and each plain word too many, so a misspelt
// attribute is never silently ignored.
//
// Used by the scenario parser on one thread.
#ifndef ALERTMOD_HOST_SCENARIO_SCENARIO_DIRECTIVE_H_
#define ALERTMOD_HOST_SCENARIO_SCENARIO_DIRECTIVE_H_

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "host/scenario/scenario_lexer.h"

namespace refhost::scenario {

// A decimal or 0x-hexadecimal integer, optionally negative, with nothing
// after it. False when `text` is anything else or outside 64 bits.
bool ParseInteger(const std::string& text, int64_t* value);

class Directive {
 public:
  // `words` starts with the directive's name; `skip` leading plain words
  // (such as "at 5") are not counted as its plain words.
  Directive(const std::vector<Token>& words, size_t skip);

  const std::string& name() const { return m_name; }

  // The plain word at `index`, or a fault "missing <what>".
  std::optional<std::string> Word(size_t index, const char* what);
  std::optional<int32_t> IntegerWord(size_t index, const char* what, int64_t min, int64_t max);
  size_t WordCount() const { return m_words.size(); }

  bool Has(const char* key) const;
  // The attribute's value, or nothing when it is absent (no fault).
  std::optional<std::string> Text(const char* key);
  // A fault when present but not an integer in [min, max].
  std::optional<int32_t> Integer(const char* key, int64_t min, int64_t max);
  // "yes"/"no", "1"/"0", "true"/"false", "on"/"off".
  std::optional<bool> Flag(const char* key);
  // A comma-separated list; a fault for an empty entry. Empty when absent.
  std::vector<std::string> List(const char* key);
  std::vector<int32_t> IntegerList(const char* key, int64_t min, int64_t max);

  // Faults for attributes not asked for and plain words beyond `words`.
  void Finish(size_t words);

  void Fault(std::string message) { m_faults.push_back(std::move(message)); }
  bool failed() const { return !m_faults.empty(); }
  const std::vector<std::string>& faults() const { return m_faults; }

 private:
  struct Attribute {
    std::string key;
    std::string value;
    bool used = false;
  };
  Attribute* Find(const char* key);
  const Attribute* Find(const char* key) const;
  std::optional<int32_t> CheckedInteger(const std::string& text, const std::string& what,
                                        int64_t min, int64_t max);

  std::string m_name;
  std::vector<std::string> m_words;
  std::vector<Attribute> m_attributes;
  std::vector<std::string> m_faults;
};

}  // namespace refhost::scenario

#endif  // ALERTMOD_HOST_SCENARIO_SCENARIO_DIRECTIVE_H_
