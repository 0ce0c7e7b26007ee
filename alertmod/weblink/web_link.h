// Links into the recording system's web front end for "{weblink}".
//
// MakeWebLink asks the configured web server for its list of recording
// systems, finds this system's server identifier by its serial, and encodes a
// search of the event's cameras into the link. It blocks the calling thread
// (the manager's worker) for one bounded HTTP exchange and never throws.
#ifndef ALERTMOD_WEBLINK_WEB_LINK_H_
#define ALERTMOD_WEBLINK_WEB_LINK_H_

#include <cstdint>
#include <string>
#include <vector>

#include "alertmod/config/notify_types.h"
#include "alertmod/host_records.h"

namespace hx {

// The link for an event at `eventTime` (seconds since 1970) from the cameras
// `cameraKeys` (the event source keys of the video sources), or one of the
// bracketed texts that say why there is none. Failures are logged through
// `callback`.
std::string MakeWebLink(const WebServerAddress& web, const std::string& serial, int64_t eventTime,
                        const std::vector<uint32_t>& cameraKeys,
                        core::HostCallbackFn callback);

}  // namespace hx

#endif  // ALERTMOD_WEBLINK_WEB_LINK_H_
