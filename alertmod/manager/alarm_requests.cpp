// Alarm documents: the requests of other modules that name a notification
// profile for an event's start or end. Each accepted request becomes a work
// item, queued at once or, when video is to be attached, parked until its
// captures complete or its deadline passes.
#include <tinyxml.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <sstream>
#include <string>

#include "alertmod/config/xml_attr.h"
#include "alertmod/config/xml_document.h"
#include "alertmod/diag/log.h"
#include "alertmod/manager/event_source.h"
#include "alertmod/manager/notify_manager.h"
#include "alertmod/manager/video_capture.h"

namespace hx {
namespace {

constexpr char kTestMessage[] = "Testing Profile";
constexpr char kTestSourceName[] = "[Test Event Source]";
constexpr char kLineBreak[] = "\r\n";
// Seconds a notification waits beyond its clip's length for the clip.
constexpr uint32_t kDeadlineGraceSeconds = 2;

constexpr int32_t kEdgeStart = 0;
constexpr int32_t kEdgeEnd = 1;
constexpr int32_t kEdgeBoth = 2;

// Whether a request for the event's start (`alarmStarts`) or end notifies a
// profile with event edge `edge`.
bool EdgeNotifies(int32_t edge, bool alarmStarts) {
  return edge == kEdgeBoth || (edge == kEdgeStart && alarmStarts) ||
         (edge == kEdgeEnd && !alarmStarts);
}

// Whether a request for the event's start or end completes a waiting
// notification of a profile with event edge `edge`: the start edge waits for
// the event's end, the end edge for the next start.
bool EdgeReleases(int32_t edge, bool alarmStarts) {
  return edge == kEdgeBoth || (edge == kEdgeEnd && alarmStarts) ||
         (edge == kEdgeStart && !alarmStarts);
}

// The leading decimal number of `text` as the C library's atoi reads it, but
// saturated instead of undefined beyond 32 bits; 0 when missing.
int32_t LeadingInt(const char* text) {
  if (text == nullptr) return 0;
  const long long value = std::strtoll(text, nullptr, 10);
  if (value > std::numeric_limits<int32_t>::max()) return std::numeric_limits<int32_t>::max();
  if (value < std::numeric_limits<int32_t>::min()) return std::numeric_limits<int32_t>::min();
  return static_cast<int32_t>(value);
}

// Reads `name` with formatted stream extraction into `value` when present:
// leading digits count, and what the stream cannot read leaves its result.
template <typename Number>
void ExtractAttribute(const TiXmlElement& element, const char* name, Number& value) {
  const char* text = element.Attribute(name);
  if (text == nullptr) return;
  std::istringstream stream(text);
  stream >> value;
}

void ReadServerIdentity(const TiXmlElement& root, ServerIdentity& server) {
  const TiXmlElement* servers = root.FirstChildElement("Servers");
  const TiXmlElement* entry = servers != nullptr ? servers->FirstChildElement("Server") : nullptr;
  if (entry == nullptr) return;
  if (const char* serial = entry->Attribute("Serial")) server.serial = serial;
  if (const char* description = entry->Attribute("Description")) server.systemName = description;
}

struct RequestFacts {
  const NotifyProfile& profile;
  const TiXmlElement& request;
  bool alarmStarts;
  int32_t action;
};

std::shared_ptr<NotifyWorkItem> BuildWorkItem(const RequestFacts& facts, const NotifyCfg& config,
                                              const ServerIdentity& server,
                                              core::HostCallbackFn callback) {
  auto item = std::make_shared<NotifyWorkItem>(kWorkItemNotification);
  item->web = config.Web();
  item->serial = server.serial;
  item->profile = facts.profile;
  item->profile.preAlarmSeconds = config.PreAlarmSeconds(facts.action);
  item->profile.sizeLimit = config.EmailSizeLimitBytes();
  if (config.AttachmentsDisabled() && item->profile.attach) {
    item->profile.attach = false;
    LogToHost(core::kModuleId, callback, LogLevelWarning, "Attachments will be omitted for \"%s\"",
              facts.profile.description.c_str());
  }
  if (facts.profile.hasPlaceholders) {
    item->systemName = server.systemName;
    item->licensedMac = server.licensedMac;
    item->eventState = facts.alarmStarts ? "Start" : "End";
  }
  item->servers = config.Servers();
  ExtractAttribute(facts.request, "Time", item->eventTime);
  ExtractAttribute(facts.request, "Milliseconds", item->milliseconds);
  return item;
}

bool HasCapture(const NotifyWorkItem& item) {
  return std::any_of(item.videoSources.begin(), item.videoSources.end(),
                     [](const VideoSource& source) { return source.stream != nullptr; });
}

void MakeTestNotification(NotifyWorkItem& item) {
  item.profile.body = kTestMessage + std::string(kLineBreak) + item.profile.body;
  item.sourceKey = kTestSourceKey;
  item.sourceName = kTestSourceName;
  item.eventType = kTestEventType;
}

}  // namespace

void NotifyManager::OnAlarmDocument(const void* data, uint32_t length) {
  if (data == nullptr || length == 0) return;
  TiXmlDocument document;
  if (!ParseXmlDocument(std::string(static_cast<const char*>(data), length), document,
                        m_callback)) {
    return;
  }
  const TiXmlElement* root = document.RootElement();
  if (root == nullptr) return;
  ReadServerIdentity(*root, m_server);
  for (const TiXmlElement* notify = root->FirstChildElement("Notify"); notify != nullptr;
       notify = notify->NextSiblingElement("Notify")) {
    std::optional<int32_t> id = IntAttribute(*notify, "ID");
    if (!id || *id != static_cast<int32_t>(core::kModuleId)) continue;
    const TiXmlElement* profiles = notify->FirstChildElement("Profiles");
    if (profiles == nullptr) continue;
    for (const TiXmlElement* request = profiles->FirstChildElement(); request != nullptr;
         request = request->NextSiblingElement()) {
      HandleAlarmRequest(*request);
    }
  }
  ReleaseReady();
}

void NotifyManager::HandleAlarmRequest(const TiXmlElement& request) {
  std::optional<int32_t> alarm = IntAttribute(request, "Alarm");
  if (!alarm) return;
  const bool alarmStarts = *alarm != 0;
  const EventSource source = RequestEventSource(request, m_aliases);
  if (source.key != 0) ReleasePendingOfSource(source.key, alarmStarts);
  const int32_t profileId = LeadingInt(request.Attribute("ID"));
  const NotifyProfile* profile = m_config.FindProfile(profileId);
  if (profile == nullptr) {
    LogToHost(core::kModuleId, m_callback, LogLevelInfo,
              "Received a notification request for an unknown profile %d. Request will be ignored",
              profileId);
    return;
  }
  std::optional<int32_t> action = IntAttribute(request, "Action");
  if (!action) return;
  const char* message = request.Attribute("Message");
  const bool test = message != nullptr && std::strcmp(message, kTestMessage) == 0;
  if (!test && !EdgeNotifies(profile->eventEdge, alarmStarts)) return;
  if (!m_throttle.Admit(profileId, profile->throttleSeconds, m_env.TickMs())) return;
  std::shared_ptr<NotifyWorkItem> item =
      BuildWorkItem({*profile, request, alarmStarts, *action}, m_config, m_server, m_callback);
  if (test) {
    MakeTestNotification(*item);
    QueueWorkItem(std::move(item), false);
    return;
  }
  if (message != nullptr) item->profile.body = message + std::string(kLineBreak) + profile->body;
  RaiseNotification(item, *profile, request);
}

void NotifyManager::RaiseNotification(const std::shared_ptr<NotifyWorkItem>& item,
                                      const NotifyProfile& profile, const TiXmlElement& request) {
  // The sum is a signed 32-bit number of seconds, computed without overflow.
  const int32_t wait =
      static_cast<int32_t>(static_cast<uint32_t>(profile.maxVideoSeconds) + kDeadlineGraceSeconds);
  auto callback =
      std::make_shared<SNOTIFY_CALLBACK>(this, item, m_env.WallSeconds() + int64_t{wait});
  // Parked before any capture is attached: a capture that is complete the
  // moment it is attached reports at once, and its report must find the
  // notification waiting so that it becomes ready like any later one.
  if (profile.attach) Park(callback);
  SetupVideoCapture(MakeCaptureContext(), profile.attach, request, *item, callback);
  // Without a single capture nothing can complete, and nothing more would
  // come by waiting: the message goes at once.
  if (profile.attach && HasCapture(*item)) return;
  Unpark(callback.get());
  QueueWorkItem(item, false);
}

void NotifyManager::ReleasePendingOfSource(uint32_t key, bool alarmStarts) {
  auto released = [key, alarmStarts](const std::shared_ptr<SNOTIFY_CALLBACK>& callback) {
    const NotifyWorkItem& item = *callback->m_item;
    return item.sourceKey == key && EdgeReleases(item.profile.eventEdge, alarmStarts);
  };
  auto firstKept = std::stable_partition(m_pending.begin(), m_pending.end(), released);
  m_ready.insert(m_ready.end(), m_pending.begin(), firstKept);
  m_pending.erase(m_pending.begin(), firstKept);
}

CaptureContext NotifyManager::MakeCaptureContext() {
  return CaptureContext{m_catalogue, m_videoBuffer, m_wanted, m_aliases, m_callback, m_env};
}

}  // namespace hx
