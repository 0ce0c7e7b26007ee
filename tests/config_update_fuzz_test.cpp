// Robustness of configuration updates: randomly mutated configuration
// documents (fixed seed) go through the testing module's update path. None
// may crash the module, and every accepted one must read back to itself: the
// configuration the module posts, sent back as an update, is accepted and
// posts the same document again.
#include <gtest/gtest.h>

#include <random>
#include <string>
#include <vector>

#include "tests/support/host_fixture.h"
#include "tests/support/module_hooks.h"

namespace {

constexpr int kDocuments = 1000;
constexpr uint32_t kSeed = 20261206;

const char* const kSeeds[] = {
    "<Notify ID=\"786432\" MaxRetrySeconds=\"600\" MaxRetryQueue=\"7\" EmailSizeLimitMB=\"3\">"
    "<Web address=\"https://[fe80::1]:8443\"/><Servers>"
    "<smtp description=\"main\" address=\"mail.example\" port=\"587\" UseSSL=\"2\">"
    "<Authentication username=\"u&amp;1\" password=\"p&quot;w\"/></smtp>"
    "<smtp description=\"spare\" address=\"10.0.0.2\" port=\"465\"/></Servers>"
    "<Profiles autoincrement=\"4\"><smtp ID=\"3\" attach=\"1\" description=\"Door\" "
    "ThrottleSeconds=\"30\" from=\"cam@example\" subject=\"{event type} at {source}\" "
    "MaxVideoSeconds=\"12\" EventEdge=\"2\"><to>a@example</to><to>b@example</to>"
    "<cc>c@example</cc><bcc>d@example</bcc><body>Line 1&#x0D;&#x0A;Line 2&#x09;&lt;x&gt;"
    "</body></smtp><smtp ID=\"0\" description=\"\" from=\"\" subject=\"\"><to>e@example</to>"
    "</smtp></Profiles></Notify>",
    "<Notify ID=\"786432\"><Servers><smtp description=\"s\" address=\"h\"><Authentication "
    "username=\"v\" password=\"QUJDREVGR0g=\" encrypt=\"algo\"/></smtp></Servers>"
    "<Profiles><smtp ID=\"0\" description=\"a\" from=\"f\" subject=\"{date format='%d'}\">"
    "<to>x@y</to><body>  spaced\n  text  </body></smtp><smtp ID=\"9\" description=\"b\" "
    "from=\"g\" subject=\"s\" attach=\"2\"><to>z@y</to><body/></smtp></Profiles>"
    "<Servers><smtp description=\"t\" address=\"k\" port=\"25\" UseSSL=\"0\"/></Servers>"
    "<Profiles autoincrement=\"2\"><smtp ID=\"0\" description=\"c\" from=\"\" subject=\"\">"
    "<to>q@y</to></smtp></Profiles></Notify>",
    "<?xml ?><Trellan Delta=\"1\"><Notify ID=\"786432\" EmailSizeLimitMB=\"4096\"><Web/>"
    "<Servers/><Profiles><smtp ID=\"-4\" description=\"neg\" from=\"\" subject=\"\">"
    "<to>w@y</to><cc></cc><bcc>v@y</bcc></smtp></Profiles></Notify></Trellan>",
};

const char* const kTokens[] = {
    "<",
    ">",
    "/>",
    "\"",
    "'",
    "&",
    "&amp;",
    "&#x0A;",
    "&#x20;",
    "&#x0;",
    "<to>",
    "</to>",
    "<body>",
    "</body>",
    "<smtp ",
    "</smtp>",
    " ID=\"0\"",
    " ID=\"786432\"",
    " attach=\"1\"",
    " port=\"465\"",
    " UseSSL=\"1\"",
    " encrypt=\"algo\"",
    "2147483647",
    "-2147483648",
    "<Servers/>",
    "<Profiles autoincrement=\"2147483647\">",
    "<![CDATA[x]]>",
    "<!-- c -->",
    " ",
    "\n",
    "\t",
    "\xc3\xa9",
    "{source}",
};

class Mutator {
 public:
  explicit Mutator(uint32_t seed) : m_random(seed) {}

  std::string Mutate(std::string text) {
    int steps = 1 + Below(2);
    for (int i = 0; i < steps; ++i) Step(text);
    return text;
  }

 private:
  size_t Below(size_t bound) {
    return std::uniform_int_distribution<size_t>(0, bound - 1)(m_random);
  }
  char Any() { return static_cast<char>(Below(256)); }
  char Printable() { return static_cast<char>(' ' + Below(95)); }
  void Step(std::string& text) {
    size_t at = Below(text.size() + 1);
    switch (Below(4)) {
      case 0:
        // Mostly characters that keep the document XML, so that many
        // mutations reach the configuration parser.
        if (!text.empty()) text[Below(text.size())] = Below(8) == 0 ? Any() : Printable();
        break;
      case 1:
        text.erase(at, 1 + Below(8));
        break;
      case 2: {
        size_t from = Below(text.size() + 1);
        text.insert(at, text.substr(from, 1 + Below(32)));
        break;
      }
      default:
        text.insert(at, kTokens[Below(sizeof(kTokens) / sizeof(kTokens[0]))]);
        break;
    }
  }

  std::mt19937 m_random;
};

class ConfigUpdateFuzzTest : public testsupport::ModuleHostTest {
 protected:
  int32_t Apply(const std::string& text) {
    auto hook = reinterpret_cast<testhooks::ApplyConfigurationUpdateFn>(
        host().Hook("ApplyConfigurationUpdate"));
    if (hook == nullptr) return -2;
    return host().GetDispatcher().Call(
        [&] { return hook(text.data(), static_cast<uint32_t>(text.size())); });
  }
};

TEST_F(ConfigUpdateFuzzTest, MutatedUpdatesNeverCrashAndAcceptedOnesReadBackToThemselves) {
  Options().logThreshold = 100;  // keep the host log small; failures are counted below
  StartHost();
  ASSERT_NE(host().Hook("ApplyConfigurationUpdate"), nullptr);
  Mutator mutator(kSeed);
  int accepted = 0;
  int mismatches = 0;
  for (int i = 0; i < kDocuments; ++i) {
    std::string input = mutator.Mutate(kSeeds[i % (sizeof(kSeeds) / sizeof(kSeeds[0]))]);
    int32_t result = Apply(refhost::ConfigurationUpdateDocument(input));
    ASSERT_NE(result, -2);
    if (result != 1) continue;
    ++accepted;
    std::string posted = host().Config().Configuration();
    ASSERT_EQ(Apply(posted), 1) << "input: " << input << "\nposted: " << posted;
    std::string again = host().Config().Configuration();
    if (again != posted && ++mismatches <= 3) {
      ADD_FAILURE() << "input: " << input << "\nposted: " << posted << "\nagain:  " << again;
    }
  }
  EXPECT_EQ(mismatches, 0);
  // The mutations must leave enough documents valid to test the round trip.
  EXPECT_GT(accepted, kDocuments / 10);
  RecordProperty("accepted", accepted);
  host().Stop();
}

}  // namespace
