// The event source key: the 32-bit number by which the host names the origin
// of an event (plug-in class, device, input and context) and numbers its
// video streams. Alarm requests, host system documents, the catalogue and
// video capture all build and take apart keys with these helpers, so the bit
// layout lives here only.
//
//   bits 28..31  context (extra streams of a camera: 1, 2, ...)
//   bits 16..23  plug-in class (the plug-in number AND 0xFF0000)
//   bits  8..15  device
//   bits  0..7   input
//
// Device and input numbers of 256 and above spill into the neighbouring bits,
// as they do in the host. Pure functions; any thread.
#ifndef ALERTMOD_MANAGER_EVENT_SOURCE_KEY_H_
#define ALERTMOD_MANAGER_EVENT_SOURCE_KEY_H_

#include <cstdint>

namespace hx {

// The plug-in bits of a key.
constexpr uint32_t kPluginBitsMask = 0xFF0000u;
// A key without its context bits: the camera itself rather than one of its
// extra streams.
constexpr uint32_t kKeyWithoutContextMask = 0x0FFFFFFFu;
// Source groups are keyed as this plug-in class OR the group number.
constexpr uint32_t kSourceGroupKeyBase = 0xA0000u;

// ((device | (context << 20)) << 8) | input | (plugin & 0xFF0000), in unsigned
// 32-bit arithmetic, so negative or oversized numbers wrap instead of
// overflowing.
constexpr uint32_t EventSourceKey(int32_t plugin, int32_t device, int32_t input, int32_t context) {
  return ((static_cast<uint32_t>(device) | (static_cast<uint32_t>(context) << 20)) << 8) |
         static_cast<uint32_t>(input) | (static_cast<uint32_t>(plugin) & kPluginBitsMask);
}

// The key under which the catalogue lists a camera's extra streams: device
// and input cut to eight bits each, no context.
constexpr uint32_t CameraKey(int32_t plugin, int32_t device, int32_t input) {
  return ((static_cast<uint32_t>(device) & 0xFFu) << 8) | (static_cast<uint32_t>(input) & 0xFFu) |
         (static_cast<uint32_t>(plugin) & kPluginBitsMask);
}

// The key of source group `groupId` (only its low eight bits count).
constexpr uint32_t SourceGroupKey(int32_t groupId) {
  return kSourceGroupKeyBase | (static_cast<uint32_t>(groupId) & 0xFFu);
}

// The parts of a key, as SourceName and the stream lookups read them back.
constexpr int32_t KeyPlugin(uint32_t key) {
  return static_cast<int32_t>(key & kPluginBitsMask);
}
constexpr int32_t KeyDevice(uint32_t key) {
  return static_cast<int32_t>((key >> 8) & 0xFFu);
}
constexpr int32_t KeyInput(uint32_t key) {
  return static_cast<int32_t>(key & 0xFFu);
}
constexpr int32_t KeyContext(uint32_t key) {
  return static_cast<int32_t>(key >> 28);
}

}  // namespace hx

#endif  // ALERTMOD_MANAGER_EVENT_SOURCE_KEY_H_
