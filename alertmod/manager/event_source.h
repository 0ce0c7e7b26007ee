// Where an alarm request's event comes from: its event source key and host
// event type, read from the request's "EventSource" or "SourceGroup" element,
// and the cameras of a source group whose video goes with a notification.
//
// Pure functions of the element and the tables they are given; called on the
// host thread of Write.
#ifndef ALERTMOD_MANAGER_EVENT_SOURCE_H_
#define ALERTMOD_MANAGER_EVENT_SOURCE_H_

#include <cstdint>

#include "alertmod/mail/notify_work_item.h"

class TiXmlElement;

namespace hx {

class HostSystemCatalogue;
class SourceAliases;

// Host event type of a source group's event.
constexpr int32_t kSourceGroupEventType = 12;

struct EventSource {
  uint32_t key = 0;
  int32_t type = 0;
};

// The source of an "EventSource" element with integer "Plugin", "Device",
// "Input", "Context" and "Type": its key, without context bits for type 18,
// replaced by the camera's key when it is an analytics source with an alias.
// Key and type 0 when one of the five is missing or not an integer.
EventSource ReadEventSource(const TiXmlElement& eventSource, const SourceAliases& aliases);

// The source of a "SourceGroup" element: the group's key (its integer "ID",
// 0 when missing) and type 12.
EventSource ReadSourceGroup(const TiXmlElement& sourceGroup);

// The source of an alarm request: from its "EventSource" child, else from
// its "SourceGroup" child, else key and type 0.
EventSource RequestEventSource(const TiXmlElement& request, const SourceAliases& aliases);

// Appends to `item`'s video sources, without streams, the camera members of
// source group `sourceGroup` (its "EventSource" children with all five
// integers and an event type that has video), named by `catalogue`.
void AppendSourceGroupMembers(const TiXmlElement& sourceGroup, const SourceAliases& aliases,
                              const HostSystemCatalogue& catalogue, NotifyWorkItem& item);

}  // namespace hx

#endif  // ALERTMOD_MANAGER_EVENT_SOURCE_H_
