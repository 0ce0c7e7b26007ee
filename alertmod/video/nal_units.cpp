#include "alertmod/video/nal_units.h"

#include <cstring>
#include <utility>

namespace hx {
namespace {

constexpr size_t kStartCodeSize = 3;
constexpr size_t kPrefixSize = 4;
constexpr size_t kMaxParameterSetSize = 0xFFFF;

constexpr uint8_t kH264Sps = 7;
constexpr uint8_t kH264Pps = 8;
constexpr uint8_t kH265Vps = 32;
constexpr uint8_t kH265Sps = 33;
constexpr uint8_t kH265Pps = 34;
constexpr uint8_t kMpeg4VopCode = 0xB6;

// Offset of the next 00 00 01 at or after `from`, or `size` when none.
size_t FindStartCode(const uint8_t* data, size_t size, size_t from) {
  size_t i = from + 2;
  while (i < size) {
    // Looking for the 01 first skips most bytes at memchr's speed.
    const void* one = memchr(data + i, 1, size - i);
    if (one == nullptr) return size;
    i = static_cast<size_t>(static_cast<const uint8_t*>(one) - data);
    if (data[i - 1] == 0 && data[i - 2] == 0) return i - 2;
    ++i;
  }
  return size;
}

uint8_t NalType(const NalUnit& unit, NalCodec codec) {
  return codec == NalCodec::kH264 ? (unit.data[0] & 0x1F) : ((unit.data[0] >> 1) & 0x3F);
}

void KeepFirst(const NalUnit& unit, std::vector<uint8_t>* set) {
  if (set->empty()) set->assign(unit.data, unit.data + unit.size);
}

void PutU16(std::vector<uint8_t>* out, size_t value) {
  out->push_back(static_cast<uint8_t>(value >> 8));
  out->push_back(static_cast<uint8_t>(value));
}

bool FitsRecord(const std::vector<uint8_t>& set) {
  return set.size() <= kMaxParameterSetSize;
}

// Reads the bits of a NAL unit's payload with its emulation prevention bytes
// (00 00 03) removed. Reading past the end yields zero bits and sets a flag.
class RbspReader final {
 public:
  RbspReader(const uint8_t* data, size_t size) {
    m_bytes.reserve(size);
    size_t zeros = 0;
    for (size_t i = 0; i < size; ++i) {
      if (zeros >= 2 && data[i] == 3) {
        zeros = 0;
        continue;
      }
      zeros = data[i] == 0 ? zeros + 1 : 0;
      m_bytes.push_back(data[i]);
    }
  }

  const std::vector<uint8_t>& Bytes() const { return m_bytes; }
  bool Overrun() const { return m_overrun; }
  void SkipBytes(size_t count) { m_bit += count * 8; }

  uint32_t Bits(int count) {
    uint32_t value = 0;
    for (int i = 0; i < count; ++i) value = (value << 1) | Bit();
    return value;
  }

  // Exp-Golomb unsigned value; gives up after 31 leading zeros.
  uint32_t Ue() {
    int zeros = 0;
    while (Bit() == 0) {
      if (++zeros > 31 || m_overrun) return 0;
    }
    return ((1u << zeros) - 1) + Bits(zeros);
  }

 private:
  uint32_t Bit() {
    if (m_bit >= m_bytes.size() * 8) {
      m_overrun = true;
      return 0;
    }
    const uint32_t bit = (m_bytes[m_bit / 8] >> (7 - m_bit % 8)) & 1u;
    ++m_bit;
    return bit;
  }

  std::vector<uint8_t> m_bytes;
  size_t m_bit = 0;
  bool m_overrun = false;
};

// What the HEVC configuration record repeats from the SPS.
struct HevcSpsSummary {
  uint8_t generalProfileTierLevel[12] = {};
  uint8_t maxSubLayersMinus1 = 0;
  uint8_t temporalIdNesting = 0;
  uint32_t chromaFormat = 1;
  uint32_t bitDepthLumaMinus8 = 0;
  uint32_t bitDepthChromaMinus8 = 0;
};

constexpr size_t kHevcNalHeaderSize = 2;
constexpr size_t kHevcGeneralPtlSize = 12;

void SkipSubLayerProfiles(RbspReader* reader, uint32_t maxSubLayersMinus1) {
  bool profilePresent[8] = {};
  bool levelPresent[8] = {};
  for (uint32_t i = 0; i < maxSubLayersMinus1; ++i) {
    profilePresent[i] = reader->Bits(1) != 0;
    levelPresent[i] = reader->Bits(1) != 0;
  }
  if (maxSubLayersMinus1 > 0) {
    for (uint32_t i = maxSubLayersMinus1; i < 8; ++i) reader->Bits(2);
  }
  for (uint32_t i = 0; i < maxSubLayersMinus1; ++i) {
    if (profilePresent[i]) reader->SkipBytes(11);
    if (levelPresent[i]) reader->SkipBytes(1);
  }
}

bool ParseHevcSps(const std::vector<uint8_t>& sps, HevcSpsSummary* summary) {
  RbspReader reader(sps.data(), sps.size());
  if (reader.Bytes().size() < kHevcNalHeaderSize + 1 + kHevcGeneralPtlSize) return false;
  reader.SkipBytes(kHevcNalHeaderSize);
  reader.Bits(4);  // sps_video_parameter_set_id
  summary->maxSubLayersMinus1 = static_cast<uint8_t>(reader.Bits(3));
  summary->temporalIdNesting = static_cast<uint8_t>(reader.Bits(1));
  memcpy(summary->generalProfileTierLevel, reader.Bytes().data() + kHevcNalHeaderSize + 1,
         kHevcGeneralPtlSize);
  reader.SkipBytes(kHevcGeneralPtlSize);
  SkipSubLayerProfiles(&reader, summary->maxSubLayersMinus1);
  reader.Ue();  // sps_seq_parameter_set_id
  const uint32_t chromaFormat = reader.Ue();
  if (chromaFormat == 3) reader.Bits(1);  // separate_colour_plane_flag
  reader.Ue();                            // pic_width_in_luma_samples
  reader.Ue();                            // pic_height_in_luma_samples
  if (reader.Bits(1) != 0) {              // conformance window offsets
    for (int i = 0; i < 4; ++i) reader.Ue();
  }
  const uint32_t lumaMinus8 = reader.Ue();
  const uint32_t chromaMinus8 = reader.Ue();
  // The profile fields alone still make a usable record.
  if (!reader.Overrun() && chromaFormat <= 3 && lumaMinus8 <= 7 && chromaMinus8 <= 7) {
    summary->chromaFormat = chromaFormat;
    summary->bitDepthLumaMinus8 = lumaMinus8;
    summary->bitDepthChromaMinus8 = chromaMinus8;
  }
  return true;
}

void PutHevcArray(std::vector<uint8_t>* out, uint8_t nalType, const std::vector<uint8_t>& set) {
  out->push_back(static_cast<uint8_t>(0x80 | nalType));  // array_completeness = 1
  PutU16(out, 1);
  PutU16(out, set.size());
  out->insert(out->end(), set.begin(), set.end());
}

}  // namespace

void SplitNalUnits(const uint8_t* data, size_t size, std::vector<NalUnit>* units) {
  units->clear();
  if (data == nullptr) return;
  size_t code = FindStartCode(data, size, 0);
  while (code < size) {
    const size_t begin = code + kStartCodeSize;
    const size_t next = FindStartCode(data, size, begin);
    size_t end = next;
    // NAL units never end in a zero byte: those belong to the next start code.
    while (end > begin && data[end - 1] == 0) --end;
    if (end > begin) units->push_back(NalUnit{data + begin, end - begin});
    code = next;
  }
}

size_t PrefixedSize(const std::vector<NalUnit>& units) {
  size_t total = 0;
  for (const NalUnit& unit : units) total += kPrefixSize + unit.size;
  return total;
}

void WritePrefixed(const std::vector<NalUnit>& units, bool startCodes, uint8_t* out) {
  for (const NalUnit& unit : units) {
    const size_t length = startCodes ? 1 : unit.size;
    out[0] = static_cast<uint8_t>(length >> 24);
    out[1] = static_cast<uint8_t>(length >> 16);
    out[2] = static_cast<uint8_t>(length >> 8);
    out[3] = static_cast<uint8_t>(length);
    memcpy(out + kPrefixSize, unit.data, unit.size);
    out += kPrefixSize + unit.size;
  }
}

bool ParameterSets::Complete(NalCodec codec) const {
  return !sps.empty() && !pps.empty() && (codec == NalCodec::kH264 || !vps.empty());
}

void CollectParameterSets(const std::vector<NalUnit>& units, NalCodec codec, ParameterSets* sets) {
  for (const NalUnit& unit : units) {
    const uint8_t type = NalType(unit, codec);
    if (codec == NalCodec::kH264) {
      if (type == kH264Sps) KeepFirst(unit, &sets->sps);
      if (type == kH264Pps) KeepFirst(unit, &sets->pps);
    } else {
      if (type == kH265Vps) KeepFirst(unit, &sets->vps);
      if (type == kH265Sps) KeepFirst(unit, &sets->sps);
      if (type == kH265Pps) KeepFirst(unit, &sets->pps);
    }
  }
}

std::vector<uint8_t> BuildAvcConfig(const ParameterSets& sets) {
  const std::vector<uint8_t>& sps = sets.sps;
  if (sps.size() < 4 || !FitsRecord(sps) || !FitsRecord(sets.pps)) return {};
  // Version 1, profile, compatibility and level from the SPS, 4-byte
  // lengths (0xFF), one SPS (0xE1).
  std::vector<uint8_t> record = {1, sps[1], sps[2], sps[3], 0xFF, 0xE1};
  PutU16(&record, sps.size());
  record.insert(record.end(), sps.begin(), sps.end());
  if (sets.pps.empty()) {
    record.push_back(0);
    return record;
  }
  record.push_back(1);
  PutU16(&record, sets.pps.size());
  record.insert(record.end(), sets.pps.begin(), sets.pps.end());
  return record;
}

std::vector<uint8_t> BuildHevcConfig(const ParameterSets& sets) {
  HevcSpsSummary sps;
  if (!FitsRecord(sets.vps) || !FitsRecord(sets.sps) || !FitsRecord(sets.pps)) return {};
  if (!ParseHevcSps(sets.sps, &sps)) return {};
  std::vector<uint8_t> record = {1};
  record.insert(record.end(), sps.generalProfileTierLevel, sps.generalProfileTierLevel + 12);
  PutU16(&record, 0xF000);  // no minimum spatial segmentation
  record.push_back(0xFC);   // parallelism unknown
  record.push_back(static_cast<uint8_t>(0xFC | sps.chromaFormat));
  record.push_back(static_cast<uint8_t>(0xF8 | sps.bitDepthLumaMinus8));
  record.push_back(static_cast<uint8_t>(0xF8 | sps.bitDepthChromaMinus8));
  PutU16(&record, 0);  // average frame rate unspecified
  // Constant frame rate unknown, temporal layers, nesting, 4-byte lengths.
  record.push_back(
      static_cast<uint8_t>(((sps.maxSubLayersMinus1 + 1) << 3) | (sps.temporalIdNesting << 2) | 3));
  const std::vector<std::pair<uint8_t, const std::vector<uint8_t>*>> arrays = {
      {kH265Vps, &sets.vps}, {kH265Sps, &sets.sps}, {kH265Pps, &sets.pps}};
  uint8_t count = 0;
  for (const auto& array : arrays) count += array.second->empty() ? 0 : 1;
  record.push_back(count);
  for (const auto& array : arrays) {
    if (!array.second->empty()) PutHevcArray(&record, array.first, *array.second);
  }
  return record;
}

size_t Mpeg4ConfigSize(const uint8_t* data, size_t size) {
  if (data == nullptr) return 0;
  for (size_t code = FindStartCode(data, size, 0); code < size;
       code = FindStartCode(data, size, code + kStartCodeSize)) {
    if (code + kStartCodeSize < size && data[code + kStartCodeSize] == kMpeg4VopCode) return code;
  }
  return 0;
}

}  // namespace hx
