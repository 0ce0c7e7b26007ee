#include "alertmod/video/nal_units.h"

#include <gtest/gtest.h>

#include <string>

namespace hx {
namespace {

std::vector<uint8_t> Hex(const std::string& text) {
  std::vector<uint8_t> bytes;
  for (size_t i = 0; i + 1 < text.size(); i += 2) {
    if (text[i] == ' ') {
      --i;
      continue;
    }
    bytes.push_back(static_cast<uint8_t>(std::stoi(text.substr(i, 2), nullptr, 16)));
  }
  return bytes;
}

std::vector<std::vector<uint8_t>> Units(const std::vector<uint8_t>& stream) {
  std::vector<NalUnit> units;
  SplitNalUnits(stream.data(), stream.size(), &units);
  std::vector<std::vector<uint8_t>> out;
  for (const NalUnit& unit : units) out.emplace_back(unit.data, unit.data + unit.size);
  return out;
}

TEST(NalUnitsTest, SplitsAtStartCodes) {
  struct Case {
    const char* name;
    std::string stream;
    std::vector<std::string> units;
  };
  const Case cases[] = {
      {"four and three byte codes", "00000001 67AA 000001 68BB", {"67AA", "68BB"}},
      {"leading bytes and zero runs", "FFEE 000001 651122 0000000001 4133", {"651122", "4133"}},
      {"empty unit", "000001 000001 09F0", {"09F0"}},
      {"trailing zeros", "00000001 0910 0000", {"0910"}},
      {"no start code", "AABBCC", {}},
      {"start code only", "000001", {}},
      {"nothing", "", {}},
      {"two zeros at the end", "000001 25 00 00", {"25"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    std::vector<std::vector<uint8_t>> expected;
    for (const std::string& unit : c.units) expected.push_back(Hex(unit));
    EXPECT_EQ(Units(Hex(c.stream)), expected);
  }
}

TEST(NalUnitsTest, WritesLengthPrefixesOrStartCodes) {
  const std::vector<uint8_t> stream = Hex("000001 0910 00000001 65AABBCC");
  std::vector<NalUnit> units;
  SplitNalUnits(stream.data(), stream.size(), &units);
  ASSERT_EQ(PrefixedSize(units), 14u);
  std::vector<uint8_t> out(PrefixedSize(units));
  WritePrefixed(units, false, out.data());
  EXPECT_EQ(out, Hex("00000002 0910 00000004 65AABBCC"));
  WritePrefixed(units, true, out.data());
  EXPECT_EQ(out, Hex("00000001 0910 00000001 65AABBCC"));
  // The source is only read.
  EXPECT_EQ(stream, Hex("000001 0910 00000001 65AABBCC"));
}

TEST(NalUnitsTest, CollectsTheFirstParameterSetOfEachKind) {
  const std::vector<uint8_t> avc = Hex("000001 6742 000001 68CE 000001 6743 000001 65");
  std::vector<NalUnit> units;
  SplitNalUnits(avc.data(), avc.size(), &units);
  ParameterSets sets;
  CollectParameterSets(units, NalCodec::kH264, &sets);
  EXPECT_EQ(sets.sps, Hex("6742"));
  EXPECT_EQ(sets.pps, Hex("68CE"));
  EXPECT_TRUE(sets.Complete(NalCodec::kH264));
  EXPECT_FALSE(sets.Complete(NalCodec::kH265));

  const std::vector<uint8_t> hevc = Hex("000001 4201AA 000001 4401BB 000001 2601");
  SplitNalUnits(hevc.data(), hevc.size(), &units);
  ParameterSets hevcSets;
  CollectParameterSets(units, NalCodec::kH265, &hevcSets);
  EXPECT_FALSE(hevcSets.Complete(NalCodec::kH265));
  const std::vector<uint8_t> vps = Hex("000001 4001CC");
  SplitNalUnits(vps.data(), vps.size(), &units);
  CollectParameterSets(units, NalCodec::kH265, &hevcSets);
  EXPECT_TRUE(hevcSets.Complete(NalCodec::kH265));
  EXPECT_EQ(hevcSets.vps, Hex("4001CC"));
}

TEST(NalUnitsTest, AvcRecordCarriesFullParameterSetLengths) {
  ParameterSets sets;
  sets.sps = Hex("67640028");
  sets.sps.resize(300, 0xAB);  // longer than one length byte can say
  sets.pps = Hex("68EE3CB0");
  const std::vector<uint8_t> record = BuildAvcConfig(sets);
  ASSERT_EQ(record.size(), 6u + 2 + 300 + 1 + 2 + 4);
  EXPECT_EQ(std::vector<uint8_t>(record.begin(), record.begin() + 8), Hex("01 640028 FF E1 012C"));
  EXPECT_EQ(std::vector<uint8_t>(record.begin() + 308, record.end()), Hex("01 0004 68EE3CB0"));

  sets.pps.clear();
  EXPECT_EQ(BuildAvcConfig(sets).back(), 0);
  sets.sps = Hex("6764");
  EXPECT_TRUE(BuildAvcConfig(sets).empty());
}

TEST(NalUnitsTest, HevcRecordTakesProfileAndFormatFromTheSps) {
  struct Case {
    const char* name;
    const char* sps;
    uint8_t profileByte;
    uint8_t lumaByte;
    uint8_t chromaDepthByte;
  };
  // Parameter sets of x265 at 8 and 10 bits per sample (Main, Main 10).
  const Case cases[] = {
      {"main",
       "42010101600000030090000003000003003ca00a080f16595952930bc05a020000030002000003003210", 0x01,
       0xF8, 0xF8},
      {"main10",
       "42010102200000030090000003000003003ca00a080f136595952930bc05a02000000300200000030321", 0x02,
       0xFA, 0xFA},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    ParameterSets sets;
    sets.vps = Hex("40010c01ffff01600000030090000003000003003c959409");
    sets.sps = Hex(c.sps);
    sets.pps = Hex("4401c073c189");
    const std::vector<uint8_t> record = BuildHevcConfig(sets);
    ASSERT_GE(record.size(), 23u);
    EXPECT_EQ(record[0], 1);
    EXPECT_EQ(record[1], c.profileByte);  // space 0, main tier, profile idc
    EXPECT_EQ(record[12], 0x3C);          // level 2
    EXPECT_EQ(record[16], 0xFD);          // 4:2:0
    EXPECT_EQ(record[17], c.lumaByte);
    EXPECT_EQ(record[18], c.chromaDepthByte);
    EXPECT_EQ(record[21] & 0x03, 3);  // 4-byte lengths
    EXPECT_EQ(record[21] >> 3, 1);    // one temporal layer
    EXPECT_EQ(record[22], 3);         // VPS, SPS and PPS arrays
    EXPECT_EQ(record.size(), 23u + 3 * 5 + sets.vps.size() + sets.sps.size() + sets.pps.size());
  }
}

TEST(NalUnitsTest, HevcRecordNeedsAReadableSps) {
  ParameterSets sets;
  sets.vps = Hex("4001");
  sets.pps = Hex("4401");
  sets.sps = Hex("420101");
  EXPECT_TRUE(BuildHevcConfig(sets).empty());
  sets.sps.clear();
  EXPECT_TRUE(BuildHevcConfig(sets).empty());
}

TEST(NalUnitsTest, Mpeg4ConfigurationEndsAtTheFirstPicture) {
  struct Case {
    std::string stream;
    size_t size;
  };
  const Case cases[] = {
      {"000001B0 01 000001B5 09 00000120 0086 000001B6 10", 16},
      {"000001B6 10 000001B6 50", 0},
      {"000001B0 01", 0},
      {"", 0},
  };
  for (const Case& c : cases) {
    const std::vector<uint8_t> bytes = Hex(c.stream);
    EXPECT_EQ(Mpeg4ConfigSize(bytes.data(), bytes.size()), c.size) << c.stream;
  }
}

}  // namespace
}  // namespace hx
