#include "host/scenario/scenario_runner.h"

#include <ctime>
#include <fstream>
#include <sstream>
#include <thread>

#include "host/scenario/notify_config.h"

namespace refhost::scenario {
namespace {

using namespace std::chrono_literals;

constexpr auto kConditionPoll = 100ms;
constexpr char kConfigurationFile[] = "notify.xml";

std::string ReadTextFile(const std::string& path, bool* ok) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream text;
  text << in.rdbuf();
  *ok = static_cast<bool>(in);
  return text.str();
}

std::string ProfileList(const std::vector<AlarmRequest>& requests) {
  std::string list;
  for (const AlarmRequest& request : requests) {
    list += (list.empty() ? "" : ", ") + std::to_string(request.profile);
  }
  return (requests.size() == 1 ? "profile " : "profiles ") + list;
}

// Where a timeline entry stands in the scenario file, for the live log.
std::string LineOf(const TimelineEntry& entry) {
  return entry.line > 0 ? " (line " + std::to_string(entry.line) + ")" : std::string();
}

}  // namespace

ScenarioRunner::ScenarioRunner(const Scenario& scenario, HostOptions options, Console& console)
    : m_scenario(scenario),
      m_options(std::move(options)),
      m_console(console),
      m_cameras(scenario.cameras) {}

ScenarioRunner::~ScenarioRunner() {
  Finish();
}

RunReport ScenarioRunner::Run() {
  m_host = std::make_unique<ReferenceHost>(m_options);
  m_console.Follow(m_host->Log());
  if (PrepareConfiguration() && OpenFeeds() && StartModule()) {
    StartFeeds();
    PlayTimeline();
  }
  Finish();
  return m_report;
}

void ScenarioRunner::Fail(std::string problem) {
  m_console.Note("problem: " + problem);
  m_report.failures.push_back(std::move(problem));
}

bool ScenarioRunner::WriteTextFile(const std::string& path, const std::string& text) {
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out << text;
  out.close();
  if (out) return true;
  Fail("cannot write " + path);
  return false;
}

bool ScenarioRunner::PrepareConfiguration() {
  const ConfigSetting& config = m_scenario.config;
  std::string text;
  switch (config.source) {
    case ConfigSetting::Source::kWorkingDirectory:
      return true;
    case ConfigSetting::Source::kInline:
      text = config.delivery == ConfigSetting::Delivery::kUpdate ? NotifyElementText(config)
                                                                 : NotifyFileText(config);
      break;
    case ConfigSetting::Source::kFile: {
      bool ok = false;
      text = ReadTextFile(config.file, &ok);
      if (!ok) {
        Fail("cannot read the configuration file " + config.file);
        return false;
      }
      break;
    }
  }
  if (config.delivery == ConfigSetting::Delivery::kUpdate) {
    m_update = text;
    return true;
  }
  m_console.Note("configuration written to notify.xml");
  return WriteTextFile(kConfigurationFile, text);
}

bool ScenarioRunner::OpenFeed(const std::string& label, uint32_t streamId, const std::string& path,
                              bool realTime, FeedFormat* format) {
  FeedOptions options;
  options.path = path;
  options.streamId = streamId;
  options.realTime = realTime;
  options.loops = 0;  // again and again until the run ends
  auto feed = std::make_unique<CameraFeed>(*m_host, m_host->Frames(), options);
  std::string error;
  if (!feed->Open(&error)) {
    Fail("cannot play " + path + " for " + label + ": " + error);
    return false;
  }
  *format = feed->Format();
  m_feeds.push_back(Feed{label, streamId, std::move(feed)});
  return true;
}

bool ScenarioRunner::OpenFeeds() {
  for (CameraSetting& camera : m_cameras) {
    for (StreamSetting& stream : camera.streams) {
      if (stream.feed.empty()) continue;
      const int32_t context = stream.description.context;
      const std::string label =
          camera.name + (context == 0 ? "" : " (" + std::to_string(context) + ")");
      const uint32_t id = HostStreamId(camera.plugin, camera.device, camera.input, context);
      FeedFormat format;
      if (!OpenFeed(label, id, stream.feed, true, &format)) return false;
      if (stream.formatGiven) continue;
      stream.description.standard = static_cast<int32_t>(format.codec);
      stream.description.width = static_cast<int32_t>(format.width);
      stream.description.height = static_cast<int32_t>(format.height);
    }
  }
  for (const RawFeed& raw : m_scenario.rawFeeds) {
    FeedFormat format;
    const std::string label = raw.path.substr(raw.path.find_last_of('/') + 1);
    if (!OpenFeed(label, raw.streamId, raw.path, raw.realTime, &format)) {
      return false;
    }
  }
  return true;
}

SystemDescription ScenarioRunner::BuildSystem() const {
  SystemDescription system = m_scenario.system;
  for (const CameraSetting& camera : m_cameras) {
    CameraDescription description;
    description.name = camera.name;
    description.plugin = camera.plugin;
    description.device = camera.device;
    description.input = camera.input;
    for (const StreamSetting& stream : camera.streams)
      description.streams.push_back(stream.description);
    system.cameras.push_back(description);
  }
  return system;
}

bool ScenarioRunner::StartModule() {
  std::string error;
  if (!m_host->Start(&error)) {
    Fail("cannot load the module " + m_options.modulePath + ": " + error);
    return false;
  }
  m_console.Note("module loaded from " + m_options.modulePath + " and opened");
  if (!m_update.empty()) {
    m_host->SendConfigurationUpdate(m_update);
    m_console.Note("configuration sent as an update");
  }
  if (m_scenario.DescribesSystem()) {
    const SystemDescription system = BuildSystem();
    m_host->SendHostDocument(BuildSystemDocument(system));
    m_console.Note("system document sent: " + std::to_string(system.cameras.size()) +
                   " camera(s), " + std::to_string(system.events.size()) + " event(s), " +
                   std::to_string(system.groups.size()) + " group(s)");
  }
  return true;
}

void ScenarioRunner::StartFeeds() {
  for (Feed& feed : m_feeds) {
    std::string error;
    if (!feed.feed->Start(&error)) Fail("cannot start the feed of " + feed.label + ": " + error);
  }
  if (!m_feeds.empty()) m_console.SetProgress([this] { return Progress(); });
  m_start = std::chrono::steady_clock::now();
}

std::string ScenarioRunner::Progress() const {
  std::string text;
  for (const Feed& feed : m_feeds) {
    const FeedStats stats = feed.feed->Stats();
    text += (text.empty() ? "" : " | ") + feed.label + ": " + std::to_string(stats.frames) +
            " sent, " + std::to_string(stats.kept) + " kept";
  }
  const FramePoolCounts frames = m_host->Frames().Counts();
  return text + " | held by the module: " + std::to_string(frames.outstanding);
}

void ScenarioRunner::PlayTimeline() {
  for (const TimelineEntry& entry : m_scenario.timeline) {
    std::this_thread::sleep_until(m_start +
                                  std::chrono::duration_cast<std::chrono::steady_clock::duration>(
                                      std::chrono::duration<double>(entry.at)));
    switch (entry.kind) {
      case TimelineEntry::Kind::kAlarm:
        SendAlarm(entry);
        break;
      case TimelineEntry::Kind::kWait:
        AwaitCondition(entry);
        break;
      case TimelineEntry::Kind::kStop:
        m_console.Note("stop" + LineOf(entry));
        return;
    }
  }
}

void ScenarioRunner::SendAlarm(const TimelineEntry& entry) {
  AlarmDocument alarm;
  alarm.serverSerial = m_scenario.serverSerial;
  alarm.serverDescription = m_scenario.serverDescription;
  timespec now{};
  clock_gettime(CLOCK_REALTIME, &now);
  for (AlarmRequest request : entry.requests) {
    request.time = static_cast<int64_t>(now.tv_sec);
    request.milliseconds = static_cast<int32_t>(now.tv_nsec / 1000000);
    alarm.requests.push_back(request);
    if (entry.test) {
      ++m_report.tests;
    } else {
      ++(request.alarm.value_or(1) != 0 ? m_report.alarmStarts : m_report.alarmEnds);
    }
  }
  m_console.Note(entry.label + " for " + ProfileList(entry.requests) + LineOf(entry));
  m_host->WriteDocument(BuildAlarmDocument(alarm), kAlarmSender);
}

bool ScenarioRunner::ConditionHolds(const WaitSetting& wait, int* reports) const {
  *reports = 0;
  for (const ProfileStatusReport& status : m_host->Config().StatusReports()) {
    const bool delivery = status.status == 0 || status.status == 1;
    if (delivery && (!wait.profile || *wait.profile == status.id)) ++*reports;
  }
  if (*reports < wait.reports) return false;
  return wait.logText.empty() || m_host->Log().Contains(wait.logText);
}

void ScenarioRunner::AwaitCondition(const TimelineEntry& entry) {
  const WaitSetting& wait = entry.wait;
  std::string what;
  if (wait.reports > 0) {
    what = std::to_string(wait.reports) + " delivery report(s)" +
           (wait.profile ? " of profile " + std::to_string(*wait.profile) : "");
  }
  if (!wait.logText.empty()) what += (what.empty() ? "" : " and ") + ("\"" + wait.logText + "\"");
  m_console.Note("waiting for " + what + LineOf(entry));
  const auto deadline = std::chrono::steady_clock::now() +
                        std::chrono::duration_cast<std::chrono::steady_clock::duration>(
                            std::chrono::duration<double>(wait.timeoutSeconds));
  int reports = 0;
  while (!ConditionHolds(wait, &reports)) {
    if (std::chrono::steady_clock::now() >= deadline) {
      return Fail("line " + std::to_string(entry.line) + ": no " + what + " within " +
                  std::to_string(static_cast<int>(wait.timeoutSeconds)) + " s (" +
                  std::to_string(reports) + " report(s) seen)");
    }
    std::this_thread::sleep_for(kConditionPoll);
  }
}

void ScenarioRunner::Finish() {
  if (!m_host) return;
  m_console.SetProgress(nullptr);
  // The feeds write to the host, so they end first.
  for (Feed& feed : m_feeds) {
    feed.feed->Stop();
    std::string error;
    if (!feed.feed->Wait(&error)) Fail("the feed of " + feed.label + " broke off: " + error);
  }
  m_host->Stop();
  m_console.Stop();
  m_report.statuses = m_host->Config().StatusReports();
  m_report.profileNames = ProfileNames(m_host->Config().Configuration());
  m_report.log = m_host->Log().Lines();
  for (const Feed& feed : m_feeds) {
    m_report.feeds.push_back(
        FeedReport{feed.label, feed.streamId, feed.feed->Format(), feed.feed->Stats()});
  }
  m_report.frames = m_host->Frames().Counts();
  m_report.frameFaults = m_host->Frames().FaultReport();
  m_feeds.clear();
  m_host.reset();
}

}  // namespace refhost::scenario
