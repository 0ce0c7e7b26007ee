// alertmod-host: the reference recording server. Loads the alert module,
// opens it, lends it its threads, runs for a while and stops cleanly, then
// prints what the module logged.
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "host/camera_feed.h"
#include "host/reference_host.h"

namespace {

struct CommandLine {
  refhost::HostOptions host;
  int seconds = 5;
  bool help = false;
  bool showConfig = false;
  std::string updateFile;
  std::vector<std::pair<uint32_t, std::string>> feeds;  // stream id, video file
  bool fastFeeds = false;
  std::string error;
};

const char kUsage[] =
    "usage: alertmod-host [options]\n"
    "\n"
    "Loads the alert module, opens it, runs it for a while and stops it.\n"
    "\n"
    "options:\n"
    "  --module PATH      the module to load (default: the one built beside this program)\n"
    "  --seconds N        how long to run (default 5)\n"
    "  --log-level N      host log threshold: 25 info, 50 warning, 75 error (default 25)\n"
    "  --log-file PATH    write the host log to PATH instead of standard error\n"
    "  --transfer-tool P  the program that \"./curl\" runs (default: curl on PATH)\n"
    "  --host-key PATH    the password key file (default: hostkey.bin)\n"
    "  --update FILE      after Open, send FILE as a configuration update (a Notify\n"
    "                     element, or a whole Trellan document)\n"
    "  --show-config      print the configuration the module posted last, passwords\n"
    "                     shown as ***\n"
    "  --feed ID=FILE     play the video FILE (H.264, H.265, MPEG-4 or MJPEG) as camera\n"
    "                     stream ID, again and again while the module runs; repeatable\n"
    "  --fast-feeds       push feed frames as fast as the module takes them instead of\n"
    "                     at the files' frame rates\n"
    "  --help             show this text\n";

std::string DefaultModulePath() {
  char exe[4096] = {0};
  ssize_t n = readlink("/proc/self/exe", exe, sizeof(exe) - 1);
  std::string dir = n > 0 ? std::string(exe, static_cast<size_t>(n)) : std::string();
  dir = dir.substr(0, dir.find_last_of('/'));
  return dir + "/../alertmod/libalertmod.so";
}

bool ParseInt(const char* text, int* value) {
  char* end = nullptr;
  long parsed = strtol(text, &end, 10);
  if (end == text || *end != '\0') return false;
  *value = static_cast<int>(parsed);
  return true;
}

// "ID=FILE" with a decimal stream id.
bool ParseFeed(const std::string& text, std::vector<std::pair<uint32_t, std::string>>* feeds) {
  const size_t equals = text.find('=');
  int id = 0;
  if (equals == std::string::npos || equals + 1 == text.size()) return false;
  if (!ParseInt(text.substr(0, equals).c_str(), &id) || id < 0) return false;
  feeds->emplace_back(static_cast<uint32_t>(id), text.substr(equals + 1));
  return true;
}

CommandLine Parse(int argc, char** argv) {
  CommandLine cl;
  cl.host.modulePath = DefaultModulePath();
  for (int i = 1; i < argc; ++i) {
    std::string arg = argv[i];
    const char* value = i + 1 < argc ? argv[i + 1] : nullptr;
    int number = 0;
    if (arg == "--help" || arg == "-h") {
      cl.help = true;
    } else if (arg == "--module" && value) {
      cl.host.modulePath = argv[++i];
    } else if (arg == "--log-file" && value) {
      cl.host.logFile = argv[++i];
    } else if (arg == "--transfer-tool" && value) {
      cl.host.transferTool = argv[++i];
    } else if (arg == "--host-key" && value) {
      cl.host.hostKeyFile = argv[++i];
    } else if (arg == "--update" && value) {
      cl.updateFile = argv[++i];
    } else if (arg == "--feed" && value && ParseFeed(value, &cl.feeds)) {
      ++i;
    } else if (arg == "--fast-feeds") {
      cl.fastFeeds = true;
    } else if (arg == "--show-config") {
      cl.showConfig = true;
    } else if (arg == "--seconds" && value && ParseInt(value, &number) && number >= 0) {
      cl.seconds = number;
      ++i;
    } else if (arg == "--log-level" && value && ParseInt(value, &number)) {
      cl.host.logThreshold = number;
      ++i;
    } else {
      cl.error = "unknown or incomplete option: " + arg;
      return cl;
    }
  }
  return cl;
}

void PrintModuleLog(const refhost::ReferenceHost& host, refhost::LogSink& log) {
  (void)host;
  printf("The module logged %zu line(s):\n", log.Lines().size());
  for (const refhost::LogLine& line : log.Lines()) {
    printf("  %-5s %s\n", refhost::LogSink::LevelName(line.level).c_str(), line.text.c_str());
  }
}

bool ReadWholeFile(const std::string& path, std::string* text) {
  std::ifstream in(path, std::ios::binary);
  if (!in) return false;
  std::ostringstream content;
  content << in.rdbuf();
  *text = content.str();
  return true;
}

using Feeds = std::vector<std::unique_ptr<refhost::CameraFeed>>;

bool StartFeeds(const CommandLine& cl, refhost::ReferenceHost& host, Feeds* feeds) {
  for (const auto& entry : cl.feeds) {
    refhost::FeedOptions options;
    options.streamId = entry.first;
    options.path = entry.second;
    options.realTime = !cl.fastFeeds;
    options.loops = 0;
    feeds->push_back(std::make_unique<refhost::CameraFeed>(host, host.Frames(), options));
    std::string error;
    if (!feeds->back()->Start(&error)) {
      fprintf(stderr, "alertmod-host: cannot play %s: %s\n", entry.second.c_str(), error.c_str());
      return false;
    }
  }
  return true;
}

void PrintFeeds(const CommandLine& cl, const Feeds& feeds, refhost::FramePool& frames) {
  for (size_t i = 0; i < feeds.size(); ++i) {
    const refhost::FeedStats stats = feeds[i]->Stats();
    printf("Stream %u (%s): %llu frames, %llu kept, %llu refused\n", cl.feeds[i].first,
           cl.feeds[i].second.c_str(), static_cast<unsigned long long>(stats.frames),
           static_cast<unsigned long long>(stats.kept),
           static_cast<unsigned long long>(stats.refused));
  }
  const std::string faults = frames.FaultReport();
  if (feeds.empty()) return;
  printf("Frame buffers: %s\n", faults.empty() ? "all returned" : faults.c_str());
}

void PrintConfiguration(refhost::ConfigStore& store) {
  std::string configuration = store.Configuration();
  if (configuration.empty()) {
    printf("The module posted no configuration.\n");
    return;
  }
  printf("Configuration posted by the module:\n%s",
         refhost::MaskedConfiguration(configuration).c_str());
}

}  // namespace

int main(int argc, char** argv) {
  CommandLine cl = Parse(argc, argv);
  if (cl.help) {
    fputs(kUsage, stdout);
    return 0;
  }
  if (!cl.error.empty()) {
    fprintf(stderr, "alertmod-host: %s\n\n%s", cl.error.c_str(), kUsage);
    return 2;
  }
  std::string update;
  if (!cl.updateFile.empty() && !ReadWholeFile(cl.updateFile, &update)) {
    fprintf(stderr, "alertmod-host: cannot read %s\n", cl.updateFile.c_str());
    return 2;
  }
  refhost::ReferenceHost host(cl.host);
  std::string error;
  if (!host.Start(&error)) {
    fprintf(stderr, "alertmod-host: cannot load %s: %s\n", cl.host.modulePath.c_str(),
            error.c_str());
    return 1;
  }
  printf("Module loaded from %s; running for %d s.\n", cl.host.modulePath.c_str(), cl.seconds);
  if (!cl.updateFile.empty()) host.SendConfigurationUpdate(update);
  Feeds feeds;
  const bool fed = StartFeeds(cl, host, &feeds);
  if (fed) std::this_thread::sleep_for(std::chrono::seconds(cl.seconds));
  for (auto& feed : feeds) feed->Stop();  // before the host, which they write to
  host.Stop();
  printf("Module stopped.\n");
  PrintFeeds(cl, feeds, host.Frames());
  PrintModuleLog(host, host.Log());
  if (cl.showConfig) PrintConfiguration(host.Config());
  return fed ? 0 : 1;
}
