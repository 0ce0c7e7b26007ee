#include "alertmod/manager/host_documents.h"

#include <gtest/gtest.h>
#include <tinyxml.h>

#include <set>
#include <string>

#include "alertmod/manager/event_source_key.h"
#include "alertmod/manager/source_aliases.h"

namespace hx {
namespace {

// Parses `text`; the test fails when it is not XML.
const TiXmlElement& Parse(TiXmlDocument& document, const std::string& text) {
  document.Parse(text.c_str());
  EXPECT_FALSE(document.Error()) << text;
  static const TiXmlElement empty("Empty");
  return document.RootElement() != nullptr ? *document.RootElement() : empty;
}

TEST(HostDocumentsTest, VideoSourceKeyOfEachSourceShape) {
  struct Case {
    const char* name;
    std::string event;
    uint32_t key;
  };
  const Case cases[] = {
      {"camera input",
       R"(<Event><Devices ID="65536"><Device Number="2"><Video><Input Number="3"/></Video></Device></Devices></Event>)",
       EventSourceKey(0x10000, 2, 3, 0)},
      {"camera input in a context",
       R"(<Event><Devices ID="65536"><Device Number="2"><Video><Input Number="3" Context="1"/></Video></Device></Devices></Event>)",
       EventSourceKey(0x10000, 2, 3, 1)},
      {"input cut to eight bits",
       R"(<Event><Devices ID="65536"><Device Number="2"><Video><Input Number="259"/></Video></Device></Devices></Event>)",
       EventSourceKey(0x10000, 2, 3, 0)},
      {"input without number",
       R"(<Event><Devices ID="65536"><Device Number="2"><Video><Input/></Video></Device></Devices></Event>)",
       0},
      {"encoder channel",
       R"(<Event><Devices ID="65536"><Device Number="2"><Codec><Encoder><Channel Number="5"/></Encoder></Codec></Device></Devices></Event>)",
       EventSourceKey(0x10000, 2, 5, 0)},
      {"encoder channel in a context",
       R"(<Event><Devices ID="65536"><Device Number="2"><Context Number="2"><Codec><Encoder><Channel Number="5"/></Encoder></Codec></Context></Device></Devices></Event>)",
       EventSourceKey(0x10000, 2, 5, 2)},
      {"context without number",
       R"(<Event><Devices ID="65536"><Device Number="2"><Context><Codec><Encoder><Channel Number="5"/></Encoder></Codec></Context></Device></Devices></Event>)",
       0},
      {"trigger input",
       R"(<Event><Devices ID="65536"><Device Number="2"><Trigger><Input Number="1"/></Trigger></Device></Devices></Event>)",
       0},
      {"devices without id",
       R"(<Event><Devices><Device Number="2"><Video><Input Number="3"/></Video></Device></Devices></Event>)",
       0},
      {"devices win over analytics",
       R"(<Event><Devices ID="65536"/><Analytics ID="458752"><Device Number="1"><Input Number="4"/></Device></Analytics></Event>)",
       0},
      {"source group", R"(<Event><SourceGroup ID="3"/></Event>)", 0},
      {"nothing", "<Event/>", 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    SourceAliases aliases;
    TiXmlDocument document;
    EXPECT_EQ(VideoSourceKey(Parse(document, c.event), aliases), c.key);
    EXPECT_TRUE(aliases.Unresolved().empty());
  }
}

TEST(HostDocumentsTest, EventsWithANotificationActionNameTheirCamerasAndGroups) {
  TiXmlDocument document;
  const TiXmlElement& events = Parse(document, R"(<Events ID="655360">
    <SourceGroup ID="1"><Entry><Devices ID="65536"><Device Number="5"><Video><Input Number="0"/></Video></Device></Devices></Entry>
      <Entry><Devices ID="65536"><Device Number="6"><Video><Input Number="1"/></Video></Device></Devices></Entry></SourceGroup>
    <SourceGroup ID="2"><Entry><Devices ID="65536"><Device Number="7"><Video><Input Number="0"/></Video></Device></Devices></Entry></SourceGroup>
    <Event ID="1"><Devices ID="65536"><Device Number="1"><Video><Input Number="0"/></Video></Device></Devices><Action><Notify ID="786432"/></Action></Event>
    <Event ID="2"><Devices ID="65536"><Device Number="2"><Video><Input Number="0"/></Video></Device></Devices><Action><Record/></Action></Event>
    <Event ID="3"><SourceGroup ID="1"/><Action><Notify ID="786432"/></Action></Event>
    <Other ID="4"><Devices ID="65536"><Device Number="3"><Video><Input Number="0"/></Video></Device></Devices><Action><Notify/></Action></Other>
    <Event ID="5"><Analytics ID="458752"><Device Number="1"><Input Number="4"/></Device></Analytics><Action><Notify/></Action></Event>
  </Events>)");
  SourceAliases aliases;
  std::set<uint32_t> sources = {EventSourceKey(0x10000, 9, 9, 0)};
  RebuildVideoSources(events, aliases, sources);
  EXPECT_EQ(sources, (std::set<uint32_t>{
                         EventSourceKey(0x10000, 1, 0, 0), EventSourceKey(0x10000, 3, 0, 0),
                         EventSourceKey(0x10000, 5, 0, 0), EventSourceKey(0x10000, 6, 1, 0)}));
  EXPECT_EQ(aliases.Unresolved(), (std::set<uint32_t>{0x70104u}));

  // Once the alias is known, the next full document finds the camera.
  aliases.Add(0x70104u, SourceAlias{0x10000, 8, 2, 0});
  RebuildVideoSources(events, aliases, sources);
  EXPECT_EQ(sources.count(EventSourceKey(0x10000, 8, 2, 0)), 1u);
}

TEST(HostDocumentsTest, AnalyticsAliasesResolveWaitingSourcesAndStopAtAMissingNumber) {
  SourceAliases aliases;
  aliases.MarkUnresolved(0x70104u);
  std::set<uint32_t> sources;
  TiXmlDocument first;
  EXPECT_TRUE(ApplyAnalyticsAliases(Parse(first, R"(<Trellan>
    <Analytics ID="458752"><Device Number="1">
      <Input Number="4" DevicesID="65536" DeviceNumber="8" InputNumber="2"><Rule ID="1"/></Input>
      <Input Number="5" DevicesID="65536" DeviceNumber="9" InputNumber="0"/>
    </Device></Analytics></Trellan>)"),
                                    aliases, sources));
  EXPECT_EQ(sources, std::set<uint32_t>{EventSourceKey(0x10000, 8, 2, 0)});
  EXPECT_TRUE(aliases.Unresolved().empty());
  EXPECT_EQ(aliases.Aliases().size(), 1u);  // the input without a rule is passed over

  // An alias, once known, stays; a missing number ends the reading there.
  TiXmlDocument second;
  EXPECT_FALSE(ApplyAnalyticsAliases(Parse(second, R"(<Trellan>
    <Analytics ID="458752"><Device Number="1">
      <Input Number="4" DevicesID="65536" DeviceNumber="1" InputNumber="1"><Rule ID="1"/></Input>
      <Input Number="6" DevicesID="65536" DeviceNumber="3" InputNumber="3"><Rule ID="1"/></Input>
      <Input Number="7" DevicesID="65536" InputNumber="3"><Rule ID="1"/></Input>
      <Input Number="8" DevicesID="65536" DeviceNumber="4" InputNumber="4"><Rule ID="1"/></Input>
    </Device></Analytics></Trellan>)"),
                                     aliases, sources));
  EXPECT_EQ(aliases.Find(0x70104u)->device, 8);
  EXPECT_TRUE(aliases.Find(0x70106u).has_value());
  EXPECT_FALSE(aliases.Find(0x70108u).has_value());

  const char* malformed[] = {
      R"(<Trellan><Analytics><Device Number="1"/></Analytics></Trellan>)",
      R"(<Trellan><Analytics ID="458752"><Device/></Analytics></Trellan>)",
      R"(<Trellan><Analytics ID="458752"><Device Number="1"><Input Number="9" DevicesID="1" DeviceNumber="1" InputNumber="1"><Rule/></Input></Device></Analytics></Trellan>)",
      R"(<Trellan><Analytics ID="458752"/><Users/></Trellan>)",
  };
  for (const char* text : malformed) {
    TiXmlDocument document;
    EXPECT_FALSE(ApplyAnalyticsAliases(Parse(document, text), aliases, sources)) << text;
  }
  TiXmlDocument none;
  EXPECT_TRUE(ApplyAnalyticsAliases(Parse(none, "<Trellan><Users/></Trellan>"), aliases, sources));
}

}  // namespace
}  // namespace hx
