// The byte-stream work of the muxer: splitting H.264 and H.265 payloads into
// NAL units at their start codes, rewriting them with length prefixes,
// collecting parameter sets, building the decoder configuration records that
// MP4 and QuickTime files carry for these codecs, and finding the
// configuration header of an MPEG-4 Part 2 stream.
//
// Pure functions over caller-owned bytes; any thread. Input may be any
// bytes: malformed data yields fewer units or an empty record, never a read
// outside the given range.
#ifndef ALERTMOD_VIDEO_NAL_UNITS_H_
#define ALERTMOD_VIDEO_NAL_UNITS_H_

#include <cstddef>
#include <cstdint>
#include <vector>

namespace hx {

// One NAL unit inside a caller's buffer, without its start code.
struct NalUnit {
  const uint8_t* data = nullptr;
  size_t size = 0;
};

enum class NalCodec { kH264, kH265 };

// Replaces `units` by the NAL units of the Annex-B byte stream `data`: each
// starts after a 00 00 01 start code and ends where the next start code
// (with the zero bytes before it) begins. Bytes before the first start code
// and empty units are skipped.
void SplitNalUnits(const uint8_t* data, size_t size, std::vector<NalUnit>* units);

// Bytes needed to write `units` each behind a 4-byte prefix.
size_t PrefixedSize(const std::vector<NalUnit>& units);

// Writes each unit behind a 4-byte big-endian length (`startCodes` false) or
// behind the start code 00 00 00 01 (true). `out` must hold PrefixedSize.
void WritePrefixed(const std::vector<NalUnit>& units, bool startCodes, uint8_t* out);

// The parameter sets of a stream: the first of each kind seen.
struct ParameterSets {
  std::vector<uint8_t> vps;  // H.265 only
  std::vector<uint8_t> sps;
  std::vector<uint8_t> pps;

  // True when every set that `codec` needs in its configuration is known.
  bool Complete(NalCodec codec) const;
};

// Keeps, from `units`, each kind of parameter set not yet in `sets`.
void CollectParameterSets(const std::vector<NalUnit>& units, NalCodec codec, ParameterSets* sets);

// The AVC decoder configuration record (avcC) for 4-byte NAL lengths with the
// first SPS and PPS. Empty when the SPS is missing or too short, or a set
// exceeds 65535 bytes.
std::vector<uint8_t> BuildAvcConfig(const ParameterSets& sets);

// The HEVC decoder configuration record (hvcC) for 4-byte NAL lengths with
// the VPS, SPS and PPS, its profile, tier, level, chroma format and bit
// depths taken from the SPS. Empty when the SPS is missing or too short, or
// a set exceeds 65535 bytes.
std::vector<uint8_t> BuildHevcConfig(const ParameterSets& sets);

// Length of the MPEG-4 Part 2 configuration header at the start of `data`:
// the bytes before the first picture (VOP, start code 00 00 01 B6). Zero when
// the data starts with a picture or has none.
size_t Mpeg4ConfigSize(const uint8_t* data, size_t size);

}  // namespace hx

#endif  // ALERTMOD_VIDEO_NAL_UNITS_H_
