#include "host/scenario/scenario_lexer.h"

#include <cctype>
#include <cstdlib>
#include <utility>

namespace refhost::scenario {
namespace {

bool IsKeyCharacter(char c) {
  return std::isalnum(static_cast<unsigned char>(c)) != 0 || c == '-' || c == '_';
}

// Reads the words of one line from left to right.
class LineLexer {
 public:
  LineLexer(const std::string& line, const VariableLookup& variables)
      : m_line(line), m_variables(variables) {}

  bool Split(std::vector<Token>* tokens, std::string* error) {
    tokens->clear();
    for (;;) {
      while (m_pos < m_line.size() && std::isspace(static_cast<unsigned char>(m_line[m_pos]))) {
        ++m_pos;
      }
      if (m_pos >= m_line.size() || m_line[m_pos] == '#') return true;
      Token token;
      if (!ReadWord(&token)) {
        *error = m_error;
        return false;
      }
      tokens->push_back(std::move(token));
    }
  }

 private:
  // One word up to the next blank outside quotes. The first "=" outside
  // quotes after a plain name makes the word key=value.
  bool ReadWord(Token* token) {
    std::string text;
    bool plainSoFar = true;  // nothing quoted or substituted yet
    while (m_pos < m_line.size() && !std::isspace(static_cast<unsigned char>(m_line[m_pos]))) {
      const char c = m_line[m_pos];
      if (c == '=' && plainSoFar && token->key.empty() && !text.empty() && PlainKey(text)) {
        token->key = std::move(text);
        text.clear();
        ++m_pos;
      } else if (c == '"') {
        plainSoFar = false;
        if (!ReadQuoted(&text)) return false;
      } else if (c == '$') {
        plainSoFar = false;
        if (!ReadVariable(&text)) return false;
      } else {
        text += c;
        ++m_pos;
      }
    }
    token->value = std::move(text);
    return true;
  }

  static bool PlainKey(const std::string& text) {
    for (char c : text) {
      if (!IsKeyCharacter(c)) return false;
    }
    return true;
  }

  bool ReadQuoted(std::string* text) {
    const size_t open = m_pos++;
    while (m_pos < m_line.size()) {
      const char c = m_line[m_pos];
      if (c == '"') {
        ++m_pos;
        return true;
      }
      if (c == '$') {
        if (!ReadVariable(text)) return false;
      } else if (c == '\\') {
        if (!ReadEscape(text)) return false;
      } else {
        *text += c;
        ++m_pos;
      }
    }
    return Fail("unterminated quote starting at column " + std::to_string(open + 1));
  }

  bool ReadEscape(std::string* text) {
    if (m_pos + 1 >= m_line.size()) return Fail("a backslash ends the line");
    const char c = m_line[m_pos + 1];
    switch (c) {
      case '"':
      case '\\':
        *text += c;
        break;
      case 'n':
        *text += '\n';
        break;
      case 't':
        *text += '\t';
        break;
      default:
        return Fail(std::string("unknown escape \\") + c + " (use \\\" \\\\ \\n or \\t)");
    }
    m_pos += 2;
    return true;
  }

  // "$$", "${NAME}" or "${NAME:-default}"; a lone "$" is kept as it is.
  bool ReadVariable(std::string* text) {
    if (m_line.compare(m_pos, 2, "$$") == 0) {
      *text += '$';
      m_pos += 2;
      return true;
    }
    if (m_line.compare(m_pos, 2, "${") != 0) {
      *text += '$';
      ++m_pos;
      return true;
    }
    const size_t close = m_line.find('}', m_pos);
    if (close == std::string::npos) return Fail("\"${\" without a closing \"}\"");
    std::string name = m_line.substr(m_pos + 2, close - m_pos - 2);
    std::optional<std::string> fallback;
    const size_t dash = name.find(":-");
    if (dash != std::string::npos) {
      fallback = name.substr(dash + 2);
      name.resize(dash);
    }
    m_pos = close + 1;
    return Substitute(name, fallback, text);
  }

  bool Substitute(const std::string& name, const std::optional<std::string>& fallback,
                  std::string* text) {
    if (name.empty() || !PlainKey(name)) return Fail("bad variable name \"" + name + "\"");
    std::optional<std::string> value = m_variables ? m_variables(name) : std::nullopt;
    if (!value) value = fallback;
    if (!value) return Fail("variable " + name + " is not set");
    *text += *value;
    return true;
  }

  bool Fail(std::string message) {
    m_error = std::move(message);
    return false;
  }

  const std::string& m_line;
  const VariableLookup& m_variables;
  size_t m_pos = 0;
  std::string m_error;
};

}  // namespace

VariableLookup EnvironmentVariables(std::map<std::string, std::string> overrides) {
  return [overrides = std::move(overrides)](const std::string& name) -> std::optional<std::string> {
    const auto found = overrides.find(name);
    if (found != overrides.end()) return found->second;
    const char* value = std::getenv(name.c_str());
    if (value == nullptr) return std::nullopt;
    return std::string(value);
  };
}

bool SplitLine(const std::string& line, const VariableLookup& variables, std::vector<Token>* tokens,
               std::string* error) {
  LineLexer lexer(line, variables);
  return lexer.Split(tokens, error);
}

}  // namespace refhost::scenario
