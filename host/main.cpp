// alertmod-host: the reference recording server. It loads the alert module
// and drives it as a recording server does: it plays scenarios, checks and
// shows the module's configuration, sends test notifications, or simply runs
// the module for a while. `alertmod-host --help` lists the commands.
#include <cstdio>
#include <string>
#include <vector>

#include "host/cli/command_line.h"
#include "host/cli/commands.h"

int main(int argc, char** argv) {
  const std::vector<std::string> words(argv + 1, argv + argc);
  refhost::cli::CommandLine line;
  std::string error;
  if (!refhost::cli::ParseCommandLine(words, &line, &error)) {
    fprintf(stderr, "alertmod-host: %s\nRun \"alertmod-host --help\" for the commands.\n",
            error.c_str());
    return refhost::cli::kExitUsage;
  }
  return refhost::cli::RunCommand(line);
}
