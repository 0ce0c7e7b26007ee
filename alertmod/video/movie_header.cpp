#include "alertmod/video/movie_header.h"

#include <algorithm>

namespace hx {
namespace {

// Every box but the sample tables and the decoder configuration: movie,
// track, media and handler headers, data reference, sample description,
// metadata. About 600 bytes in practice; the rest is room for what a newer
// release of the libraries may add.
constexpr uint64_t kFixedBoxesBytes = 1024;
// Size, type, version and flags, entry count; the sample-size table also
// carries a common size.
constexpr uint64_t kTableHeaderBytes = 20;
constexpr uint64_t kSampleTables = 6;  // stts stss ctts stsc stsz co64
// The composition offset limits written beside reordered samples.
constexpr uint64_t kCompositionLimitsBytes = 32;
constexpr uint64_t kTimeToSampleEntryBytes = 8;
constexpr uint64_t kSyncSampleEntryBytes = 4;
constexpr uint64_t kCompositionEntryBytes = 8;
constexpr uint64_t kSampleSizeEntryBytes = 4;
// One sample-to-chunk entry (12) and one 64-bit chunk offset (8).
constexpr uint64_t kChunkEntryBytes = 20;
// The muxer closes a chunk before it would reach this size.
constexpr uint64_t kChunkLimitBytes = uint64_t{1} << 20;

// A chunk ends only when the next frame would take it to the limit, so any
// two neighbouring chunks together hold at least the limit.
uint64_t ChunkBound(const MovieTrackShape& track) {
  const uint64_t pairs = track.mediaBytes / kChunkLimitBytes + 1;
  return std::min(track.samples, 2 * pairs + 1);
}

}  // namespace

uint64_t MovieHeaderBound(const MovieTrackShape& track) {
  // Equal durations make one time-to-sample entry, the last frame's may make
  // a second; uneven ones at worst one a frame.
  const uint64_t durations = track.evenFrameDuration ? 2 : track.samples + 1;
  uint64_t bytes = kFixedBoxesBytes + track.configBytes + kSampleTables * kTableHeaderBytes;
  bytes += durations * kTimeToSampleEntryBytes;
  bytes += track.keyFrames * kSyncSampleEntryBytes;
  bytes += track.samples * kSampleSizeEntryBytes;
  bytes += ChunkBound(track) * kChunkEntryBytes;
  if (track.reordered) {
    bytes += kCompositionLimitsBytes + track.samples * kCompositionEntryBytes;
  }
  return bytes;
}

}  // namespace hx
