// The words of one scenario line. A line is a directive followed by words
// separated by blanks; a word is either a plain value or key=value. Double
// quotes keep blanks and "#" inside a value and understand \" \\ \n \t; a "#"
// outside quotes at the start of a word ends the line. ${NAME} anywhere in a
// word (quoted or not) is replaced by the variable's value, ${NAME:-text} by
// the text when the variable is not set, and $$ stands for one "$". A value
// put in by a variable is taken as it is: it never splits a word.
//
// Pure functions; any thread.
#ifndef ALERTMOD_HOST_SCENARIO_SCENARIO_LEXER_H_
#define ALERTMOD_HOST_SCENARIO_SCENARIO_LEXER_H_

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace refhost::scenario {

struct Token {
  std::string key;  // empty for a plain value
  std::string value;
};

// The value of a variable, or nothing when it is not set.
using VariableLookup = std::function<std::optional<std::string>(const std::string& name)>;

// Variables from `overrides` first, then the process environment.
VariableLookup EnvironmentVariables(std::map<std::string, std::string> overrides = {});

// Splits `line` into `tokens` (empty for a blank or comment line). Returns
// false with `error` for an unterminated quote, an unknown escape, a "${"
// without "}", or a variable that is not set and has no default.
bool SplitLine(const std::string& line, const VariableLookup& variables, std::vector<Token>* tokens,
               std::string* error);

}  // namespace refhost::scenario

#endif  // ALERTMOD_HOST_SCENARIO_SCENARIO_LEXER_H_
