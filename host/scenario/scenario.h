// A scenario is one run of the reference host, written as a small text file
// (see scenarios/README.md): the recording system the host describes to the
// alert module, the module's configuration, the camera feeds that play video
// files as camera streams, and a timeline of alarms, tests and waits.
//
// This header holds the parsed form. ParseScenario (scenario_parser.h) makes
// it; ScenarioRunner (scenario_runner.h) plays it. Plain data; any thread.
#ifndef ALERTMOD_HOST_SCENARIO_SCENARIO_H_
#define ALERTMOD_HOST_SCENARIO_SCENARIO_H_

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "host/system_description.h"

namespace refhost::scenario {

// One video stream of a camera and the file that plays it, if any.
struct StreamSetting {
  StreamDescription description;
  // Codec, width and height were written in the scenario. Otherwise they are
  // taken from the feed's file when the run starts.
  bool formatGiven = false;
  std::string feed;  // absolute path of the video file; empty: no feed
  int line = 0;
};

struct CameraSetting {
  std::string name;
  int32_t plugin = 0x10000;
  int32_t device = 1;
  int32_t input = 0;
  std::vector<StreamSetting> streams;  // the main stream (context 0) first
  int line = 0;
};

// A video file played as a bare stream identifier, outside any camera.
struct RawFeed {
  uint32_t streamId = 0;
  std::string path;
  bool realTime = true;
};

struct SmtpServerSetting {
  std::string description;
  std::string address;
  std::optional<int32_t> port;
  std::optional<int32_t> security;  // "UseSSL": 0 plain, 1 SMTPS, 2 STARTTLS
  std::string user;
  std::string password;
};

struct ProfileSetting {
  int32_t id = 0;
  std::string description;
  std::string from;
  std::string subject;
  std::vector<std::string> to;
  std::vector<std::string> cc;
  std::vector<std::string> bcc;
  std::vector<std::string> bodyLines;  // joined with CR LF
  std::optional<bool> attach;
  std::optional<int32_t> maxVideoSeconds;
  std::optional<int32_t> eventEdge;  // 0 start, 1 end, 2 both
  std::optional<int32_t> throttleSeconds;
};

struct ConfigSetting {
  enum class Source {
    kWorkingDirectory,  // whatever notify.xml the working directory holds
    kInline,            // the "limits", "web", "smtp" and "profile" lines
    kFile,              // a notify.xml written elsewhere
  };
  enum class Delivery {
    kBeforeOpen,  // written as notify.xml before the module opens
    kUpdate,      // sent as a configuration update once it runs
  };
  Source source = Source::kWorkingDirectory;
  Delivery delivery = Delivery::kBeforeOpen;
  std::string file;  // for kFile: absolute path

  std::optional<int32_t> maxRetrySeconds;
  std::optional<int32_t> maxRetryQueue;
  std::optional<int32_t> emailSizeLimitMb;
  std::optional<std::string> webAddress;
  std::vector<SmtpServerSetting> servers;
  std::vector<ProfileSetting> profiles;
};

// What the runner waits for before the timeline goes on.
struct WaitSetting {
  int reports = 0;                 // delivery status reports (0 or 1) seen in all
  std::optional<int32_t> profile;  // count only this profile's reports
  std::string logText;             // a module log line containing this text
  double timeoutSeconds = 60;
};

struct TimelineEntry {
  enum class Kind { kAlarm, kWait, kStop };
  Kind kind = Kind::kAlarm;
  double at = 0;  // seconds after the feeds started
  int line = 0;
  std::string label;  // what the live log says when it happens
  // kAlarm: the requests of one alarm document ("Time" is set when sent).
  std::vector<AlarmRequest> requests;
  bool test = false;  // the requests are test notifications
  WaitSetting wait;
};

struct Scenario {
  std::string name;  // the file it came from, for messages
  std::optional<std::string> serverSerial;
  std::optional<std::string> serverDescription;
  std::vector<CameraSetting> cameras;
  // Everything else the system document describes: devices, triggers,
  // source groups and event definitions. Cameras are added at run time,
  // once the feeds' formats are known.
  SystemDescription system;
  std::vector<RawFeed> rawFeeds;
  ConfigSetting config;
  std::vector<TimelineEntry> timeline;  // in time order

  // Whether a system document is to be sent.
  bool DescribesSystem() const {
    return !cameras.empty() || !system.triggers.empty() || !system.groups.empty() ||
           !system.events.empty() || !system.devices.empty();
  }
};

}  // namespace refhost::scenario

#endif  // ALERTMOD_HOST_SCENARIO_SCENARIO_H_
