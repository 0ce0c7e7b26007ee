// The recording system's own packet records, through which the clip writer
// hands frames to the stream muxer: one packet per frame, a 4-byte
// descriptor per stream and the packet-file header record; and the
// conversions between a packet's time fields and milliseconds.
//
// Plain data and pure functions; any thread.
#ifndef ALERTMOD_VIDEO_PS_PACKET_H_
#define ALERTMOD_VIDEO_PS_PACKET_H_

#include <cstddef>
#include <cstdint>

namespace hx {

// Stream codec bytes of packets and stream descriptors.
constexpr uint8_t kPSCodecMjpeg = 128;
constexpr uint8_t kPSCodecH263 = 131;
constexpr uint8_t kPSCodecMpeg4 = 132;
constexpr uint8_t kPSCodecH264 = 133;
constexpr uint8_t kPSCodecH265 = 134;
constexpr uint8_t kPSCodecMulaw = 144;
constexpr uint8_t kPSCodecMsAdpcm = 145;
constexpr uint8_t kPSCodecAac = 148;
constexpr uint8_t kPSCodecG726 = 149;
constexpr uint8_t kPSCodecPcm16 = 150;
constexpr uint8_t kPSCodecNone = 255;

// Frame type of a key frame in a packet.
constexpr uint16_t kPSKeyFrame = 1;

// One packet: a frame of one stream with the time it belongs to.
struct _PSFILE_PACKET {
  uint16_t streamIndex = 0;  // 0 for clips; the muxer handles 0 to 47
  uint16_t frameType = 0;    // kPSKeyFrame, or a dependent frame
  uint32_t size = 0;         // payload bytes
  uint16_t reserved0 = 0;
  uint16_t year = 0;  // UTC calendar fields of the packet's time
  uint16_t month = 0;
  uint16_t day = 0;
  uint32_t hour = 0;
  uint32_t minute = 0;
  uint32_t second = 0;
  uint32_t millisecond = 0;
  uint32_t seconds = 0;  // the whole seconds the calendar fields came from
  uint32_t reserved1 = 0;
  const uint8_t* data = nullptr;  // first payload byte
  uint8_t reserved2 = 0;
  uint8_t flag = 0;  // per-packet flag byte; 0 from the clip writer
  uint8_t reserved3[6] = {};
  double muxerTime = 0;  // the muxer's own bookkeeping
};
static_assert(offsetof(_PSFILE_PACKET, data) == 40, "packet layout");
static_assert(sizeof(_PSFILE_PACKET) == 64, "packet layout");

// Describes one stream of a packet file.
struct PSStreamDescriptor {
  uint8_t codec = kPSCodecNone;
  uint8_t unused = 0;
  uint8_t width16 = 0;   // width / 16, truncated
  uint8_t height16 = 0;  // height / 16, truncated
};
static_assert(sizeof(PSStreamDescriptor) == 4, "descriptor layout");

// Stream flag of PSFileHeader: the file carries motion JPEG, which the
// container must be able to store.
constexpr uint8_t kPSHeaderMjpegStreams = 0x01;

// The header record of a packet file, as the muxer's Open takes it. The
// default values are those of a file without a primary stream.
struct PSFileHeader {
  uint16_t recordSize = 16;
  uint16_t word1 = 0xFFFF;
  uint32_t word2 = 0;
  uint32_t word3 = 0xFFFFFFFFu;
  uint32_t word4 = 0;
  uint8_t primaryCodec = kPSCodecNone;
  uint8_t primaryAux = 0xFF;
  uint8_t streamFlags = 0;
  uint8_t reserved[13] = {};
};
static_assert(sizeof(PSFileHeader) == 32, "header layout");

// Sets the packet's time fields from `timeMs` since 1970: the UTC calendar
// breakdown of the whole seconds (left unchanged if it fails), the whole
// seconds, and the millisecond remainder.
void SetPacketTime(int64_t timeMs, _PSFILE_PACKET* packet);

// The packet's time in units of 1/`unitsPerSecond` s since 1970, from its
// calendar fields and millisecond field (the seconds field is not read).
int64_t PacketTime(const _PSFILE_PACKET& packet, int64_t unitsPerSecond = 1000);

// The descriptor of a stream of `codec` with the given size in pixels.
PSStreamDescriptor MakeStreamDescriptor(uint8_t codec, uint32_t width, uint32_t height);

}  // namespace hx

#endif  // ALERTMOD_VIDEO_PS_PACKET_H_
