#include "alertmod/video/ps_packet.h"

#include "alertmod/platform/utc_time.h"

namespace hx {

void SetPacketTime(int64_t timeMs, _PSFILE_PACKET* packet) {
  const int64_t whole = timeMs / 1000;  // truncates towards zero, as the record wants
  std::tm fields{};
  if (platform::UtcFields(whole, &fields)) {
    packet->year = static_cast<uint16_t>(fields.tm_year + 1900);
    packet->month = static_cast<uint16_t>(fields.tm_mon + 1);
    packet->day = static_cast<uint16_t>(fields.tm_mday);
    packet->hour = static_cast<uint32_t>(fields.tm_hour);
    packet->minute = static_cast<uint32_t>(fields.tm_min);
    packet->second = static_cast<uint32_t>(fields.tm_sec);
  }
  packet->seconds = static_cast<uint32_t>(whole);
  packet->millisecond = static_cast<uint16_t>(timeMs - whole * 1000);
}

int64_t PacketTime(const _PSFILE_PACKET& packet, int64_t unitsPerSecond) {
  std::tm fields{};
  fields.tm_year = static_cast<int>(packet.year) - 1900;
  fields.tm_mon = static_cast<int>(packet.month) - 1;
  fields.tm_mday = static_cast<int>(packet.day);
  fields.tm_hour = static_cast<int>(packet.hour);
  fields.tm_min = static_cast<int>(packet.minute);
  fields.tm_sec = static_cast<int>(packet.second);
  const int64_t seconds = platform::UtcSeconds(fields);
  return seconds * unitsPerSecond + (unitsPerSecond / 1000) * packet.millisecond;
}

PSStreamDescriptor MakeStreamDescriptor(uint8_t codec, uint32_t width, uint32_t height) {
  PSStreamDescriptor descriptor;
  descriptor.codec = codec;
  descriptor.width16 = static_cast<uint8_t>(width / 16);
  descriptor.height16 = static_cast<uint8_t>(height / 16);
  return descriptor;
}

}  // namespace hx
