// The command line of alertmod-host: a command (run, validate, show-config,
// test-profile, serve, help), its arguments, and options that may stand
// anywhere among them. Options that belong to another command are refused,
// so that a mistyped invocation never does something else quietly.
//
// Pure functions; any thread.
#ifndef ALERTMOD_HOST_CLI_COMMAND_LINE_H_
#define ALERTMOD_HOST_CLI_COMMAND_LINE_H_

#include <cstdint>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "host/reference_host.h"

namespace refhost::cli {

enum class Command { kHelp, kRun, kValidate, kShowConfig, kTestProfile, kServe };

struct CommandLine {
  Command command = Command::kHelp;
  std::vector<std::string> arguments;  // after the command's name

  HostOptions host;  // module path, log threshold and file, transfer tool, key file
  bool hostKeyGiven = false;
  std::string workDir;  // empty: the command's default
  bool quiet = false;

  // run
  std::map<std::string, std::string> variables;
  bool keepWorkDir = false;
  // serve
  int seconds = 5;
  std::vector<std::pair<uint32_t, std::string>> feeds;  // stream id, video file
  bool fastFeeds = false;
  std::string updateFile;
  // test-profile
  double timeoutSeconds = 60;
};

// Parses the words after the program's name. False with `error` for an
// unknown command or option, a missing or malformed value, an option of
// another command, or the wrong number of arguments.
bool ParseCommandLine(const std::vector<std::string>& words, CommandLine* commandLine,
                      std::string* error);

// The module built beside this program or, for an installed program, the
// module installed with it.
std::string DefaultModulePath();

// The text of --help.
const char* UsageText();

}  // namespace refhost::cli

#endif  // ALERTMOD_HOST_CLI_COMMAND_LINE_H_
