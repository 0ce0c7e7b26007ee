// Alarm documents through Write from another module, on a system described
// by the reference host: the work items the worker receives, their source
// names from the catalogue, event edges, the pending release by edge, the
// throttle on the replaced tick, test requests, and documents that are not
// what they should be.
#include <gtest/gtest.h>

#include <chrono>
#include <string>
#include <vector>

#include "alertmod/config/xml_document.h"
#include "host/system_description.h"
#include "tests/manager_fixture.h"

namespace {

using managertest::kAlarmSender;
using managertest::NotifyElement;
using managertest::NotifyFile;
using managertest::ProfileSetting;
using refhost::AlarmDocument;
using refhost::AlarmRequest;
using refhost::EventSourceRef;

constexpr int32_t kEncoders = 0x10000;
constexpr uint32_t kLobby = 0x10100;  // camera: plug-in 0x10000, device 1, input 0

refhost::SystemDescription Site() {
  refhost::SystemDescription site;
  site.pluginDescriptions[kEncoders] = "Analog Encoder";
  site.devices = {{kEncoders, 1, "Encoder A", std::string("SN-1")}};
  site.cameras = {{"Lobby", kEncoders, 1, 0, {}}, {"Yard", kEncoders, 1, 1, {}}};
  site.triggers = {{"Door Contact", kEncoders, 1, 2, false}};
  site.softTriggers = {{"Panic Button", 4}};
  site.timeTriggers = {{"Night", 2}};
  site.groups = {{3, std::string("Ground floor"), {EventSourceRef::Camera(kEncoders, 1, 0)}}};
  site.events = {{7, 5, EventSourceRef::Camera(kEncoders, 1, 0), {1}},
                 {8, std::nullopt, EventSourceRef::Camera(kEncoders, 1, 1), {1}}};
  return site;
}

AlarmRequest::Source Source(int32_t plugin, int32_t device, int32_t input, int32_t type,
                            int32_t context = 0) {
  return AlarmRequest::Source{plugin, device, input, context, type};
}

AlarmRequest Request(int32_t profile, int32_t alarm, std::optional<AlarmRequest::Source> source,
                     const std::string& message = "") {
  AlarmRequest request;
  request.profile = profile;
  request.alarm = alarm;
  request.source = source;
  if (!message.empty()) request.message = message;
  return request;
}

class AlarmDocumentsTest : public managertest::ManagerHostTest {
 protected:
  void Send(const std::vector<AlarmRequest>& requests) {
    AlarmDocument document;
    document.requests = requests;
    SendAlarm(document);
  }
  // The messages (body up to its line break) of the items received so far.
  std::vector<std::string> Messages() {
    std::vector<std::string> messages;
    for (const auto& item : Items()) messages.push_back(item.body.substr(0, item.body.find('\r')));
    return messages;
  }
};

TEST_F(AlarmDocumentsTest, ItemsCarryTheCataloguesNamesAndTheServersFacts) {
  ProfileSetting templated{1, "Front door"};
  templated.eventEdge = 2;
  templated.subject = "{system name}: {event state}";
  ProfileSetting plain{2, "Plain"};
  StartWith(NotifyFile({templated, plain}));
  SendSystem(Site());
  struct Case {
    const char* name;
    std::optional<AlarmRequest::Source> source;
    std::optional<int32_t> group;
    uint32_t key;
    int32_t type;
    const char* sourceName;
  };
  const Case cases[] = {
      {"camera", Source(kEncoders, 1, 0, 1), {}, kLobby, 1, "Lobby"},
      {"second camera", Source(kEncoders, 1, 1, 2), {}, 0x10101, 2, "Yard"},
      {"trigger input", Source(kEncoders, 1, 2, 3), {}, 0x10102, 3, "Door Contact"},
      {"soft trigger", Source(0x30000, 0, 4, 16), {}, 0x30004, 16, "Panic Button"},
      {"time trigger", Source(0x40000, 0, 2, 24), {}, 0x40002, 24, "Night"},
      {"power supply", Source(kEncoders, 3, 0, 13), {}, 0x10300, 13, "Power Supply 3"},
      {"device", Source(kEncoders, 1, 0, 21), {}, kLobby, 21, "Analog Encoder Encoder A: SN-1"},
      {"no source of its own", Source(kEncoders, 1, 0, 15), {}, kLobby, 15, "Unknown"},
      {"source group", std::nullopt, 3, 0xA0003, 12, "Ground floor"},
      {"camera stream of type 18", Source(kEncoders, 1, 0, 18, 2), {}, kLobby, 18, "Lobby"},
  };
  AlarmDocument document;
  document.serverSerial = "SN-77";
  document.serverDescription = "Main NVR";
  for (const Case& c : cases) {
    AlarmRequest request = Request(1, 1, c.source, "Door forced");
    request.group = c.group;
    request.action = 7;
    request.time = 1767225600;
    request.milliseconds = 250;
    document.requests.push_back(request);
  }
  document.requests.push_back(Request(2, 1, Source(kEncoders, 1, 0, 1)));
  SendAlarm(document);
  ASSERT_TRUE(WaitForItems(std::size(cases) + 1));
  const auto items = Items();
  for (size_t i = 0; i < std::size(cases); ++i) {
    SCOPED_TRACE(cases[i].name);
    const testhooks::WorkItemRecord& item = items[i];
    EXPECT_EQ(item.sourceName, cases[i].sourceName);
    EXPECT_EQ(item.sourceKey, cases[i].key);
    EXPECT_EQ(item.eventType, cases[i].type);
    EXPECT_EQ(item.serial, "SN-77");
    EXPECT_EQ(item.systemName, "Main NVR");
    EXPECT_EQ(item.eventState, "Start");
    EXPECT_EQ(item.eventTime, 1767225600);
    EXPECT_EQ(item.milliseconds, 250);
    EXPECT_EQ(item.body, "Door forced\r\nSomething happened");
    EXPECT_EQ(item.preAlarmSeconds, 5);
    EXPECT_EQ(item.sizeLimit, 10485760);
    EXPECT_EQ(item.servers, 0u);
  }
  // Without placeholders the system's name and the state are left out.
  const testhooks::WorkItemRecord& plainItem = items.back();
  EXPECT_EQ(plainItem.profileId, 2);
  EXPECT_EQ(plainItem.serial, "SN-77");
  EXPECT_EQ(plainItem.systemName, "");
  EXPECT_EQ(plainItem.eventState, "");
  EXPECT_EQ(plainItem.body, "Something happened");
  EXPECT_EQ(plainItem.preAlarmSeconds, 0);
}

TEST_F(AlarmDocumentsTest, EventEdgeDecidesWhichAlarmValueNotifies) {
  std::vector<ProfileSetting> profiles;
  for (int32_t edge = 0; edge <= 2; ++edge) {
    ProfileSetting profile{10 + edge, "Edge " + std::to_string(edge)};
    profile.eventEdge = edge;
    profiles.push_back(profile);
  }
  StartWith(NotifyFile(profiles));
  SendSystem(Site());
  std::vector<AlarmRequest> requests;
  for (int32_t edge = 0; edge <= 2; ++edge) {
    for (int32_t alarm : {1, 0, 7}) {
      requests.push_back(Request(10 + edge, alarm, Source(kEncoders, 1, 0, 1),
                                 std::to_string(edge) + "/" + std::to_string(alarm)));
    }
  }
  Send(requests);
  ASSERT_TRUE(WaitForItems(6));
  EXPECT_EQ(ItemCountAfterQuiet(), 6u);
  EXPECT_EQ(Messages(), (std::vector<std::string>{"0/1", "0/7", "1/0", "2/1", "2/0", "2/7"}));
}

TEST_F(AlarmDocumentsTest, WaitingNotificationsAreReleasedByTheEdgeThatEndsThem) {
  struct Case {
    int32_t edge;
    int32_t raisedBy;   // alarm value that raises the notification
    int32_t releaseBy;  // alarm value of a later request on the same source
    bool released;
  };
  const Case cases[] = {
      {0, 1, 0, true},  {0, 1, 1, false}, {1, 0, 1, true},
      {1, 0, 0, false}, {2, 1, 1, true},  {2, 1, 0, true},
  };
  std::vector<ProfileSetting> profiles;
  refhost::SystemDescription site;
  for (int32_t i = 0; i < static_cast<int32_t>(std::size(cases)); ++i) {
    ProfileSetting profile{20 + i, "Case " + std::to_string(i)};
    profile.attach = true;
    profile.maxVideoSeconds = 60;  // the clip goes on collecting
    profile.eventEdge = cases[i].edge;
    profiles.push_back(profile);
    site.cameras.push_back({"Camera " + std::to_string(i), kEncoders, 1 + i, 0, {}});
    site.events.push_back({i, std::nullopt, EventSourceRef::Camera(kEncoders, 1 + i, 0), {20 + i}});
  }
  StartWith(NotifyFile(profiles));
  SendSystem(site);
  size_t released = 0;
  for (int32_t i = 0; i < static_cast<int32_t>(std::size(cases)); ++i) {
    SCOPED_TRACE("case " + std::to_string(i));
    const uint32_t camera = refhost::HostStreamId(kEncoders, 1 + i, 0, 0);
    ASSERT_TRUE(PushFrame(camera, true));
    Send({Request(20 + i, cases[i].raisedBy, Source(kEncoders, 1 + i, 0, 1))});
    ASSERT_EQ(State().pending, 1u);
    // Another source's request releases nothing; the request's own profile
    // (here one that does not exist) plays no part.
    Send({Request(99, cases[i].releaseBy, Source(kEncoders, 9, 0, 1))});
    ASSERT_EQ(State().pending, 1u);
    Send({Request(99, cases[i].releaseBy, Source(kEncoders, 1 + i, 0, 1))});
    EXPECT_EQ(State().pending, cases[i].released ? 0u : 1u);
    if (cases[i].released) {
      ++released;
      ASSERT_TRUE(WaitForItems(released));
      EXPECT_EQ(Items().back().profileId, 20 + i);
    } else {
      // Let it go by its deadline, as a tick does.
      clock().Advance(std::chrono::seconds(63));
      Tick();
      ++released;
      ASSERT_TRUE(WaitForItems(released));
    }
  }
  EXPECT_EQ(ItemCountAfterQuiet(), std::size(cases));
}

TEST_F(AlarmDocumentsTest, ThrottleCountsOnTheWrappingTick) {
  ProfileSetting profile{1, "Throttled"};
  profile.throttleSeconds = 60;
  profile.eventEdge = 2;
  // The tick wraps 4 s after the first request.
  clock().Reset(0xFFFFF000u, 1767225600);
  StartWith(NotifyFile({profile}));
  SendSystem(Site());
  auto alarm = [&](const std::string& message) {
    Send({Request(1, 1, Source(kEncoders, 1, 0, 1), message)});
  };
  auto throttle = [&](int32_t seconds) {
    ProfileSetting changed = profile;
    changed.throttleSeconds = seconds;
    host().SendConfigurationUpdate(NotifyElement({changed}));
  };
  alarm("first");
  clock().Advance(std::chrono::milliseconds(59900));
  alarm("59.9 s later");
  clock().Advance(std::chrono::milliseconds(100));
  alarm("60 s later");
  clock().Advance(std::chrono::seconds(30));
  alarm("30 s later");
  throttle(30);
  alarm("throttle changed");
  clock().Advance(std::chrono::milliseconds(29999));
  alarm("29.999 s later");
  clock().Advance(std::chrono::milliseconds(1));
  alarm("30 s after the change");
  throttle(0);
  alarm("unthrottled");
  alarm("unthrottled again");
  ASSERT_TRUE(WaitForItems(6));
  EXPECT_EQ(ItemCountAfterQuiet(), 6u);
  EXPECT_EQ(Messages(), (std::vector<std::string>{"first", "60 s later", "throttle changed",
                                                  "30 s after the change", "unthrottled",
                                                  "unthrottled again"}));
}

TEST_F(AlarmDocumentsTest, TestRequestsIgnoreTheEdgeButNotTheThrottle) {
  ProfileSetting profile{4, "End only"};
  profile.eventEdge = 1;
  profile.throttleSeconds = 60;
  StartWith(NotifyFile({profile}));
  SendSystem(Site());
  Send({Request(4, 1, Source(kEncoders, 1, 0, 1), "Testing Profile"),
        Request(4, 1, Source(kEncoders, 1, 0, 1), "Testing Profile")});
  ASSERT_TRUE(WaitForItems(1));
  EXPECT_EQ(ItemCountAfterQuiet(), 1u);
  const testhooks::WorkItemRecord item = Items()[0];
  EXPECT_EQ(item.body, "Testing Profile\r\nSomething happened");
  EXPECT_EQ(item.sourceKey, 0xFFFFFFFFu);
  EXPECT_EQ(item.sourceName, "[Test Event Source]");
  EXPECT_EQ(item.eventType, -1);
  EXPECT_TRUE(item.videoSources.empty());
}

TEST_F(AlarmDocumentsTest, RequestsThatCannotBeReadAreSkippedAndTheOthersRun) {
  StartWith(NotifyFile({ProfileSetting{1, "Front door"}}));
  SendSystem(Site());
  const std::string source =
      R"(<EventSource Plugin="65536" Device="1" Input="0" Context="0" Type="1"/>)";
  const std::string document =
      R"(<Trellan><Notify ID="0xC0000"><Profiles><Profile Alarm="1" ID="1" Action="0" Message="hex">)" +
      source +
      R"(</Profile></Profiles></Notify><Notify ID="786433"><Profiles><Profile Alarm="1" ID="1" Action="0" Message="other">)" +
      source + R"(</Profile></Profiles></Notify><Notify ID="786432"><Profiles>
      <Profile ID="1" Action="0" Message="no alarm">)" +
      source + R"(</Profile>
      <Profile Alarm="1" ID="1" Message="no action">)" +
      source + R"(</Profile>
      <Profile Alarm="x" ID="1" Action="0" Message="bad alarm">)" +
      source + R"(</Profile>
      <Profile Alarm="1" ID="42" Action="0" Message="unknown">)" +
      source + R"(</Profile>
      <Anything Alarm="1" ID="1abc" Action="0" Message="read">)" +
      source + R"(</Anything>
      </Profiles></Notify></Trellan>)";
  host().WriteDocument(document, kAlarmSender);
  ASSERT_TRUE(WaitForItems(1));
  EXPECT_EQ(ItemCountAfterQuiet(), 1u);
  EXPECT_EQ(Messages(), std::vector<std::string>{"read"});
  ASSERT_TRUE(WaitForLog(
      "Received a notification request for an unknown profile 42. Request will be ignored"));
  for (const auto& line : host().Log().Lines()) {
    if (line.text.find("unknown profile") != std::string::npos) {
      EXPECT_EQ(line.level, 25);
    }
  }
}

// What must not change when a document is refused.
struct Snapshot {
  std::vector<uint32_t> videoSources;
  std::vector<std::pair<uint32_t, int32_t>> links;
  std::vector<int32_t> buffered;
  size_t pending;
  std::string serial;
  bool operator==(const Snapshot& o) const {
    return videoSources == o.videoSources && links == o.links && buffered == o.buffered &&
           pending == o.pending && serial == o.serial;
  }
};

TEST_F(AlarmDocumentsTest, MalformedTruncatedAndHugeDocumentsChangeNothing) {
  StartWith(NotifyFile({ProfileSetting{1, "Front door"}}));
  SendSystem(Site());
  ASSERT_TRUE(PushFrame(kLobby, true));
  AlarmDocument serial;
  serial.serverSerial = "SN-1";
  SendAlarm(serial);
  auto snapshot = [&] {
    const testhooks::ManagerStateRecord s = State();
    return Snapshot{s.videoSources, s.links, s.bufferedStreams, s.pending, s.serverSerial};
  };
  const Snapshot before = snapshot();
  ASSERT_FALSE(before.videoSources.empty());

  AlarmDocument alarm;
  alarm.serverSerial = "SN-2";
  alarm.requests = {Request(1, 1, Source(kEncoders, 1, 0, 1))};
  const std::string alarmText = refhost::BuildAlarmDocument(alarm);
  refhost::SystemDescription emptied;
  emptied.cameras = {{"Other", kEncoders, 5, 0, {}}};
  const std::string systemText = refhost::BuildSystemDocument(emptied);
  const size_t kTenMB = 10u << 20;
  std::string nested;
  while (nested.size() < kTenMB) nested += "<a>";
  std::string noise(kTenMB, '\0');
  for (size_t i = 0; i < noise.size(); ++i) noise[i] = static_cast<char>((i * 7919) >> 3);
  const std::string hugeValue =
      "<Trellan Delta=\"0\"><Servers><Server Serial=\"" + std::string(kTenMB, 'x') + "\"";
  // Documents whose root has more attributes than are allowed; each quoted
  // value looks like more attributes and a tag end.
  std::string attributes;
  for (size_t i = 0; i <= hx::kMaxXmlAttributes; ++i) {
    attributes += " a" + std::to_string(i) + "='b=\"c\" />'";
  }
  const std::string documents[] = {
      "<",
      "<Trellan",
      "not xml at all",
      std::string("\0\0\0", 3),
      alarmText.substr(0, alarmText.size() / 2),
      alarmText.substr(0, alarmText.size() - 3),
      systemText.substr(0, systemText.size() / 2),
      systemText.substr(0, systemText.size() - 1),
      nested,
      noise,
      hugeValue,
      "<Trellan><Servers><Server Serial=\"SN-3\"></Servers></Trellan>",
      "<Trellan" + attributes + alarmText.substr(alarmText.find("<Trellan") + 8),
      "<Trellan" + attributes + systemText.substr(systemText.find("<Trellan") + 8),
  };
  for (const std::string& text : documents) {
    host().WriteDocument(text, kAlarmSender);
    host().SendHostDocument(text);
  }
  hx::core::WriteParmsIn in{};
  in.length = 100;  // and no data
  in.source = kAlarmSender;
  hx::core::WriteParmsOut out{};
  host().Write(in, &out);
  host().Ioctl(hx::core::kIoctlHostDocument, nullptr, 100);
  host().Ioctl(hx::core::kIoctlHostDocument, "x", 0);

  EXPECT_EQ(snapshot(), before);
  EXPECT_EQ(ItemCountAfterQuiet(), 0u);
  EXPECT_TRUE(host().Log().Contains("has more than " + std::to_string(hx::kMaxXmlAttributes) +
                                    " attributes."));
  // The module still works.
  SendAlarm(alarm);
  ASSERT_TRUE(WaitForItems(1));
  EXPECT_EQ(Items()[0].serial, "SN-2");
  ExpectFramesReturned();
}

}  // namespace
