// Placeholder expansion of a profile's subject and body: the event's type,
// state and source, the system's name, serial and licensed MAC, a link into
// the web front end, and the event's date and time in formats the user picks
// ("{date format='%d.%m.%Y'}").
//
// ExpandTemplates runs on the manager's worker thread, on the one work item it
// is given. The other functions are pure and may be called from any thread.
#ifndef ALERTMOD_MAIL_TEMPLATES_H_
#define ALERTMOD_MAIL_TEMPLATES_H_

#include <chrono>
#include <cstdint>
#include <string>

#include "alertmod/host_records.h"
#include "alertmod/mail/notify_work_item.h"

namespace hx {

// True when `text` contains any of the ten placeholder texts ("{weblink}",
// "{source}", "{event type}", "{date}", "{time}", "{date format",
// "{system name}", "{serial}", "{licensed mac}", "{event state}").
bool HasPlaceholders(const std::string& text);

// Rewrites the subject and body of `item.profile` in place. Each placeholder
// other than the date/time groups is replaced at its first occurrence only;
// then the date/time pass runs on the subject and on the body. "{weblink}" is
// replaced in the body only and may block for one request to the web server.
// The warning for a missing web server goes to the host through `callback`,
// which also serves the web link's own log lines; `webTimeout` bounds the
// exchange with the web server. Call it once per item, and
// only when the item's placeholder flag is set. Never fails: a value that
// cannot be had becomes a bracketed text.
void ExpandTemplates(NotifyWorkItem& item, core::HostCallbackFn callback,
                     std::chrono::milliseconds webTimeout);

// The date/time pass. When `text` contains "{date}", "{time}" or
// "{date format", it is rebuilt: every brace group that reads as an XML
// element named "date" or "time" becomes `eventTime` (seconds since 1970)
// formatted in local time by its "format" attribute (default "%x" or "%X");
// every other brace group is dropped; an invalid format becomes
// "[invalid format specified]". Otherwise `text` is left unchanged.
void ExpandDateTime(int64_t eventTime, std::string& text);

}  // namespace hx

#endif  // ALERTMOD_MAIL_TEMPLATES_H_
