// ScenarioRunner plays one scenario with a ReferenceHost in the current
// working directory: it writes or sends the module's configuration, starts
// the module, describes the recording system to it, plays the camera feeds
// and works through the timeline; then it stops everything and reports what
// happened. The live log goes to a Console.
//
// Use from one thread. Only one runner (one loaded module) at a time.
#ifndef ALERTMOD_HOST_SCENARIO_SCENARIO_RUNNER_H_
#define ALERTMOD_HOST_SCENARIO_SCENARIO_RUNNER_H_

#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include "host/camera_feed.h"
#include "host/reference_host.h"
#include "host/scenario/console.h"
#include "host/scenario/run_summary.h"
#include "host/scenario/scenario.h"

namespace refhost::scenario {

// The module identifier that alarm documents come from: the host's own
// event module, anything but the alert module's 0xC0000.
constexpr uint32_t kAlarmSender = 0x20000;

class ScenarioRunner {
 public:
  ScenarioRunner(const Scenario& scenario, HostOptions options, Console& console);
  ~ScenarioRunner();

  ScenarioRunner(const ScenarioRunner&) = delete;
  ScenarioRunner& operator=(const ScenarioRunner&) = delete;

  // Plays the scenario and returns what happened. A configuration that
  // cannot be written, a feed that cannot be opened or a module that
  // cannot be loaded ends the run early and is one of the report's
  // failures; so is a wait whose condition never came.
  RunReport Run();

 private:
  struct Feed {
    std::string label;
    uint32_t streamId = 0;
    std::unique_ptr<CameraFeed> feed;
  };

  bool PrepareConfiguration();
  bool WriteTextFile(const std::string& path, const std::string& text);
  bool OpenFeeds();
  bool OpenFeed(const std::string& label, uint32_t streamId, const std::string& path, bool realTime,
                FeedFormat* format);
  SystemDescription BuildSystem() const;
  bool StartModule();
  void StartFeeds();
  void PlayTimeline();
  void SendAlarm(const TimelineEntry& entry);
  void AwaitCondition(const TimelineEntry& entry);
  bool ConditionHolds(const WaitSetting& wait, int* reports) const;
  std::string Progress() const;
  void Finish();
  void Fail(std::string problem);

  const Scenario& m_scenario;
  HostOptions m_options;
  Console& m_console;
  std::vector<CameraSetting> m_cameras;  // the scenario's, formats filled from the feeds
  std::string m_update;                  // a configuration update to send after Open
  std::unique_ptr<ReferenceHost> m_host;
  std::vector<Feed> m_feeds;
  std::chrono::steady_clock::time_point m_start;
  RunReport m_report;
};

}  // namespace refhost::scenario

#endif  // ALERTMOD_HOST_SCENARIO_SCENARIO_RUNNER_H_
