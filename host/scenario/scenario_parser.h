// Reads a scenario file (format: scenarios/README.md) into a Scenario.
//
// The parser checks everything it can without running anything: directive
// names and their attributes, numbers and their ranges, names that must be
// defined before use, and the timeline's order. Files named in the scenario
// are not opened here; relative paths are taken from `baseDir`.
//
// Pure functions apart from reading the file in LoadScenario; any thread.
#ifndef ALERTMOD_HOST_SCENARIO_SCENARIO_PARSER_H_
#define ALERTMOD_HOST_SCENARIO_SCENARIO_PARSER_H_

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "host/scenario/scenario.h"
#include "host/scenario/scenario_lexer.h"

namespace refhost::scenario {

struct Diagnostic {
  int line = 0;  // 1-based; 0 for the file as a whole
  std::string message;
};

struct ParseOptions {
  std::string name = "scenario";  // used in messages
  std::string baseDir = ".";      // relative file names are taken from here
  VariableLookup variables;       // for ${NAME}; none set when empty
};

struct ParseResult {
  Scenario scenario;
  std::vector<Diagnostic> errors;  // every fault found, in line order
  bool ok() const { return errors.empty(); }
};

// Parses the text of a scenario. The result's scenario is meaningful only
// when ok().
ParseResult ParseScenario(const std::string& text, const ParseOptions& options);

// Reads and parses the file at `path`; its folder is the base directory and
// its path the name. A file that cannot be read gives one error at line 0.
ParseResult LoadScenario(const std::string& path, const VariableLookup& variables);

// "name:line: message" (or "name: message" for line 0).
std::string FormatDiagnostic(const std::string& name, const Diagnostic& diagnostic);

}  // namespace refhost::scenario

#endif  // ALERTMOD_HOST_SCENARIO_SCENARIO_PARSER_H_
