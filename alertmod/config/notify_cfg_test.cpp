#include "alertmod/config/notify_cfg.h"

#include <gtest/gtest.h>
#include <tinyxml.h>

#include <climits>
#include <limits>
#include <string>
#include <vector>

#include "alertmod/config/module_replies.h"
#include "tests/support/fake_host.h"

namespace hx {
namespace {

// A host password service that "encrypts" by XOR with a key byte behind a
// key tag, so that a password protected under one key fails under another.
class FakeVault {
 public:
  explicit FakeVault(testsupport::FakeHost& host) {
    host.SetHandler(core::kClassCrypto, [this](core::HostRequest& r) { return Answer(r); });
  }
  void SetKey(char key) { m_key = key; }
  void FailProtection() { m_failProtect = true; }

 private:
  int32_t Answer(core::HostRequest& request) {
    auto* buffer = static_cast<char*>(request.data);
    std::string input(buffer, static_cast<size_t>(request.extValue));
    std::string output;
    if (request.code == core::kCodeEncrypt) {
      if (m_failProtect) return -7;
      output = std::string(1, m_key) + Xor(input);
    } else {
      if (input.empty()) return -3;
      // Under another key the bytes decrypt to garbage without the marker.
      output = Xor(input.substr(1));
      if (input[0] != m_key) output = "garbage" + output;
    }
    if (output.size() > request.length) return static_cast<int32_t>(output.size());
    output.copy(buffer, output.size());
    request.extValue = static_cast<int32_t>(output.size());
    return 0;
  }
  std::string Xor(std::string text) const {
    for (char& c : text) c = static_cast<char>(c ^ 0x5A);
    return text;
  }

  char m_key = 'A';
  bool m_failProtect = false;
};

// Stands in for the template vocabulary: any brace marks a placeholder.
bool TestPlaceholders(const std::string& text) {
  return text.find('{') != std::string::npos;
}

class NotifyCfgTest : public ::testing::Test {
 protected:
  NotifyCfgTest() : m_vault(m_host) {
    m_services.callback = m_host.callback();
    m_services.errorSink = [this](const std::string& text) { m_errors.push_back(text); };
    m_services.hasPlaceholders = &TestPlaceholders;
  }

  // Parses `notifyBody` as the content of a Notify element with the module's ID.
  bool ParseNotify(NotifyCfg& config, const std::string& notifyAttributes,
                   const std::string& notifyBody) {
    return ParseText(config, "<Trellan Delta=\"1\"><Notify ID=\"786432\" " + notifyAttributes +
                                 ">" + notifyBody + "</Notify></Trellan>");
  }
  bool ParseText(NotifyCfg& config, const std::string& text) {
    TiXmlDocument document;
    document.Parse(text.c_str());
    EXPECT_FALSE(document.Error()) << text;
    return config.Parse(document, m_services);
  }
  std::string Compact(const NotifyCfg& config) {
    TiXmlDocument document;
    BuildConfigDocument(document, config, m_services);
    return PrintCompact(document);
  }
  // The configuration written and read back into a fresh one.
  NotifyCfg RoundTrip(const NotifyCfg& config) {
    NotifyCfg copy;
    EXPECT_TRUE(ParseText(copy, Compact(config)));
    return copy;
  }

  testsupport::FakeHost m_host;
  FakeVault m_vault;
  ConfigServices m_services;
  std::vector<std::string> m_errors;
};

const char kRichConfig[] =
    "<Web address='http://cam.example:8080' />"
    "<Servers>"
    "<smtp description='main' address='mail.example' port='587' UseSSL='2'>"
    "<Authentication username='alice' password='s3cr&quot;t &amp; more' /></smtp>"
    "<smtp description='backup' address='10.0.0.2' port='465' />"
    "</Servers>"
    "<Profiles autoincrement='5'>"
    "<smtp ID='3' attach='1' description='Door' ThrottleSeconds='30' from='cam@example' "
    "subject='{event type} at {source}' MaxVideoSeconds='12' EventEdge='2'>"
    "<to>a@example</to><to>b@example</to><cc>c@example</cc><bcc>d@example</bcc>"
    "<body>Line 1&#x0D;&#x0A;Line 2&#x09;tab &lt;x&gt;</body></smtp>"
    "<smtp ID='4' description='' from='' subject=''><to>e@example</to></smtp>"
    "</Profiles>";

TEST_F(NotifyCfgTest, DefaultsWriteTheDocumentOfAnEmptyConfiguration) {
  NotifyCfg config;
  EXPECT_EQ(Compact(config),
            "<?xml ?><Trellan Delta=\"0\"><Notify ID=\"786432\" SupportsThrottleSeconds=\"1\" "
            "SupportsAttach=\"1\" SupportsVideoAttach=\"1\" SupportsStatus=\"1\" "
            "SupportsEventEdge=\"1\" TemplateSupportLevel=\"3\" IsSupported=\"1\" "
            "MaxRetrySeconds=\"172800\" MaxRetryQueue=\"100\" EmailSizeLimitMB=\"10\">"
            "<Web address=\"\" /><Servers /><Profiles autoincrement=\"1\" /></Notify></Trellan>");
}

TEST_F(NotifyCfgTest, WritesElementsAndAttributesInTheirOrder) {
  NotifyCfg config;
  ASSERT_TRUE(ParseNotify(config, "", kRichConfig));
  config.SetSmtpsAvailable(true);
  TiXmlDocument document;
  BuildConfigDocument(document, config, m_services);
  ASSERT_TRUE(RevealPasswords(document, m_services));
  EXPECT_EQ(PrintCompact(document),
            "<?xml ?><Trellan Delta=\"0\"><Notify ID=\"786432\" SupportsThrottleSeconds=\"1\" "
            "SupportsAttach=\"1\" SupportsVideoAttach=\"1\" SupportsStatus=\"1\" "
            "SupportsEventEdge=\"1\" TemplateSupportLevel=\"3\" IsSupported=\"1\" SSL=\"2\" "
            "MaxRetrySeconds=\"172800\" MaxRetryQueue=\"100\" EmailSizeLimitMB=\"10\">"
            "<Web address=\"cam.example:8080\" /><Servers>"
            "<smtp description=\"main\" address=\"mail.example\" port=\"587\" UseSSL=\"2\">"
            "<Authentication username=\"alice\" password='s3cr&quot;t &amp; more' /></smtp>"
            "<smtp description=\"backup\" address=\"10.0.0.2\" port=\"465\" UseSSL=\"1\" />"
            "</Servers><Profiles autoincrement=\"5\">"
            "<smtp ID=\"3\" attach=\"1\" description=\"Door\" ThrottleSeconds=\"30\" "
            "from=\"cam@example\" subject=\"{event type} at {source}\" MaxVideoSeconds=\"12\" "
            "EventEdge=\"2\"><to>a@example</to><to>b@example</to><cc>c@example</cc>"
            "<bcc>d@example</bcc><body>Line 1&#x0D;&#x0A;Line 2&#x09;tab &lt;x&gt;</body></smtp>"
            "<smtp ID=\"4\" attach=\"0\" description=\"\" ThrottleSeconds=\"0\" from=\"\" "
            "subject=\"\" MaxVideoSeconds=\"0\" EventEdge=\"0\"><to>e@example</to>"
            "<body></body></smtp></Profiles></Notify></Trellan>");
}

void ExpectSameProfiles(const NotifyCfg& a, const NotifyCfg& b) {
  ASSERT_EQ(a.Profiles().size(), b.Profiles().size());
  for (const auto& [id, p] : a.Profiles()) {
    const NotifyProfile* q = b.FindProfile(id);
    ASSERT_NE(q, nullptr) << id;
    EXPECT_EQ(p.id, q->id);
    EXPECT_EQ(p.attach, q->attach);
    EXPECT_EQ(p.description, q->description);
    EXPECT_EQ(p.throttleSeconds, q->throttleSeconds);
    EXPECT_EQ(p.maxVideoSeconds, q->maxVideoSeconds);
    EXPECT_EQ(p.from, q->from);
    EXPECT_EQ(p.subject, q->subject);
    EXPECT_EQ(p.to, q->to);
    EXPECT_EQ(p.cc, q->cc);
    EXPECT_EQ(p.bcc, q->bcc);
    EXPECT_EQ(p.body, q->body);
    EXPECT_EQ(p.eventEdge, q->eventEdge);
    EXPECT_EQ(p.hasPlaceholders, q->hasPlaceholders);
  }
}

TEST_F(NotifyCfgTest, RoundTripKeepsEveryField) {
  NotifyCfg config;
  ASSERT_TRUE(ParseNotify(config, "MaxRetrySeconds='600' MaxRetryQueue='7' EmailSizeLimitMB='3'",
                          kRichConfig));
  NotifyCfg copy = RoundTrip(config);
  EXPECT_EQ(copy.MaxRetrySeconds(), 600);
  EXPECT_EQ(copy.MaxRetryQueue(), 7);
  EXPECT_EQ(copy.EmailSizeLimitMB(), 3);
  EXPECT_EQ(copy.NextProfileId(), 5);
  EXPECT_EQ(copy.Web().address, "cam.example:8080");
  EXPECT_EQ(copy.Web().host, "cam.example");
  EXPECT_EQ(copy.Web().port, "8080");
  ASSERT_EQ(copy.Servers().size(), 2u);
  const SmtpServer& main = copy.Servers()[0];
  EXPECT_EQ(main.description, "main");
  EXPECT_EQ(main.address, "mail.example");
  EXPECT_EQ(main.port, 587);
  EXPECT_EQ(main.useSsl, 2);
  EXPECT_EQ(main.username, "alice");
  EXPECT_EQ(main.password, "s3cr\"t & more");
  EXPECT_EQ(copy.Servers()[1].useSsl, 1);
  ExpectSameProfiles(config, copy);
  const NotifyProfile* door = copy.FindProfile(3);
  ASSERT_NE(door, nullptr);
  EXPECT_EQ(door->body, "Line 1\r\nLine 2\ttab <x>");
  EXPECT_TRUE(door->hasPlaceholders);
  EXPECT_EQ(door->to, (std::vector<std::string>{"a@example", "b@example"}));
  EXPECT_EQ(door->sizeLimit, kDefaultSizeLimitBytes);
  EXPECT_EQ(door->preAlarmSeconds, 0);
  EXPECT_TRUE(m_errors.empty());
}

TEST_F(NotifyCfgTest, HandEditedBodyWhiteSpaceCondenses) {
  NotifyCfg config;
  ASSERT_TRUE(ParseNotify(config, "",
                          "<Servers/><Profiles><smtp ID='1' description='d' from='f' subject='s'>"
                          "<to>  a@example \n</to><body>\n    First line\n\t  second   "
                          "line  \n  </body></smtp></Profiles>"));
  const NotifyProfile* profile = config.FindProfile(1);
  ASSERT_NE(profile, nullptr);
  EXPECT_EQ(profile->body, "First line second line");
  EXPECT_EQ(profile->to, std::vector<std::string>{"a@example"});
}

TEST_F(NotifyCfgTest, RejectsOtherModulesAndIncompleteElements) {
  struct Case {
    const char* text;
  };
  const Case cases[] = {
      {"<Trellan/>"},
      {"<Trellan><Notify><Servers/><Profiles/></Notify></Trellan>"},
      {"<Trellan><Notify ID='786433'><Servers/><Profiles/></Notify></Trellan>"},
      {"<Trellan><Notify ID='0xC0000'><Servers/><Profiles/></Notify></Trellan>"},
      {"<Trellan><Notify ID='786432x'><Servers/><Profiles/></Notify></Trellan>"},
      {"<Trellan><Other><Notify ID='786432'><Servers/><Profiles/></Notify></Other></Trellan>"},
  };
  for (const Case& c : cases) {
    NotifyCfg config;
    ASSERT_TRUE(ParseNotify(config, "", kRichConfig));
    std::string before = Compact(config);
    EXPECT_FALSE(ParseText(config, c.text)) << c.text;
    EXPECT_EQ(Compact(config), before) << c.text;
  }
}

TEST_F(NotifyCfgTest, MissingProfilesKeepsTheLimitsButNothingElse) {
  NotifyCfg config;
  ASSERT_TRUE(ParseNotify(config, "", kRichConfig));
  EXPECT_FALSE(ParseNotify(config, "MaxRetryQueue='5'", "<Servers/><Web address='x'/>"));
  EXPECT_EQ(config.MaxRetryQueue(), 5);
  EXPECT_EQ(config.Servers().size(), 2u);
  EXPECT_EQ(config.Profiles().size(), 2u);
  EXPECT_EQ(config.Web().address, "cam.example:8080");
  // Unreadable limits leave the current values.
  EXPECT_TRUE(
      ParseNotify(config, "MaxRetryQueue='many' EmailSizeLimitMB=''", "<Servers/><Profiles/>"));
  EXPECT_EQ(config.MaxRetryQueue(), 5);
  EXPECT_EQ(config.EmailSizeLimitMB(), 10);
}

TEST_F(NotifyCfgTest, AutomaticIdentifiersFollowTheLargerCounter) {
  const char kProfiles[] =
      "<Servers/><Profiles autoincrement='7'>"
      "<smtp ID='0' description='a' from='' subject=''><to>x</to></smtp>"
      "<smtp ID='0' description='b' from='' subject=''><to>x</to></smtp>"
      "<smtp ID='3' description='c' from='' subject=''><to>x</to></smtp>"
      "</Profiles>";
  struct Case {
    int32_t counterBefore;
    std::vector<int32_t> ids;
    int32_t counterAfter;
  };
  // The counter stops at the largest identifier: the second automatic
  // profile then replaces the first, and nothing overflows.
  constexpr int32_t kLargest = std::numeric_limits<int32_t>::max();
  const Case cases[] = {
      {1, {3, 7, 8}, 9}, {10, {3, 10, 11}, 12}, {kLargest, {3, kLargest}, kLargest}};
  for (const Case& c : cases) {
    NotifyCfg config;
    ASSERT_TRUE(ParseNotify(
        config, "",
        "<Servers/><Profiles autoincrement='" + std::to_string(c.counterBefore) + "'/>"));
    ASSERT_TRUE(ParseNotify(config, "", kProfiles));
    std::vector<int32_t> ids;
    for (const auto& entry : config.Profiles()) ids.push_back(entry.first);
    EXPECT_EQ(ids, c.ids) << c.counterBefore;
    EXPECT_EQ(config.NextProfileId(), c.counterAfter);
    EXPECT_NE(Compact(config).find("autoincrement=\"" + std::to_string(c.counterAfter) + "\""),
              std::string::npos);
  }
}

TEST_F(NotifyCfgTest, SkipsProfilesThatFailAChecks) {
  struct Case {
    const char* profile;
    bool kept;
  };
  const Case cases[] = {
      {"<smtp ID='2' description='' from='' subject=''><to>x</to></smtp>", true},
      {"<smtp description='' from='' subject=''><to>x</to></smtp>", false},
      {"<smtp ID='two' description='' from='' subject=''><to>x</to></smtp>", false},
      {"<smtp ID='2' from='' subject=''><to>x</to></smtp>", false},
      {"<smtp ID='2' description='' subject=''><to>x</to></smtp>", false},
      {"<smtp ID='2' description='' from=''><to>x</to></smtp>", false},
      {"<smtp ID='2' description='' from='' subject=''><cc>x</cc></smtp>", false},
      {"<smtp ID='2' description='' from='' subject=''><to/><to>x</to></smtp>", false},
      {"<smtp ID='2' description='' from='' subject=''><to>  </to></smtp>", false},
      {"<smtp ID='2' description='' from='' subject=''><to>x</to><body>a</body><cc>c</cc>"
       "<body>b</body></smtp>",
       false},
      {"<smtp ID='2' description='' from='' subject=''><to>x</to><body/></smtp>", true},
  };
  for (const Case& c : cases) {
    NotifyCfg config;
    ASSERT_TRUE(ParseNotify(config, "",
                            std::string("<Servers/><Profiles>") + c.profile +
                                "<smtp ID='9' description='' from='' subject=''>"
                                "<to>x</to></smtp></Profiles>"));
    EXPECT_EQ(config.FindProfile(2) != nullptr, c.kept) << c.profile;
    EXPECT_NE(config.FindProfile(9), nullptr) << c.profile;
  }
}

TEST_F(NotifyCfgTest, SkippedAutomaticProfileStillSpendsItsIdentifier) {
  NotifyCfg config;
  ASSERT_TRUE(ParseNotify(config, "",
                          "<Servers/><Profiles><smtp ID='0' description='' from=''><to>x</to>"
                          "</smtp><smtp ID='0' description='' from='' subject=''><to>x</to>"
                          "</smtp></Profiles>"));
  ASSERT_EQ(config.Profiles().size(), 1u);
  EXPECT_NE(config.FindProfile(2), nullptr);
  EXPECT_EQ(config.NextProfileId(), 3);
}

TEST_F(NotifyCfgTest, ServerDefaultsAndSkips) {
  struct Case {
    const char* smtp;
    int32_t port;
    int32_t useSsl;
  };
  const Case cases[] = {
      {"<smtp description='s' address='h'/>", 25, 0},
      {"<smtp description='s' address='h' port='465'/>", 465, 1},
      {"<smtp description='s' address='h' port='465' UseSSL='0'/>", 465, 0},
      {"<smtp description='s' address='h' port='x25' UseSSL='2'/>", 25, 2},
      {"<smtp description='s' address='h' port='587' UseSSL='yes'/>", 587, 0},
      {"<smtp description='' address=''/>", 25, 0},
  };
  for (const Case& c : cases) {
    NotifyCfg config;
    ASSERT_TRUE(ParseNotify(config, "",
                            std::string("<Servers>") + c.smtp +
                                "<smtp address='no description'/>"
                                "<smtp description='no address'/></Servers>"
                                "<Profiles/>"));
    ASSERT_EQ(config.Servers().size(), 1u) << c.smtp;
    EXPECT_EQ(config.Servers()[0].port, c.port) << c.smtp;
    EXPECT_EQ(config.Servers()[0].useSsl, c.useSsl) << c.smtp;
  }
}

TEST_F(NotifyCfgTest, RepeatedServersAndProfilesElements) {
  NotifyCfg config;
  ASSERT_TRUE(ParseNotify(config, "",
                          "<Servers><smtp description='a' address='1'/></Servers>"
                          "<Profiles><smtp ID='1' description='' from='' subject=''><to>x</to>"
                          "</smtp></Profiles>"
                          "<Servers><smtp description='b' address='2'/></Servers>"
                          "<Profiles><smtp ID='2' description='' from='' subject=''><to>x</to>"
                          "</smtp></Profiles>"));
  ASSERT_EQ(config.Servers().size(), 2u);
  EXPECT_EQ(config.Servers()[1].description, "b");
  EXPECT_EQ(config.FindProfile(1), nullptr);
  EXPECT_NE(config.FindProfile(2), nullptr);
}

TEST_F(NotifyCfgTest, ResentProfileKeepsAttachVideoAndEdgeButNotThrottle) {
  NotifyCfg config;
  ASSERT_TRUE(ParseNotify(config, "",
                          "<Servers/><Profiles><smtp ID='1' description='' from='' subject='' "
                          "attach='1' MaxVideoSeconds='9' EventEdge='2' ThrottleSeconds='60'>"
                          "<to>x</to></smtp></Profiles>"));
  ASSERT_TRUE(ParseNotify(config, "",
                          "<Servers/><Profiles><smtp ID='1' description='' from='' subject=''>"
                          "<to>x</to></smtp><smtp ID='2' description='' from='' subject=''>"
                          "<to>x</to></smtp></Profiles>"));
  const NotifyProfile* one = config.FindProfile(1);
  ASSERT_NE(one, nullptr);
  EXPECT_TRUE(one->attach);
  EXPECT_EQ(one->maxVideoSeconds, 9);
  EXPECT_EQ(one->eventEdge, 2);
  EXPECT_EQ(one->throttleSeconds, 0);
  const NotifyProfile* two = config.FindProfile(2);
  ASSERT_NE(two, nullptr);
  EXPECT_FALSE(two->attach);
  EXPECT_EQ(two->maxVideoSeconds, 0);
  EXPECT_EQ(two->eventEdge, 0);
}

TEST_F(NotifyCfgTest, AttachIsOnlyOneOutsideSecondReviewerMode) {
  struct Case {
    const char* attach;
    bool reviewer;
    bool expected;
  };
  const Case cases[] = {{"1", false, true},
                        {"2", false, false},
                        {"0", false, false},
                        {"1", true, false},
                        {"+1", false, true}};
  for (const Case& c : cases) {
    NotifyCfg config;
    config.SetAttachmentsDisabled(c.reviewer);
    ASSERT_TRUE(ParseNotify(config, "",
                            std::string("<Servers/><Profiles><smtp ID='1' description='' "
                                        "from='' subject='' attach='") +
                                c.attach + "'><to>x</to></smtp></Profiles>"));
    EXPECT_EQ(config.FindProfile(1)->attach, c.expected) << c.attach << c.reviewer;
  }
}

TEST_F(NotifyCfgTest, SecondReviewerFlagAndAttachments) {
  NotifyCfg config;
  ASSERT_TRUE(ParseNotify(config, "", kRichConfig));
  EXPECT_FALSE(config.SetAttachmentsDisabled(false));
  EXPECT_TRUE(config.SetAttachmentsDisabled(true));
  EXPECT_FALSE(config.SetAttachmentsDisabled(true));
  EXPECT_TRUE(config.DisableAllAttachments());
  EXPECT_FALSE(config.FindProfile(3)->attach);
  EXPECT_FALSE(config.DisableAllAttachments());
  std::string text = Compact(config);
  EXPECT_NE(text.find("SupportsAttach=\"0\" SupportsVideoAttach=\"0\" SupportsStatus=\"1\""),
            std::string::npos);
}

TEST_F(NotifyCfgTest, PlaceholderFlagComesFromSubjectOrBody) {
  struct Case {
    const char* subject;
    const char* body;
    bool expected;
  };
  const Case cases[] = {{"{x}", "", true}, {"plain", "{x}", true}, {"plain", "plain", false}};
  for (const Case& c : cases) {
    NotifyCfg config;
    ASSERT_TRUE(ParseNotify(config, "",
                            std::string("<Servers/><Profiles><smtp ID='1' description='' "
                                        "from='' subject='") +
                                c.subject + "'><to>x</to><body>" + c.body +
                                "</body></smtp></Profiles>"));
    EXPECT_EQ(config.FindProfile(1)->hasPlaceholders, c.expected) << c.subject << c.body;
  }
}

TEST_F(NotifyCfgTest, NormalizesWebAddresses) {
  struct Case {
    const char* text;  // null: absent
    const char* host;
    const char* port;
    const char* address;
    bool plainHost;
  };
  const Case cases[] = {
      {nullptr, "", "", "", true},
      {"HTTP://Server1", "Server1", "80", "Server1", true},
      {"https://192.168.1.5:8443", "192.168.1.5", "8443", "192.168.1.5:8443", true},
      {"[fe80::1]:81", "fe80::1", "81", "[fe80::1]:81", false},
      {"fe80::1", "fe80::1", "80", "fe80::1", false},
      {"http://host:8080/", "host", "8080/", "host:8080/", true},
      {"HtTpS://box", "box", "80", "box", true},
      {"ftp://box", "ftp", "//box", "ftp://box", true},
      {"", "", "80", "", true},
      {"]:1:2", "", "1:2", "[]:1:2", false},
  };
  for (const Case& c : cases) {
    NotifyCfg config;
    config.SetWebAddress("previous:1");
    config.SetWebAddress(c.text);
    const char* label = c.text != nullptr ? c.text : "(absent)";
    EXPECT_EQ(config.Web().host, c.host) << label;
    EXPECT_EQ(config.Web().port, c.port) << label;
    EXPECT_EQ(config.Web().address, c.address) << label;
    EXPECT_EQ(config.Web().plainHost, c.plainHost) << label;
  }
}

TEST_F(NotifyCfgTest, WebElementRules) {
  NotifyCfg config;
  ASSERT_TRUE(ParseNotify(config, "", "<Web address='a:1'/><Servers/><Profiles/>"));
  ASSERT_TRUE(ParseNotify(config, "", "<Servers/><Profiles/>"));
  EXPECT_EQ(config.Web().address, "a:1");
  ASSERT_TRUE(ParseNotify(config, "", "<Web/><Servers/><Profiles/>"));
  EXPECT_EQ(config.Web().address, "");
}

TEST_F(NotifyCfgTest, EmailSizeLimitBytesNeverOverflows) {
  struct Case {
    const char* megabytes;
    int64_t bytes;
  };
  const Case cases[] = {
      {"10", 10485760},
      {"0", 0},
      {"1", 1048576},
      {"2047", kMaxEmailSizeLimitBytes},
      {"2048", kMaxEmailSizeLimitBytes},
      {"4096", kMaxEmailSizeLimitBytes},
      {"2147483647", kMaxEmailSizeLimitBytes},
      {"-1", 0},
      {"-2147483648", 0},
  };
  for (const Case& c : cases) {
    NotifyCfg config;
    ASSERT_TRUE(ParseNotify(config, std::string("EmailSizeLimitMB='") + c.megabytes + "'",
                            "<Servers/><Profiles/>"));
    EXPECT_EQ(config.EmailSizeLimitBytes(), c.bytes) << c.megabytes;
    // The configured value itself is kept as given.
    EXPECT_EQ(std::to_string(config.EmailSizeLimitMB()), c.megabytes);
  }
}

TEST_F(NotifyCfgTest, PreAlarmTableFromFullDocuments) {
  NotifyCfg config;
  struct Update {
    const char* text;
  };
  const Update updates[] = {
      {"<Trellan><Events><Event ID='1' PreAlarm='5'/><Other ID='2' PreAlarm='6'/>"
       "<Event ID='x' PreAlarm='7'/><Event ID='3'/></Events>"
       "<Later><Event ID='4' PreAlarm='8'/></Later><Empty/></Trellan>"},
      {"<Trellan><Events><Event ID='1' PreAlarm='9'/></Events></Trellan>"},
      {"<Other><Events><Event ID='5' PreAlarm='1'/></Events></Other>"},
      {"<Trellan><Before><Event ID='6' PreAlarm='1'/></Before></Trellan>"},
  };
  for (const Update& u : updates) {
    TiXmlDocument document;
    document.Parse(u.text);
    config.UpdatePreAlarm(document);
  }
  EXPECT_EQ(config.PreAlarmTable(), (std::map<int32_t, int32_t>{{1, 9}, {2, 6}, {4, 8}}));
  EXPECT_EQ(config.PreAlarmSeconds(4), 8);
  EXPECT_EQ(config.PreAlarmSeconds(3), 0);
}

// Passwords: protected on disk, clear in memory and for the host.

TEST_F(NotifyCfgTest, PasswordsAreProtectedInTheFileAndClearForTheHost) {
  NotifyCfg config;
  ASSERT_TRUE(ParseNotify(config, "",
                          "<Servers><smtp description='s' address='h'>"
                          "<Authentication username='u' password='Pa55word'/></smtp>"
                          "<smtp description='t' address='h'>"
                          "<Authentication username='v' password=''/></smtp></Servers>"
                          "<Profiles/>"));
  TiXmlDocument document;
  BuildConfigDocument(document, config, m_services);
  std::string stored = PrintCompact(document);
  EXPECT_EQ(stored.find("Pa55word"), std::string::npos);
  EXPECT_NE(stored.find("encrypt=\"algo\""), std::string::npos);
  NotifyCfg reread;
  ASSERT_TRUE(ParseText(reread, stored));
  EXPECT_EQ(reread.Servers()[0].password, "Pa55word");
  EXPECT_EQ(reread.Servers()[1].password, "");
  EXPECT_EQ(reread.Servers()[1].username, "v");

  ASSERT_TRUE(RevealPasswords(document, m_services));
  std::string posted = PrintCompact(document);
  EXPECT_NE(posted.find("<Authentication username=\"u\" password=\"Pa55word\" />"),
            std::string::npos);
  EXPECT_EQ(posted.find("encrypt"), std::string::npos);
  EXPECT_TRUE(m_errors.empty());
}

TEST_F(NotifyCfgTest, UnreadablePasswordIsKeptAndWrittenBackUnchanged) {
  NotifyCfg original;
  ASSERT_TRUE(ParseNotify(original, "",
                          "<Servers><smtp description='s' address='h'>"
                          "<Authentication username='u' password='Pa55word'/></smtp></Servers>"
                          "<Profiles/>"));
  std::string stored = Compact(original);
  m_vault.SetKey('B');  // another host's key

  NotifyCfg config;
  ASSERT_TRUE(ParseText(config, stored));
  ASSERT_EQ(config.Servers().size(), 1u);
  EXPECT_EQ(config.Servers()[0].username, "u");
  EXPECT_EQ(config.Servers()[0].password, "");
  EXPECT_FALSE(config.Servers()[0].unreadablePassword.empty());
  ASSERT_GE(m_errors.size(), 2u);
  EXPECT_EQ(m_errors[0], "decryption failure");
  EXPECT_NE(m_errors[1].find("SMTP server s"), std::string::npos);
  EXPECT_EQ(Compact(config), stored);

  // The host is sent the server without a password; everything else goes.
  TiXmlDocument document;
  BuildConfigDocument(document, config, m_services);
  EXPECT_FALSE(RevealPasswords(document, m_services));
  std::string posted = PrintCompact(document);
  EXPECT_NE(posted.find("<Authentication username=\"u\" password=\"\" />"), std::string::npos);

  // The host sends it back with no password: the stored text stays.
  ASSERT_TRUE(ParseText(config, posted));
  EXPECT_EQ(Compact(config), stored);
  // With the right key again, the password is readable once more.
  m_vault.SetKey('A');
  NotifyCfg recovered;
  ASSERT_TRUE(ParseText(recovered, Compact(config)));
  EXPECT_EQ(recovered.Servers()[0].password, "Pa55word");
}

TEST_F(NotifyCfgTest, NewPasswordReplacesAnUnreadableOne) {
  NotifyCfg config;
  ASSERT_TRUE(ParseNotify(config, "",
                          "<Servers><smtp description='s' address='h'><Authentication "
                          "username='u' password='QUJD' encrypt=''/></smtp></Servers>"
                          "<Profiles/>"));
  ASSERT_EQ(config.Servers()[0].unreadablePassword, "QUJD");
  ASSERT_TRUE(ParseNotify(config, "",
                          "<Servers><smtp description='s' address='h'><Authentication "
                          "username='u' password='new'/></smtp></Servers><Profiles/>"));
  EXPECT_EQ(config.Servers()[0].password, "new");
  EXPECT_EQ(config.Servers()[0].unreadablePassword, "");
  // A different account on the server does not inherit the stored text.
  ASSERT_TRUE(ParseNotify(config, "",
                          "<Servers><smtp description='s' address='h'><Authentication "
                          "username='u' password='QUJD' encrypt='x'/></smtp></Servers>"
                          "<Profiles/>"));
  ASSERT_TRUE(ParseNotify(config, "",
                          "<Servers><smtp description='s' address='h'><Authentication "
                          "username='other'/></smtp></Servers><Profiles/>"));
  EXPECT_EQ(config.Servers()[0].unreadablePassword, "");
}

TEST_F(NotifyCfgTest, PasswordThatCannotBeProtectedKeepsItsStoredForm) {
  NotifyCfg typed;
  ASSERT_TRUE(ParseNotify(typed, "",
                          "<Servers><smtp description='s' address='h'>"
                          "<Authentication username='u' password='Pa55word'/></smtp></Servers>"
                          "<Profiles/>"));
  const std::string stored = Compact(typed);
  NotifyCfg reread;
  ASSERT_TRUE(ParseText(reread, stored));
  m_vault.FailProtection();
  EXPECT_EQ(Compact(reread), stored);
  ASSERT_EQ(m_errors.size(), 2u);
  EXPECT_EQ(m_errors[0], "encryption error: -7");
  EXPECT_NE(m_errors[1].find("keeps the one stored before"), std::string::npos);

  // Typed in and never stored: left out, and the document is not to be saved.
  TiXmlDocument document;
  EXPECT_FALSE(BuildConfigDocument(document, typed, m_services));
  const std::string unsaved = PrintCompact(document);
  EXPECT_EQ(unsaved.find("Pa55word"), std::string::npos);
  EXPECT_NE(unsaved.find("<Authentication username=\"u\" />"), std::string::npos);
  EXPECT_NE(m_errors.back().find("notify.xml is left unchanged"), std::string::npos);
}

}  // namespace
}  // namespace hx
