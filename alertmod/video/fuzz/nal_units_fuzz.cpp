// Camera payloads reach the muxer's byte-stream code unchecked: split, rewrite
// and parse any bytes, as H.264, as H.265 and as MPEG-4 Part 2.
#include <cstddef>
#include <cstdint>
#include <vector>

#include "alertmod/video/nal_units.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  std::vector<hx::NalUnit> units;
  hx::SplitNalUnits(data, size, &units);
  std::vector<uint8_t> framed(hx::PrefixedSize(units));
  hx::WritePrefixed(units, false, framed.data());
  hx::WritePrefixed(units, true, framed.data());

  for (hx::NalCodec codec : {hx::NalCodec::kH264, hx::NalCodec::kH265}) {
    hx::ParameterSets sets;
    hx::CollectParameterSets(units, codec, &sets);
    hx::BuildAvcConfig(sets);
    hx::BuildHevcConfig(sets);
  }
  // The whole input as an H.265 SPS, so the parser sees arbitrary fields.
  hx::ParameterSets raw;
  raw.sps.assign(data, data + size);
  raw.vps = raw.sps;
  raw.pps = raw.sps;
  hx::BuildHevcConfig(raw);
  hx::BuildAvcConfig(raw);
  hx::Mpeg4ConfigSize(data, size);
  return 0;
}
