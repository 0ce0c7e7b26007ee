// The reference host's frame buffers and camera feeds: real files made by
// ffmpeg are demuxed and pushed through Write class 1, and every buffer the
// host lent comes back, either at once (refused) or by the module's release.
#include <gtest/gtest.h>

#include <chrono>
#include <cstdlib>
#include <string>
#include <thread>
#include <vector>

#include "host/camera_feed.h"
#include "host/frame_pool.h"
#include "tests/support/host_fixture.h"

extern "C" {
#include <libavutil/log.h>
}

namespace {

using refhost::CameraFeed;
using refhost::FeedOptions;
using refhost::FrameHeader;

hx::core::HostRequest ReleaseOf(const void* buffer) {
  hx::core::HostRequest request =
      hx::core::MakeHostRequest(hx::core::kModuleId, hx::core::kClassFrameRelease, 0);
  request.data = const_cast<void*>(buffer);
  return request;
}

TEST(FramePoolTest, CountsReturnsDiscardsSecondReleasesAndUnknownBuffers) {
  refhost::FramePool pool;
  EXPECT_EQ(nullptr, pool.Allocate(0));
  uint8_t* kept = pool.Allocate(100);
  uint8_t* refused = pool.Allocate(50);
  uint8_t* lost = pool.Allocate(10);
  ASSERT_TRUE(kept && refused && lost);
  EXPECT_EQ(160u, pool.Counts().peakOutstandingBytes);
  pool.Discard(refused);
  EXPECT_EQ(0, pool.OnReleaseRequest(ReleaseOf(kept)));
  pool.OnReleaseRequest(ReleaseOf(kept));
  int onStack = 0;
  pool.Release(&onStack);
  pool.Release(nullptr);
  const refhost::FramePoolCounts counts = pool.Counts();
  EXPECT_EQ(3u, counts.allocated);
  EXPECT_EQ(1u, counts.outstanding);
  EXPECT_EQ(10u, counts.outstandingBytes);
  EXPECT_EQ(1u, counts.returned);
  EXPECT_EQ(1u, counts.discarded);
  EXPECT_EQ(1u, counts.releasedTwice);
  EXPECT_EQ(2u, counts.unknown);
  EXPECT_EQ("frame buffers: 1 never returned (10 bytes), 1 released twice, 2 unknown released",
            pool.FaultReport());
  pool.Release(lost);
  refhost::FramePool clean;
  EXPECT_EQ("", clean.FaultReport());
}

class CameraFeedTest : public testsupport::ModuleHostTest {
 protected:
  // Encodes `frames` frames of ffmpeg's test picture with `codecArgs` into
  // `name` in the test's directory.
  std::string MakeVideo(const std::string& name, int frames, const std::string& codecArgs) {
    const std::string path = dir().File(name);
    const std::string command =
        "ffmpeg -nostdin -v error -y -f lavfi -i testsrc=size=320x240:rate=25 -frames:v " +
        std::to_string(frames) + " " + codecArgs + " '" + path + "'";
    const int status = std::system(command.c_str());
    EXPECT_EQ(0, status) << "ffmpeg is needed for this test: " << command;
    return path;
  }

  struct Seen {
    std::vector<FrameHeader> headers;
    std::vector<std::string> payloadHeads;  // first bytes of each payload
  };

  FeedOptions Options(const std::string& path, uint32_t streamId, Seen* seen) {
    FeedOptions options;
    options.path = path;
    options.streamId = streamId;
    options.realTime = false;
    options.observer = [seen](const FrameHeader& header, const uint8_t* payload) {
      seen->headers.push_back(header);
      const size_t head = header.payloadBytes < 4 ? header.payloadBytes : 4;
      seen->payloadHeads.emplace_back(reinterpret_cast<const char*>(payload), head);
    };
    return options;
  }

  // Stops the host and checks that every lent buffer came back exactly once.
  void ExpectAllBuffersReturned(uint64_t lent) {
    host().Stop();
    const refhost::FramePoolCounts counts = host().Frames().Counts();
    EXPECT_EQ(lent, counts.allocated);
    EXPECT_EQ(0u, counts.outstanding);
    EXPECT_EQ(lent, counts.returned + counts.discarded);
    EXPECT_EQ(0u, counts.releasedTwice);
    EXPECT_EQ(0u, counts.unknown);
    EXPECT_FALSE(host().Log().Contains("host: frame buffers"));
  }

  static bool StartsWithStartCode(const std::string& head) {
    return head.compare(0, 4, std::string("\0\0\0\1", 4)) == 0 ||
           head.compare(0, 3, std::string("\0\0\1", 3)) == 0;
  }
};

TEST_F(CameraFeedTest, CompressedVideoIsFedAsStartCodedFramesAndEveryBufferComesBack) {
  struct Case {
    const char* name;
    const char* codecArgs;
    uint32_t hostCodec;
  } cases[] = {
      {"h264.mp4", "-c:v libx264 -pix_fmt yuv420p -x264-params keyint=10:min-keyint=10:scenecut=0",
       5},
      {"h265.mp4",
       "-c:v libx265 -pix_fmt yuv420p "
       "-x265-params keyint=10:min-keyint=10:scenecut=0:log-level=error",
       6},
      {"h264.h264", "-c:v libx264 -pix_fmt yuv420p -x264-params keyint=10:min-keyint=10", 5},
  };
  StartHost();
  uint64_t lent = 0;
  uint32_t streamId = 3;
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    Seen seen;
    CameraFeed feed(host(), host().Frames(),
                    Options(MakeVideo(c.name, 40, c.codecArgs), streamId, &seen));
    std::string error;
    ASSERT_TRUE(feed.Run(&error)) << error;
    EXPECT_EQ(c.hostCodec, feed.Format().codec);
    EXPECT_EQ(320u, feed.Format().width);
    EXPECT_EQ(240u, feed.Format().height);
    EXPECT_DOUBLE_EQ(25.0, feed.Format().fps);
    const refhost::FeedStats stats = feed.Stats();
    EXPECT_EQ(40u, stats.frames);
    EXPECT_EQ(4u, stats.keyFrames);
    EXPECT_EQ(stats.frames, stats.kept + stats.refused);
    EXPECT_EQ(0u, stats.failed);
    ASSERT_EQ(40u, seen.headers.size());
    EXPECT_EQ(refhost::kFrameFlagKey, seen.headers[0].flags);
    for (size_t i = 0; i < seen.headers.size(); ++i) {
      EXPECT_EQ(refhost::kFrameHeaderMagic, seen.headers[i].magic);
      EXPECT_EQ(32u, seen.headers[i].headerBytes);
      EXPECT_EQ(streamId, seen.headers[i].streamId);
      EXPECT_EQ(i, seen.headers[i].sequence);
      EXPECT_TRUE(StartsWithStartCode(seen.payloadHeads[i])) << "frame " << i;
    }
    lent += stats.frames;
    ++streamId;
  }
  ExpectAllBuffersReturned(lent);
}

TEST_F(CameraFeedTest, MotionJpegFramesAreAllKeyFramesHoldingWholePictures) {
  const std::string path = MakeVideo("mjpeg.avi", 12, "-c:v mjpeg -pix_fmt yuvj420p -q:v 5");
  StartHost();
  Seen seen;
  CameraFeed feed(host(), host().Frames(), Options(path, 9, &seen));
  std::string error;
  ASSERT_TRUE(feed.Run(&error)) << error;
  EXPECT_EQ(0u, feed.Format().codec);
  EXPECT_EQ(12u, feed.Stats().frames);
  EXPECT_EQ(12u, feed.Stats().keyFrames);
  for (const std::string& head : seen.payloadHeads) EXPECT_EQ(0, head.compare(0, 2, "\xFF\xD8"));
  ExpectAllBuffersReturned(12);
}

TEST_F(CameraFeedTest, AStartedFeedPacesAtTheFileRateLoopsAndStopsOnRequest) {
  const std::string path = MakeVideo("paced.mp4", 5, "-c:v libx264 -r 20");
  StartHost();
  Seen seen;
  FeedOptions options = Options(path, 4, &seen);
  options.realTime = true;
  options.loops = 2;
  CameraFeed paced(host(), host().Frames(), options);
  const auto started = std::chrono::steady_clock::now();
  std::string error;
  ASSERT_TRUE(paced.Start(&error)) << error;
  EXPECT_FALSE(paced.Start(&error));
  ASSERT_TRUE(paced.Wait(&error)) << error;
  // Ten frames at 20 per second: the last is due 450 ms after the first.
  EXPECT_GE(std::chrono::steady_clock::now() - started, std::chrono::milliseconds(450));
  EXPECT_EQ(10u, paced.Stats().frames);
  EXPECT_EQ(9u, seen.headers.back().sequence);

  options.loops = 0;  // endless until stopped
  CameraFeed endless(host(), host().Frames(), options);
  ASSERT_TRUE(endless.Start(&error)) << error;
  // Past the end of the first round: the file is played again.
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
  while (endless.Stats().frames < 7 && std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  endless.Stop();
  EXPECT_GE(endless.Stats().frames, 7u);
  EXPECT_TRUE(endless.Wait(&error)) << error;
  ExpectAllBuffersReturned(10 + endless.Stats().frames);
}

TEST_F(CameraFeedTest, FilesThatCannotBeFedAreReportedWithoutPushingAnything) {
  testsupport::WriteFile(dir().File("notes.txt"), "no video here");
  const std::string audio = dir().File("tone.wav");
  const std::string command =
      "ffmpeg -nostdin -v error -y -f lavfi -i sine=duration=0.2 '" + audio + "'";
  ASSERT_EQ(0, std::system(command.c_str())) << "ffmpeg is needed for this test";
  const std::string png = MakeVideo("still.mkv", 3, "-c:v png");
  StartHost();
  const std::string paths[] = {dir().File("missing.mp4"), dir().File("notes.txt"), audio, png};
  for (const std::string& path : paths) {
    SCOPED_TRACE(path);
    FeedOptions options;
    options.path = path;
    CameraFeed feed(host(), host().Frames(), options);
    std::string error;
    EXPECT_FALSE(feed.Run(&error));
    EXPECT_FALSE(error.empty());
    EXPECT_EQ(0u, feed.Stats().frames);
  }
  ExpectAllBuffersReturned(0);
}

TEST_F(CameraFeedTest, ABufferNeverReturnedIsReportedAtShutdown) {
  StartHost();
  ASSERT_NE(nullptr, host().Frames().Allocate(64));
  host().Stop();
  EXPECT_TRUE(host().Log().Contains("host: frame buffers: 1 never returned (64 bytes)"));
}

// The codec libraries live in the host's process too. While the module is
// loaded their warnings and errors reach the host's log (not its standard
// error); after Unload they print by themselves again, and no call reaches
// the module that is gone.
TEST_F(CameraFeedTest, CodecLibraryWarningsReachTheHostsLogWhileTheModuleIsLoaded) {
  StartHost();
  av_log(nullptr, AV_LOG_WARNING, "codec warning %d\n", 1);
  av_log(nullptr, AV_LOG_ERROR, "codec error\n");
  av_log(nullptr, AV_LOG_INFO, "codec chatter\n");
  host().Stop();
  av_log(nullptr, AV_LOG_WARNING, "codec warning after unload\n");
  std::vector<std::string> texts;
  for (const refhost::LogLine& line : host().Log().Lines()) {
    if (line.text.rfind("codec ", 0) != 0) continue;
    texts.push_back(line.text);
    EXPECT_EQ(refhost::kLogWarning, line.level);
  }
  EXPECT_EQ((std::vector<std::string>{"codec warning 1", "codec error"}), texts);
}

}  // namespace
