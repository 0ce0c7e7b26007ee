// Links into the recording system's web front end for "{weblink}".
//
// MakeWebLink asks the configured web server for its list of recording
// systems, finds this system's server identifier by its serial, and encodes a
// search of the event's cameras around the event time into the link. It runs
// on the manager's worker, blocks it for one bounded HTTP exchange (see
// HttpGetClient) and never throws.
#ifndef ALERTMOD_WEBLINK_WEB_LINK_H_
#define ALERTMOD_WEBLINK_WEB_LINK_H_

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

#include "alertmod/config/notify_types.h"
#include "alertmod/host_records.h"

namespace hx {

// The link for an event at `eventTime` (seconds since 1970) from the cameras
// `cameraKeys` (the event source keys of the video sources), or the bracketed
// text that says why there is none:
//   "[Web Server Unreachable]"       the exchange failed (logged as an error);
//   "[Invalid Web Server Version]"   the reply is not understood (warning);
//   "[Tamberlux System Not Found]"   the reply does not list `serial` with a
//                                    server identifier (warning);
//   "[Connected to Web Server]"      found, but `cameraKeys` is empty.
// The server is reached at web.host and web.port; the link names
// web.address. Log lines go through `callback` (may be null). `timeout`
// bounds the exchange (connection, request and reply).
std::string MakeWebLink(const WebServerAddress& web, const std::string& serial, int64_t eventTime,
                        const std::vector<uint32_t>& cameraKeys, core::HostCallbackFn callback,
                        std::chrono::milliseconds timeout);

}  // namespace hx

#endif  // ALERTMOD_WEBLINK_WEB_LINK_H_
