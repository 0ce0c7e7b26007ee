// The host's event vocabulary: display names of its event type codes and the
// two groups of health events that messages describe as "Health".
//
// The tables are built on first use (safely, if two threads arrive together)
// and are read-only afterwards; any thread may call these functions.
#ifndef ALERTMOD_MAIL_EVENT_TYPES_H_
#define ALERTMOD_MAIL_EVENT_TYPES_H_

#include <cstdint>
#include <set>
#include <string>

namespace hx {

// Display name of the host's event type `code`, "Unknown" for a code outside
// the table. The text lives as long as the process.
const std::string& EventTypeName(int32_t code);

// Event types that concern the recording system itself (storage, archive,
// licence, hardware sensors ...). Their source is named by the event type.
const std::set<int32_t>& SystemHealthEventTypes();

// Event types that concern the health of one device (temperature, power
// supply, device failure, fan).
const std::set<int32_t>& DeviceHealthEventTypes();

// True for the event types whose source is a camera, so that the event has
// video: 1, 2, 9 and 18.
bool IsCameraEventType(int32_t code);

}  // namespace hx

#endif  // ALERTMOD_MAIL_EVENT_TYPES_H_
