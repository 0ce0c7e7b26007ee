// The reference host's documents, built from a few lines of description.
//
// The recording server tells the alert module about itself in a system
// document ("Trellan" with "Delta" 0): its plug-ins ("Devices") with their
// devices, camera inputs, video streams and trigger lines; its soft and time
// triggers; and its event definitions ("Events"), which say which source fires
// which event and which event notifies which profile. When an event fires, a
// module of the host sends an alarm document whose requests name the profile,
// the edge (start or end) and the source of the event.
//
// SystemDescription and AlarmDocument describe such a system and such an
// alarm; BuildSystemDocument and BuildAlarmDocument print them as the host
// does. Tests and the demo use them instead of hand-written XML.
//
// The host numbers every video stream with the event source key of the input
// it carries, context included:
//   stream ID = ((device | (context << 20)) << 8) | input | (plugin & 0xFF0000)
// so a camera's main stream (context 0) has the camera's own key and its
// extra streams (context 1, 2, ...) have that key with the context bits set.
//
// Plain data and pure functions; any thread.
#ifndef ALERTMOD_HOST_SYSTEM_DESCRIPTION_H_
#define ALERTMOD_HOST_SYSTEM_DESCRIPTION_H_

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace refhost {

// Host codec codes, written as a stream's "Standard".
constexpr int32_t kStandardJpeg = 0;  // every frame a complete still image
constexpr int32_t kStandardMpeg4 = 4;
constexpr int32_t kStandardH264 = 5;
constexpr int32_t kStandardH265 = 6;

// Plug-in classes of the host's own event sources.
constexpr int32_t kSoftTriggerPlugin = 0x30000;
constexpr int32_t kTimeTriggerPlugin = 0x40000;
constexpr int32_t kSourceGroupPlugin = 0xA0000;  // a group's key is this OR its number

// The stream identifier the host gives to the stream of input `input` of
// `device` of plug-in `plugin` at `context` (see above).
uint32_t HostStreamId(int32_t plugin, int32_t device, int32_t input, int32_t context);

// One video stream of a camera.
struct StreamDescription {
  int32_t context = 0;  // 0: the camera's main stream; 1, 2, ...: extra streams
  int32_t standard = kStandardH264;
  int32_t width = 1280;
  int32_t height = 720;
  // The channel number the host writes as the stream's "Number". By default
  // the input's number within its encoder (input % 16). A number of its own
  // (a multiplexed encoder) is mapped back to the input with a "Sequence";
  // -1 marks a stream without a valid number and can be expressed only for
  // inputs where input + 1 is a multiple of 16.
  std::optional<int32_t> number;
};

struct CameraDescription {
  std::string name;
  int32_t plugin = 0x10000;  // the "Devices" ID of the camera's plug-in
  int32_t device = 1;
  int32_t input = 0;
  // Empty: one H.264 main stream at context 0.
  std::vector<StreamDescription> streams;
};

// A device of a plug-in, for its name ("Name", "Serial"). Cameras and
// triggers on a device that is not listed get a device without a name.
struct DeviceDescription {
  int32_t plugin = 0x10000;
  int32_t device = 1;
  std::string name;
  std::optional<std::string> serial;
};

// A trigger line of a device: an input (an event source) or an output.
struct TriggerDescription {
  std::string name;
  int32_t plugin = 0x10000;
  int32_t device = 1;
  int32_t number = 0;
  bool output = false;
};

// A soft or time trigger of the host.
struct HostTriggerDescription {
  std::string name;
  int32_t number = 0;
};

// Where an event comes from, in the shapes the host writes inside an event
// definition or a source group's entry.
struct EventSourceRef {
  enum class Kind {
    kNone,           // no source element
    kCamera,         // Devices / Device / Video / Input (Number, Context)
    kCameraChannel,  // Devices / Device / [Context] / Codec / Encoder / Channel
    kTrigger,        // Devices / Device / Trigger / Input
    kSourceGroup,    // SourceGroup (ID)
    kAnalytics,      // Analytics (ID) / Device (Number) / Input (Number)
  };
  Kind kind = Kind::kNone;
  int32_t plugin = 0;  // for kAnalytics: the analytics section's ID
  int32_t device = 0;
  int32_t input = 0;  // for kSourceGroup: the group number
  int32_t context = 0;

  static EventSourceRef Camera(int32_t plugin, int32_t device, int32_t input, int32_t context = 0);
  static EventSourceRef CameraChannel(int32_t plugin, int32_t device, int32_t channel,
                                      int32_t context = 0);
  static EventSourceRef Trigger(int32_t plugin, int32_t device, int32_t input);
  static EventSourceRef Group(int32_t group);
  static EventSourceRef Analytics(int32_t section, int32_t device, int32_t input);
};

struct SourceGroupDescription {
  int32_t id = 0;
  std::optional<std::string> name;  // a group may have no name
  std::vector<EventSourceRef> members;
};

// An event definition: its source and, when `notifyProfiles` is not empty, an
// action that notifies those profiles of the alert module.
struct EventDescription {
  int32_t id = 0;
  std::optional<int32_t> preAlarmSeconds;
  EventSourceRef source;
  std::vector<int32_t> notifyProfiles;
};

// An analytics input and the camera input that supplies its video.
struct AnalyticsInputDescription {
  int32_t section = 0x70000;  // the "Analytics" ID
  int32_t device = 1;
  int32_t input = 0;
  int32_t cameraPlugin = 0x10000;
  int32_t cameraDevice = 1;
  int32_t cameraInput = 0;
  int32_t rule = 1;
};

struct SystemDescription {
  std::map<int32_t, std::string> pluginDescriptions;  // "Devices" Description by ID
  std::vector<DeviceDescription> devices;
  std::vector<CameraDescription> cameras;
  std::vector<TriggerDescription> triggers;
  std::vector<HostTriggerDescription> softTriggers;
  std::vector<HostTriggerDescription> timeTriggers;
  std::vector<SourceGroupDescription> groups;
  std::vector<EventDescription> events;
  std::vector<AnalyticsInputDescription> analytics;
};

// The full system document ("Trellan", "Delta" 0) of `system`, printed
// compactly. Plug-ins appear in ascending ID order, devices in ascending
// number order; everything else in the order given.
std::string BuildSystemDocument(const SystemDescription& system);

// The "Analytics" section of `system` alone, in a document that carries no
// "Delta" (it changes nothing else). Empty when `system` has no analytics.
std::string BuildAnalyticsDocument(const SystemDescription& system);

// One request of an alarm document: an event's start or end for a profile.
struct AlarmRequest {
  std::optional<int32_t> alarm = 1;  // non-zero: the event starts; 0: it ends
  int32_t profile = 0;
  std::optional<int32_t> action = 0;  // the event definition's ID
  std::optional<std::string> message;
  std::optional<int64_t> time;  // seconds since 1970
  std::optional<int32_t> milliseconds;
  // An "EventSource" child with these five numbers, or else a "SourceGroup"
  // child with `group`, or else no source.
  struct Source {
    int32_t plugin = 0x10000;
    int32_t device = 1;
    int32_t input = 0;
    int32_t context = 0;
    int32_t type = 1;  // host event type: 1 motion
  };
  std::optional<Source> source = Source();
  std::optional<int32_t> group;
  // The group's members, written as "EventSource" children of "SourceGroup".
  std::vector<Source> groupMembers;
};

struct AlarmDocument {
  std::optional<std::string> serverSerial;
  std::optional<std::string> serverDescription;
  std::vector<AlarmRequest> requests;
};

// The alarm document of `alarm`, addressed to the alert module
// ("Notify" ID 786432), printed compactly.
std::string BuildAlarmDocument(const AlarmDocument& alarm);

}  // namespace refhost

#endif  // ALERTMOD_HOST_SYSTEM_DESCRIPTION_H_
