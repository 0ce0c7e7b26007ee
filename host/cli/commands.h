// The commands of alertmod-host, each a small program on top of the
// reference host and the scenario runner.
//
// Call from the main thread; a command changes the process's working
// directory while it runs and restores it afterwards.
#ifndef ALERTMOD_HOST_CLI_COMMANDS_H_
#define ALERTMOD_HOST_CLI_COMMANDS_H_

#include "host/cli/command_line.h"

namespace refhost::cli {

constexpr int kExitOk = 0;
constexpr int kExitFailed = 1;  // the run, test or check failed
constexpr int kExitUsage = 2;   // a usage error or unreadable input

// Runs the command of `line`; returns the program's exit status. Results go
// to standard output, the live log and errors to standard error.
int RunCommand(const CommandLine& line);

}  // namespace refhost::cli

#endif  // ALERTMOD_HOST_CLI_COMMANDS_H_
