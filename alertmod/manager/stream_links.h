// Which camera streams the module buffers. The host's event definitions name
// the sources whose events notify a profile (the video source set); a source
// whose own stream is compressed video is linked to a still-image stream of
// the same camera, whose frames then serve its snapshots and clips instead.
// From the two the frame intake decides which streams to keep, the video
// buffer is pruned when the host's description changes, and video capture
// finds the stream to attach to.
//
// The host numbers each video stream with the event source key of its input,
// context included, so stream identifiers and keys are compared directly.
//
// The manager owns one WantedVideo. It is changed by host documents and read
// by frames and alarm requests, on the host threads of Write and IOCTL code
// 2, one at a time; it takes no lock.
#ifndef ALERTMOD_MANAGER_STREAM_LINKS_H_
#define ALERTMOD_MANAGER_STREAM_LINKS_H_

#include <cstdint>
#include <map>
#include <set>

#include "alertmod/host_records.h"
#include "alertmod/manager/catalogue.h"
#include "alertmod/video/gop_buffer.h"

namespace hx {

class VideoBuffer;

// Event source key -> format record of the stream that supplies its video.
using SourceLinkMap = std::map<uint32_t, StreamFormatRecord>;

class WantedVideo {
 public:
  // True when the frames of the stream with key `key` are buffered: a source
  // of the set that is not linked elsewhere, or the stream some source is
  // linked to.
  bool Wants(uint32_t key) const;

  const std::set<uint32_t>& Sources() const { return m_sources; }
  std::set<uint32_t>& MutableSources() { return m_sources; }
  const SourceLinkMap& Links() const { return m_links; }

  // Replaces every link.
  void SetLinks(SourceLinkMap links);

 private:
  std::set<uint32_t> m_sources;
  SourceLinkMap m_links;
  std::set<uint32_t> m_linkedStreams;  // the IDs of m_links' records
};

// Rebuilds the links of every source of `wanted` from the catalogue. A
// source whose stream has no format record cannot be buffered: its stream
// leaves `buffer`. Of a camera's still-image streams the one with the
// smallest picture is chosen, a stream without a valid number only when
// there is no other.
void RelinkStreams(WantedVideo& wanted, const HostSystemCatalogue& catalogue, VideoBuffer& buffer);

// Removes from `buffer` every stream that has no format record any more or
// that `wanted` no longer wants; their captures are finished.
void ReconcileVideoBuffer(const WantedVideo& wanted, const HostSystemCatalogue& catalogue,
                          VideoBuffer& buffer);

// The stream whose frames serve the video of event source `key`: the first
// video stream of the catalogue that carries the source (the key itself,
// with a warning through `callback`, when none does), or the stream that
// one is linked to.
int32_t MapSourceToStream(uint32_t key, const HostSystemCatalogue& catalogue,
                          const WantedVideo& wanted, core::HostCallbackFn callback);

// The video buffer's description of a stream: the catalogue's record field
// for field. Its "Standard" is the host codec code (0 still images, 4 MPEG-4,
// 5 H.264, 6 H.265); "ID" and "Number" fill the two words that take part in
// no comparison.
StreamFormat ToStreamFormat(const StreamFormatRecord& record);

}  // namespace hx

#endif  // ALERTMOD_MANAGER_STREAM_LINKS_H_
