// NotifyWorkItem is the unit of work handed from alarm handling to the worker:
// one notification (type 1) or the stop item (type 0).
//
// Alarm handling fills an item on a host thread. Once the item is in the work
// queue only the worker touches it; it is shared through std::shared_ptr.
#ifndef ALERTMOD_MAIL_NOTIFY_WORK_ITEM_H_
#define ALERTMOD_MAIL_NOTIFY_WORK_ITEM_H_

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "alertmod/config/notify_types.h"

namespace hx {

class CVideoEmailStream;

constexpr uint32_t kWorkItemStop = 0;
constexpr uint32_t kWorkItemNotification = 1;

// Source key and event type of a test notification.
constexpr uint32_t kTestSourceKey = 0xFFFFFFFFu;
constexpr int32_t kTestEventType = -1;

// One camera whose still or clip goes with the message.
struct VideoSource {
  uint32_t sourceKey = 0;
  std::string name;
  std::shared_ptr<CVideoEmailStream> stream;  // empty when nothing is captured
};

struct NotifyWorkItem {
  explicit NotifyWorkItem(uint32_t itemType) : type(itemType) {}

  uint32_t type;
  NotifyProfile profile;
  std::vector<SmtpServer> servers;
  int64_t eventTime = 0;
  uint16_t milliseconds = 0;
  std::string sourceName;
  uint32_t sourceKey = 0;
  int32_t eventType = 0;
  WebServerAddress web;
  std::vector<VideoSource> videoSources;
  std::string serial;
  std::string systemName;
  std::string licensedMac;
  std::string eventState;
};

}  // namespace hx

#endif  // ALERTMOD_MAIL_NOTIFY_WORK_ITEM_H_
