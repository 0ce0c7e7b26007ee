#include "alertmod/manager/event_source.h"

#include <gtest/gtest.h>
#include <tinyxml.h>

#include <string>

#include "alertmod/manager/catalogue.h"
#include "alertmod/manager/event_source_key.h"
#include "alertmod/manager/source_aliases.h"

namespace hx {
namespace {

TEST(EventSourceTest, KeyAndTypeOfARequest) {
  struct Case {
    const char* name;
    std::string request;
    uint32_t key;
    int32_t type;
  };
  const Case cases[] = {
      {"camera",
       R"(<P><EventSource Plugin="65536" Device="2" Input="3" Context="1" Type="1"/></P>)",
       0x10010203u, 1},
      {"type 18 drops the context",
       R"(<P><EventSource Plugin="65536" Device="2" Input="3" Context="1" Type="18"/></P>)",
       0x00010203u, 18},
      {"plug-in masked",
       R"(<P><EventSource Plugin="74565" Device="0" Input="1" Context="0" Type="3"/></P>)",
       0x00010001u, 3},
      {"a missing number", R"(<P><EventSource Plugin="65536" Device="2" Input="3" Type="1"/></P>)",
       0, 0},
      {"not a number",
       R"(<P><EventSource Plugin="65536" Device="2" Input="3x" Context="0" Type="1"/></P>)", 0, 0},
      {"analytics alias",
       R"(<P><EventSource Plugin="458752" Device="1" Input="4" Context="0" Type="9"/></P>)",
       EventSourceKey(0x10000, 8, 2, 0), 9},
      {"source group", R"(<P><SourceGroup ID="261"/></P>)", 0xA0005u, 12},
      {"source group without id", R"(<P><SourceGroup/></P>)", 0xA0000u, 12},
      {"event source first",
       R"(<P><SourceGroup ID="3"/><EventSource Plugin="0" Device="0" Input="5" Context="0" Type="16"/></P>)",
       5u, 16},
      {"no source", "<P/>", 0, 0},
  };
  SourceAliases aliases;
  aliases.Add(0x70104u, SourceAlias{0x10000, 8, 2, 0});
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    TiXmlDocument document;
    document.Parse(c.request.c_str());
    ASSERT_FALSE(document.Error());
    const EventSource source = RequestEventSource(*document.RootElement(), aliases);
    EXPECT_EQ(source.key, c.key);
    EXPECT_EQ(source.type, c.type);
  }
}

TEST(EventSourceTest, SourceGroupMembersWithVideoAreListed) {
  TiXmlDocument system;
  system.Parse(R"(<Trellan Delta="0"><Devices ID="65536"><Device Number="1"><Video>
      <Input Number="0" Name="Gate"/><Input Number="1" Name="Yard"/></Video></Device></Devices></Trellan>)");
  HostSystemCatalogue catalogue;
  catalogue.RebuildCatalogue(*system.RootElement());
  TiXmlDocument group;
  group.Parse(R"(<SourceGroup ID="1">
      <EventSource Plugin="65536" Device="1" Input="0" Context="0" Type="1"/>
      <Other Plugin="65536" Device="1" Input="1" Context="0" Type="1"/>
      <EventSource Plugin="65536" Device="1" Input="1" Context="0" Type="3"/>
      <EventSource Plugin="65536" Device="1" Input="1" Context="0"/>
      <EventSource Plugin="65536" Device="1" Input="1" Context="2" Type="18"/>
    </SourceGroup>)");
  NotifyWorkItem item(kWorkItemNotification);
  AppendSourceGroupMembers(*group.RootElement(), SourceAliases(), catalogue, item);
  ASSERT_EQ(item.videoSources.size(), 2u);
  EXPECT_EQ(item.videoSources[0].sourceKey, 0x10100u);
  EXPECT_EQ(item.videoSources[0].name, "Gate");
  EXPECT_EQ(item.videoSources[1].sourceKey, 0x10101u);
  EXPECT_EQ(item.videoSources[1].name, "Yard");
  EXPECT_EQ(item.videoSources[1].stream, nullptr);
}

}  // namespace
}  // namespace hx
