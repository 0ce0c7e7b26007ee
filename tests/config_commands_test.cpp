// The configuration through the reference host: "notify.xml" at Open, the
// documents posted to the host, passwords under the host's real AES service,
// configuration updates with their status reports, second reviewer mode and
// the SMTPS probe with the real curl.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <tinyxml.h>
#include <unistd.h>

#include <cstdio>
#include <string>
#include <vector>

#include "host/password_service.h"
#include "tests/support/host_fixture.h"
#include "tests/support/module_hooks.h"

namespace {

using testsupport::FileExists;
using testsupport::ReadFile;
using testsupport::WriteFile;

constexpr char kPassword[] = "Pa55-w0rd!xyzzy";

const char kDefaultsFile[] =
    "<?xml ?>\n"
    "<Trellan Delta=\"0\">\n"
    "    <Notify ID=\"786432\" SupportsThrottleSeconds=\"1\" SupportsAttach=\"1\" "
    "SupportsVideoAttach=\"1\" SupportsStatus=\"1\" SupportsEventEdge=\"1\" "
    "TemplateSupportLevel=\"3\" IsSupported=\"1\" SSL=\"2\" MaxRetrySeconds=\"172800\" "
    "MaxRetryQueue=\"100\" EmailSizeLimitMB=\"10\">\n"
    "        <Web address=\"\" />\n"
    "        <Servers />\n"
    "        <Profiles autoincrement=\"1\" />\n"
    "    </Notify>\n"
    "</Trellan>\n";

// One server and two profiles; `server` and `profiles` replace the defaults.
std::string Notify(const std::string& servers, const std::string& profiles,
                   const std::string& attributes = "") {
  return "<Notify ID=\"786432\" " + attributes + "><Servers>" + servers + "</Servers><Profiles>" +
         profiles + "</Profiles></Notify>";
}

std::string Server(const std::string& description, const std::string& password = "pw") {
  return "<smtp description=\"" + description +
         "\" address=\"mail.example\" port=\"587\"><Authentication username=\"u\" password=\"" +
         password + "\"/></smtp>";
}

std::string Profile(int id, const std::string& from = "cam@example",
                    const std::string& subject = "Alarm", const std::string& extra = "") {
  return "<smtp ID=\"" + std::to_string(id) + "\" description=\"P" + std::to_string(id) +
         "\" from=\"" + from + "\" subject=\"" + subject + "\" " + extra +
         "><to>ops@example</to></smtp>";
}

const TiXmlElement* FindElement(const TiXmlElement* element, const char* name) {
  for (; element != nullptr; element = element->NextSiblingElement()) {
    if (element->ValueStr() == name) return element;
    if (const TiXmlElement* found = FindElement(element->FirstChildElement(), name)) {
      return found;
    }
  }
  return nullptr;
}

// The value of attribute `name` of the first element `element` (in document
// order) of `xml`.
std::string AttributeOf(const std::string& xml, const char* element, const char* name) {
  TiXmlDocument document;
  document.Parse(xml.c_str());
  const TiXmlElement* found = FindElement(document.RootElement(), element);
  if (found == nullptr) return "(no element)";
  const char* value = found->Attribute(name);
  return value != nullptr ? value : "(absent)";
}

class ConfigCommandsTest : public testsupport::ModuleHostTest {
 protected:
  // Applies a configuration update on the dispatcher, as IOCTL code 2 would.
  int32_t ApplyUpdate(const std::string& notify) {
    return CallHook<testhooks::ApplyConfigurationUpdateFn>(
        "ApplyConfigurationUpdate", refhost::ConfigurationUpdateDocument(notify));
  }
  int32_t ApplyReviewer(const std::string& enabled) {
    return CallHook<testhooks::ApplySecondReviewerFn>(
        "ApplySecondReviewer", "<Trellan Delta=\"0\"><Users><SecondReviewer Enabled=\"" + enabled +
                                   "\"/></Users></Trellan>");
  }
  template <typename Fn>
  int32_t CallHook(const char* name, const std::string& text) {
    auto hook = reinterpret_cast<Fn>(host().Hook(name));
    EXPECT_NE(hook, nullptr) << name;
    if (hook == nullptr) return -2;
    return host().GetDispatcher().Call(
        [&] { return hook(text.data(), static_cast<uint32_t>(text.size())); });
  }
  std::string Posted() { return host().Config().Configuration(); }
  size_t PostCount() { return host().Config().ConfigurationCount(); }
  std::vector<std::pair<int32_t, int32_t>> Reports() {
    std::vector<std::pair<int32_t, int32_t>> reports;
    for (const auto& r : host().Config().StatusReports()) reports.emplace_back(r.id, r.status);
    return reports;
  }
  bool Logged(const std::string& fragment) { return host().Log().Contains(fragment); }
  size_t LogCount(const std::string& fragment) {
    size_t count = 0;
    for (const auto& line : host().Log().Lines()) count += line.text == fragment ? 1 : 0;
    return count;
  }
  // Everything the host and the disk hold that a password must not appear in.
  void ExpectPasswordNowhereInClear(const std::string& password) {
    EXPECT_EQ(ReadFile("notify.xml").find(password), std::string::npos);
    EXPECT_EQ(ReadFile("notify.xml.pending").find(password), std::string::npos);
    EXPECT_EQ(ReadFile(dir().File("host.log")).find(password), std::string::npos);
    for (const auto& line : host().Log().Lines()) {
      EXPECT_EQ(line.text.find(password), std::string::npos) << line.text;
    }
  }
};

TEST_F(ConfigCommandsTest, OpenWithoutFileWritesAndPostsTheDefaults) {
  StartHost();
  EXPECT_TRUE(
      Logged("Either no configuration or an improper configuration was found, "
             "continuing with empty configuration."));
  EXPECT_EQ(ReadFile("notify.xml"), kDefaultsFile);
  EXPECT_FALSE(FileExists("notify.xml.rejected"));
  // The module description comes first, then the configuration.
  auto documents = host().Requests().OfClass(hx::core::kClassDocument);
  ASSERT_EQ(documents.size(), 2u);
  EXPECT_EQ(documents[0].bytes,
            "<?xml ?><Trellan Delta=\"0\"><Modules><Module Name=\"Alertmod\" ID=\"786432\" "
            "Version=\"25.1.6.0\" /></Modules></Trellan>");
  std::string compact = kDefaultsFile;
  for (const char* drop : {"\n        ", "\n    ", "\n"}) {
    for (size_t at; (at = compact.find(drop)) != std::string::npos;) {
      compact.erase(at, std::string(drop).size());
    }
  }
  EXPECT_EQ(documents[1].bytes, compact);
}

TEST_F(ConfigCommandsTest, PasswordIsProtectedOnDiskAndClearOnlyForTheHost) {
  Options().logFile = dir().File("host.log");
  ASSERT_TRUE(WriteFile(
      "notify.xml",
      "<?xml ?><Trellan>" + Notify(Server("main", kPassword), Profile(1)) + "</Trellan>"));
  StartHost();
  EXPECT_TRUE(Logged("Loaded configuration from disk successfully"));
  std::string stored = ReadFile("notify.xml");
  EXPECT_EQ(AttributeOf(stored, "Authentication", "encrypt"), "algo");
  EXPECT_NE(AttributeOf(stored, "Authentication", "password"), kPassword);
  EXPECT_EQ(AttributeOf(Posted(), "Authentication", "password"), kPassword);
  EXPECT_EQ(Posted().find("encrypt"), std::string::npos);
  ExpectPasswordNowhereInClear(kPassword);

  // An update with the same password keeps it protected on disk.
  ASSERT_EQ(ApplyUpdate(Notify(Server("main", kPassword), Profile(1, "x@example"))), 1);
  ExpectPasswordNowhereInClear(kPassword);
  host().Stop();

  // A restart under the same host key reads the protected password back.
  ASSERT_TRUE(FileExists("hostkey.bin"));
  StartHost();
  EXPECT_TRUE(Logged("Loaded configuration from disk successfully"));
  EXPECT_EQ(AttributeOf(Posted(), "Authentication", "password"), kPassword);
  ExpectPasswordNowhereInClear(kPassword);
}

TEST_F(ConfigCommandsTest, StoredPasswordOutlivesSavesTheHostCannotProtect) {
  using Answer = int32_t (*)(hx::core::HostRequest&);
  const Answer refusals[] = {
      [](hx::core::HostRequest&) { return refhost::PasswordService::kCipherFailure; },
      [](hx::core::HostRequest& r) {
        r.extValue = 0;
        return 0;
      },
      [](hx::core::HostRequest& r) {
        r.extValue = static_cast<int32_t>(r.length) + 1;
        return 0;
      },
  };
  for (const Answer refuse : refusals) {
    ASSERT_TRUE(WriteFile(
        "notify.xml", "<Trellan>" + Notify(Server("main", kPassword), Profile(1)) + "</Trellan>"));
    StartHost();
    refhost::PasswordService keys(Options().hostKeyFile);
    host().SetHandler(hx::core::kClassCrypto, [&](hx::core::HostRequest& r) {
      return r.code == hx::core::kCodeEncrypt ? refuse(r) : keys.Handle(r);
    });
    ASSERT_EQ(ApplyUpdate(Notify(Server("main", kPassword), Profile(1, "new@example"))), 1);
    EXPECT_TRUE(Logged("notify.xml keeps the one stored before."));
    // A server with nothing stored yet: the file stays as it was.
    const std::string saved = ReadFile("notify.xml");
    ASSERT_EQ(ApplyUpdate(Notify(Server("main", kPassword) + Server("spare"), Profile(1))), 1);
    EXPECT_TRUE(
        Logged("The password of SMTP server spare could not be protected; notify.xml is "
               "left unchanged."));
    EXPECT_EQ(ReadFile("notify.xml"), saved);
    host().Stop();

    StartHost();
    EXPECT_EQ(AttributeOf(Posted(), "Authentication", "password"), kPassword);
    EXPECT_NE(Posted().find("new@example"), std::string::npos);
    host().Stop();
  }
}

TEST_F(ConfigCommandsTest, UnreadablePasswordIsKeptAndTheRestIsPosted) {
  const std::string foreign = "c29tZSBvdGhlciBob3N0J3Mga2V5IG1hZGUgdGhpcyB0ZXh0";
  ASSERT_TRUE(WriteFile("notify.xml",
                        "<?xml ?><Trellan><Notify ID=\"786432\"><Servers><smtp description=\"m\" "
                        "address=\"h\"><Authentication username=\"u\" password=\"" +
                            foreign + "\" encrypt=\"algo\"/></smtp></Servers><Profiles>" +
                            Profile(1) + "</Profiles></Notify></Trellan>"));
  StartHost();
  EXPECT_TRUE(Logged("decyrption error: "));
  EXPECT_TRUE(Logged("The stored password of SMTP server m cannot be read"));
  EXPECT_EQ(AttributeOf(ReadFile("notify.xml"), "Authentication", "password"), foreign);
  EXPECT_EQ(AttributeOf(Posted(), "Authentication", "password"), "");
  EXPECT_EQ(AttributeOf(Posted(), "Authentication", "username"), "u");
  EXPECT_EQ(AttributeOf(Posted(), "smtp", "description"), "m");
  // The host sends the server back as it was shown: the stored text stays.
  ASSERT_EQ(ApplyUpdate(Notify("<smtp description=\"m\" address=\"h\"><Authentication "
                               "username=\"u\" password=\"\"/></smtp>",
                               Profile(1, "new@example"))),
            1);
  EXPECT_EQ(AttributeOf(ReadFile("notify.xml"), "Authentication", "password"), foreign);
}

TEST_F(ConfigCommandsTest, UnusableFileIsKeptAsideBeforeTheDefaultsAreWritten) {
  const std::string broken = "<?xml ?><Trellan><Notify ID=\"786432\"><Servers>& oops";
  ASSERT_TRUE(WriteFile("notify.xml", broken));
  StartHost();
  EXPECT_TRUE(Logged("Either no configuration or an improper configuration was found"));
  EXPECT_TRUE(Logged("was kept as notify.xml.rejected"));
  EXPECT_EQ(ReadFile("notify.xml.rejected"), broken);
  EXPECT_EQ(ReadFile("notify.xml"), kDefaultsFile);
}

TEST_F(ConfigCommandsTest, UpdatesReportTheProfilesWhoseStatusNoLongerApplies) {
  const std::string servers = Server("main") + Server("spare");
  struct Case {
    const char* name;
    std::string notify;
    std::vector<std::pair<int32_t, int32_t>> reports;
  };
  const Case cases[] = {
      {"subject only", Notify(servers, Profile(1, "cam@example", "Other") + Profile(2)), {}},
      {"profile added", Notify(servers, Profile(1) + Profile(2) + Profile(5)), {{5, -1}}},
      {"sender changed", Notify(servers, Profile(1) + Profile(2, "new@example")), {{2, -1}}},
      {"one server equal",
       Notify(Server("main") + Server("spare", "new"), Profile(1) + Profile(2)),
       {}},
      {"servers reordered", Notify(Server("spare") + Server("main"), Profile(1) + Profile(2)), {}},
      {"passwords changed",
       Notify(Server("main", "new") + Server("spare", "new"), Profile(1) + Profile(2)),
       {{1, -1}, {2, -1}}},
      {"server removed", Notify(Server("main"), Profile(2) + Profile(1)), {{1, -1}, {2, -1}}},
      {"all servers removed", Notify("", Profile(1) + Profile(2)), {{1, -1}, {2, -1}}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    ASSERT_TRUE(WriteFile("notify.xml",
                          "<Trellan>" + Notify(servers, Profile(1) + Profile(2)) + "</Trellan>"));
    StartHost();
    clock().Reset(0x10000, 1767225600);
    size_t posts = PostCount();
    ASSERT_EQ(ApplyUpdate(c.notify), 1);
    EXPECT_EQ(Reports(), c.reports);
    for (const auto& report : host().Config().StatusReports()) {
      EXPECT_EQ(report.time, 1767225600);
    }
    EXPECT_EQ(LogCount("Updated configuration successfully"), 1u);
    EXPECT_EQ(PostCount(), posts + 1);
    host().Stop();
  }
}

TEST_F(ConfigCommandsTest, EmptyOldServerListCountsAsChanged) {
  StartHost();
  ASSERT_EQ(ApplyUpdate(Notify("", Profile(3) + Profile(1))), 1);
  EXPECT_EQ(Reports(), (std::vector<std::pair<int32_t, int32_t>>{{1, -1}, {3, -1}}));
}

TEST_F(ConfigCommandsTest, RejectedUpdateKeepsOnlyTheLimitsItCarried) {
  ASSERT_TRUE(
      WriteFile("notify.xml", "<Trellan>" + Notify(Server("main"), Profile(1)) + "</Trellan>"));
  StartHost();
  size_t posts = PostCount();
  size_t lines = host().Log().Lines().size();
  const std::string rejected[] = {
      "<Notify ID=\"786433\" MaxRetryQueue=\"7\"><Servers/><Profiles/></Notify>",
      "<Notify ID=\"786432\" MaxRetryQueue=\"5\"><Servers/></Notify>",
      "<Notify ID=\"786432\" EmailSizeLimitMB=\"1\" MaxRetrySeconds=\"60\"><Profiles/></Notify>",
  };
  for (const std::string& notify : rejected) EXPECT_EQ(ApplyUpdate(notify), 0) << notify;
  EXPECT_EQ(PostCount(), posts);
  EXPECT_TRUE(Reports().empty());
  EXPECT_EQ(host().Log().Lines().size(), lines);

  // The video buffer follows the new size limit at once.
  auto state = reinterpret_cast<testhooks::GetManagerStateFn>(host().Hook("GetManagerState"));
  ASSERT_NE(state, nullptr);
  testhooks::ManagerStateRecord record;
  ASSERT_TRUE(host().GetDispatcher().Call([&] { return state(record); }));
  EXPECT_EQ(record.videoBufferMaxBytes, 1048576u);

  // The next post shows the limits with the servers and profiles of before.
  ASSERT_EQ(ApplyReviewer("1"), 1);
  EXPECT_EQ(AttributeOf(Posted(), "Notify", "MaxRetryQueue"), "5");
  EXPECT_EQ(AttributeOf(Posted(), "Notify", "MaxRetrySeconds"), "60");
  EXPECT_EQ(AttributeOf(Posted(), "Notify", "EmailSizeLimitMB"), "1");
  EXPECT_EQ(AttributeOf(Posted(), "smtp", "description"), "main");
  EXPECT_NE(Posted().find("description=\"P1\""), std::string::npos);
}

TEST_F(ConfigCommandsTest, SecondReviewerModeWithdrawsAttachments) {
  ASSERT_TRUE(
      WriteFile("notify.xml",
                "<Trellan>" + Notify("", Profile(1, "a@b", "s", "attach=\"1\"")) + "</Trellan>"));
  StartHost();
  size_t posts = PostCount();
  const char kDisabled[] = "Disabled all attachments for second reviewer mode.";
  EXPECT_EQ(ApplyReviewer("1"), 1);
  EXPECT_EQ(PostCount(), posts + 1);
  EXPECT_EQ(LogCount(kDisabled), 1u);
  EXPECT_EQ(AttributeOf(Posted(), "Notify", "SupportsAttach"), "0");
  EXPECT_EQ(AttributeOf(Posted(), "Notify", "SupportsVideoAttach"), "0");
  EXPECT_EQ(AttributeOf(Posted(), "Notify", "SupportsStatus"), "1");
  EXPECT_EQ(AttributeOf(Posted(), "smtp", "attach"), "0");
  EXPECT_EQ(AttributeOf(ReadFile("notify.xml"), "smtp", "attach"), "0");

  // The same setting again changes nothing and posts nothing.
  EXPECT_EQ(ApplyReviewer("1"), 0);
  EXPECT_EQ(ApplyReviewer("7"), 0);
  EXPECT_EQ(PostCount(), posts + 1);
  // An update asking for attachments meanwhile does not get them.
  ASSERT_EQ(ApplyUpdate(Notify("", Profile(1, "a@b", "s", "attach=\"1\""))), 1);
  EXPECT_EQ(AttributeOf(Posted(), "smtp", "attach"), "0");
  posts = PostCount();

  // Turning the mode off posts again but does not bring attachments back.
  EXPECT_EQ(ApplyReviewer("0"), 1);
  EXPECT_EQ(PostCount(), posts + 1);
  EXPECT_EQ(AttributeOf(Posted(), "Notify", "SupportsAttach"), "1");
  EXPECT_EQ(AttributeOf(Posted(), "smtp", "attach"), "0");
  EXPECT_EQ(LogCount(kDisabled), 1u);

  // Documents without a readable setting are passed over.
  EXPECT_EQ(ApplyReviewer("yes"), 0);
  EXPECT_EQ(CallHook<testhooks::ApplySecondReviewerFn>("ApplySecondReviewer",
                                                       "<Trellan><Users/></Trellan>"),
            0);
  EXPECT_EQ(PostCount(), posts + 1);
}

TEST_F(ConfigCommandsTest, SmtpsIsOfferedOnlyWhenTheTransferToolListsIt) {
  struct Case {
    const char* name;
    std::string tool;  // empty: the real curl
    const char* ssl;
  };
  const std::string script = dir().File("fake-curl");
  ASSERT_TRUE(WriteFile(script, "#!/bin/sh\necho 'Protocols: http smtp'\n"));
  ASSERT_EQ(chmod(script.c_str(), 0755), 0);
  const Case cases[] = {
      {"real curl", "", "2"},
      {"no smtps in its list", script, "(absent)"},
      {"tool missing", dir().File("no-such-tool"), "(absent)"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    if (!c.tool.empty()) Options().transferTool = c.tool;
    StartHost();
    EXPECT_EQ(AttributeOf(Posted(), "Notify", "SSL"), c.ssl);
    EXPECT_EQ(AttributeOf(ReadFile("notify.xml"), "Notify", "SSL"), c.ssl);
    host().Stop();
  }
}

TEST_F(ConfigCommandsTest, FailedSaveIsLoggedAndTheConfigurationStillPosted) {
  // A working directory that no longer exists makes every save fail.
  const std::string gone = dir().File("gone");
  ASSERT_EQ(mkdir(gone.c_str(), 0755), 0);
  ASSERT_EQ(chdir(gone.c_str()), 0);
  ASSERT_EQ(rmdir(gone.c_str()), 0);
  StartHost();
  EXPECT_TRUE(Logged("Unable to save the configuration to notify.xml: create error "));
  EXPECT_EQ(PostCount(), 1u);
  host().Stop();
  ASSERT_EQ(chdir(dir().path().c_str()), 0);
}

// The output of a command, and its exit status.
std::string RunCommand(const std::string& command, int* status) {
  std::string output;
  FILE* pipe = popen(command.c_str(), "r");
  if (pipe == nullptr) return output;
  char buffer[4096];
  for (size_t n; (n = fread(buffer, 1, sizeof(buffer), pipe)) > 0;) output.append(buffer, n);
  *status = pclose(pipe);
  return output;
}

TEST(HostProgramTest, ShowsThePostedConfigurationWithMaskedPasswords) {
  testsupport::TempDir dir;
  testsupport::ScopedChdir chdir(dir.path());
  ASSERT_TRUE(WriteFile(
      "notify.xml", "<Trellan>" + Notify(Server("main", kPassword), Profile(1)) + "</Trellan>"));
  int status = -1;
  std::string output = RunCommand(std::string(ALERTMOD_HOST_PROGRAM) + " show-config --module " +
                                      testsupport::ProductionModulePath() + " 2>&1",
                                  &status);
  EXPECT_EQ(status, 0) << output;
  EXPECT_NE(output.find("Configuration posted by the module:"), std::string::npos) << output;
  EXPECT_NE(output.find("<Authentication username=\"u\" password=\"***\" />"), std::string::npos)
      << output;
  EXPECT_EQ(output.find(kPassword), std::string::npos) << output;
}

}  // namespace
