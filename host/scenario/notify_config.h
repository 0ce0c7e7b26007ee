// The alert module's configuration as the host writes it for the module: a
// "Notify" element (ID 786432) with limits, web server, SMTP servers and
// profiles, made from a scenario's configuration lines. Attributes the
// scenario leaves out are left out of the element too, so the module keeps
// its own defaults (or, for an update, its earlier values).
//
// Pure functions; any thread.
#ifndef ALERTMOD_HOST_SCENARIO_NOTIFY_CONFIG_H_
#define ALERTMOD_HOST_SCENARIO_NOTIFY_CONFIG_H_

#include <string>

#include "host/scenario/scenario.h"

namespace refhost::scenario {

// The text of a "notify.xml" file: declaration, "Trellan" with Delta 0 and
// the "Notify" element, indented.
std::string NotifyFileText(const ConfigSetting& config);

// The "Notify" element alone, compact, for a configuration update.
std::string NotifyElementText(const ConfigSetting& config);

// A profile's body: its lines joined with CR LF, as mail bodies are written.
std::string ProfileBody(const ProfileSetting& profile);

}  // namespace refhost::scenario

#endif  // ALERTMOD_HOST_SCENARIO_NOTIFY_CONFIG_H_
