#include "host/system_description.h"

#include <tinyxml.h>

#include <utility>

#include "alertmod/host_records.h"

namespace refhost {
namespace {

constexpr int32_t kAlertModuleId = static_cast<int32_t>(hx::core::kModuleId);  // its "Notify" ID
constexpr int32_t kChannelsPerEncoder = 16;

// Adds a new child element named `name` to `parent` and returns it.
TiXmlElement* AddChild(TiXmlElement* parent, const char* name) {
  return static_cast<TiXmlElement*>(parent->LinkEndChild(new TiXmlElement(name)));
}

std::string Print(const TiXmlElement& root) {
  std::string text;
  text << root;
  return text;
}

// What the host writes under one "Device" element: its name, its cameras'
// inputs and streams by context, and its trigger lines.
struct DeviceTree {
  const DeviceDescription* description = nullptr;
  std::vector<const CameraDescription*> cameras;
  std::map<int32_t, std::vector<std::pair<const CameraDescription*, StreamDescription>>> streams;
  std::vector<const TriggerDescription*> triggers;
};

// Plug-in ID -> device number -> what lies under that device.
using PluginTree = std::map<int32_t, std::map<int32_t, DeviceTree>>;

PluginTree SortByDevice(const SystemDescription& system) {
  PluginTree tree;
  for (const DeviceDescription& device : system.devices) {
    tree[device.plugin][device.device].description = &device;
  }
  for (const CameraDescription& camera : system.cameras) {
    DeviceTree& device = tree[camera.plugin][camera.device];
    device.cameras.push_back(&camera);
    const std::vector<StreamDescription> mainOnly(1);
    for (const StreamDescription& stream : camera.streams.empty() ? mainOnly : camera.streams) {
      device.streams[stream.context].emplace_back(&camera, stream);
    }
  }
  for (const TriggerDescription& trigger : system.triggers) {
    tree[trigger.plugin][trigger.device].triggers.push_back(&trigger);
  }
  return tree;
}

// The encoder of one stream: the channel number is the stream's "Number",
// and encoder * 16 + channel, or the sequence entry at the channel, must give
// the camera's input back.
void AddEncoder(TiXmlElement* codec, const CameraDescription& camera,
                const StreamDescription& stream) {
  const int32_t channel = stream.number.value_or(camera.input % kChannelsPerEncoder);
  const int32_t offset = camera.input - channel;
  const bool direct = offset % kChannelsPerEncoder == 0 || channel < 0;
  TiXmlElement* encoder = AddChild(codec, "Encoder");
  encoder->SetAttribute("Number", direct ? offset / kChannelsPerEncoder : 0);
  if (!direct) {
    TiXmlElement* sequence = AddChild(encoder, "Sequence");
    for (int32_t entry = 0; entry <= channel; ++entry) {
      AddChild(sequence, "Entry")->SetAttribute("Input", camera.input);
    }
  }
  TiXmlElement* element = AddChild(encoder, "Channel");
  const uint32_t id = HostStreamId(camera.plugin, camera.device, camera.input, stream.context);
  element->SetAttribute("ID", static_cast<int32_t>(id));
  element->SetAttribute("Number", channel);
  element->SetAttribute("Width", stream.width);
  element->SetAttribute("Height", stream.height);
  element->SetAttribute("Standard", stream.standard);
}

// "Video" / "Input" names and "Codec" / "Encoder" streams of one context.
// Every camera is named at context 0; an extra stream's camera is named in
// its context too, or the module would not know whose stream it is.
void AddContextStreams(TiXmlElement* parent, const DeviceTree& device, int32_t context) {
  const auto streams = device.streams.find(context);
  std::vector<const CameraDescription*> named = device.cameras;
  if (context != 0) {
    named.clear();
    for (const auto& entry : streams->second) named.push_back(entry.first);
  }
  if (!named.empty()) {
    TiXmlElement* video = AddChild(parent, "Video");
    for (const CameraDescription* camera : named) {
      TiXmlElement* input = AddChild(video, "Input");
      input->SetAttribute("Number", camera->input);
      input->SetAttribute("Name", camera->name);
    }
  }
  if (streams != device.streams.end()) {
    TiXmlElement* codec = AddChild(parent, "Codec");
    for (const auto& [camera, stream] : streams->second) {
      AddEncoder(codec, *camera, stream);
    }
  }
}

void AddTriggers(TiXmlElement* parent, const DeviceTree& device) {
  if (device.triggers.empty()) {
    return;
  }
  TiXmlElement* triggers = AddChild(parent, "Trigger");
  for (const TriggerDescription* trigger : device.triggers) {
    TiXmlElement* line = AddChild(triggers, trigger->output ? "Output" : "Input");
    line->SetAttribute("Number", trigger->number);
    line->SetAttribute("Name", trigger->name);
  }
}

void AddDevice(TiXmlElement* devices, int32_t number, const DeviceTree& tree) {
  TiXmlElement* device = AddChild(devices, "Device");
  device->SetAttribute("Number", number);
  if (tree.description != nullptr) {
    device->SetAttribute("Name", tree.description->name);
    if (tree.description->serial) {
      device->SetAttribute("Serial", *tree.description->serial);
    }
  }
  AddContextStreams(device, tree, 0);
  AddTriggers(device, tree);
  for (const auto& [context, streams] : tree.streams) {
    if (context != 0) {
      TiXmlElement* element = AddChild(device, "Context");
      element->SetAttribute("Number", context);
      AddContextStreams(element, tree, context);
    }
  }
}

void AddPlugins(TiXmlElement* trellan, const SystemDescription& system) {
  for (const auto& [plugin, devices] : SortByDevice(system)) {
    TiXmlElement* element = AddChild(trellan, "Devices");
    element->SetAttribute("ID", plugin);
    const auto description = system.pluginDescriptions.find(plugin);
    if (description != system.pluginDescriptions.end()) {
      element->SetAttribute("Description", description->second);
    }
    for (const auto& [number, tree] : devices) {
      AddDevice(element, number, tree);
    }
  }
}

void AddHostTriggers(TiXmlElement* trellan, const char* section, int32_t plugin,
                     const std::vector<HostTriggerDescription>& triggers) {
  if (triggers.empty()) {
    return;
  }
  TiXmlElement* element = AddChild(trellan, section);
  element->SetAttribute("ID", plugin);
  for (const HostTriggerDescription& trigger : triggers) {
    TiXmlElement* input = AddChild(element, "Input");
    input->SetAttribute("Number", trigger.number);
    input->SetAttribute("Name", trigger.name);
  }
}

// Devices (ID) / Device (Number): the start of every device-borne source.
TiXmlElement* AddDevicePath(TiXmlElement* parent, const EventSourceRef& source) {
  TiXmlElement* devices = AddChild(parent, "Devices");
  devices->SetAttribute("ID", source.plugin);
  TiXmlElement* device = AddChild(devices, "Device");
  device->SetAttribute("Number", source.device);
  return device;
}

void AddCameraChannel(TiXmlElement* parent, const EventSourceRef& source) {
  TiXmlElement* holder = AddDevicePath(parent, source);
  if (source.context != 0) {
    holder = AddChild(holder, "Context");
    holder->SetAttribute("Number", source.context);
  }
  TiXmlElement* encoder = AddChild(AddChild(holder, "Codec"), "Encoder");
  AddChild(encoder, "Channel")->SetAttribute("Number", source.input);
}

// The source of an event definition or of a source group's entry.
void AddSource(TiXmlElement* parent, const EventSourceRef& source) {
  using Kind = EventSourceRef::Kind;
  switch (source.kind) {
    case Kind::kNone:
      return;
    case Kind::kCamera: {
      TiXmlElement* input = AddChild(AddChild(AddDevicePath(parent, source), "Video"), "Input");
      input->SetAttribute("Number", source.input);
      input->SetAttribute("Context", source.context);
      return;
    }
    case Kind::kCameraChannel:
      AddCameraChannel(parent, source);
      return;
    case Kind::kTrigger:
      AddChild(AddChild(AddDevicePath(parent, source), "Trigger"), "Input")
          ->SetAttribute("Number", source.input);
      return;
    case Kind::kSourceGroup:
      AddChild(parent, "SourceGroup")->SetAttribute("ID", source.input);
      return;
    case Kind::kAnalytics: {
      TiXmlElement* analytics = AddChild(parent, "Analytics");
      analytics->SetAttribute("ID", source.plugin);
      TiXmlElement* device = AddChild(analytics, "Device");
      device->SetAttribute("Number", source.device);
      AddChild(device, "Input")->SetAttribute("Number", source.input);
      return;
    }
  }
}

void AddEvent(TiXmlElement* events, const EventDescription& description) {
  TiXmlElement* event = AddChild(events, "Event");
  event->SetAttribute("ID", description.id);
  if (description.preAlarmSeconds) {
    event->SetAttribute("PreAlarm", *description.preAlarmSeconds);
  }
  AddSource(event, description.source);
  TiXmlElement* action = AddChild(event, "Action");
  if (description.notifyProfiles.empty()) {
    AddChild(action, "Record");
    return;
  }
  TiXmlElement* notify = AddChild(action, "Notify");
  notify->SetAttribute("ID", kAlertModuleId);
  for (const int32_t profile : description.notifyProfiles) {
    AddChild(notify, "Profile")->SetAttribute("ID", profile);
  }
}

// Source groups first: the module reads every element from the first
// "Event" on as an event definition.
void AddEvents(TiXmlElement* trellan, const SystemDescription& system) {
  if (system.groups.empty() && system.events.empty()) {
    return;
  }
  TiXmlElement* events = AddChild(trellan, "Events");
  events->SetAttribute("ID", kSourceGroupPlugin);
  for (const SourceGroupDescription& group : system.groups) {
    TiXmlElement* element = AddChild(events, "SourceGroup");
    element->SetAttribute("ID", group.id);
    if (group.name) {
      element->SetAttribute("Name", *group.name);
    }
    for (const EventSourceRef& member : group.members) {
      AddSource(AddChild(element, "Entry"), member);
    }
  }
  for (const EventDescription& event : system.events) {
    AddEvent(events, event);
  }
}

// One "Analytics" element per section; the module reads every element from
// the first "Analytics" on as such a section, so they come last.
void AddAnalytics(TiXmlElement* root, const std::vector<AnalyticsInputDescription>& inputs) {
  std::map<int32_t, TiXmlElement*> sections;
  for (const AnalyticsInputDescription& description : inputs) {
    TiXmlElement*& section = sections[description.section];
    if (section == nullptr) {
      section = AddChild(root, "Analytics");
      section->SetAttribute("ID", description.section);
    }
    TiXmlElement* device = AddChild(section, "Device");
    device->SetAttribute("Number", description.device);
    TiXmlElement* input = AddChild(device, "Input");
    input->SetAttribute("Number", description.input);
    input->SetAttribute("DevicesID", description.cameraPlugin);
    input->SetAttribute("DeviceNumber", description.cameraDevice);
    input->SetAttribute("InputNumber", description.cameraInput);
    AddChild(input, "Rule")->SetAttribute("ID", description.rule);
  }
}

void AddEventSource(TiXmlElement* parent, const AlarmRequest::Source& source) {
  TiXmlElement* element = AddChild(parent, "EventSource");
  element->SetAttribute("Plugin", source.plugin);
  element->SetAttribute("Device", source.device);
  element->SetAttribute("Input", source.input);
  element->SetAttribute("Context", source.context);
  element->SetAttribute("Type", source.type);
}

void AddAlarmRequest(TiXmlElement* profiles, const AlarmRequest& request) {
  TiXmlElement* element = AddChild(profiles, "Profile");
  if (request.alarm) element->SetAttribute("Alarm", *request.alarm);
  element->SetAttribute("ID", request.profile);
  if (request.action) element->SetAttribute("Action", *request.action);
  if (request.message) element->SetAttribute("Message", *request.message);
  if (request.time) element->SetAttribute("Time", std::to_string(*request.time));
  if (request.milliseconds) element->SetAttribute("Milliseconds", *request.milliseconds);
  if (request.source) {
    AddEventSource(element, *request.source);
  } else if (request.group) {
    TiXmlElement* group = AddChild(element, "SourceGroup");
    group->SetAttribute("ID", *request.group);
    for (const AlarmRequest::Source& member : request.groupMembers) AddEventSource(group, member);
  }
}

}  // namespace

uint32_t HostStreamId(int32_t plugin, int32_t device, int32_t input, int32_t context) {
  // The host's own numbering; the module reads stream identifiers as event
  // source keys, so the two must agree.
  return ((static_cast<uint32_t>(device) | (static_cast<uint32_t>(context) << 20)) << 8) |
         static_cast<uint32_t>(input) | (static_cast<uint32_t>(plugin) & 0xFF0000u);
}

EventSourceRef EventSourceRef::Camera(int32_t plugin, int32_t device, int32_t input,
                                      int32_t context) {
  return {Kind::kCamera, plugin, device, input, context};
}

EventSourceRef EventSourceRef::CameraChannel(int32_t plugin, int32_t device, int32_t channel,
                                             int32_t context) {
  return {Kind::kCameraChannel, plugin, device, channel, context};
}

EventSourceRef EventSourceRef::Trigger(int32_t plugin, int32_t device, int32_t input) {
  return {Kind::kTrigger, plugin, device, input, 0};
}

EventSourceRef EventSourceRef::Group(int32_t group) {
  return {Kind::kSourceGroup, kSourceGroupPlugin, 0, group, 0};
}

EventSourceRef EventSourceRef::Analytics(int32_t section, int32_t device, int32_t input) {
  return {Kind::kAnalytics, section, device, input, 0};
}

std::string BuildSystemDocument(const SystemDescription& system) {
  TiXmlElement trellan("Trellan");
  trellan.SetAttribute("Delta", 0);
  AddPlugins(&trellan, system);
  AddHostTriggers(&trellan, "SoftTriggers", kSoftTriggerPlugin, system.softTriggers);
  AddHostTriggers(&trellan, "TimeTriggers", kTimeTriggerPlugin, system.timeTriggers);
  AddEvents(&trellan, system);
  AddAnalytics(&trellan, system.analytics);
  return Print(trellan);
}

std::string BuildAnalyticsDocument(const SystemDescription& system) {
  if (system.analytics.empty()) {
    return std::string();
  }
  TiXmlElement trellan("Trellan");
  AddAnalytics(&trellan, system.analytics);
  return Print(trellan);
}

std::string BuildAlarmDocument(const AlarmDocument& alarm) {
  TiXmlElement root("Trellan");
  if (alarm.serverSerial || alarm.serverDescription) {
    TiXmlElement* server = AddChild(AddChild(&root, "Servers"), "Server");
    if (alarm.serverSerial) server->SetAttribute("Serial", *alarm.serverSerial);
    if (alarm.serverDescription) server->SetAttribute("Description", *alarm.serverDescription);
  }
  TiXmlElement* notify = AddChild(&root, "Notify");
  notify->SetAttribute("ID", kAlertModuleId);
  TiXmlElement* profiles = AddChild(notify, "Profiles");
  for (const AlarmRequest& request : alarm.requests) {
    AddAlarmRequest(profiles, request);
  }
  return Print(root);
}

}  // namespace refhost
