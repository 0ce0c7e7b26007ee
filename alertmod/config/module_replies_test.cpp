#include "alertmod/config/module_replies.h"

#include <gtest/gtest.h>

#include "tests/support/fake_host.h"

namespace hx {
namespace {

class ModuleRepliesTest : public ::testing::Test {
 protected:
  testsupport::FakeHost m_host;
};

TEST_F(ModuleRepliesTest, PostToHostSendsTheTextWithoutTerminator) {
  PostToHost(m_host.callback(), core::kClassDocument, "<a />");
  auto posted = m_host.Requests().OfClass(core::kClassDocument);
  ASSERT_EQ(posted.size(), 1u);
  EXPECT_EQ(posted[0].code, core::kCodeDocument);
  EXPECT_EQ(posted[0].requester, core::kModuleId);
  EXPECT_EQ(posted[0].length, 5u);
  EXPECT_EQ(posted[0].bytes, "<a />");
  PostToHost(nullptr, core::kClassDocument, "ignored");  // no host: nothing happens
}

TEST_F(ModuleRepliesTest, ModuleDescription) {
  PostModuleDescription(m_host.callback());
  auto posted = m_host.Requests().OfClass(core::kClassDocument);
  ASSERT_EQ(posted.size(), 1u);
  EXPECT_EQ(posted[0].bytes,
            "<?xml ?><Trellan Delta=\"0\"><Modules><Module Name=\"Alertmod\" ID=\"786432\" "
            "Version=\"25.1.6.0\" /></Modules></Trellan>");
}

TEST_F(ModuleRepliesTest, CapabilityAttributes) {
  struct Case {
    bool reviewer;
    bool smtps;
    const char* attributes;
  };
  const Case cases[] = {
      {false, false,
       "SupportsThrottleSeconds=\"1\" SupportsAttach=\"1\" SupportsVideoAttach=\"1\" "
       "SupportsStatus=\"1\" SupportsEventEdge=\"1\" TemplateSupportLevel=\"3\" "
       "IsSupported=\"1\""},
      {true, true,
       "SupportsThrottleSeconds=\"1\" SupportsAttach=\"0\" SupportsVideoAttach=\"0\" "
       "SupportsStatus=\"1\" SupportsEventEdge=\"1\" TemplateSupportLevel=\"3\" "
       "IsSupported=\"1\" SSL=\"2\""},
  };
  for (const Case& c : cases) {
    TiXmlDocument document;
    auto* notify = new TiXmlElement("Notify");
    document.LinkEndChild(notify);
    AddCapabilityAttributes(*notify, c.reviewer, c.smtps);
    EXPECT_EQ(PrintCompact(document), std::string("<Notify ") + c.attributes + " />");
  }
}

TEST_F(ModuleRepliesTest, StatusReportsReplaceTheirValues) {
  ProfileStatusDocument document;
  ReportProfileStatus(document, 4, kProfileStatusFailed, 1767225600, m_host.callback());
  ReportProfileStatus(document, 7, kProfileStatusUnknown, 1767225605, m_host.callback());
  auto posted = m_host.Requests().OfClass(core::kClassProfileStatus);
  ASSERT_EQ(posted.size(), 2u);
  EXPECT_EQ(posted[0].code, core::kCodeDocument);
  EXPECT_EQ(posted[0].bytes,
            "<?xml ?><Trellan><Notify ID=\"786432\"><Profiles><Profile ID=\"4\" Status=\"1\" "
            "Time=\"1767225600\" /></Profiles></Notify></Trellan>");
  EXPECT_EQ(posted[1].bytes,
            "<?xml ?><Trellan><Notify ID=\"786432\"><Profiles><Profile ID=\"7\" Status=\"-1\" "
            "Time=\"1767225605\" /></Profiles></Notify></Trellan>");
}

}  // namespace
}  // namespace hx
