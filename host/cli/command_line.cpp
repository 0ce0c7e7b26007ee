#include "host/cli/command_line.h"

#include <unistd.h>

#include <cstdlib>

#include "host/scenario/scenario_directive.h"

namespace refhost::cli {
namespace {

using scenario::ParseInteger;

constexpr int64_t kMaxLogLevel = 1000;
constexpr int64_t kMaxSeconds = 366 * 86400;

const char kUsage[] =
    "usage: alertmod-host [options] COMMAND [ARGUMENTS]\n"
    "\n"
    "The reference recording server: loads the alert module and drives it the way a\n"
    "recording server does.\n"
    "\n"
    "commands:\n"
    "  run SCENARIO          play a scenario file (see scenarios/README.md), then print\n"
    "                        a summary\n"
    "  validate FILE         read a notify.xml the way the module does and report what\n"
    "                        it made of it\n"
    "  show-config           print the configuration the module posts, passwords as ***\n"
    "  test-profile ID       send a test notification for profile ID and wait for its\n"
    "                        delivery report\n"
    "  serve                 run the module for a while with the working directory's\n"
    "                        notify.xml, optionally playing video files as cameras\n"
    "  help                  show this text\n"
    "\n"
    "options of every command:\n"
    "  --module PATH         the module to load (default: the one built beside this\n"
    "                        program)\n"
    "  --workdir DIR         the host's working directory, where notify.xml and data/\n"
    "                        live (default: the current directory; for run a new\n"
    "                        temporary directory, removed afterwards)\n"
    "  --log-level N         the host's log threshold: 25 info, 50 warning, 75 error\n"
    "  --log-file PATH       also append the module's log to PATH\n"
    "  --transfer-tool PATH  the program that \"./curl\" runs (default: curl on PATH)\n"
    "  --host-key PATH       the password key file (default: hostkey.bin in the\n"
    "                        working directory)\n"
    "  --quiet               no live log, only the result\n"
    "run:\n"
    "  --set NAME=VALUE      gives ${NAME} in the scenario this value (repeatable);\n"
    "                        other names come from the environment\n"
    "  --keep                keep the temporary working directory\n"
    "serve:\n"
    "  --seconds N           how long to run (default 5)\n"
    "  --feed ID=FILE        play FILE (H.264, H.265, MPEG-4 or MJPEG) as camera stream\n"
    "                        ID, again and again (repeatable)\n"
    "  --fast-feeds          push frames as fast as the module takes them\n"
    "  --update FILE         after Open, send FILE as a configuration update\n"
    "test-profile:\n"
    "  --timeout SECONDS     how long to wait for the delivery report (default 60)\n"
    "\n"
    "exit status: 0 success; 1 the run, test or check failed; 2 a usage error or\n"
    "unreadable input.\n";

struct CommandInfo {
  const char* name;
  Command command;
  size_t arguments;
};

constexpr CommandInfo kCommands[] = {
    {"help", Command::kHelp, 0},
    {"run", Command::kRun, 1},
    {"validate", Command::kValidate, 1},
    {"show-config", Command::kShowConfig, 0},
    {"test-profile", Command::kTestProfile, 1},
    {"serve", Command::kServe, 0},
};

// Which commands an option belongs to.
enum : unsigned {
  kAll = 0xFF,
  // validate always works in a temporary directory of its own, so that the
  // checked file never replaces a live configuration.
  kAllButValidate = kAll & ~(1u << static_cast<int>(Command::kValidate)),
  kForRun = 1u << static_cast<int>(Command::kRun),
  kForServe = 1u << static_cast<int>(Command::kServe),
  kForTest = 1u << static_cast<int>(Command::kTestProfile),
};

using Apply = bool (*)(const std::string& value, CommandLine* line);

struct OptionInfo {
  const char* name;
  bool takesValue;
  unsigned commands;
  const char* owner;  // for the message when it is used with another command
  Apply apply;
};

bool PositiveInt(const std::string& text, int64_t max, int64_t* value) {
  return ParseInteger(text, value) && *value >= 0 && *value <= max;
}

// "ID=FILE" with a decimal stream id.
bool ApplyFeed(const std::string& value, CommandLine* line) {
  const size_t equals = value.find('=');
  int64_t id = 0;
  if (equals == std::string::npos || equals + 1 == value.size()) return false;
  if (!PositiveInt(value.substr(0, equals), UINT32_MAX, &id)) return false;
  line->feeds.emplace_back(static_cast<uint32_t>(id), value.substr(equals + 1));
  return true;
}

bool ApplySet(const std::string& value, CommandLine* line) {
  const size_t equals = value.find('=');
  if (equals == std::string::npos || equals == 0) return false;
  line->variables[value.substr(0, equals)] = value.substr(equals + 1);
  return true;
}

bool ApplyLogLevel(const std::string& value, CommandLine* line) {
  int64_t level = 0;
  if (!PositiveInt(value, kMaxLogLevel, &level) || level == 0) return false;
  line->host.logThreshold = static_cast<int32_t>(level);
  return true;
}

bool ApplySeconds(const std::string& value, CommandLine* line) {
  int64_t seconds = 0;
  if (!PositiveInt(value, kMaxSeconds, &seconds)) return false;
  line->seconds = static_cast<int>(seconds);
  return true;
}

bool ApplyTimeout(const std::string& value, CommandLine* line) {
  char* end = nullptr;
  line->timeoutSeconds = std::strtod(value.c_str(), &end);
  return !value.empty() && *end == '\0' && line->timeoutSeconds > 0;
}

const OptionInfo kOptions[] = {
    {"--module", true, kAll, "",
     [](const std::string& v, CommandLine* l) { return !(l->host.modulePath = v).empty(); }},
    {"--workdir", true, kAllButValidate, "every command but validate",
     [](const std::string& v, CommandLine* l) { return !(l->workDir = v).empty(); }},
    {"--log-level", true, kAll, "", ApplyLogLevel},
    {"--log-file", true, kAll, "",
     [](const std::string& v, CommandLine* l) { return !(l->host.logFile = v).empty(); }},
    {"--transfer-tool", true, kAll, "",
     [](const std::string& v, CommandLine* l) { return !(l->host.transferTool = v).empty(); }},
    {"--host-key", true, kAll, "",
     [](const std::string& v, CommandLine* l) {
       l->hostKeyGiven = true;
       return !(l->host.hostKeyFile = v).empty();
     }},
    {"--quiet", false, kAll, "",
     [](const std::string&, CommandLine* l) { return l->quiet = true; }},
    {"--set", true, kForRun, "run", ApplySet},
    {"--keep", false, kForRun, "run",
     [](const std::string&, CommandLine* l) { return l->keepWorkDir = true; }},
    {"--seconds", true, kForServe, "serve", ApplySeconds},
    {"--feed", true, kForServe, "serve", ApplyFeed},
    {"--fast-feeds", false, kForServe, "serve",
     [](const std::string&, CommandLine* l) { return l->fastFeeds = true; }},
    {"--update", true, kForServe, "serve",
     [](const std::string& v, CommandLine* l) { return !(l->updateFile = v).empty(); }},
    {"--timeout", true, kForTest, "test-profile", ApplyTimeout},
};

const OptionInfo* FindOption(const std::string& name) {
  for (const OptionInfo& option : kOptions) {
    if (name == option.name) return &option;
  }
  return nullptr;
}

const CommandInfo* FindCommand(const std::string& name) {
  for (const CommandInfo& command : kCommands) {
    if (name == command.name) return &command;
  }
  return nullptr;
}

// Reads the option at words[*i] (and its value); advances *i past them.
bool ReadOption(const std::vector<std::string>& words, size_t* i, CommandLine* line,
                std::vector<const OptionInfo*>* given, std::string* error) {
  std::string name = words[*i];
  std::string value;
  const size_t equals = name.find('=');
  const bool inlineValue = equals != std::string::npos;
  if (inlineValue) {
    value = name.substr(equals + 1);
    name.resize(equals);
  }
  const OptionInfo* option = FindOption(name);
  if (option == nullptr) {
    *error = "unknown option " + name;
    return false;
  }
  if (option->takesValue && !inlineValue) {
    if (*i + 1 >= words.size()) {
      *error = name + " needs a value";
      return false;
    }
    value = words[++*i];
  } else if (!option->takesValue && inlineValue) {
    *error = name + " takes no value";
    return false;
  }
  if (!option->apply(value, line)) {
    *error = "bad value for " + name + ": \"" + value + "\"";
    return false;
  }
  given->push_back(option);
  return true;
}

bool CheckCommand(const CommandLine& line, const CommandInfo& command,
                  const std::vector<const OptionInfo*>& given, std::string* error) {
  const unsigned bit = 1u << static_cast<int>(line.command);
  for (const OptionInfo* option : given) {
    if ((option->commands & bit) == 0) {
      *error = std::string(option->name) + " is an option of " + option->owner + ", not of " +
               command.name;
      return false;
    }
  }
  if (line.arguments.size() < command.arguments) {
    *error = std::string(command.name) + " needs " +
             (command.command == Command::kTestProfile ? "a profile number"
              : command.command == Command::kRun       ? "a scenario file"
                                                       : "a file");
    return false;
  }
  if (line.arguments.size() > command.arguments) {
    *error = "unexpected argument \"" + line.arguments[command.arguments] + "\"";
    return false;
  }
  return true;
}

}  // namespace

std::string DefaultModulePath() {
  char exe[4096] = {0};
  const ssize_t n = readlink("/proc/self/exe", exe, sizeof(exe) - 1);
  std::string dir = n > 0 ? std::string(exe, static_cast<size_t>(n)) : std::string(".");
  dir = dir.substr(0, dir.find_last_of('/'));
  const std::string built = dir + "/../alertmod/libalertmod.so";
#ifdef ALERTMOD_INSTALLED_MODULE
  // An installed program has no build tree beside it, but the module at the
  // same place relative to the program (the prefix may have been moved).
  if (access(built.c_str(), F_OK) != 0) return dir + "/" + ALERTMOD_INSTALLED_MODULE;
#endif
  return built;
}

const char* UsageText() {
  return kUsage;
}

bool ParseCommandLine(const std::vector<std::string>& words, CommandLine* line,
                      std::string* error) {
  *line = CommandLine();
  line->host.modulePath = DefaultModulePath();
  std::vector<const OptionInfo*> given;
  const CommandInfo* command = nullptr;
  for (size_t i = 0; i < words.size(); ++i) {
    const std::string& word = words[i];
    if (word == "--help" || word == "-h") {
      line->command = Command::kHelp;
      return true;
    }
    if (word.size() > 1 && word[0] == '-') {
      if (!ReadOption(words, &i, line, &given, error)) return false;
    } else if (command == nullptr) {
      command = FindCommand(word);
      if (command == nullptr) {
        *error = "unknown command \"" + word + "\"";
        return false;
      }
      line->command = command->command;
    } else {
      line->arguments.push_back(word);
    }
  }
  if (command == nullptr) {
    *error = "no command given";
    return false;
  }
  return CheckCommand(*line, *command, given, error);
}

}  // namespace refhost::cli
