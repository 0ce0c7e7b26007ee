// The parts of a host system document that decide which video the module
// buffers: the event definitions ("Events"), which name the sources whose
// events notify a profile, and the analytics sections ("Analytics"), which
// say which camera input supplies an analytics source's video.
//
// Pure functions of the document and the tables they are given; the manager
// calls them on the host thread of IOCTL code 2.
#ifndef ALERTMOD_MANAGER_HOST_DOCUMENTS_H_
#define ALERTMOD_MANAGER_HOST_DOCUMENTS_H_

#include <cstdint>
#include <set>

class TiXmlElement;

namespace hx {

class SourceAliases;

// The key of the camera whose video an event definition or a source group
// entry refers to: a "Devices" / "Device" camera input or encoder channel,
// or an "Analytics" input with a known alias. 0 when there is none; an
// analytics input without an alias is remembered in `aliases` as unresolved.
uint32_t VideoSourceKey(const TiXmlElement& element, SourceAliases& aliases);

// Rebuilds `sources` from an "Events" element: the camera of every event
// with a notification action ("Action" / "Notify"), and the cameras of the
// source groups such events name. Nothing for an element of another name.
void RebuildVideoSources(const TiXmlElement& events, SourceAliases& aliases,
                         std::set<uint32_t>& sources);

// Reads the analytics sections of `root` (its first "Analytics" child and
// every element after it): each input with a rule gets its alias unless it
// has one, and an input that events were waiting for joins `sources`.
// Returns false at the first missing or non-integer number, keeping what
// was read before it.
bool ApplyAnalyticsAliases(const TiXmlElement& root, SourceAliases& aliases,
                           std::set<uint32_t>& sources);

}  // namespace hx

#endif  // ALERTMOD_MANAGER_HOST_DOCUMENTS_H_
