#include "host/scenario/scenario_parser.h"

#include <algorithm>
#include <cctype>
#include <climits>
#include <cstdlib>
#include <fstream>
#include <map>
#include <sstream>

#include "host/scenario/scenario_directive.h"
#include "host/scenario/scenario_vocabulary.h"

namespace refhost::scenario {
namespace {

constexpr int64_t kMaxId = INT32_MAX;
constexpr int32_t kByteMax = 255;
constexpr int32_t kMaxContext = 15;  // four bits of the event source key
constexpr int32_t kMaxSizeLimitMb = 2047;
constexpr int32_t kMaxPictureSide = 16384;
constexpr char kTestMessage[] = "Testing Profile";

// A code of `vocabulary` by its word, or a number when `numbers` allows it.
std::optional<int32_t> NamedValue(Directive& d, const char* key, Vocabulary vocabulary,
                                  bool numbers) {
  std::optional<std::string> text = d.Text(key);
  if (!text) return std::nullopt;
  if (std::optional<int32_t> code = CodeOf(vocabulary, *text)) return code;
  int64_t number = 0;
  if (numbers && ParseInteger(*text, &number) && number >= INT32_MIN && number <= INT32_MAX) {
    return static_cast<int32_t>(number);
  }
  d.Fault(std::string(key) + " must be one of " + WordsOf(vocabulary) +
          (numbers ? " or a number" : "") + ", not \"" + *text + "\"");
  return std::nullopt;
}

// Seconds as "2", "2.5" or "2.5s".
bool ParseSeconds(std::string text, double* seconds) {
  if (!text.empty() && text.back() == 's') text.pop_back();
  if (text.empty() || !(std::isdigit(static_cast<unsigned char>(text[0])))) return false;
  char* end = nullptr;
  *seconds = std::strtod(text.c_str(), &end);
  return *end == '\0' && *seconds >= 0 && *seconds < 1e7;
}

// Where an event or an alarm comes from.
struct SourceRef {
  enum class Kind { kSystem, kCamera, kTrigger, kGroup };
  Kind kind = Kind::kSystem;
  int32_t plugin = 0;
  int32_t device = 0;
  int32_t input = 0;  // for kGroup: the group's number
  std::string name;
};

struct EventInfo {
  SourceRef source;
  std::optional<int32_t> type;
  std::vector<int32_t> profiles;
};

class Parser {
 public:
  explicit Parser(const ParseOptions& options) : m_options(options) {}

  ParseResult Run(const std::string& text) {
    std::istringstream lines(text);
    std::string line;
    int next = 0;
    while (ReadLogicalLine(lines, &line, &next)) ParseLine(line);
    FinishTimeline();
    std::stable_sort(m_result.errors.begin(), m_result.errors.end(),
                     [](const Diagnostic& a, const Diagnostic& b) { return a.line < b.line; });
    return std::move(m_result);
  }

 private:
  using Handler = void (Parser::*)(Directive&);

  void Error(int line, std::string message) {
    m_result.errors.push_back(Diagnostic{line, std::move(message)});
  }

  // One line, joined with the lines after it while it ends in a backslash.
  // Faults are reported at the line where it started.
  bool ReadLogicalLine(std::istream& in, std::string* logical, int* next) {
    logical->clear();
    std::string line;
    bool more = true;
    bool any = false;
    while (more && std::getline(in, line)) {
      if (!any) m_line = *next + 1;
      ++*next;
      any = true;
      if (!line.empty() && line.back() == '\r') line.pop_back();
      const size_t end = line.find_last_not_of(" \t");
      more = end != std::string::npos && line[end] == '\\';
      if (more) line.resize(end);
      *logical += line;
      if (more) *logical += ' ';
    }
    return any;
  }

  void ParseLine(const std::string& line) {
    std::vector<Token> words;
    std::string error;
    if (!SplitLine(line, m_options.variables, &words, &error)) return Error(m_line, error);
    if (words.empty()) return;
    if (!words[0].key.empty())
      return Error(m_line, "a line starts with a directive, not " + words[0].key + "=");
    if (words[0].value == "at") return ParseTimed(words);
    static const std::map<std::string, Handler> kHandlers = {
        {"system", &Parser::System},
        {"plugin", &Parser::Plugin},
        {"device", &Parser::Device},
        {"camera", &Parser::Camera},
        {"stream", &Parser::Stream},
        {"trigger", &Parser::Trigger},
        {"group", &Parser::Group},
        {"event", &Parser::Event},
        {"feed", &Parser::Feed},
        {"limits", &Parser::Limits},
        {"web", &Parser::Web},
        {"smtp", &Parser::Smtp},
        {"profile", &Parser::Profile},
        {"body", &Parser::Body},
        {"config-file", &Parser::ConfigFile},
        {"config-as", &Parser::ConfigAs},
    };
    const auto handler = kHandlers.find(words[0].value);
    if (handler == kHandlers.end())
      return Error(m_line, "unknown directive \"" + words[0].value + "\"");
    Directive directive(words, 0);
    (this->*handler->second)(directive);
    for (const std::string& fault : directive.faults()) Error(m_line, fault);
  }

  std::string ResolvePath(const std::string& path) const {
    if (path.empty() || path[0] == '/') return path;
    return m_options.baseDir + "/" + path;
  }

  // ---- the recording system -------------------------------------------

  void System(Directive& d) {
    std::optional<std::string> serial = d.Text("serial");
    std::optional<std::string> name = d.Text("name");
    d.Finish(0);
    if (!serial && !name) d.Fault("system needs serial= or name=");
    if (d.failed()) return;
    if (serial) m_result.scenario.serverSerial = serial;
    if (name) m_result.scenario.serverDescription = name;
  }

  // The plug-in and device numbers of a camera, trigger or device line,
  // keeping the given defaults when absent. False when either is faulty.
  bool ReadDevice(Directive& d, int32_t* plugin, int32_t* device) {
    std::optional<int32_t> givenPlugin = d.Integer("plugin", 0, 0xFF0000);
    if (givenPlugin && (*givenPlugin & 0xFFFF) != 0) {
      d.Fault("plugin must be a multiple of 0x10000");
      givenPlugin.reset();
    }
    *plugin = givenPlugin.value_or(*plugin);
    *device = d.Integer("device", 0, kByteMax).value_or(*device);
    return !d.failed();
  }

  void Plugin(Directive& d) {
    std::optional<int32_t> id = d.IntegerWord(0, "plugin number", 0x10000, 0xFF0000);
    std::optional<std::string> description = d.Word(1, "plugin description");
    d.Finish(2);
    if (id && (*id & 0xFFFF) != 0) d.Fault("plugin must be a multiple of 0x10000");
    if (d.failed()) return;
    m_result.scenario.system.pluginDescriptions[*id] = *description;
  }

  void Device(Directive& d) {
    DeviceDescription device;
    std::optional<std::string> name = d.Word(0, "device name");
    ReadDevice(d, &device.plugin, &device.device);
    device.serial = d.Text("serial");
    d.Finish(1);
    if (d.failed()) return;
    device.name = *name;
    m_result.scenario.system.devices.push_back(device);
  }

  // The stream attributes of "camera" and "stream": feed, codec, width, height.
  StreamSetting ReadStream(Directive& d, int32_t context) {
    StreamSetting stream;
    stream.line = m_line;
    stream.description.context = context;
    if (std::optional<std::string> feed = d.Text("feed")) stream.feed = ResolvePath(*feed);
    stream.formatGiven = d.Has("codec") || d.Has("width") || d.Has("height");
    std::optional<int32_t> codec = NamedValue(d, "codec", Vocabulary::kCodec, false);
    stream.description.standard = codec.value_or(stream.description.standard);
    stream.description.width =
        d.Integer("width", 1, kMaxPictureSide).value_or(stream.description.width);
    stream.description.height =
        d.Integer("height", 1, kMaxPictureSide).value_or(stream.description.height);
    if (stream.feed.empty()) stream.formatGiven = true;
    return stream;
  }

  // Names of cameras and triggers share one space: a group lists both.
  bool NameIsFree(Directive& d, const std::string& name) {
    if (name.empty()) {
      d.Fault("a name must not be empty");
      return false;
    }
    if (m_cameras.count(name) != 0 || m_triggers.count(name) != 0) {
      d.Fault("\"" + name + "\" is defined twice");
      return false;
    }
    return true;
  }

  void Camera(Directive& d) {
    CameraSetting camera;
    std::optional<std::string> name = d.Word(0, "camera name");
    ReadDevice(d, &camera.plugin, &camera.device);
    camera.input = d.Integer("input", 0, kByteMax).value_or(camera.input);
    camera.streams.push_back(ReadStream(d, 0));
    d.Finish(1);
    if (d.failed() || !NameIsFree(d, *name)) return;
    camera.name = *name;
    camera.line = m_line;
    for (const CameraSetting& other : m_result.scenario.cameras) {
      if (other.plugin == camera.plugin && other.device == camera.device &&
          other.input == camera.input) {
        return d.Fault("camera \"" + other.name + "\" already has this plugin, device and input");
      }
    }
    m_cameras[camera.name] = m_result.scenario.cameras.size();
    m_result.scenario.cameras.push_back(std::move(camera));
  }

  CameraSetting* FindCamera(Directive& d, const std::string& name) {
    const auto found = m_cameras.find(name);
    if (found != m_cameras.end()) return &m_result.scenario.cameras[found->second];
    d.Fault("unknown camera \"" + name + "\"");
    return nullptr;
  }

  void Stream(Directive& d) {
    std::optional<std::string> name = d.Word(0, "camera name");
    std::optional<int32_t> context = d.Integer("context", 1, kMaxContext);
    if (!d.Has("context")) d.Fault("stream needs context= (1 to 15)");
    std::optional<int32_t> number = d.Integer("number", -1, kByteMax);
    StreamSetting stream = ReadStream(d, context.value_or(1));
    d.Finish(1);
    CameraSetting* camera = name ? FindCamera(d, *name) : nullptr;
    if (d.failed() || camera == nullptr) return;
    for (const StreamSetting& other : camera->streams) {
      if (other.description.context == *context)
        return d.Fault("camera \"" + *name + "\" already has a stream at context " +
                       std::to_string(*context));
    }
    stream.description.number = number;
    camera->streams.push_back(std::move(stream));
  }

  void Trigger(Directive& d) {
    TriggerDescription trigger;
    std::optional<std::string> name = d.Word(0, "trigger name");
    ReadDevice(d, &trigger.plugin, &trigger.device);
    trigger.number = d.Integer("number", 0, kByteMax).value_or(trigger.number);
    trigger.output = d.Flag("output").value_or(false);
    d.Finish(1);
    if (d.failed() || !NameIsFree(d, *name)) return;
    trigger.name = *name;
    m_triggers[trigger.name] = m_result.scenario.system.triggers.size();
    m_result.scenario.system.triggers.push_back(trigger);
  }

  // A camera's or a trigger's name as a source.
  std::optional<SourceRef> NamedSource(Directive& d, const std::string& name) {
    if (const auto camera = m_cameras.find(name); camera != m_cameras.end()) {
      const CameraSetting& found = m_result.scenario.cameras[camera->second];
      return SourceRef{SourceRef::Kind::kCamera, found.plugin, found.device, found.input, name};
    }
    if (const auto trigger = m_triggers.find(name); trigger != m_triggers.end()) {
      const TriggerDescription& found = m_result.scenario.system.triggers[trigger->second];
      if (found.output) d.Fault("\"" + name + "\" is an output, not an event source");
      return SourceRef{SourceRef::Kind::kTrigger, found.plugin, found.device, found.number, name};
    }
    d.Fault("unknown camera or trigger \"" + name + "\"");
    return std::nullopt;
  }

  static EventSourceRef HostReference(const SourceRef& source) {
    switch (source.kind) {
      case SourceRef::Kind::kCamera:
        return EventSourceRef::Camera(source.plugin, source.device, source.input);
      case SourceRef::Kind::kTrigger:
        return EventSourceRef::Trigger(source.plugin, source.device, source.input);
      case SourceRef::Kind::kGroup:
        return EventSourceRef::Group(source.input);
      case SourceRef::Kind::kSystem:
        break;
    }
    return EventSourceRef();
  }

  void Group(Directive& d) {
    SourceGroupDescription group;
    std::optional<int32_t> id = d.IntegerWord(0, "group number", 0, kByteMax);
    if (d.WordCount() > 1) group.name = *d.Word(1, "group name");
    std::vector<SourceRef> members;
    for (const std::string& member : d.List("members")) {
      if (std::optional<SourceRef> source = NamedSource(d, member)) members.push_back(*source);
    }
    if (!d.Has("members")) d.Fault("group needs members=NAME,NAME...");
    d.Finish(2);
    if (d.failed()) return;
    if (m_groups.count(*id) != 0)
      return d.Fault("group " + std::to_string(*id) + " is defined twice");
    group.id = *id;
    for (const SourceRef& member : members) group.members.push_back(HostReference(member));
    m_groups[*id] = members;
    m_result.scenario.system.groups.push_back(group);
  }

  // camera=, trigger= or group=; the system itself when none is given.
  std::optional<SourceRef> ReadSource(Directive& d) {
    const int given = d.Has("camera") + d.Has("trigger") + d.Has("group");
    if (given > 1) {
      d.Fault("give only one of camera=, trigger= and group=");
      return std::nullopt;
    }
    if (std::optional<std::string> camera = d.Text("camera")) {
      if (FindCamera(d, *camera) == nullptr) return std::nullopt;
      return NamedSource(d, *camera);
    }
    if (std::optional<std::string> trigger = d.Text("trigger")) {
      if (m_triggers.count(*trigger) == 0) {
        d.Fault("unknown trigger \"" + *trigger + "\"");
        return std::nullopt;
      }
      return NamedSource(d, *trigger);
    }
    if (d.Has("group")) {
      std::optional<int32_t> group = d.Integer("group", 0, kByteMax);
      if (!group) return std::nullopt;
      if (m_groups.count(*group) == 0) {
        d.Fault("unknown group " + std::to_string(*group));
        return std::nullopt;
      }
      return SourceRef{SourceRef::Kind::kGroup, kSourceGroupPlugin, 0, *group,
                       "group " + std::to_string(*group)};
    }
    return SourceRef();
  }

  void Event(Directive& d) {
    std::optional<int32_t> id = d.IntegerWord(0, "event number", 1, kMaxId);
    std::optional<SourceRef> source = ReadSource(d);
    std::optional<int32_t> type = NamedValue(d, "type", Vocabulary::kEventType, true);
    std::optional<int32_t> preAlarm = d.Integer("prealarm", 0, 3600);
    std::vector<int32_t> profiles = d.IntegerList("notify", 1, kMaxId);
    d.Finish(1);
    if (d.failed()) return;
    if (m_events.count(*id) != 0)
      return d.Fault("event " + std::to_string(*id) + " is defined twice");
    EventDescription event;
    event.id = *id;
    event.preAlarmSeconds = preAlarm;
    event.source = HostReference(*source);
    event.notifyProfiles = profiles;
    m_events[*id] = EventInfo{*source, type, profiles};
    m_result.scenario.system.events.push_back(event);
  }

  void Feed(Directive& d) {
    std::optional<int32_t> id = d.IntegerWord(0, "stream number", 0, kMaxId);
    std::optional<std::string> path = d.Word(1, "video file");
    std::optional<bool> realTime = d.Flag("realtime");
    d.Finish(2);
    if (d.failed()) return;
    m_result.scenario.rawFeeds.push_back(
        RawFeed{static_cast<uint32_t>(*id), ResolvePath(*path), realTime.value_or(true)});
  }

  // ---- the module's configuration -------------------------------------

  ConfigSetting& InlineConfig(Directive& d) {
    ConfigSetting& config = m_result.scenario.config;
    if (config.source == ConfigSetting::Source::kFile) {
      d.Fault("configuration lines cannot be mixed with config-file");
    }
    return config;
  }

  void Limits(Directive& d) {
    std::optional<int32_t> retrySeconds = d.Integer("retry-seconds", 0, kMaxId);
    std::optional<int32_t> retryQueue = d.Integer("retry-queue", 0, kMaxId);
    std::optional<int32_t> sizeLimit = d.Integer("size-limit-mb", 0, kMaxSizeLimitMb);
    d.Finish(0);
    ConfigSetting& config = InlineConfig(d);
    if (d.failed()) return;
    config.source = ConfigSetting::Source::kInline;
    if (retrySeconds) config.maxRetrySeconds = retrySeconds;
    if (retryQueue) config.maxRetryQueue = retryQueue;
    if (sizeLimit) config.emailSizeLimitMb = sizeLimit;
  }

  void Web(Directive& d) {
    std::optional<std::string> address = d.Word(0, "web server address");
    d.Finish(1);
    ConfigSetting& config = InlineConfig(d);
    if (d.failed()) return;
    config.source = ConfigSetting::Source::kInline;
    config.webAddress = address;
  }

  void Smtp(Directive& d) {
    SmtpServerSetting server;
    std::optional<std::string> name = d.Word(0, "server name");
    std::optional<std::string> address = d.Text("address");
    if (!address) d.Fault("smtp needs address=");
    server.port = d.Integer("port", 1, 65535);
    server.security = NamedValue(d, "security", Vocabulary::kSecurity, true);
    server.user = d.Text("user").value_or("");
    server.password = d.Text("password").value_or("");
    d.Finish(1);
    ConfigSetting& config = InlineConfig(d);
    if (d.failed()) return;
    server.description = *name;
    server.address = *address;
    config.source = ConfigSetting::Source::kInline;
    config.servers.push_back(server);
  }

  void Profile(Directive& d) {
    ProfileSetting profile;
    std::optional<int32_t> id = d.IntegerWord(0, "profile number", 1, kMaxId);
    std::optional<std::string> name = d.Word(1, "profile name");
    std::optional<std::string> from = d.Text("from");
    profile.to = d.List("to");
    if (!from || profile.to.empty()) d.Fault("profile needs from= and to=");
    profile.cc = d.List("cc");
    profile.bcc = d.List("bcc");
    profile.subject = d.Text("subject").value_or("");
    if (std::optional<std::string> body = d.Text("body")) profile.bodyLines.push_back(*body);
    profile.attach = d.Flag("attach");
    profile.maxVideoSeconds = d.Integer("video-seconds", 0, 3600);
    profile.eventEdge = NamedValue(d, "edge", Vocabulary::kEdge, false);
    profile.throttleSeconds = d.Integer("throttle", 0, kMaxId);
    d.Finish(2);
    ConfigSetting& config = InlineConfig(d);
    if (d.failed()) return;
    if (m_profiles.count(*id) != 0)
      return d.Fault("profile " + std::to_string(*id) + " is defined twice");
    profile.id = *id;
    profile.description = *name;
    profile.from = *from;
    config.source = ConfigSetting::Source::kInline;
    m_profiles[*id] = config.profiles.size();
    config.profiles.push_back(std::move(profile));
  }

  void Body(Directive& d) {
    std::optional<int32_t> id = d.IntegerWord(0, "profile number", 1, kMaxId);
    std::optional<std::string> text = d.Word(1, "body text");
    d.Finish(2);
    if (d.failed()) return;
    const auto found = m_profiles.find(*id);
    if (found == m_profiles.end()) return d.Fault("unknown profile " + std::to_string(*id));
    m_result.scenario.config.profiles[found->second].bodyLines.push_back(*text);
  }

  void ConfigFile(Directive& d) {
    std::optional<std::string> path = d.Word(0, "configuration file");
    d.Finish(1);
    ConfigSetting& config = m_result.scenario.config;
    if (config.source == ConfigSetting::Source::kInline) {
      d.Fault("config-file cannot be mixed with configuration lines");
    } else if (config.source == ConfigSetting::Source::kFile) {
      d.Fault("config-file is given twice");
    }
    if (d.failed()) return;
    config.source = ConfigSetting::Source::kFile;
    config.file = ResolvePath(*path);
  }

  void ConfigAs(Directive& d) {
    std::optional<std::string> how = d.Word(0, "notify.xml or update");
    d.Finish(1);
    if (d.failed()) return;
    if (*how == "notify.xml") {
      m_result.scenario.config.delivery = ConfigSetting::Delivery::kBeforeOpen;
    } else if (*how == "update") {
      m_result.scenario.config.delivery = ConfigSetting::Delivery::kUpdate;
    } else {
      d.Fault("config-as takes notify.xml or update, not \"" + *how + "\"");
    }
  }

  // ---- the timeline ----------------------------------------------------

  void ParseTimed(const std::vector<Token>& words) {
    TimelineEntry entry;
    entry.line = m_line;
    if (words.size() < 3 || !words[1].key.empty() || !words[2].key.empty()) {
      return Error(m_line, "at needs a time and an action, like: at 5 alarm start camera=Lobby");
    }
    if (!ParseSeconds(words[1].value, &entry.at)) {
      return Error(m_line, "at needs a time in seconds, like 2.5, not \"" + words[1].value + "\"");
    }
    const std::vector<Token> action(words.begin() + 2, words.end());
    Directive d(action, 0);
    if (d.name() == "alarm") {
      Alarm(d, &entry);
    } else if (d.name() == "test") {
      Test(d, &entry);
    } else if (d.name() == "wait") {
      Wait(d, &entry);
    } else if (d.name() == "stop") {
      Stop(d, &entry);
    } else {
      d.Fault("unknown action \"" + d.name() + "\" (alarm, test, wait or stop)");
    }
    for (const std::string& fault : d.faults()) Error(m_line, fault);
    if (!d.failed()) m_result.scenario.timeline.push_back(std::move(entry));
  }

  // The profiles and the source of an alarm, from its own attributes or
  // else from its event.
  const EventInfo* AlarmEvent(Directive& d, std::optional<int32_t> id) {
    if (!id) return nullptr;
    const auto found = m_events.find(*id);
    if (found != m_events.end()) return &found->second;
    d.Fault("unknown event " + std::to_string(*id));
    return nullptr;
  }

  std::optional<int32_t> AlarmType(Directive& d, const SourceRef& source, const EventInfo* event) {
    std::optional<int32_t> type = NamedValue(d, "type", Vocabulary::kEventType, true);
    if (type) return type;
    if (event != nullptr && event->type) return event->type;
    switch (source.kind) {
      case SourceRef::Kind::kCamera:
        return kEventTypeMotion;
      case SourceRef::Kind::kTrigger:
        return kEventTypeInput;
      case SourceRef::Kind::kGroup:
        return kEventTypeSourceGroup;
      case SourceRef::Kind::kSystem:
        break;
    }
    if (!d.failed()) d.Fault("an alarm without camera, trigger or group needs type=");
    return std::nullopt;
  }

  AlarmRequest RequestFor(const SourceRef& source, int32_t type) const {
    AlarmRequest request;
    request.source.reset();
    if (source.kind == SourceRef::Kind::kGroup) {
      request.group = source.input;
      for (const SourceRef& member : m_groups.at(source.input)) {
        const bool camera = member.kind == SourceRef::Kind::kCamera;
        request.groupMembers.push_back(
            AlarmRequest::Source{member.plugin, member.device, member.input, 0,
                                 camera ? kEventTypeMotion : kEventTypeInput});
      }
      return request;
    }
    request.source = AlarmRequest::Source{source.plugin, source.device, source.input, 0, type};
    return request;
  }

  void Alarm(Directive& d, TimelineEntry* entry) {
    std::optional<std::string> edge = d.Word(0, "start or end");
    if (edge && *edge != "start" && *edge != "end")
      d.Fault("alarm start or alarm end, not \"" + *edge + "\"");
    std::optional<int32_t> eventId = d.Integer("event", 1, kMaxId);
    const EventInfo* event = AlarmEvent(d, eventId);
    std::vector<int32_t> profiles = d.IntegerList("profile", 1, kMaxId);
    if (profiles.empty() && event != nullptr) profiles = event->profiles;
    std::optional<SourceRef> source = ReadSource(d);
    const bool ownSource = d.Has("camera") || d.Has("trigger") || d.Has("group");
    if (source && !ownSource && event != nullptr) source = event->source;
    // AlarmType notes a fault when there is no type, so 0 is never sent.
    const int32_t type = source ? AlarmType(d, *source, event).value_or(0) : 0;
    std::optional<std::string> message = d.Text("message");
    d.Finish(1);
    if (!d.failed() && profiles.empty())
      d.Fault("alarm needs profile= or an event= that notifies profiles");
    if (d.failed()) return;
    for (int32_t profile : profiles) {
      AlarmRequest request = RequestFor(*source, type);
      request.alarm = *edge == "start" ? 1 : 0;
      request.profile = profile;
      request.action = eventId.value_or(0);
      request.message = message;
      entry->requests.push_back(request);
    }
    entry->label = "alarm " + *edge + ", " + WordOf(Vocabulary::kEventType, type) +
                   (source->name.empty() ? "" : " on " + source->name) +
                   (eventId ? ", event " + std::to_string(*eventId) : "");
  }

  void Test(Directive& d, TimelineEntry* entry) {
    if (d.WordCount() == 0) d.Fault("test needs a profile number");
    for (size_t i = 0; i < d.WordCount(); ++i) {
      std::optional<int32_t> profile = d.IntegerWord(i, "profile number", 1, kMaxId);
      if (!profile) continue;
      AlarmRequest request;
      request.source.reset();
      request.profile = *profile;
      request.message = kTestMessage;
      entry->requests.push_back(request);
    }
    d.Finish(d.WordCount());
    entry->test = true;
    entry->label = "test notification";
  }

  void Wait(Directive& d, TimelineEntry* entry) {
    entry->kind = TimelineEntry::Kind::kWait;
    WaitSetting& wait = entry->wait;
    wait.reports = d.Integer("reports", 1, kMaxId).value_or(0);
    wait.profile = d.Integer("profile", 1, kMaxId);
    wait.logText = d.Text("log").value_or("");
    if (std::optional<std::string> timeout = d.Text("timeout")) {
      if (!ParseSeconds(*timeout, &wait.timeoutSeconds) || wait.timeoutSeconds <= 0) {
        d.Fault("timeout must be a number of seconds, not \"" + *timeout + "\"");
      }
    }
    d.Finish(0);
    if (!d.Has("reports") && !d.Has("log")) d.Fault("wait needs reports=N or log=TEXT");
    entry->label = "wait";
  }

  void Stop(Directive& d, TimelineEntry* entry) {
    entry->kind = TimelineEntry::Kind::kStop;
    d.Finish(0);
    if (m_stop) d.Fault("stop is given twice (first at line " + std::to_string(m_stop->line) + ")");
    if (!d.failed()) m_stop = *entry;
    entry->label = "stop";
  }

  // Sorts the timeline and refuses anything planned after the stop.
  void FinishTimeline() {
    std::vector<TimelineEntry>& timeline = m_result.scenario.timeline;
    std::stable_sort(timeline.begin(), timeline.end(),
                     [](const TimelineEntry& a, const TimelineEntry& b) { return a.at < b.at; });
    if (!m_stop) return;
    for (const TimelineEntry& entry : timeline) {
      const bool after =
          entry.at > m_stop->at || (entry.at == m_stop->at && entry.line > m_stop->line);
      if (after && entry.kind != TimelineEntry::Kind::kStop) {
        Error(entry.line, "comes after the stop at line " + std::to_string(m_stop->line));
      }
    }
  }

  const ParseOptions& m_options;
  ParseResult m_result;
  int m_line = 0;
  std::map<std::string, size_t> m_cameras;             // name -> index in the scenario
  std::map<std::string, size_t> m_triggers;            // name -> index in the system
  std::map<int32_t, std::vector<SourceRef>> m_groups;  // number -> members
  std::map<int32_t, EventInfo> m_events;
  std::map<int32_t, size_t> m_profiles;  // number -> index in the configuration
  std::optional<TimelineEntry> m_stop;
};

}  // namespace

ParseResult ParseScenario(const std::string& text, const ParseOptions& options) {
  ParseResult result = Parser(options).Run(text);
  result.scenario.name = options.name;
  return result;
}

ParseResult LoadScenario(const std::string& path, const VariableLookup& variables) {
  ParseOptions options;
  options.name = path;
  const size_t slash = path.find_last_of('/');
  options.baseDir = slash == std::string::npos ? "." : (slash == 0 ? "/" : path.substr(0, slash));
  options.variables = variables;
  std::ifstream in(path, std::ios::binary);
  if (!in) {
    ParseResult result;
    result.errors.push_back(Diagnostic{0, "cannot read the file"});
    return result;
  }
  std::ostringstream text;
  text << in.rdbuf();
  return ParseScenario(text.str(), options);
}

std::string FormatDiagnostic(const std::string& name, const Diagnostic& diagnostic) {
  if (diagnostic.line == 0) return name + ": " + diagnostic.message;
  return name + ":" + std::to_string(diagnostic.line) + ": " + diagnostic.message;
}

}  // namespace refhost::scenario
