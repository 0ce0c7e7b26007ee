#include "alertmod/manager/catalogue.h"

#include <gtest/gtest.h>
#include <tinyxml.h>

#include <algorithm>

#include "alertmod/manager/event_source_key.h"
#include "host/system_description.h"

namespace hx {
namespace {

using refhost::CameraDescription;
using refhost::EventSourceRef;
using refhost::StreamDescription;
using refhost::SystemDescription;

constexpr int32_t kEncoders = 0x10000;
constexpr int32_t kAudio = 0x20000;
constexpr int32_t kSerial = 0x50000;
constexpr int32_t kPosAtm = 0x60000;
constexpr int32_t kAccess = 0x80000;
constexpr int32_t kLinks = 0x90000;

// Parses `text` and rebuilds `catalogue` from its root element.
void Rebuild(HostSystemCatalogue& catalogue, const std::string& text) {
  TiXmlDocument document;
  document.Parse(text.c_str());
  ASSERT_FALSE(document.Error()) << document.ErrorDesc() << "\n" << text;
  catalogue.RebuildCatalogue(*document.RootElement());
}

// Appends the children of the hand-written `fragment` ("<X>...</X>") to the
// root of the system document `text`.
std::string Extend(const std::string& text, const std::string& fragment) {
  TiXmlDocument document;
  document.Parse(text.c_str());
  TiXmlDocument extra;
  extra.Parse(fragment.c_str());
  for (const TiXmlNode* child = extra.RootElement()->FirstChild(); child != nullptr;
       child = child->NextSibling()) {
    document.RootElement()->InsertEndChild(*child);
  }
  std::string result;
  result << *document.RootElement();
  return result;
}

SystemDescription DescribeSite() {
  SystemDescription site;
  site.pluginDescriptions[kEncoders] = "Analog Encoder";
  site.devices = {{kEncoders, 1, "Encoder A", std::string("SN-1")},
                  {kEncoders, 2, "Encoder B", std::nullopt}};
  CameraDescription door{"Front Door", kEncoders, 1, 0, {}};
  door.streams = {StreamDescription{0, refhost::kStandardH264, 1280, 720, std::nullopt},
                  StreamDescription{1, refhost::kStandardJpeg, 640, 480, std::nullopt}};
  site.cameras = {door, CameraDescription{"Yard", kEncoders, 2, 17, {}}};
  site.triggers = {{"Door Contact", kEncoders, 1, 2, false}, {"Siren", kEncoders, 1, 0, true}};
  site.softTriggers = {{"Panic Button", 4}};
  site.timeTriggers = {{"Night Shift", 2}};
  site.groups = {{5, std::string("Lobby"), {EventSourceRef::Camera(kEncoders, 1, 0)}},
                 {6, std::nullopt, {EventSourceRef::Camera(kEncoders, 2, 17)}}};
  return site;
}

// The sources the builder does not describe, as the host writes them.
const char kHandWritten[] = R"(<X>
  <Devices ID="131072">
    <Device Number="4">
      <Audio><Input Number="3" Name="Lobby Mic"/></Audio>
      <Codec><Encoder Number="0"><AudioChannel ID="900" Number="3"/></Encoder></Codec>
    </Device>
  </Devices>
  <AccessDevices ID="524288" Description="Door Controller">
    <Device Number="3" Name="Side Gate"/>
  </AccessDevices>
  <AutoConnections ID="589824">
    <AutoConnection Number="2" Port="8080" Address="10.0.0.5"/>
  </AutoConnections>
  <Serial ID="327680">
    <Input><Device ID="6" Name="Register 6" StreamID="329216" RawStreamID="4000" Profile="7"/></Input>
  </Serial>
  <POSATM ID="393216">
    <Profile ID="7" Name="Grocery">
      <Keyword ID="1" Value="VOID"/>
      <Field ID="2" Name="Total"/>
      <Keyword ID="3"/>
    </Profile>
  </POSATM>
  <Cases><Case ID="12" Title="Theft"><Bookmark Time="100"/><Bookmark Time="200"/></Case></Cases>
</X>)";

class CatalogueTest : public ::testing::Test {
 protected:
  void SetUp() override {
    Rebuild(m_catalogue, Extend(refhost::BuildSystemDocument(DescribeSite()), kHandWritten));
  }
  HostSystemCatalogue m_catalogue;
};

TEST_F(CatalogueTest, NamesEverySourceByEventType) {
  const uint32_t door = EventSourceKey(kEncoders, 1, 0, 0);
  struct Case {
    uint32_t key;
    std::vector<int32_t> types;
    std::string name;
  };
  const Case cases[] = {
      {door, {1, 2, 9, 18, 34}, "Front Door"},
      {EventSourceKey(kEncoders, 1, 0, 1), {1}, "Front Door"},
      {EventSourceKey(kEncoders, 2, 17, 0), {1}, "Yard"},
      {EventSourceKey(kEncoders, 1, 2, 0), {3, 31, 32}, "Door Contact"},
      {EventSourceKey(kSerial, 6, 1, 0), {4, 5}, "Register 6 - Grocery - VOID"},
      {EventSourceKey(kSerial, 6, 2, 0), {4}, "Register 6 - Total"},
      {EventSourceKey(kSerial, 6, 3, 0), {4}, "Register 6"},  // keyword without a value
      {door, {6}, "Button 1"},
      {door, {7}, "Device Temperature 1"},
      {door, {8, 10, 11, 17, 22, 25, 26, 27, 28, 29, 35}, ""},
      {SourceGroupKey(5), {12}, "Lobby"},
      {SourceGroupKey(6), {12}, ""},  // a group without a name
      {EventSourceKey(kEncoders, 3, 0, 0), {13}, "Power Supply 3"},
      {EventSourceKey(kLinks, 2, 0, 0), {14}, "Outbound Connection 2 (10.0.0.5:8080)"},
      {door, {15, 0, -1, 36, 1000}, "Unknown"},
      {EventSourceKey(refhost::kSoftTriggerPlugin, 0, 4, 0), {16}, "Panic Button"},
      {door, {19}, "Device Failure 1"},
      {EventSourceKey(kAudio, 4, 3, 0), {20}, "Lobby Mic"},
      {door, {21, 30, 33}, "Analog Encoder Encoder A: SN-1"},
      {EventSourceKey(kEncoders, 2, 0, 0), {21}, ""},  // a device without a serial
      {EventSourceKey(kAccess, 3, 0, 0), {30}, "Door Controller Side Gate: 3"},
      {EventSourceKey(kSerial, 6, 0, 0), {33}, "Register 6"},
      {door, {23}, "Device Fan 1"},
      {EventSourceKey(refhost::kTimeTriggerPlugin, 0, 2, 0), {24}, "Night Shift"},
      {0, {1, 6, 13, 15, 99}, ""},
  };
  for (const Case& c : cases) {
    for (const int32_t type : c.types) {
      EXPECT_EQ(m_catalogue.SourceName(c.key, type), c.name)
          << "key 0x" << std::hex << c.key << std::dec << " type " << type;
    }
  }
}

TEST_F(CatalogueTest, FallsBackToSectionNumbers) {
  // A serial device named under its section answers for any plug-in number.
  EXPECT_EQ(m_catalogue.SourceName(EventSourceKey(0x70000, 6, 0, 0), 21), "Register 6");
  // A POS/ATM keyword answers when the device number is the profile number.
  EXPECT_EQ(m_catalogue.SourceName(EventSourceKey(0x70000, 7, 1, 0), 5), "Grocery - VOID");
  EXPECT_EQ(m_catalogue.Sections(), (std::set<int32_t>{kSerial, kPosAtm}));
  // The lowest section with the name wins.
  HostSystemCatalogue catalogue;
  Rebuild(catalogue, R"(<Trellan Delta="0">
      <Serial ID="900"><Input><Device ID="1" Name="High"/></Input></Serial>
      <Serial ID="-5"><Input><Device ID="1" Name="Low"/></Input></Serial></Trellan>)");
  EXPECT_EQ(catalogue.LookupName({kKindDevice, 42, 1, 0, 0}), "Low");
  EXPECT_EQ(catalogue.LookupName({kKindDevice, 42, 2, 0, 0}), std::nullopt);
}

TEST_F(CatalogueTest, KeepsSerialStreamsProfilesAndCases) {
  const SourceIdentity registerSix{kKindSerialDevice, kSerial, 6, 0, 0};
  EXPECT_EQ(m_catalogue.StreamIdentity(329216), registerSix);
  EXPECT_EQ(m_catalogue.StreamIdentity(4000), registerSix);
  EXPECT_EQ(m_catalogue.SerialProfiles(), (std::map<int32_t, int32_t>{{329216, 7}}));
  ASSERT_EQ(m_catalogue.Cases().count(12), 1u);
  EXPECT_EQ(m_catalogue.Cases().at(12).attributes.at("Title"), "Theft");
  EXPECT_EQ(m_catalogue.Cases().at(12).bookmarks.size(), 2u);

  // The next full document rebuilds these sections.
  Rebuild(m_catalogue, R"(<Trellan Delta="0"/>)");
  EXPECT_TRUE(m_catalogue.SerialProfiles().empty());
  EXPECT_TRUE(m_catalogue.Cases().empty());
}

TEST(CatalogueRebuildTest, OnlyFullTrellanDocumentsCount) {
  const char* const ignored[] = {
      R"(<Trellan Delta="1"><SoftTriggers ID="1"><Input Number="1" Name="A"/></SoftTriggers></Trellan>)",
      R"(<trellan Delta="0"><SoftTriggers ID="1"><Input Number="1" Name="A"/></SoftTriggers></trellan>)",
      R"(<Trellan Delta="0x0"><SoftTriggers ID="1"><Input Number="1" Name="A"/></SoftTriggers></Trellan>)",
  };
  for (const char* text : ignored) {
    HostSystemCatalogue catalogue;
    Rebuild(catalogue, text);
    // A non-numeric Delta counts as missing, which is a full document.
    const bool full = std::string(text).find("0x0") != std::string::npos;
    EXPECT_EQ(catalogue.Names().size(), full ? 1u : 0u) << text;
  }
  HostSystemCatalogue catalogue;
  Rebuild(catalogue,
          R"(<Trellan><SoftTriggers ID="1"><Input Number="1" Name="A"/></SoftTriggers></Trellan>)");
  EXPECT_EQ(catalogue.LookupName({kKindSoftTrigger, 1, 1, 0, 0}), "A");
}

TEST(CatalogueRebuildTest, ConnectionNamePrintsNumbersInDecimal) {
  HostSystemCatalogue catalogue;
  Rebuild(catalogue, R"(<Trellan Delta="0"><AutoConnections ID="589824">
      <AutoConnection Number="10" Port="025" Address="relay.example"/>
      <AutoConnection Number="11" Address="no-port.example"/>
      <AutoConnection Number="12" Port="80"/></AutoConnections></Trellan>)");
  EXPECT_EQ(catalogue.SourceName(EventSourceKey(kLinks, 10, 0, 0), 14),
            "Outbound Connection 10 (relay.example:25)");
  EXPECT_EQ(catalogue.SourceName(EventSourceKey(kLinks, 11, 0, 0), 14), "");
  EXPECT_EQ(catalogue.SourceName(EventSourceKey(kLinks, 12, 0, 0), 14), "");
}

TEST(CatalogueRebuildTest, DeviceHealthNamesNeedNoCatalogue) {
  HostSystemCatalogue empty;
  EXPECT_EQ(empty.SourceName(EventSourceKey(kEncoders, 3, 0, 0), 13), "Power Supply 3");
  EXPECT_EQ(empty.SourceName(EventSourceKey(kEncoders, 3, 9, 2), 13), "Power Supply 3");
  EXPECT_EQ(empty.SourceName(EventSourceKey(kEncoders, 3, 0, 0), 1), "");
}

TEST(CatalogueRebuildTest, LaterDocumentReplacesOnlyListedPlugins) {
  SystemDescription site;
  site.cameras = {CameraDescription{"Gate", kEncoders, 1, 0, {}},
                  CameraDescription{"Dock", 0x30000, 1, 0, {}}};
  site.cameras[0].streams = {StreamDescription{}, StreamDescription{1, 0, 320, 240, {}}};
  HostSystemCatalogue catalogue;
  Rebuild(catalogue, refhost::BuildSystemDocument(site));
  const int32_t gateMain = static_cast<int32_t>(EventSourceKey(kEncoders, 1, 0, 0));
  const int32_t gateStill = static_cast<int32_t>(EventSourceKey(kEncoders, 1, 0, 1));
  ASSERT_TRUE(catalogue.StreamFormat(gateStill));

  // The second document lists only the second plug-in, with a renamed camera
  // on another input.
  SystemDescription later;
  later.cameras = {CameraDescription{"Loading Dock", 0x30000, 1, 5, {}}};
  Rebuild(catalogue, refhost::BuildSystemDocument(later));
  EXPECT_EQ(catalogue.SourceName(static_cast<uint32_t>(gateMain), 1), "Gate");
  EXPECT_EQ(catalogue.StreamSourceKey(gateMain), static_cast<uint32_t>(gateMain));
  EXPECT_EQ(catalogue.CameraStreams(CameraKey(kEncoders, 1, 0)), std::vector<int32_t>{gateStill});
  EXPECT_EQ(catalogue.SourceName(EventSourceKey(0x30000, 1, 0, 0), 1), "");
  EXPECT_EQ(catalogue.StreamSourceKey(static_cast<int32_t>(EventSourceKey(0x30000, 1, 0, 0))), 0u);
  EXPECT_EQ(catalogue.SourceName(EventSourceKey(0x30000, 1, 5, 0), 1), "Loading Dock");

  // When the first plug-in's camera goes, its streams and formats go too, so
  // the video buffer does not keep a camera that no longer exists.
  site.cameras = {CameraDescription{"Other", kEncoders, 2, 0, {}}};
  Rebuild(catalogue, refhost::BuildSystemDocument(site));
  EXPECT_EQ(catalogue.StreamIdentity(gateMain), std::nullopt);
  EXPECT_EQ(catalogue.StreamFormat(gateMain), std::nullopt);
  EXPECT_EQ(catalogue.StreamFormat(gateStill), std::nullopt);
  EXPECT_TRUE(catalogue.CameraStreams(CameraKey(kEncoders, 1, 0)).empty());
}

TEST(CatalogueRebuildTest, DropsUnnamedStreamsFromCameraLists) {
  HostSystemCatalogue catalogue;
  Rebuild(catalogue, R"(<Trellan Delta="0"><Devices ID="65536"><Device Number="1">
      <Context Number="1">
        <Video><Input Number="0" Name="Gate still"/></Video>
        <Codec><Encoder><Channel ID="11" Number="0" Width="640" Height="480" Standard="0"/></Encoder></Codec>
      </Context>
      <Context Number="2">
        <Codec><Encoder><Channel ID="12" Number="0" Width="320" Height="240" Standard="0"/></Encoder></Codec>
      </Context>
      <Context>
        <Video><Input Number="0" Name="No context number"/></Video>
        <Codec><Encoder><Channel ID="13" Number="0" Width="320" Height="240" Standard="0"/></Encoder></Codec>
      </Context>
    </Device></Devices></Trellan>)");
  EXPECT_EQ(catalogue.CameraStreams(CameraKey(kEncoders, 1, 0)), std::vector<int32_t>{11});
  // The unnamed stream is still known and has its format.
  EXPECT_EQ(catalogue.StreamSourceKey(12), EventSourceKey(kEncoders, 1, 0, 2));
  EXPECT_TRUE(catalogue.StreamFormat(12));
  EXPECT_EQ(catalogue.StreamIdentity(13), std::nullopt);
}

TEST(CatalogueRebuildTest, ReusedStreamIdentifierLeavesCameraList) {
  // A later plug-in reuses stream 77 for its own camera; the first camera
  // must not pick up the other camera's stream as one of its own.
  HostSystemCatalogue catalogue;
  Rebuild(catalogue, R"(<Trellan Delta="0">
      <Devices ID="65536"><Device Number="1"><Context Number="1">
        <Video><Input Number="0" Name="Gate still"/></Video>
        <Codec><Encoder><Channel ID="77" Number="0" Width="640" Height="480" Standard="0"/></Encoder></Codec>
      </Context></Device></Devices>
      <Devices ID="196608"><Device Number="2"><Context Number="1">
        <Video><Input Number="1" Name="Dock still"/></Video>
        <Codec><Encoder><Channel ID="77" Number="1" Width="320" Height="240" Standard="0"/></Encoder></Codec>
      </Context></Device></Devices></Trellan>)");
  EXPECT_TRUE(catalogue.CameraStreams(CameraKey(kEncoders, 1, 0)).empty());
  EXPECT_EQ(catalogue.CameraStreams(CameraKey(0x30000, 2, 1)), std::vector<int32_t>{77});
  EXPECT_EQ(catalogue.StreamSourceKey(77), EventSourceKey(0x30000, 2, 1, 1));
}

TEST(CatalogueRebuildTest, MapsSequencedChannelsToInputs) {
  HostSystemCatalogue catalogue;
  Rebuild(catalogue, R"(<Trellan Delta="0"><Devices ID="65536"><Device Number="1">
      <Codec><Encoder Number="2">
        <Sequence><Entry Input="5"/><Entry Input="x"/><Entry Input="9"/><Entry Input="12"/></Sequence>
        <Channel ID="100" Number="0"/>
        <Channel ID="101" Number="1"/>
        <Channel ID="102" Number="2"/>
        <Channel ID="103" Number="3"/>
        <Channel ID="104" Number="-1"/>
        <Channel ID="105" Number="2147483647"/>
        <AudioChannel ID="106" Number="1"/>
      </Encoder>
      <Encoder Number="2147483647"><Channel ID="107" Number="5"/></Encoder>
      <Encoder><Channel ID="108" Number="4"/><Channel Number="5"/><Channel ID="109"/></Encoder>
      </Codec></Device></Devices></Trellan>)");
  struct Case {
    int32_t stream;
    std::optional<SourceIdentity> identity;
  };
  const Case cases[] = {
      {100, SourceIdentity{kKindVideoInput, kEncoders, 1, 0, 5}},
      {101, SourceIdentity{kKindVideoInput, kEncoders, 1, 0, 9}},  // "x" is not an entry
      {102, SourceIdentity{kKindVideoInput, kEncoders, 1, 0, 12}},
      {103, std::nullopt},  // beyond the sequence
      {104, std::nullopt},  // negative channel number
      {105, std::nullopt},
      // Audio channels are not sequenced: encoder * 16 + channel.
      {106, SourceIdentity{kKindAudioInput, kEncoders, 1, 0, 33}},
      // The input wraps like the host's 32-bit arithmetic.
      {107, SourceIdentity{kKindVideoInput, kEncoders, 1, 0, -11}},
      {108, SourceIdentity{kKindVideoInput, kEncoders, 1, 0, 4}},
      {109, std::nullopt},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(catalogue.StreamIdentity(c.stream), c.identity) << c.stream;
  }
  EXPECT_EQ(catalogue.Streams().size(), 6u);
  // None of these channels has a complete format.
  EXPECT_TRUE(catalogue.Formats().empty());
}

TEST(CatalogueRebuildTest, FormatNeedsAllFiveNumbers) {
  HostSystemCatalogue catalogue;
  Rebuild(catalogue, R"(<Trellan Delta="0"><Devices ID="65536"><Device Number="1"><Codec><Encoder>
      <Channel ID="1" Number="0" Width="640" Height="480" Standard="5"/>
      <Channel ID="2" Number="1" Width="640" Height="480"/>
      <Channel ID="3" Number="2" Width="640" Height="480" Standard="H264"/>
      </Encoder></Codec></Device></Devices></Trellan>)");
  EXPECT_EQ(catalogue.StreamFormat(1), (StreamFormatRecord{1, 0, 640, 480, 5}));
  EXPECT_EQ(catalogue.StreamFormat(2), std::nullopt);
  EXPECT_EQ(catalogue.StreamFormat(3), std::nullopt);
  EXPECT_EQ(StreamFormatRecord(), (StreamFormatRecord{0, -1, 0, 0, 0}));

  // A channel that loses a number loses its format.
  Rebuild(catalogue, R"(<Trellan Delta="0"><Devices ID="65536"><Device Number="1"><Codec><Encoder>
      <Channel ID="1" Number="0" Width="640" Height="480"/></Encoder></Codec></Device></Devices></Trellan>)");
  EXPECT_EQ(catalogue.StreamFormat(1), std::nullopt);
  EXPECT_EQ(catalogue.StreamSourceKey(1), EventSourceKey(kEncoders, 1, 0, 0));
}

TEST(CatalogueRebuildTest, KeepsKeywordsOfEveryPosAtmSection) {
  HostSystemCatalogue catalogue;
  Rebuild(catalogue, R"(<Trellan Delta="0">
      <POSATM ID="1"><Profile ID="7" Name="Grocery"><Keyword ID="1" Value="VOID"/></Profile></POSATM>
      <POSATM ID="2"><Profile ID="8" Name="Fuel"><Keyword ID="1" Value="PUMP"/></Profile></POSATM>
    </Trellan>)");
  EXPECT_EQ(catalogue.PosAtmKeywords().size(), 2u);
  // A later document with profiles replaces the table.
  Rebuild(catalogue, R"(<Trellan Delta="0">
      <POSATM ID="2"><Profile ID="8" Name="Fuel"><Keyword ID="2" Value="CASH"/></Profile></POSATM>
    </Trellan>)");
  EXPECT_EQ(catalogue.PosAtmKeywords(),
            (HostSystemCatalogue::PosAtmTable{{8, {{2, "Fuel - CASH"}}}}));
}

TEST(CatalogueRebuildTest, FindsFirstVideoStreamOfKeyInSignedOrder) {
  HostSystemCatalogue catalogue;
  // Both channels carry input 1 of device 1; stream -5 sorts first.
  Rebuild(catalogue, R"(<Trellan Delta="0"><Devices ID="65536"><Device Number="1"><Codec>
      <Encoder><Channel ID="40" Number="1"/><AudioChannel ID="-9" Number="1"/></Encoder>
      <Encoder><Channel ID="-5" Number="1"/></Encoder>
      </Codec></Device></Devices></Trellan>)");
  EXPECT_EQ(catalogue.FirstVideoStreamOfKey(EventSourceKey(kEncoders, 1, 1, 0)), -5);
  EXPECT_EQ(catalogue.FirstVideoStreamOfKey(EventSourceKey(kEncoders, 1, 2, 0)), std::nullopt);
}

// The builder numbers each stream with the key of its input and context, and
// the catalogue reads every stream back where the builder put it.
TEST(SystemDocumentTest, StreamIdentifiersAreTheirKeys) {
  SystemDescription site;
  CameraDescription lobby{"Lobby", kEncoders, 1, 0, {}};
  lobby.streams = {StreamDescription{0, refhost::kStandardH264, 1920, 1080, std::nullopt},
                   StreamDescription{1, refhost::kStandardJpeg, 640, 480, std::nullopt},
                   StreamDescription{2, refhost::kStandardJpeg, 320, 240, std::nullopt}};
  CameraDescription muxed{"Muxed", kEncoders, 1, 37, {}};
  muxed.streams = {StreamDescription{0, refhost::kStandardJpeg, 704, 576, 3}};
  CameraDescription unnumbered{"Unnumbered", kEncoders, 1, 15, {}};
  unnumbered.streams = {StreamDescription{1, refhost::kStandardJpeg, 352, 288, -1}};
  CameraDescription far{"Far", 0x2A0000, 200, 255, {}};
  far.streams = {StreamDescription{}, StreamDescription{9, refhost::kStandardJpeg, 160, 120, {}}};
  site.cameras = {lobby, muxed, unnumbered, far};

  HostSystemCatalogue catalogue;
  Rebuild(catalogue, refhost::BuildSystemDocument(site));
  size_t streams = 0;
  for (const CameraDescription& camera : site.cameras) {
    const uint32_t cameraKey = EventSourceKey(camera.plugin, camera.device, camera.input, 0);
    EXPECT_EQ(catalogue.FirstVideoStreamOfKey(cameraKey) == static_cast<int32_t>(cameraKey),
              camera.streams[0].context == 0)
        << camera.name;
    for (const StreamDescription& stream : camera.streams) {
      ++streams;
      const uint32_t key =
          EventSourceKey(camera.plugin, camera.device, camera.input, stream.context);
      const uint32_t id =
          refhost::HostStreamId(camera.plugin, camera.device, camera.input, stream.context);
      ASSERT_EQ(id, key) << camera.name;
      const int32_t streamId = static_cast<int32_t>(id);
      EXPECT_EQ(catalogue.StreamSourceKey(streamId), key) << camera.name;
      EXPECT_EQ(catalogue.SourceName(key, 1), camera.name);
      const int32_t number = stream.number.value_or(camera.input % 16);
      EXPECT_EQ(
          catalogue.StreamFormat(streamId),
          (StreamFormatRecord{streamId, number, stream.width, stream.height, stream.standard}))
          << camera.name;
      const std::vector<int32_t> extra =
          catalogue.CameraStreams(CameraKey(camera.plugin, camera.device, camera.input));
      const bool listed = std::find(extra.begin(), extra.end(), streamId) != extra.end();
      EXPECT_EQ(listed, stream.context >= 1) << camera.name << " context " << stream.context;
    }
  }
  EXPECT_EQ(catalogue.Streams().size(), streams);
}

TEST(SystemDocumentTest, WritesEventsAndAlarmsWhereTheModuleReadsThem) {
  SystemDescription site = DescribeSite();
  site.events = {{7, 5, EventSourceRef::Camera(kEncoders, 1, 0, 1), {3, 4}},
                 {8, std::nullopt, EventSourceRef::Group(5), {}}};
  TiXmlDocument document;
  document.Parse(refhost::BuildSystemDocument(site).c_str());
  TiXmlHandle root(document.RootElement());
  TiXmlElement* event = root.FirstChild("Events").FirstChild("Event").ToElement();
  ASSERT_NE(event, nullptr);
  EXPECT_STREQ(event->Attribute("PreAlarm"), "5");
  const TiXmlElement* input = TiXmlHandle(event)
                                  .FirstChild("Devices")
                                  .FirstChild("Device")
                                  .FirstChild("Video")
                                  .FirstChild("Input")
                                  .ToElement();
  ASSERT_NE(input, nullptr);
  EXPECT_STREQ(input->Attribute("Context"), "1");
  const TiXmlElement* notify = event->FirstChildElement("Action")->FirstChildElement("Notify");
  ASSERT_NE(notify, nullptr);
  EXPECT_STREQ(notify->Attribute("ID"), "786432");
  const TiXmlElement* second = event->NextSiblingElement("Event");
  ASSERT_NE(second, nullptr);
  EXPECT_EQ(second->FirstChildElement("Action")->FirstChildElement("Notify"), nullptr);
  EXPECT_STREQ(second->FirstChildElement("SourceGroup")->Attribute("ID"), "5");

  refhost::AlarmDocument alarm;
  alarm.serverSerial = "S-1";
  alarm.requests.resize(1);
  alarm.requests[0].time = 1700000000;
  alarm.requests[0].message = std::string("Testing Profile");
  TiXmlDocument alarmDocument;
  alarmDocument.Parse(refhost::BuildAlarmDocument(alarm).c_str());
  TiXmlHandle alarmRoot(alarmDocument.RootElement());
  EXPECT_STREQ(
      alarmRoot.FirstChild("Servers").FirstChild("Server").ToElement()->Attribute("Serial"), "S-1");
  const TiXmlElement* request =
      alarmRoot.FirstChild("Notify").FirstChild("Profiles").FirstChildElement().ToElement();
  ASSERT_NE(request, nullptr);
  EXPECT_STREQ(request->Attribute("Time"), "1700000000");
  EXPECT_STREQ(request->Attribute("Alarm"), "1");
  EXPECT_STREQ(request->FirstChildElement("EventSource")->Attribute("Type"), "1");
}

}  // namespace
}  // namespace hx
