#include "host/cli/commands.h"

#include <climits>
#include <cstdio>
#include <fstream>
#include <sstream>

#include "host/cli/config_report.h"
#include "host/cli/work_directory.h"
#include "host/config_store.h"
#include "host/scenario/console.h"
#include "host/scenario/run_summary.h"
#include "host/scenario/scenario_directive.h"
#include "host/scenario/scenario_parser.h"
#include "host/scenario/scenario_runner.h"

namespace refhost::cli {
namespace {

using scenario::RunReport;
using scenario::Scenario;
using scenario::TimelineEntry;

constexpr char kConfigurationFile[] = "notify.xml";
constexpr char kHostKeyFile[] = "hostkey.bin";
constexpr char kLoadedLine[] = "Loaded configuration from disk successfully";
constexpr char kTestMessage[] = "Testing Profile";

int Complain(const std::string& message, int status) {
  fprintf(stderr, "alertmod-host: %s\n", message.c_str());
  return status;
}

bool ReadWholeFile(const std::string& path, std::string* text) {
  std::ifstream in(path, std::ios::binary);
  if (!in) return false;
  std::ostringstream content;
  content << in.rdbuf();
  *text = content.str();
  return static_cast<bool>(in) || in.eof();
}

bool WriteWholeFile(const std::string& path, const std::string& text) {
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out << text;
  out.close();
  return static_cast<bool>(out);
}

// Paths given on the command line are taken from where the program was
// started, before any command changes the working directory.
HostOptions ResolvedHostOptions(const CommandLine& line) {
  HostOptions options = line.host;
  options.modulePath = AbsolutePath(options.modulePath);
  options.logFile = AbsolutePath(options.logFile);
  if (options.transferTool.find('/') != std::string::npos) {
    options.transferTool = AbsolutePath(options.transferTool);
  }
  if (line.hostKeyGiven) options.hostKeyFile = AbsolutePath(options.hostKeyFile);
  // The console shows the log; a log file gets its own copy.
  options.echoLog = !options.logFile.empty();
  return options;
}

RunReport Play(const Scenario& scenario, const CommandLine& line, const HostOptions& options) {
  scenario::Console console(stderr, line.quiet);
  scenario::ScenarioRunner runner(scenario, options, console);
  return runner.Run();
}

bool PlayAndSummarise(const Scenario& scenario, const CommandLine& line,
                      const HostOptions& options) {
  const RunReport report = Play(scenario, line, options);
  PrintSummary(report, stdout);
  return scenario::RunSucceeded(report);
}

bool EnterWorkDirectory(const CommandLine& line, bool temporary, WorkDirectory* directory) {
  std::string error;
  if (!directory->Enter(line.workDir, temporary, &error)) {
    Complain(error, kExitFailed);
    return false;
  }
  if (line.keepWorkDir) directory->Keep();
  if (!line.quiet) {
    const bool removed = directory->temporary() && !line.keepWorkDir;
    fprintf(stderr, "alertmod-host: working directory %s%s\n", directory->path().c_str(),
            removed ? " (removed afterwards; --keep keeps it)" : "");
  }
  return true;
}

int RunScenarioCommand(const CommandLine& line) {
  const std::string path = AbsolutePath(line.arguments[0]);
  scenario::ParseResult parsed =
      scenario::LoadScenario(path, scenario::EnvironmentVariables(line.variables));
  if (!parsed.ok()) {
    for (const scenario::Diagnostic& error : parsed.errors) {
      fprintf(stderr, "%s\n", scenario::FormatDiagnostic(line.arguments[0], error).c_str());
    }
    return kExitUsage;
  }
  const HostOptions options = ResolvedHostOptions(line);
  WorkDirectory directory;
  if (!EnterWorkDirectory(line, true, &directory)) return kExitFailed;
  return PlayAndSummarise(parsed.scenario, line, options) ? kExitOk : kExitFailed;
}

int ServeCommand(const CommandLine& line) {
  Scenario scenario;
  scenario.name = "serve";
  for (const auto& [id, file] : line.feeds) {
    scenario.rawFeeds.push_back(scenario::RawFeed{id, AbsolutePath(file), !line.fastFeeds});
  }
  if (!line.updateFile.empty()) {
    scenario.config.source = scenario::ConfigSetting::Source::kFile;
    scenario.config.delivery = scenario::ConfigSetting::Delivery::kUpdate;
    scenario.config.file = AbsolutePath(line.updateFile);
  }
  TimelineEntry stop;
  stop.kind = TimelineEntry::Kind::kStop;
  stop.at = line.seconds;
  scenario.timeline.push_back(stop);
  const HostOptions options = ResolvedHostOptions(line);
  WorkDirectory directory;
  if (!EnterWorkDirectory(line, false, &directory)) return kExitFailed;
  return PlayAndSummarise(scenario, line, options) ? kExitOk : kExitFailed;
}

// The profile numbers of the working directory's notify.xml, listed for a
// message; empty when the file is missing or has none.
std::string ConfiguredProfiles(const std::map<int32_t, std::string>& names) {
  std::string list;
  for (const auto& entry : names) list += (list.empty() ? "" : ", ") + std::to_string(entry.first);
  return list.empty() ? "none" : list;
}

constexpr int32_t kStatusDelivered = 0;
constexpr int32_t kStatusFailed = 1;
constexpr int32_t kNoStatus = -2;

// The last delivery report (delivered or failed) for `profile`, or kNoStatus.
int32_t DeliveryStatus(const RunReport& report, int32_t profile) {
  for (auto status = report.statuses.rbegin(); status != report.statuses.rend(); ++status) {
    if (status->id == profile &&
        (status->status == kStatusDelivered || status->status == kStatusFailed)) {
      return status->status;
    }
  }
  return kNoStatus;
}

Scenario TestScenario(int32_t profile, double timeoutSeconds) {
  Scenario scenario;
  scenario.name = "test-profile";
  TimelineEntry test;
  test.label = "test notification";
  test.test = true;
  AlarmRequest request;
  request.source.reset();
  request.profile = profile;
  request.message = kTestMessage;
  test.requests.push_back(request);
  TimelineEntry wait;
  wait.kind = TimelineEntry::Kind::kWait;
  wait.wait.reports = 1;
  wait.wait.profile = profile;
  wait.wait.timeoutSeconds = timeoutSeconds;
  scenario.timeline = {test, wait};
  return scenario;
}

int TestProfileCommand(const CommandLine& line) {
  int64_t id = 0;
  if (!scenario::ParseInteger(line.arguments[0], &id) || id < 1 || id > INT32_MAX) {
    return Complain("test-profile needs a profile number, not \"" + line.arguments[0] + "\"",
                    kExitUsage);
  }
  const int32_t profile = static_cast<int32_t>(id);
  const HostOptions options = ResolvedHostOptions(line);
  WorkDirectory directory;
  if (!EnterWorkDirectory(line, false, &directory)) return kExitFailed;
  std::string file;
  ReadWholeFile(kConfigurationFile, &file);
  const auto names = scenario::ProfileNames(file);
  if (names.count(profile) == 0) {
    return Complain(directory.path() + "/notify.xml has no profile " + std::to_string(profile) +
                        " (profiles: " + ConfiguredProfiles(names) + ")",
                    kExitFailed);
  }
  RunReport report = Play(TestScenario(profile, line.timeoutSeconds), line, options);
  const int32_t status = DeliveryStatus(report, profile);
  if (status == kStatusFailed) {
    // The run itself went well, but what it was for did not.
    const std::string reason = scenario::DeliveryFailureReason(report);
    report.failures.push_back(
        "test notification for profile " + std::to_string(profile) +
        " not delivered: " + (reason.empty() ? "the module's log tells no reason" : reason));
  }
  PrintSummary(report, stdout);
  printf("Profile %d \"%s\": %s\n", profile, names.at(profile).c_str(),
         status == kStatusDelivered ? "test notification delivered"
         : status == kStatusFailed  ? "test notification FAILED"
                                    : "no delivery report");
  return status == kStatusDelivered && scenario::RunSucceeded(report) ? kExitOk : kExitFailed;
}

// What the module made of the working directory's configuration when it was
// loaded and opened once, without the lent threads.
struct OpenedModule {
  std::string error;          // the module could not be loaded
  std::string configuration;  // as posted; empty when none was
  std::vector<LogLine> log;
};

OpenedModule OpenModuleOnce(const HostOptions& options) {
  OpenedModule opened;
  ReferenceHost host(options);
  if (!host.LoadModule(&opened.error)) return opened;
  host.OpenModule();
  host.Stop();
  opened.configuration = host.Config().Configuration();
  opened.log = host.Log().Lines();
  return opened;
}

bool LoggedAtLeast(const OpenedModule& opened, int32_t level) {
  for (const LogLine& line : opened.log) {
    if (line.level >= level) return true;
  }
  return false;
}

bool Logged(const OpenedModule& opened, const char* text) {
  for (const LogLine& line : opened.log) {
    if (line.text.find(text) != std::string::npos) return true;
  }
  return false;
}

void PrintValidation(const std::string& name, const OpenedModule& opened,
                     const std::vector<std::string>& dropped, bool valid) {
  printf("%s: %s\n", name.c_str(), valid ? "valid" : "NOT VALID");
  printf("The module logged:\n");
  for (const LogLine& line : opened.log) {
    printf("  %-5s %s\n", LogSink::LevelName(line.level).c_str(), line.text.c_str());
  }
  if (opened.configuration.empty()) {
    printf("The module posted no configuration.\n");
  } else if (!Logged(opened, kLoadedLine)) {
    printf("The module could not use the file and goes on with its defaults.\n");
  } else {
    printf("The module's configuration:\n");
    for (const std::string& text : DescribeConfiguration(opened.configuration)) {
      printf("  %s\n", text.c_str());
    }
  }
  if (dropped.empty()) return;
  printf("Left out by the module:\n");
  for (const std::string& text : dropped) printf("  %s\n", text.c_str());
}

int ValidateCommand(const CommandLine& line) {
  const std::string path = AbsolutePath(line.arguments[0]);
  std::string file;
  if (!ReadWholeFile(path, &file)) return Complain("cannot read " + line.arguments[0], kExitUsage);
  HostOptions options = ResolvedHostOptions(line);
  // Protected passwords open only with the key of the host that wrote them,
  // which it keeps beside its notify.xml.
  const std::string besideFile = DirectoryOf(path) + "/" + kHostKeyFile;
  if (!line.hostKeyGiven && FileExists(besideFile)) options.hostKeyFile = besideFile;
  WorkDirectory directory;
  std::string error;
  if (!directory.Enter("", true, &error)) return Complain(error, kExitFailed);
  if (!WriteWholeFile(kConfigurationFile, file))
    return Complain("cannot write notify.xml", kExitFailed);
  const OpenedModule opened = OpenModuleOnce(options);
  if (!opened.error.empty())
    return Complain("cannot load the module: " + opened.error, kExitFailed);
  const std::vector<std::string> dropped = DroppedEntries(file, opened.configuration);
  const bool valid = Logged(opened, kLoadedLine) && !LoggedAtLeast(opened, kLogError) &&
                     !opened.configuration.empty() && dropped.empty();
  PrintValidation(line.arguments[0], opened, dropped, valid);
  return valid ? kExitOk : kExitFailed;
}

int ShowConfigCommand(const CommandLine& line) {
  const HostOptions options = ResolvedHostOptions(line);
  WorkDirectory directory;
  std::string error;
  if (!directory.Enter(line.workDir, false, &error)) return Complain(error, kExitFailed);
  const OpenedModule opened = OpenModuleOnce(options);
  if (!opened.error.empty())
    return Complain("cannot load the module: " + opened.error, kExitFailed);
  for (const LogLine& text : opened.log) {
    if (text.level > kLogInfo) {
      fprintf(stderr, "module %s: %s\n", LogSink::LevelName(text.level).c_str(), text.text.c_str());
    }
  }
  if (opened.configuration.empty())
    return Complain("the module posted no configuration", kExitFailed);
  printf("Configuration posted by the module:\n%s",
         MaskedConfiguration(opened.configuration).c_str());
  return kExitOk;
}

}  // namespace

int RunCommand(const CommandLine& line) {
  switch (line.command) {
    case Command::kHelp:
      fputs(UsageText(), stdout);
      return kExitOk;
    case Command::kRun:
      return RunScenarioCommand(line);
    case Command::kServe:
      return ServeCommand(line);
    case Command::kValidate:
      return ValidateCommand(line);
    case Command::kShowConfig:
      return ShowConfigCommand(line);
    case Command::kTestProfile:
      return TestProfileCommand(line);
  }
  return kExitUsage;
}

}  // namespace refhost::cli
