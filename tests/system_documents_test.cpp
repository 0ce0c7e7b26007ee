// Host system documents through IOCTL code 2: what a full document, a change
// document and a document without "Delta" each change; the stream links and
// the frames they let in; analytics aliases that arrive later; the video
// buffer following the description and the configured size limit.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "host/system_description.h"
#include "tests/manager_fixture.h"

namespace {

using managertest::NotifyElement;
using managertest::NotifyFile;
using managertest::ProfileSetting;
using refhost::AlarmRequest;
using refhost::EventSourceRef;
using refhost::HostStreamId;
using refhost::StreamDescription;

constexpr int32_t kEncoders = 0x10000;
constexpr int32_t kAnalytics = 0x70000;

uint32_t Id(int32_t device, int32_t input = 0, int32_t context = 0) {
  return HostStreamId(kEncoders, device, input, context);
}

refhost::SystemDescription OneCamera(int32_t device, const std::string& name) {
  refhost::SystemDescription system;
  system.cameras = {{name, kEncoders, device, 0, {}}};
  system.events = {{1, 4, EventSourceRef::Camera(kEncoders, device, 0), {1}}};
  return system;
}

class SystemDocumentsTest : public managertest::ManagerHostTest {
 protected:
  // The name the module gives camera (device, 0) in a notification.
  std::string NameOfCamera(int32_t device) {
    const size_t before = Items().size();
    refhost::AlarmDocument alarm;
    AlarmRequest request;
    request.profile = 1;
    request.source = AlarmRequest::Source{kEncoders, device, 0, 0, 1};
    alarm.requests = {request};
    SendAlarm(alarm);
    if (!WaitForItems(before + 1)) return "(no item)";
    return Items().back().sourceName;
  }
  std::string Posted() { return host().Config().Configuration(); }
};

TEST_F(SystemDocumentsTest, DeltaDecidesWhatADocumentChanges) {
  StartWith(NotifyFile({ProfileSetting{1, "Front door"}}));
  SendSystem(OneCamera(1, "Lobby"));
  EXPECT_EQ(State().videoSources, std::vector<uint32_t>{Id(1)});
  EXPECT_EQ(NameOfCamera(1), "Lobby");

  // A change document: the configuration only.
  const std::string camera2 = refhost::BuildSystemDocument(OneCamera(2, "Yard"));
  const std::string body = camera2.substr(camera2.find('>') + 1);
  const std::string profiles =
      NotifyElement({ProfileSetting{1, "Front door"}, ProfileSetting{5, "New"}});
  host().SendHostDocument("<Trellan Delta=\"1\">" + profiles + body);
  EXPECT_TRUE(WaitForLog("Updated configuration successfully"));
  EXPECT_NE(Posted().find("description=\"New\""), std::string::npos);
  EXPECT_EQ(State().videoSources, std::vector<uint32_t>{Id(1)});
  EXPECT_EQ(NameOfCamera(2), "");

  // A full document: the catalogue and the video, not the configuration.
  const std::string reduced = NotifyElement({ProfileSetting{1, "Front door"}});
  host().SendHostDocument("<Trellan Delta=\"0\">" + reduced + body);
  EXPECT_EQ(State().videoSources, std::vector<uint32_t>{Id(2)});
  EXPECT_EQ(NameOfCamera(2), "Yard");
  EXPECT_NE(Posted().find("description=\"New\""), std::string::npos);

  // Without "Delta" only analytics sections count.
  refhost::SystemDescription analytics = OneCamera(3, "Gate");
  analytics.analytics = {{kAnalytics, 1, 4, kEncoders, 3, 0, 1}};
  const std::string full = refhost::BuildSystemDocument(analytics);
  host().SendHostDocument("<Trellan>" + reduced + full.substr(full.find('>') + 1));
  const testhooks::ManagerStateRecord state = State();
  EXPECT_EQ(state.videoSources, std::vector<uint32_t>{Id(2)});
  EXPECT_EQ(state.aliases, (std::vector<std::pair<uint32_t, uint32_t>>{{0x70104, Id(3)}}));
  EXPECT_EQ(NameOfCamera(3), "");
  EXPECT_NE(Posted().find("description=\"New\""), std::string::npos);
}

TEST_F(SystemDocumentsTest, CameraNamesKeepTheirCharacters) {
  StartWith(NotifyFile({ProfileSetting{1, "Front door"}}));
  struct Case {
    const char* declaration;
    const char* written;
    const char* name;
  };
  const Case cases[] = {
      {"<?xml ?>", "Caf&#xE9; &#x20AC;", "Caf\xC3\xA9 \xE2\x82\xAC"},
      {"<?xml ?>", "Caf\xC3\xA9 \xE2\x82\xAC", "Caf\xC3\xA9 \xE2\x82\xAC"},
      // Not UTF-8: read byte by byte.
      {"<?xml ?>", "Caf\xE9 \xC3", "Caf\xE9 \xC3"},
      // Without a declaration, references name single bytes.
      {"", "Caf&#xE9;", "Caf\xE9"},
  };
  for (const Case& c : cases) {
    std::string document = c.declaration + refhost::BuildSystemDocument(OneCamera(1, "NAME"));
    document.replace(document.find("NAME"), 4, c.written);
    host().SendHostDocument(document);
    EXPECT_EQ(NameOfCamera(1), c.name) << c.written;
  }
}

TEST_F(SystemDocumentsTest, CompressedCameraIsServedByItsSmallestStillStream) {
  StartWith(NotifyFile({ProfileSetting{1, "Front door"}}));
  refhost::SystemDescription system = OneCamera(1, "Lobby");
  system.cameras[0].streams = {
      StreamDescription{0, refhost::kStandardH264, 1280, 720, std::nullopt},
      StreamDescription{1, refhost::kStandardJpeg, 640, 480, std::nullopt},
      StreamDescription{2, refhost::kStandardJpeg, 320, 240, std::nullopt}};
  SendSystem(system);
  EXPECT_EQ(
      State().links,
      (std::vector<std::pair<uint32_t, int32_t>>{{Id(1), static_cast<int32_t>(Id(1, 0, 2))}}));
  struct Frame {
    uint32_t stream;
    bool kept;
  };
  const Frame frames[] = {
      {Id(1), false}, {Id(1, 0, 1), false}, {Id(1, 0, 2), true}, {Id(2), false}, {0, false}};
  for (const Frame& f : frames)
    EXPECT_EQ(PushFrame(f.stream, true), f.kept) << std::hex << f.stream;
  EXPECT_EQ(State().bufferedStreams, std::vector<int32_t>{static_cast<int32_t>(Id(1, 0, 2))});
  ExpectFramesReturned();
}

TEST_F(SystemDocumentsTest, AnalyticsAliasArrivingLaterBringsItsCamerasVideo) {
  ProfileSetting profile{1, "Analytics"};
  profile.attach = true;
  profile.maxVideoSeconds = 0;
  StartWith(NotifyFile({profile}));
  refhost::SystemDescription system;
  system.cameras = {{"Gate", kEncoders, 3, 0, {}}};
  system.events = {{1, std::nullopt, EventSourceRef::Analytics(kAnalytics, 1, 4), {1}}};
  SendSystem(system);
  testhooks::ManagerStateRecord state = State();
  EXPECT_TRUE(state.videoSources.empty());
  EXPECT_EQ(state.unresolvedAnalytics, std::vector<uint32_t>{0x70104});
  EXPECT_FALSE(PushFrame(Id(3), true));

  system.analytics = {{kAnalytics, 1, 4, kEncoders, 3, 0, 1}};
  host().SendHostDocument(refhost::BuildAnalyticsDocument(system));
  state = State();
  EXPECT_EQ(state.videoSources, std::vector<uint32_t>{Id(3)});
  EXPECT_TRUE(state.unresolvedAnalytics.empty());
  EXPECT_TRUE(PushFrame(Id(3), true));

  // An alarm of the analytics input is an alarm of its camera.
  refhost::AlarmDocument alarm;
  AlarmRequest request;
  request.profile = 1;
  request.source = AlarmRequest::Source{kAnalytics, 1, 4, 0, 9};
  alarm.requests = {request};
  SendAlarm(alarm);
  ASSERT_TRUE(WaitForItems(1));
  const testhooks::WorkItemRecord item = Items()[0];
  EXPECT_EQ(item.sourceKey, Id(3));
  EXPECT_EQ(item.sourceName, "Gate");
  ASSERT_EQ(item.videoSources.size(), 1u);
  EXPECT_TRUE(item.videoSources[0].hasStream);
  EXPECT_EQ(item.videoSources[0].frames, 1u);
}

TEST_F(SystemDocumentsTest, BufferedStreamsFollowTheDescription) {
  StartWith(NotifyFile({ProfileSetting{1, "Front door"}}));
  refhost::SystemDescription both;
  both.cameras = {{"Lobby", kEncoders, 1, 0, {}}, {"Yard", kEncoders, 2, 0, {}}};
  both.events = {{1, std::nullopt, EventSourceRef::Camera(kEncoders, 1, 0), {1}},
                 {2, std::nullopt, EventSourceRef::Camera(kEncoders, 2, 0), {1}}};
  SendSystem(both);
  bool kept = false;
  const void* lobby = PushFrameBuffer(Id(1), true, 1000, &kept);
  ASSERT_TRUE(kept);
  const void* yard = PushFrameBuffer(Id(2), true, 1000, &kept);
  ASSERT_TRUE(kept);
  EXPECT_EQ(host().Frames().Counts().outstanding, 2u);

  // The yard's event no longer notifies: its buffer goes back at once.
  refhost::SystemDescription lobbyOnly = both;
  lobbyOnly.events[1].notifyProfiles.clear();
  SendSystem(lobbyOnly);
  EXPECT_EQ(State().bufferedStreams, std::vector<int32_t>{static_cast<int32_t>(Id(1))});
  EXPECT_EQ(ReleasesOf(yard), 1u);
  EXPECT_EQ(ReleasesOf(lobby), 0u);
  // The lobby camera is gone from the description.
  SendSystem(OneCamera(2, "Yard"));
  EXPECT_TRUE(State().bufferedStreams.empty());
  EXPECT_EQ(ReleasesOf(lobby), 1u);
  EXPECT_EQ(host().Frames().Counts().outstanding, 0u);
  ExpectFramesReturned();
}

TEST_F(SystemDocumentsTest, SizeLimitDecidesWhetherVideoIsBuffered) {
  struct Case {
    int32_t emailSizeLimitMB;
    bool kept;
    uint64_t bufferBytes;
  };
  const Case cases[] = {
      {0, false, 0},
      {-3, false, 0},
      {1, true, 1048576},
      {4096, true, uint64_t{2047} << 20},  // clamped, not wrapped to 0
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.emailSizeLimitMB);
    StartWith(NotifyFile({ProfileSetting{1, "Front door"}}, c.emailSizeLimitMB));
    SendSystem(OneCamera(1, "Lobby"));
    EXPECT_EQ(PushFrame(Id(1), true), c.kept);
    const testhooks::ManagerStateRecord state = State();
    EXPECT_EQ(state.bufferedStreams.size(), c.kept ? 1u : 0u);
    EXPECT_EQ(state.videoBufferMaxBytes, c.bufferBytes);
    ExpectFramesReturned();
  }
}

TEST_F(SystemDocumentsTest, TurningVideoOffReturnsTheFramesHeldAndAttachesNoOldVideo) {
  ProfileSetting profile{1, "Front door"};
  profile.attach = true;
  profile.maxVideoSeconds = 60;  // the clip goes on collecting
  profile.eventEdge = 2;
  StartWith(NotifyFile({profile}, 10));
  SendSystem(OneCamera(1, "Lobby"));
  PushFrames(Id(1), 10, 10, 40);
  SendAlarm(1, 1);
  ASSERT_EQ(State().pending, 1u);

  host().SendConfigurationUpdate(NotifyElement({profile}, 0));
  ASSERT_TRUE(WaitForLog("Updated configuration successfully"));
  // No frame can come any more: the waiting notification goes with what it
  // has, and the host has every other buffer back.
  const testhooks::ManagerStateRecord state = State();
  EXPECT_TRUE(state.bufferedStreams.empty());
  EXPECT_EQ(state.pending + state.ready, 0u);
  ASSERT_TRUE(WaitForItems(1));
  EXPECT_TRUE(Items()[0].videoSources.at(0).done);
  EXPECT_EQ(Items()[0].videoSources.at(0).frames, 10u);
  EXPECT_FALSE(PushFrame(Id(1), true));

  // A later alarm finds no video from before the change to attach.
  SendAlarm(1, 1);
  ASSERT_TRUE(WaitForItems(2));
  EXPECT_FALSE(Items()[1].videoSources.at(0).hasStream);
  EXPECT_EQ(State().pending, 0u);
  ExpectFramesReturned();
}

TEST_F(SystemDocumentsTest, AFrameLargerThanANewLimitIsRefused) {
  StartWith(NotifyFile({ProfileSetting{1, "Front door"}}, 10));
  SendSystem(OneCamera(1, "Lobby"));
  EXPECT_TRUE(PushFrame(Id(1), true, 2 << 20));
  host().SendConfigurationUpdate(NotifyElement({ProfileSetting{1, "Front door"}}, 1));
  EXPECT_TRUE(WaitForLog("Updated configuration successfully"));
  EXPECT_FALSE(PushFrame(Id(1), true, 2 << 20));
  EXPECT_TRUE(PushFrame(Id(1), true, 1 << 19));
  ExpectFramesReturned();
}

}  // namespace
