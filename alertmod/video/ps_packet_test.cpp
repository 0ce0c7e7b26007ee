#include "alertmod/video/ps_packet.h"

#include <gtest/gtest.h>

namespace hx {
namespace {

TEST(PacketTimeTest, MillisecondsToFieldsAndBack) {
  struct Case {
    int64_t timeMs;
    uint16_t year, month, day;
    uint32_t hour, minute, second, millisecond, seconds;
  };
  const Case cases[] = {
      {1234567, 1970, 1, 1, 0, 20, 34, 567, 1234},
      {999, 1970, 1, 1, 0, 0, 0, 999, 0},
      {1700000000123, 2023, 11, 14, 22, 13, 20, 123, 1700000000u},
      {951782400000, 2000, 2, 29, 0, 0, 0, 0, 951782400u},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.timeMs);
    _PSFILE_PACKET packet;
    SetPacketTime(c.timeMs, &packet);
    EXPECT_EQ(packet.year, c.year);
    EXPECT_EQ(packet.month, c.month);
    EXPECT_EQ(packet.day, c.day);
    EXPECT_EQ(packet.hour, c.hour);
    EXPECT_EQ(packet.minute, c.minute);
    EXPECT_EQ(packet.second, c.second);
    EXPECT_EQ(packet.millisecond, c.millisecond);
    EXPECT_EQ(packet.seconds, c.seconds);
    EXPECT_EQ(PacketTime(packet), c.timeMs);
    EXPECT_EQ(PacketTime(packet, 1000000), c.timeMs * 1000);
  }
}

TEST(PacketTimeTest, ReadingIgnoresTheSecondsField) {
  _PSFILE_PACKET packet;
  SetPacketTime(1234567, &packet);
  packet.seconds = 42;
  EXPECT_EQ(PacketTime(packet), 1234567);
}

TEST(StreamDescriptorTest, SizesInSixteenPixelUnits) {
  struct Case {
    uint32_t width, height;
    uint8_t width16, height16;
  };
  const Case cases[] = {
      {1920, 1080, 120, 67}, {1280, 720, 80, 45}, {352, 240, 22, 15}, {4096, 2160, 0, 135}};
  for (const Case& c : cases) {
    const PSStreamDescriptor descriptor = MakeStreamDescriptor(kPSCodecH264, c.width, c.height);
    EXPECT_EQ(descriptor.codec, kPSCodecH264);
    EXPECT_EQ(descriptor.width16, c.width16) << c.width;
    EXPECT_EQ(descriptor.height16, c.height16) << c.height;
  }
}

}  // namespace
}  // namespace hx
