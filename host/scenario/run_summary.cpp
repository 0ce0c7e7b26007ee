#include "host/scenario/run_summary.h"

#include <tinyxml.h>

#include <cstdlib>
#include <ctime>

#include "host/system_description.h"

namespace refhost::scenario {
namespace {

bool StartsWith(const std::string& text, const char* prefix) {
  return text.compare(0, std::char_traits<char>::length(prefix), prefix) == 0;
}

bool Contains(const std::string& text, const char* fragment) {
  return text.find(fragment) != std::string::npos;
}

// True with the transfer tool's exit code for the module's line about one
// delivery attempt.
bool AttemptExitCode(const std::string& text, int* exitCode) {
  static const char kAttempt[] = "Notification attempt return code= ";
  const size_t attempt = text.find(kAttempt);
  if (attempt == std::string::npos) return false;
  *exitCode = std::atoi(text.c_str() + attempt + sizeof(kAttempt) - 1);
  return true;
}

// Delivery and retry lines of the module's log.
void TallyDelivery(const std::string& text, RunTally* tally) {
  int exitCode = 0;
  if (AttemptExitCode(text, &exitCode)) {
    ++tally->attempts;
    if (exitCode == 0) ++tally->accepted;
  }
  if (Contains(text, "This message will be retried")) ++tally->retryQueued;
  if (Contains(text, "This message will NOT be retried")) ++tally->dropped;
  if (StartsWith(text, "Retrying failed notification for file")) ++tally->retried;
  if (StartsWith(text, "Retry for notification file") && Contains(text, "suceeded")) {
    ++tally->retrySucceeded;
  }
  if (Contains(text, "will be discarded")) ++tally->discarded;
}

void TallyAttachment(const std::string& text, RunTally* tally) {
  static const char kAttachment[] = "Attachment ";
  static const char kFailed[] = "Failed to prepare video attachment for source: ";
  if (StartsWith(text, kAttachment)) {
    const std::string what = text.substr(sizeof(kAttachment) - 1);
    (Contains(what, ", preview ") ? tally->clips : tally->stills).push_back(what);
  } else if (StartsWith(text, kFailed)) {
    // The module's line ends in ", " where a reason might have followed.
    std::string source = text.substr(sizeof(kFailed) - 1);
    while (!source.empty() && (source.back() == ' ' || source.back() == ',')) source.pop_back();
    tally->failedAttachments.push_back(source);
  }
}

std::string Plural(size_t count, const char* one, const char* many) {
  return std::to_string(count) + " " + (count == 1 ? one : many);
}

std::string CodecName(uint32_t codec) {
  switch (static_cast<int32_t>(codec)) {
    case kStandardJpeg:
      return "MJPEG";
    case kStandardMpeg4:
      return "MPEG-4";
    case kStandardH264:
      return "H.264";
    case kStandardH265:
      return "H.265";
    default:
      return "codec " + std::to_string(codec);
  }
}

std::string StatusText(int32_t status) {
  switch (status) {
    case 0:
      return "delivered";
    case 1:
      return "failed";
    case -1:
      return "reset by a configuration change";
    default:
      return "status " + std::to_string(status);
  }
}

std::string ClockTime(int64_t seconds) {
  const time_t when = static_cast<time_t>(seconds);
  tm local{};
  localtime_r(&when, &local);
  char text[16];
  strftime(text, sizeof(text), "%H:%M:%S", &local);
  return text;
}

void PrintStatuses(const RunReport& report, const RunTally& tally, FILE* out) {
  fprintf(out, "Status reports:  %d delivered, %d failed", tally.delivered, tally.failed);
  if (tally.reset > 0) fprintf(out, ", %d reset", tally.reset);
  fprintf(out, "\n");
  for (const ProfileStatusReport& status : report.statuses) {
    const auto name = report.profileNames.find(status.id);
    fprintf(out, "  %s profile %d%s: %s\n", ClockTime(status.time).c_str(), status.id,
            name == report.profileNames.end() ? "" : (" \"" + name->second + "\"").c_str(),
            StatusText(status.status).c_str());
  }
}

void PrintDeliveries(const RunTally& tally, FILE* out) {
  fprintf(out, "Deliveries:      %s, %d accepted by a server, %d not retried\n",
          Plural(static_cast<size_t>(tally.attempts), "attempt", "attempts").c_str(),
          tally.accepted, tally.dropped);
  fprintf(out, "Retries:         %d queued, %d retried, %d succeeded, %d discarded\n",
          tally.retryQueued, tally.retried, tally.retrySucceeded, tally.discarded);
}

void PrintAttachments(const RunTally& tally, FILE* out) {
  fprintf(out, "Attachments:     %s, %s, %d failed\n",
          Plural(tally.clips.size(), "clip", "clips").c_str(),
          Plural(tally.stills.size(), "still", "stills").c_str(),
          static_cast<int>(tally.failedAttachments.size()));
  for (const std::string& clip : tally.clips) fprintf(out, "  clip  %s\n", clip.c_str());
  for (const std::string& still : tally.stills) fprintf(out, "  still %s\n", still.c_str());
  for (const std::string& failed : tally.failedAttachments) {
    fprintf(out, "  failed %s\n", failed.c_str());
  }
}

void PrintFeeds(const RunReport& report, FILE* out) {
  if (report.feeds.empty()) return;
  fprintf(out, "Feeds:\n");
  for (const FeedReport& feed : report.feeds) {
    fprintf(out, "  %s (stream %u, %s %ux%u): %llu frames, %llu kept, %llu refused\n",
            feed.label.c_str(), feed.streamId, CodecName(feed.format.codec).c_str(),
            feed.format.width, feed.format.height,
            static_cast<unsigned long long>(feed.stats.frames),
            static_cast<unsigned long long>(feed.stats.kept),
            static_cast<unsigned long long>(feed.stats.refused));
  }
}

void PrintFrames(const RunReport& report, FILE* out) {
  const FramePoolCounts& frames = report.frames;
  fprintf(out, "Frame buffers:   %llu lent, %llu kept by the module, %s\n",
          static_cast<unsigned long long>(frames.allocated),
          static_cast<unsigned long long>(frames.returned + frames.outstanding),
          report.frameFaults.empty() ? "all returned" : report.frameFaults.c_str());
}

}  // namespace

RunTally TallyRun(const RunReport& report) {
  RunTally tally;
  for (const ProfileStatusReport& status : report.statuses) {
    if (status.status == 0) ++tally.delivered;
    if (status.status == 1) ++tally.failed;
    if (status.status == -1) ++tally.reset;
  }
  for (const LogLine& line : report.log) {
    if (line.level == kLogWarning) ++tally.warnings;
    if (line.level >= kLogError) ++tally.errors;
    TallyDelivery(line.text, &tally);
    TallyAttachment(line.text, &tally);
  }
  return tally;
}

std::string DeliveryFailureReason(const RunReport& report) {
  // The module logs the tool's error output (at information level) right
  // after the attempt that failed; curl's own error line comes last.
  static const char kToolError[] = "curl: (";
  int failedExit = 0;
  std::string toolError;
  std::string firstError;
  for (const LogLine& line : report.log) {
    int exitCode = 0;
    if (AttemptExitCode(line.text, &exitCode)) {
      failedExit = exitCode;
      toolError.clear();
    } else if (failedExit != 0 && StartsWith(line.text, kToolError)) {
      toolError = line.text;
    } else if (line.level >= kLogError && firstError.empty()) {
      firstError = line.text;
    }
  }
  if (failedExit == 0) return firstError;
  return "curl exit code " + std::to_string(failedExit) +
         (toolError.empty() ? "" : ", \"" + toolError + "\"");
}

std::map<int32_t, std::string> ProfileNames(const std::string& configuration) {
  std::map<int32_t, std::string> names;
  TiXmlDocument document;
  document.Parse(configuration.c_str());
  const TiXmlElement* root = document.RootElement();
  const TiXmlElement* notify = root != nullptr ? root->FirstChildElement("Notify") : nullptr;
  const TiXmlElement* profiles =
      notify != nullptr ? notify->FirstChildElement("Profiles") : nullptr;
  if (profiles == nullptr) return names;
  for (const TiXmlElement* profile = profiles->FirstChildElement("smtp"); profile != nullptr;
       profile = profile->NextSiblingElement("smtp")) {
    int id = 0;
    const char* description = profile->Attribute("description");
    if (profile->QueryIntAttribute("ID", &id) == TIXML_SUCCESS && description != nullptr) {
      names[id] = description;
    }
  }
  return names;
}

bool RunSucceeded(const RunReport& report) {
  return report.failures.empty() && report.frames.outstanding == 0 &&
         report.frames.releasedTwice == 0 && report.frames.unknown == 0;
}

void PrintSummary(const RunReport& report, FILE* out) {
  const RunTally tally = TallyRun(report);
  fprintf(out, "\n== Summary\n");
  fprintf(out, "Alarms sent:     %s, %s, %s\n",
          Plural(report.alarmStarts, "start", "starts").c_str(),
          Plural(report.alarmEnds, "end", "ends").c_str(),
          Plural(report.tests, "test", "tests").c_str());
  PrintStatuses(report, tally, out);
  PrintDeliveries(tally, out);
  PrintAttachments(tally, out);
  PrintFeeds(report, out);
  PrintFrames(report, out);
  fprintf(out, "Module log:      %s, %d warnings, %d errors\n",
          Plural(report.log.size(), "line", "lines").c_str(), tally.warnings, tally.errors);
  for (const std::string& failure : report.failures)
    fprintf(out, "Problem:         %s\n", failure.c_str());
  fprintf(out, "Result:          %s\n", RunSucceeded(report) ? "OK" : "FAILED");
  fflush(out);
}

}  // namespace refhost::scenario
