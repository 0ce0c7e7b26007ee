#include "alertmod/mail/templates.h"

#include <gtest/gtest.h>

#include <clocale>
#include <cstdlib>
#include <ctime>

#include "alertmod/mail/event_types.h"
#include "tests/support/fake_host.h"
#include "tests/support/web_server.h"

namespace hx {
namespace {

// 2023-11-14 22:13:20 UTC, 23:13:20 in the zone below.
constexpr int64_t kEventTime = 1700000000;
// The zone of the expected texts, set with putenv: the Windows C runtime
// has no setenv.
constexpr char kTimeZone[] = "TZ=CET-1CEST,M3.5.0,M10.5.0/3";
constexpr char kDate[] = "11/14/23";
constexpr char kTime[] = "23:13:20";

class TemplatesTest : public ::testing::Test {
 protected:
  void SetUp() override {
    putenv(const_cast<char*>(kTimeZone));
    tzset();
    setlocale(LC_ALL, "C");
  }

  NotifyWorkItem Item(int32_t eventType, const std::string& subject, const std::string& body) {
    NotifyWorkItem item(kWorkItemNotification);
    item.eventType = eventType;
    item.eventTime = kEventTime;
    item.sourceName = "Lobby";
    item.sourceKey = 0x10002;
    item.systemName = "Main Server";
    item.serial = "SN-42";
    item.licensedMac = "00:11:22:33:44:55";
    item.eventState = "Start";
    item.profile.subject = subject;
    item.profile.body = body;
    item.profile.hasPlaceholders = true;
    return item;
  }

  testsupport::FakeHost m_host;
};

TEST_F(TemplatesTest, EventTypeVocabulary) {
  EXPECT_EQ(EventTypeName(0), "Invalid");
  EXPECT_EQ(EventTypeName(2), "Video Motion");
  EXPECT_EQ(EventTypeName(15), "Security Integrations Health");
  EXPECT_EQ(EventTypeName(23), "Fan");
  EXPECT_EQ(EventTypeName(26), "Hardware Fan");
  EXPECT_EQ(EventTypeName(35), "Thinning");
  EXPECT_EQ(EventTypeName(36), "Unknown");
  EXPECT_EQ(EventTypeName(-1), "Unknown");
  int known = 0;
  for (int32_t code = -10; code < 100; ++code) known += EventTypeName(code) != "Unknown";
  EXPECT_EQ(known, 36);
  EXPECT_EQ(SystemHealthEventTypes(),
            (std::set<int32_t>{8, 10, 11, 17, 22, 25, 26, 27, 28, 29, 35}));
  EXPECT_EQ(DeviceHealthEventTypes(), (std::set<int32_t>{7, 13, 19, 23}));
}

TEST_F(TemplatesTest, HasPlaceholdersKnowsExactlyTheTenTexts) {
  const std::pair<const char*, bool> cases[] = {
      {"{weblink}", true},
      {"a {source} b", true},
      {"{event type}", true},
      {"{date}", true},
      {"{time}", true},
      {"{date format='%Y'}", true},
      {"{system name}", true},
      {"{serial}", true},
      {"{licensed mac}", true},
      {"{event state}", true},
      {"{time format='%H'}", false},
      {"{Source}", false},
      {"{ date}", false},
      {"{x}", false},
      {"", false},
  };
  for (const auto& c : cases) EXPECT_EQ(HasPlaceholders(c.first), c.second) << c.first;
}

TEST_F(TemplatesTest, DateTimePass) {
  struct Case {
    std::string text;
    std::string expected;
  };
  const Case cases[] = {
      {"{date}", kDate},
      {"{time}", kTime},
      {"at {date} {time}", std::string("at ") + kDate + " " + kTime},
      // The pass drops every other brace group, whatever it is.
      {"Price {x} at {date}", std::string("Price  at ") + kDate},
      {"{Date} {date}", std::string(" ") + kDate},
      {"{source} {date}", std::string(" ") + kDate},
      {"{ date} {time}", std::string(kDate) + " " + kTime},
      {"{date <b} {date}", std::string(" ") + kDate},
      // A time group with a format is understood once the pass runs ...
      {"{time format='%H'} {date}", std::string("23 ") + kDate},
      // ... but does not start it.
      {"{time format='%H'}", "{time format='%H'}"},
      {"{Date} only", "{Date} only"},
      {"{date format='%d.%m.%Y'}", "14.11.2023"},
      {"{date format=\"%A %B %j\"}", "Tuesday November 318"},
      {"{date format='%Y%%'}", "2023%"},
      {"{date format='%%Q'}", "%Q"},
      {"{date format='%Q'}", "[invalid format specified]"},
      {"{date format='abc%'}", "[invalid format specified]"},
      {"{date format='%e'}", "[invalid format specified]"},
      {"{date format='%#d'}", "[invalid format specified]"},
      {"{date format='%F'}", "[invalid format specified]"},
      {"{time format='%z'} {date}", std::string("[invalid format specified] ") + kDate},
      // An empty format formats to nothing; so does one longer than 79.
      {"{date format=''}x", "x"},
      {std::string("{date format='") + std::string(80, 'y') + "'}x", "x"},
      {std::string("{date format='") + std::string(79, 'y') + "'}", std::string(79, 'y')},
      // Unclosed groups stay as written.
      {"a {date} b {c", std::string("a ") + kDate + " b {c"},
      {"{date} }{", std::string(kDate) + " }{"},
      {"{date}{}", kDate},
  };
  for (const Case& c : cases) {
    std::string text = c.text;
    ExpandDateTime(kEventTime, text);
    EXPECT_EQ(text, c.expected) << c.text;
  }
}

TEST_F(TemplatesTest, DateTimeOfAnUnrepresentableTimeIsEmpty) {
  std::string text = "[{date}]";
  ExpandDateTime(INT64_MAX, text);
  EXPECT_EQ(text, "[]");
}

TEST_F(TemplatesTest, ReplacesFirstOccurrenceOnly) {
  struct Case {
    std::string body;
    std::string expected;
  };
  const Case cases[] = {
      {"{source} and {source}", "Lobby and {source}"},
      // With a date the pass removes the leftover.
      {"{source} and {source} {date}", std::string("Lobby and  ") + kDate},
      {"{system name}/{serial}/{licensed mac}/{event state}",
       "Main Server/SN-42/00:11:22:33:44:55/Start"},
      {"{serial}{serial}", "SN-42{serial}"},
  };
  for (const Case& c : cases) {
    NotifyWorkItem item = Item(2, "", c.body);
    ExpandTemplates(item, m_host.callback(), std::chrono::seconds(10));
    EXPECT_EQ(item.profile.body, c.expected) << c.body;
  }
  // An inserted value is plain text for the later steps.
  NotifyWorkItem item = Item(2, "{serial}", "x");
  item.sourceName = "{serial}";
  item.profile.body = "{source}";
  ExpandTemplates(item, m_host.callback(), std::chrono::seconds(10));
  EXPECT_EQ(item.profile.body, "SN-42");
  EXPECT_EQ(item.profile.subject, "SN-42");
}

TEST_F(TemplatesTest, SubjectWithSourceAndTime) {
  NotifyWorkItem item = Item(2, "Motion on {source} at {time}", "");
  ExpandTemplates(item, m_host.callback(), std::chrono::seconds(10));
  EXPECT_EQ(item.profile.subject, std::string("Motion on Lobby at ") + kTime);
}

TEST_F(TemplatesTest, EventTypeAndSourceByCode) {
  struct Case {
    int32_t eventType;
    std::string eventTypeText;
    std::string sourceText;
  };
  const Case cases[] = {
      {2, "Video Motion", "Lobby"}, {-1, "[Test Event Type]", "Lobby"},
      {0, "{event type}", "Lobby"}, {-5, "{event type}", "Lobby"},
      {8, "Health", "Storage"},  // system health: the source is the event type
      {35, "Health", "Thinning"},   {7, "Health", "Lobby"},  // device health keeps its source
      {23, "Health", "Lobby"},      {26, "Health", "Hardware Fan"},
      {99, "Unknown", "Lobby"},
  };
  for (const Case& c : cases) {
    NotifyWorkItem item = Item(c.eventType, "{event type}|{source}", "{source}|{event type}");
    ExpandTemplates(item, m_host.callback(), std::chrono::seconds(10));
    EXPECT_EQ(item.profile.subject, c.eventTypeText + "|" + c.sourceText) << c.eventType;
    EXPECT_EQ(item.profile.body, c.sourceText + "|" + c.eventTypeText) << c.eventType;
  }
}

TEST_F(TemplatesTest, TestNotification) {
  NotifyWorkItem item = Item(kTestEventType, "{event type} from {source}", "");
  item.sourceName = "[Test Event Source]";
  item.sourceKey = kTestSourceKey;
  ExpandTemplates(item, m_host.callback(), std::chrono::seconds(10));
  EXPECT_EQ(item.profile.subject, "[Test Event Type] from [Test Event Source]");
}

// A port on 127.0.0.1 on which nothing listens any more.
std::string ClosedPort() {
  testsupport::WebServer gone;
  return std::to_string(gone.port());
}

TEST_F(TemplatesTest, WebLinkChoices) {
  const std::string port = ClosedPort();
  struct Case {
    const char* name;
    std::string host;
    int32_t eventType;
    uint32_t sourceKey;
    bool withVideo;
    std::string expected;  // empty: the web link was asked for
  };
  const Case cases[] = {
      {"no server", "", 2, 5, false, "[No Valid Web Server Address]"},
      {"input trigger", "127.0.0.1", 3, 5, false, "[Not a Video Source Event]"},
      {"motion", "127.0.0.1", 2, 5, false, ""},
      {"video loss", "127.0.0.1", 1, 5, false, ""},
      {"ip connection", "127.0.0.1", 9, 5, false, ""},
      {"analytic", "127.0.0.1", 18, 5, false, ""},
      {"test", "127.0.0.1", -1, kTestSourceKey, false, ""},
      {"input with video", "127.0.0.1", 3, 5, true, ""},
  };
  for (const Case& c : cases) {
    NotifyWorkItem item = Item(c.eventType, "{weblink}", "see {weblink} and {weblink}");
    item.sourceKey = c.sourceKey;
    item.web.host = c.host;
    item.web.port = port;
    item.web.address = "127.0.0.1:" + port;
    if (c.withVideo) item.videoSources.push_back(VideoSource{7, "Cam", nullptr});
    ExpandTemplates(item, m_host.callback(), std::chrono::seconds(10));
    std::string expected = c.expected.empty() ? "[Web Server Unreachable]" : c.expected;
    EXPECT_EQ(item.profile.body, "see " + expected + " and {weblink}") << c.name;
    EXPECT_EQ(item.profile.subject, "{weblink}") << c.name;
  }
  std::vector<std::string> warnings = m_host.LogTexts(50);
  ASSERT_EQ(warnings.size(), 1u);
  EXPECT_EQ(warnings[0], "Web Server not configured. No link will be generated");
}

TEST_F(TemplatesTest, WebLinkInSubjectIsRemovedByDatePass) {
  NotifyWorkItem item = Item(2, "{weblink} {date}", "");
  ExpandTemplates(item, m_host.callback(), std::chrono::seconds(10));
  EXPECT_EQ(item.profile.subject, std::string(" ") + kDate);
  EXPECT_TRUE(m_host.LogTexts().empty());
}

TEST_F(TemplatesTest, TextWithoutPlaceholdersIsUntouched) {
  NotifyWorkItem item = Item(2, "Plain {x} subject", "Body {y} {Date}");
  ExpandTemplates(item, m_host.callback(), std::chrono::seconds(10));
  EXPECT_EQ(item.profile.subject, "Plain {x} subject");
  EXPECT_EQ(item.profile.body, "Body {y} {Date}");
}

}  // namespace
}  // namespace hx
