// Video capture for notifications through the reference host: captures that
// are complete the moment they are attached, captures that collect until
// their clip is long enough or their deadline passes, source groups, cameras
// without buffered video, the capture's log line, the frame buffers' return,
// and a clip of a real H.264 file made by ffmpeg and fed as a camera.
#include <gtest/gtest.h>

#include <chrono>
#include <cstdlib>
#include <string>
#include <vector>

#include "host/camera_feed.h"
#include "host/system_description.h"
#include "tests/manager_fixture.h"

namespace {

using managertest::NotifyFile;
using managertest::ProfileSetting;
using refhost::AlarmRequest;
using refhost::EventSourceRef;
using refhost::HostStreamId;
using refhost::StreamDescription;
using std::chrono::milliseconds;
using std::chrono::seconds;

constexpr int32_t kEncoders = 0x10000;

uint32_t Id(int32_t device, int32_t input = 0) {
  return HostStreamId(kEncoders, device, input, 0);
}

refhost::CameraDescription Camera(const std::string& name, int32_t device, int32_t standard) {
  return {name, kEncoders, device, 0, {StreamDescription{0, standard, 320, 240, std::nullopt}}};
}

ProfileSetting AttachProfile(int32_t id, int32_t maxVideoSeconds) {
  ProfileSetting profile{id, "Profile " + std::to_string(id)};
  profile.attach = true;
  profile.maxVideoSeconds = maxVideoSeconds;
  profile.eventEdge = 2;
  return profile;
}

AlarmRequest CameraAlarm(int32_t profile, int32_t device, int32_t action = 0) {
  AlarmRequest request;
  request.profile = profile;
  request.action = action;
  request.source = AlarmRequest::Source{kEncoders, device, 0, 0, 1};
  return request;
}

class VideoCaptureTest : public managertest::ManagerHostTest {
 protected:
  // Starts with one attaching profile and the Lobby camera (device 1), whose
  // event 7 notifies it.
  refhost::SystemDescription StartWithLobby(int32_t maxVideoSeconds,
                                            std::optional<int32_t> preAlarmSeconds = {}) {
    StartWith(NotifyFile({AttachProfile(1, maxVideoSeconds)}));
    refhost::SystemDescription system;
    system.cameras = {Camera("Lobby", 1, refhost::kStandardH264)};
    system.events = {{7, preAlarmSeconds, EventSourceRef::Camera(kEncoders, 1, 0), {1}}};
    SendSystem(system);
    return system;
  }
  void Alarm(const AlarmRequest& request) {
    refhost::AlarmDocument document;
    document.requests = {request};
    SendAlarm(document);
  }
  // One GOP of `frames` frames, `intervalMs` apart.
  void PushGop(uint32_t stream, int frames, uint32_t intervalMs = 40) {
    PushFrames(stream, frames, frames, intervalMs);
  }
};

TEST_F(VideoCaptureTest, CaptureCompleteAtAttachIsQueuedWithItsAlarmDocument) {
  StartWith(NotifyFile({AttachProfile(1, 10), AttachProfile(2, 0), AttachProfile(3, 1)}));
  refhost::SystemDescription system;
  system.cameras = {Camera("Still", 1, refhost::kStandardJpeg),
                    Camera("Short", 2, refhost::kStandardH264),
                    Camera("Long GOP", 3, refhost::kStandardH264)};
  for (int32_t i = 1; i <= 3; ++i) {
    system.events.push_back({i, std::nullopt, EventSourceRef::Camera(kEncoders, i, 0), {i}});
  }
  SendSystem(system);
  PushFrames(Id(1), 3, 1, 100);  // three stills
  PushGop(Id(2), 5);
  PushGop(Id(2), 5);
  PushGop(Id(3), 41);  // 1.6 s, longer than the whole clip

  struct Case {
    const char* name;
    int32_t profile;
    uint64_t frames;
    uint64_t gops;
  };
  const Case cases[] = {
      {"JPEG: the newest still is the clip", 1, 1, 1},
      {"video without a duration: the two newest GOPs", 2, 10, 2},
      {"video whose newest GOP spans the clip", 3, 41, 1},
  };
  size_t count = 0;
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    Alarm(CameraAlarm(c.profile, c.profile));
    // Neither the clock nor a tick moves: only the alarm document sends it.
    ASSERT_TRUE(WaitForItems(++count, seconds(10)));
    const testhooks::WorkItemRecord item = Items().back();
    EXPECT_EQ(item.profileId, c.profile);
    ASSERT_EQ(item.videoSources.size(), 1u);
    const testhooks::CapturedVideoRecord& video = item.videoSources[0];
    EXPECT_TRUE(video.hasStream);
    EXPECT_TRUE(video.done);
    EXPECT_EQ(video.frames, c.frames);
    EXPECT_EQ(video.gops, c.gops);
    EXPECT_EQ(State().pending, 0u);
    EXPECT_EQ(State().ready, 0u);
  }
  // Neither later frames nor a tick past every deadline send anything again.
  PushGop(Id(2), 5);
  PushGop(Id(3), 5);
  clock().Advance(seconds(30));
  Tick();
  EXPECT_EQ(ItemCountAfterQuiet(), std::size(cases));
  ExpectFramesReturned();
}

TEST_F(VideoCaptureTest, CollectingCaptureWaitsForItsClipOrItsDeadline) {
  StartWith(NotifyFile({AttachProfile(1, 2)}));
  refhost::SystemDescription system;
  system.cameras = {Camera("Lobby", 1, refhost::kStandardH264),
                    Camera("Yard", 2, refhost::kStandardH264)};
  system.events = {{1, std::nullopt, EventSourceRef::Camera(kEncoders, 1, 0), {1}},
                   {2, std::nullopt, EventSourceRef::Camera(kEncoders, 2, 0), {1}}};
  SendSystem(system);
  PushGop(Id(2), 25);
  PushGop(Id(1), 25);

  // The clip grows with the frames and is sent once it spans 2 s.
  Alarm(CameraAlarm(1, 1));
  EXPECT_EQ(State().pending, 1u);
  PushFrames(Id(1), 25, 25, 40);
  EXPECT_EQ(State().pending, 1u);
  EXPECT_EQ(ItemCountAfterQuiet(), 0u);
  PushFrames(Id(1), 25, 25, 40);
  ASSERT_TRUE(WaitForItems(1));
  const testhooks::CapturedVideoRecord clip = Items()[0].videoSources.at(0);
  EXPECT_TRUE(clip.done);
  EXPECT_EQ(clip.lastFrameMs - clip.firstFrameMs, 2000u);

  // A camera without new frames waits for the deadline: MaxVideoSeconds + 2.
  Alarm(CameraAlarm(1, 2));
  EXPECT_EQ(State().pending, 1u);
  clock().Advance(seconds(4));
  Tick();
  EXPECT_EQ(State().pending, 1u);
  clock().Advance(seconds(1));
  Tick();
  EXPECT_EQ(State().pending, 0u);
  ASSERT_TRUE(WaitForItems(2));
  EXPECT_TRUE(Items()[1].videoSources.at(0).done);
  // Its capture was finished when it was sent: later frames add nothing.
  PushFrames(Id(2), 100, 25, 40);
  PushFrames(Id(1), 100, 25, 40);
  Tick();
  EXPECT_EQ(ItemCountAfterQuiet(), 2u);
  ExpectFramesReturned();
}

TEST_F(VideoCaptureTest, SourceGroupCapturesEveryMemberCamera) {
  StartWith(NotifyFile({AttachProfile(1, 10)}));
  refhost::SystemDescription system;
  system.cameras = {Camera("Gate", 1, refhost::kStandardJpeg),
                    Camera("Yard", 2, refhost::kStandardH264)};
  system.groups = {
      {3,
       std::string("Ground floor"),
       {EventSourceRef::Camera(kEncoders, 1, 0), EventSourceRef::Camera(kEncoders, 2, 0)}}};
  system.events = {{1, std::nullopt, EventSourceRef::Group(3), {1}}};
  SendSystem(system);
  EXPECT_EQ(State().videoSources, (std::vector<uint32_t>{Id(1), Id(2)}));
  ASSERT_TRUE(PushFrame(Id(1), true));
  PushGop(Id(2), 10);

  AlarmRequest request;
  request.profile = 1;
  request.source.reset();
  request.group = 3;
  request.groupMembers = {
      {kEncoders, 1, 0, 0, 1}, {kEncoders, 2, 0, 0, 2}, {kEncoders, 1, 2, 0, 3}};
  Alarm(request);
  // The still completes at once; the video is finished with it.
  ASSERT_TRUE(WaitForItems(1, seconds(10)));
  const testhooks::WorkItemRecord item = Items()[0];
  EXPECT_EQ(item.sourceKey, 0xA0003u);
  EXPECT_EQ(item.eventType, 12);
  EXPECT_EQ(item.sourceName, "Ground floor");
  ASSERT_EQ(item.videoSources.size(), 2u);
  EXPECT_EQ(item.videoSources[0].name, "Gate");
  EXPECT_EQ(item.videoSources[1].name, "Yard");
  for (const auto& video : item.videoSources) {
    EXPECT_TRUE(video.hasStream);
    EXPECT_TRUE(video.done);
  }
  EXPECT_EQ(item.videoSources[0].codec, 0u);
  EXPECT_EQ(item.videoSources[1].frames, 10u);
  ExpectFramesReturned();
}

TEST_F(VideoCaptureTest, CameraWithoutBufferedVideoIsSentAtOnceWithoutIt) {
  StartWithLobby(10);
  Alarm(CameraAlarm(1, 1));
  Alarm(CameraAlarm(1, 9));  // a camera the host never described
  ASSERT_TRUE(WaitForItems(2, seconds(10)));
  for (const auto& item : Items()) {
    ASSERT_EQ(item.videoSources.size(), 1u);
    EXPECT_FALSE(item.videoSources[0].hasStream);
  }
  EXPECT_TRUE(WaitForLog("Unable to locate corresponding video frame for channel/stream id " +
                         std::to_string(Id(1)) + " to attach to this notification profile"));
  EXPECT_TRUE(WaitForLog("Unable to map video input to stream/ channel id to locate video frame"));
  EXPECT_TRUE(WaitForLog("Unable to locate corresponding video frame for channel/stream id " +
                         std::to_string(Id(9))));
}

TEST_F(VideoCaptureTest, EachCaptureIsDescribedInOneLogLine) {
  ProfileSetting plain{1, "Front door"};
  ProfileSetting templated{2, "Back door"};
  templated.subject = "{event state}";
  templated.maxVideoSeconds = 20;
  StartWith(NotifyFile({plain, templated}, 4));
  refhost::SystemDescription system;
  system.cameras = {Camera("Lobby", 1, refhost::kStandardH264)};
  system.groups = {{3, std::string("Ground floor"), {}}};
  system.events = {{7, 5, EventSourceRef::Camera(kEncoders, 1, 0), {1}}};
  SendSystem(system);
  AlarmRequest group;
  group.profile = 1;
  group.source.reset();
  group.group = 3;
  AlarmRequest ending = CameraAlarm(2, 1, 7);
  ending.alarm = 0;
  ending.profile = 2;
  refhost::AlarmDocument document;
  document.requests = {CameraAlarm(1, 1, 7), group, ending};
  SendAlarm(document);
  ASSERT_TRUE(WaitForItems(2));
  const std::string lines[] = {
      "Profile Front door: PreTrigger(5), MaxDuration(10), MaxSizeMB(4), event source (Lobby), "
      "event state ()",
      "Profile Front door: PreTrigger(0), MaxDuration(10), MaxSizeMB(4),  event source group "
      "(Ground floor), event state ()",
  };
  for (const std::string& line : lines) EXPECT_TRUE(WaitForLog(line)) << line;
  // Profile 2 takes the start edge only: the end request is not described.
  EXPECT_FALSE(host().Log().Contains("Profile Back door"));
  for (const auto& logged : host().Log().Lines()) {
    if (logged.text.rfind("Profile Front door", 0) == 0) {
      EXPECT_EQ(logged.level, 25);
    }
  }
}

TEST_F(VideoCaptureTest, FrameBuffersGoBackOnceWhenTheirLastHolderLetsGo) {
  StartWith(NotifyFile({AttachProfile(1, 10)}));
  refhost::SystemDescription system;
  system.cameras = {Camera("Gate", 1, refhost::kStandardJpeg),
                    Camera("Unwatched", 2, refhost::kStandardJpeg)};
  system.events = {{1, std::nullopt, EventSourceRef::Camera(kEncoders, 1, 0), {1}}};
  SendSystem(system);
  bool kept = true;
  PushFrameBuffer(Id(2), true, 500, &kept);
  EXPECT_FALSE(kept);
  const void* dropped = PushFrameBuffer(Id(1), true, 500, &kept);
  ASSERT_TRUE(kept);
  const void* shared = PushFrameBuffer(Id(1), true, 500, &kept);
  ASSERT_TRUE(kept);
  EXPECT_EQ(ReleasesOf(dropped), 0u);

  // The capture takes the newest still; the history keeps it too.
  Alarm(CameraAlarm(1, 1));
  ASSERT_TRUE(WaitForItems(1, seconds(10)));
  EXPECT_EQ(ItemCountAfterQuiet(), 1u);
  // The host no longer asks for this camera: its history goes.
  system.events[0].notifyProfiles.clear();
  SendSystem(system);
  EXPECT_TRUE(State().bufferedStreams.empty());
  host().Stop();
  EXPECT_EQ(ReleasesOf(dropped), 1u);
  EXPECT_EQ(ReleasesOf(shared), 1u);
  // The refused buffer was freed by the host at once (its address may be
  // lent again): no release ever names it, so the two kept are all.
  EXPECT_EQ(host().Requests().OfClass(hx::core::kClassFrameRelease).size(), 2u);
  EXPECT_EQ(host().Frames().Counts().discarded, 1u);
  ExpectFramesReturned();
}

TEST_F(VideoCaptureTest, NotificationIsSentWhenItsCameraLeavesTheDescription) {
  refhost::SystemDescription system = StartWithLobby(60);
  PushGop(Id(1), 10);
  Alarm(CameraAlarm(1, 1));
  ASSERT_EQ(State().pending, 1u);
  // No more video can come; the clip holds what it has and goes at once.
  system.events[0].notifyProfiles.clear();
  SendSystem(system);
  ASSERT_TRUE(WaitForItems(1, seconds(10)));
  EXPECT_TRUE(Items()[0].videoSources.at(0).done);
  EXPECT_EQ(Items()[0].videoSources.at(0).frames, 10u);
  EXPECT_EQ(State().pending + State().ready, 0u);
}

TEST_F(VideoCaptureTest, NotificationStillWaitingAtShutdownReturnsItsFrames) {
  StartWithLobby(60);
  PushGop(Id(1), 10);
  Alarm(CameraAlarm(1, 1));
  PushGop(Id(1), 10);
  ASSERT_EQ(State().pending, 1u);
  // The capture and its notification hold each other; the module must still
  // let both go when it is unloaded.
  ExpectFramesReturned();
  EXPECT_EQ(Items().size(), 0u);
}

// A real H.264 file, fed as fast as the module takes it, each frame one
// frame interval later on the replaced clock.
TEST_F(VideoCaptureTest, ClipOfARealCameraSpansThePreAlarmAndTheProfilesLength) {
  const std::string path = dir().File("camera.mp4");
  const std::string command =
      "ffmpeg -nostdin -v error -y -f lavfi -i testsrc=size=320x240:rate=25 -frames:v 500 "
      "-c:v libx264 -pix_fmt yuv420p -x264-params keyint=25:min-keyint=25:scenecut=0 '" +
      path + "'";
  ASSERT_EQ(0, std::system(command.c_str())) << "ffmpeg is needed for this test: " << command;
  StartWithLobby(10, 5);

  constexpr uint64_t kAlarmFrame = 300;  // 12 s into the file
  constexpr uint32_t kFrameMs = 40;
  uint32_t triggerMs = 0;
  refhost::FeedOptions options;
  options.path = path;
  options.streamId = Id(1);
  options.realTime = false;
  options.observer = [&](const refhost::FrameHeader& header, const uint8_t*) {
    clock().Advance(milliseconds(kFrameMs));
    if (header.sequence == kAlarmFrame) {
      triggerMs = clock().TickMs();
      Alarm(CameraAlarm(1, 1, 7));
    }
  };
  refhost::CameraFeed feed(host(), host().Frames(), options);
  std::string error;
  ASSERT_TRUE(feed.Run(&error)) << error;
  EXPECT_EQ(feed.Stats().frames, 500u);
  ASSERT_TRUE(WaitForItems(1));
  const testhooks::WorkItemRecord item = Items()[0];
  EXPECT_EQ(item.preAlarmSeconds, 5);
  ASSERT_EQ(item.videoSources.size(), 1u);
  const testhooks::CapturedVideoRecord& clip = item.videoSources[0];
  ASSERT_TRUE(clip.hasStream);
  EXPECT_TRUE(clip.done);
  EXPECT_EQ(clip.codec, 5u);
  EXPECT_EQ(clip.width, 320u);
  EXPECT_EQ(clip.height, 240u);
  EXPECT_EQ(clip.triggerMs, triggerMs);
  // About 5 s before the alarm, whole GOPs of 1 s, and 10 s in all.
  const uint32_t before = triggerMs - clip.firstFrameMs;
  EXPECT_GE(before, 4000u);
  EXPECT_LE(before, 5000u);
  EXPECT_LE(clip.lastFrameMs - clip.firstFrameMs, 10000u);
  EXPECT_GE(clip.lastFrameMs - clip.firstFrameMs, 9000u);
  EXPECT_EQ(clip.frames, (clip.lastFrameMs - clip.firstFrameMs) / kFrameMs + 1);
  EXPECT_EQ(ItemCountAfterQuiet(), 1u);
  ExpectFramesReturned();
  EXPECT_EQ(host().Frames().Counts().allocated, 500u);
}

}  // namespace
