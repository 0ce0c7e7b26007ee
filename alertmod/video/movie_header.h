// The most bytes that the codec libraries' MP4/QuickTime muxer needs for the
// movie header ("moov") of one video track, worked out from the track's
// counts before the file is written. The muxer reserves that room at the
// start of the file, where players find the header without reading the
// whole file, and fails when the header outgrows it.
//
// A pure function of its arguments; any thread.
#ifndef ALERTMOD_VIDEO_MOVIE_HEADER_H_
#define ALERTMOD_VIDEO_MOVIE_HEADER_H_

#include <cstdint>

namespace hx {

// One video track as far as its movie header depends on it.
struct MovieTrackShape {
  uint64_t samples = 0;           // frames in the track, at most
  uint64_t keyFrames = 0;         // key frames among them, at most
  uint64_t mediaBytes = 0;        // bytes of the frames as stored, at most
  uint64_t configBytes = 0;       // the decoder configuration record
  bool evenFrameDuration = true;  // every frame lasts the same whole ticks
  bool reordered = false;         // decoding order differs from display order
};

// Bytes enough for the movie header of a file holding `track`, its sample
// tables counted at their largest for these counts.
uint64_t MovieHeaderBound(const MovieTrackShape& track);

}  // namespace hx

#endif  // ALERTMOD_VIDEO_MOVIE_HEADER_H_
