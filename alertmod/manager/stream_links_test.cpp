#include "alertmod/manager/stream_links.h"

#include <gtest/gtest.h>
#include <tinyxml.h>

#include <optional>
#include <set>
#include <utility>
#include <vector>

#include "alertmod/manager/event_source_key.h"
#include "alertmod/platform/testing/manual_env.h"
#include "alertmod/video/video_buffer.h"
#include "host/system_description.h"
#include "tests/support/fake_host.h"

namespace hx {
namespace {

using refhost::CameraDescription;
using refhost::HostStreamId;
using refhost::StreamDescription;

constexpr int32_t kPlugin = 0x10000;
constexpr int32_t kJpeg = refhost::kStandardJpeg;
constexpr int32_t kH264 = refhost::kStandardH264;

StreamDescription Stream(int32_t context, int32_t standard, int32_t width, int32_t height,
                         std::optional<int32_t> number = std::nullopt) {
  return StreamDescription{context, standard, width, height, number};
}

uint32_t Id(int32_t device, int32_t input, int32_t context = 0) {
  return HostStreamId(kPlugin, device, input, context);
}

// Cameras whose still-image streams differ in size and numbering.
HostSystemCatalogue MakeCatalogue() {
  refhost::SystemDescription system;
  CameraDescription twoStills{"Two stills", kPlugin, 1, 0, {}};
  twoStills.streams = {Stream(0, kH264, 1280, 720), Stream(1, kJpeg, 640, 480),
                       Stream(2, kJpeg, 320, 240)};
  CameraDescription stillMain{"Still main", kPlugin, 2, 0, {Stream(0, kJpeg, 800, 600)}};
  // Input 15 lets a stream go without a valid number.
  CameraDescription unnumbered{"Unnumbered", kPlugin, 3, 15, {}};
  unnumbered.streams = {Stream(0, kH264, 1280, 720), Stream(1, kJpeg, 160, 120, -1),
                        Stream(2, kJpeg, 1024, 768)};
  CameraDescription videoOnly{"Video only", kPlugin, 4, 0, {Stream(0, kH264, 1280, 720)}};
  CameraDescription extraVideo{"Extra video", kPlugin, 5, 0, {}};
  extraVideo.streams = {Stream(0, kJpeg, 640, 480), Stream(1, kH264, 1920, 1080)};
  system.cameras = {twoStills, stillMain, unnumbered, videoOnly, extraVideo};
  TiXmlDocument document;
  document.Parse(refhost::BuildSystemDocument(system).c_str());
  HostSystemCatalogue catalogue;
  catalogue.RebuildCatalogue(*document.RootElement());
  return catalogue;
}

class StreamLinksTest : public ::testing::Test {
 protected:
  // Wants `sources` and links them.
  void Want(std::set<uint32_t> sources) {
    wanted.MutableSources() = std::move(sources);
    RelinkStreams(wanted, catalogue, buffer);
  }

  testsupport::FakeHost host;
  HostSystemCatalogue catalogue = MakeCatalogue();
  platform::ManualEnv env;
  VideoBuffer buffer{host.callback(), env};
  WantedVideo wanted;
};

TEST_F(StreamLinksTest, CompressedSourcesAreLinkedToTheirSmallestNumberedStill) {
  const uint32_t unknown = Id(9, 0);
  static const char frame[100] = {};
  ASSERT_TRUE(
      buffer.AddFrame(static_cast<int32_t>(unknown), kKeyFrameType, 0, frame, 100, StreamFormat{}));
  Want({Id(1, 0), Id(2, 0), Id(3, 15), Id(4, 0), Id(5, 0, 1), unknown});

  std::vector<std::pair<uint32_t, int32_t>> links;
  for (const auto& link : wanted.Links()) links.emplace_back(link.first, link.second.ID);
  const std::vector<std::pair<uint32_t, int32_t>> expected = {
      {Id(1, 0), static_cast<int32_t>(Id(1, 0, 2))},
      {Id(3, 15), static_cast<int32_t>(Id(3, 15, 2))},
      {Id(5, 0, 1), static_cast<int32_t>(Id(5, 0))},
  };
  EXPECT_EQ(links, expected);
  // A source without a described stream cannot be buffered.
  EXPECT_EQ(buffer.FindStream(static_cast<int32_t>(unknown)), nullptr);

  struct Want {
    uint32_t key;
    bool wanted;
  };
  const Want wants[] = {
      {Id(1, 0), false}, {Id(1, 0, 1), false},  {Id(1, 0, 2), true},
      {Id(2, 0), true},  {Id(3, 15, 1), false}, {Id(4, 0), true},
      {Id(5, 0), true},  {Id(5, 0, 1), false},  {Id(6, 0), false},
  };
  for (const Want& w : wants) EXPECT_EQ(wanted.Wants(w.key), w.wanted) << std::hex << w.key;
}

TEST_F(StreamLinksTest, StreamsNoLongerDescribedOrWantedLeaveTheBuffer) {
  Want({Id(1, 0), Id(2, 0)});
  static const char frame[100] = {};
  for (uint32_t id : {Id(1, 0), Id(1, 0, 2), Id(2, 0), Id(4, 0), Id(8, 0)}) {
    buffer.AddFrame(static_cast<int32_t>(id), kKeyFrameType, 0, frame, 100, StreamFormat{});
  }
  ReconcileVideoBuffer(wanted, catalogue, buffer);
  std::vector<int32_t> kept;
  buffer.StreamIds(&kept);
  EXPECT_EQ(kept, (std::vector<int32_t>{static_cast<int32_t>(Id(2, 0)),
                                        static_cast<int32_t>(Id(1, 0, 2))}));
}

TEST_F(StreamLinksTest, SourcesMapToTheirLinkedOrOwnStream) {
  Want({Id(1, 0), Id(2, 0)});
  const char kWarning[] = "Unable to map video input to stream/ channel id to locate video frame";
  EXPECT_EQ(MapSourceToStream(Id(1, 0), catalogue, wanted, host.callback()),
            static_cast<int32_t>(Id(1, 0, 2)));
  EXPECT_EQ(MapSourceToStream(Id(2, 0), catalogue, wanted, host.callback()),
            static_cast<int32_t>(Id(2, 0)));
  EXPECT_TRUE(host.LogTexts(50).empty());
  EXPECT_EQ(MapSourceToStream(Id(7, 3), catalogue, wanted, host.callback()),
            static_cast<int32_t>(Id(7, 3)));
  EXPECT_EQ(host.LogTexts(50), std::vector<std::string>{kWarning});
}

TEST(StreamFormatTest, IsTheCataloguesRecordFieldForField) {
  const StreamFormatRecord record{0x10100, 2, 640, 480, kH264};
  const StreamFormat format = ToStreamFormat(record);
  EXPECT_EQ(format.lead0, 0x10100u);
  EXPECT_EQ(format.lead1, 2u);
  EXPECT_EQ(format.width, 640u);
  EXPECT_EQ(format.height, 480u);
  EXPECT_EQ(format.codec, kCodecH264);
  EXPECT_EQ(ToStreamFormat(StreamFormatRecord{}).lead1, StreamFormat{}.lead1);
  EXPECT_EQ(ToStreamFormat(StreamFormatRecord{1, 1, 1, 1, kJpeg}).codec, kCodecJpeg);
}

}  // namespace
}  // namespace hx
