#include "alertmod/config/credentials.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cstring>
#include <vector>

#include "alertmod/util/base64.h"
#include "host/password_service.h"
#include "tests/support/fake_host.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace {

using core::HostRequest;
using core::kClassCrypto;
using core::kModuleId;
using testsupport::FakeHost;

struct Sink {
  std::vector<std::string> texts;
  ErrorSink fn() {
    return [this](const std::string& text) { texts.push_back(text); };
  }
};

// A host that returns what it was given, so marker and password come back.
int32_t Echo(HostRequest& request) {
  return request.extValue >= 0 ? 0 : -1;
}

TEST(CredentialsTest, RequestsCarryTheMarkedInput) {
  FakeHost host;
  host.SetHandler(kClassCrypto, &Echo);
  Sink sink;
  const std::string longPassword(600, 'p');
  struct Case {
    bool encrypt;
    std::string input;
    std::string hostInput;
    uint32_t bufferLength;
    std::optional<std::string> result;
  };
  const Case cases[] = {
      {true, "secret", "mzt58secret", 512, "mzt58secret"},
      {true, "", "mzt58", 512, "mzt58"},
      {true, longPassword, "mzt58" + longPassword, 1210, "mzt58" + longPassword},
      {false, "mzt58secret", "mzt58secret", 512, "secret"},
      {false, "mzt58", "mzt58", 512, ""},
  };
  for (const Case& c : cases) {
    host.Requests().Clear();
    std::optional<std::string> result =
        c.encrypt ? ProtectPassword(c.input, kModuleId, host.callback(), sink.fn())
                  : UnprotectPassword(c.input, kModuleId, host.callback(), sink.fn());
    EXPECT_EQ(result, c.result) << c.input;
    auto requests = host.Requests().OfClass(kClassCrypto);
    ASSERT_EQ(requests.size(), 1u);
    const testsupport::RecordedRequest& request = requests[0];
    EXPECT_EQ(request.code, c.encrypt ? 0x01000002u : 0x01000400u);
    EXPECT_EQ(request.requester, kModuleId);
    EXPECT_EQ(request.length, c.bufferLength);
    EXPECT_EQ(request.extValue, static_cast<int32_t>(c.hostInput.size()));
    std::string expectedBuffer = c.hostInput;
    expectedBuffer.resize(c.bufferLength, '\0');
    EXPECT_EQ(request.bytes, expectedBuffer);
  }
  EXPECT_TRUE(sink.texts.empty());
}

// Scripted answers: each request gets the next result; a result of 0 echoes.
struct Script {
  Script(std::vector<int32_t> r = {}, std::optional<int32_t> length = {}, std::string out = "")
      : results(std::move(r)), outputLength(length), output(std::move(out)) {}
  std::vector<int32_t> results;
  std::optional<int32_t> outputLength;  // overrides the echoed length when set
  std::string output;                   // replaces the echoed bytes when set
};

Script g_script;
size_t g_nextResult = 0;

int32_t Scripted(HostRequest& request) {
  int32_t result = g_script.results.at(g_nextResult++);
  if (result == 0 && !g_script.output.empty()) {
    memcpy(request.data, g_script.output.data(), g_script.output.size());
    request.extValue = static_cast<int32_t>(g_script.output.size());
  }
  if (result == 0 && g_script.outputLength) request.extValue = *g_script.outputLength;
  return result;
}

TEST(CredentialsTest, HostAnswersDecideTheOutcome) {
  struct Case {
    const char* name;
    bool encrypt;
    Script script;
    std::vector<std::string> texts;
    bool succeeds;
    std::vector<uint32_t> bufferLengths;
  };
  const Case cases[] = {
      {"bigger buffer once",
       true,
       {{2048, 0}},
       {"Resizing encryption buffer: 2048"},
       true,
       {512, 2048}},
      {"bigger buffer twice",
       true,
       {{600, 700}},
       {"Resizing encryption buffer: 600", "Resizing encryption buffer: 700",
        "Encryption Failure, reached max attempts"},
       false,
       {512, 600}},
      {"encrypt error", true, {{-5}}, {"encryption error: -5"}, false, {512}},
      {"decrypt error", false, {{-5}}, {"decyrption error: -5"}, false, {512}},
      {"decrypt bigger twice",
       false,
       {{4096, 4096}},
       {"Resizing decryption buffer: 4096", "Resizing decryption buffer: 4096",
        "Decryption Failure, reached max attempts"},
       false,
       {512, 4096}},
      {"no marker", false, {{0}, {}, "mzt5Xpassword"}, {"decryption failure"}, false, {512}},
      {"shorter than the marker", false, {{0}, {}, "mzt"}, {"decryption failure"}, false, {512}},
      // A host claiming more output than its buffer holds is not believed.
      {"output past the buffer",
       true,
       {{0}, 513},
       {"encryption error: output length 513 outside the buffer of 512"},
       false,
       {512}},
      {"negative output length",
       false,
       {{0}, -7},
       {"decyrption error: output length -7 outside the buffer of 512"},
       false,
       {512}},
      // The buffer never shrinks below the input the host is told about.
      {"smaller buffer", true, {{1, 0}}, {"Resizing encryption buffer: 1"}, true, {512, 13}},
      {"absurd buffer", true, {{1 << 30}}, {"encryption error: 1073741824"}, false, {512}},
  };
  for (const Case& c : cases) {
    FakeHost host;
    host.SetHandler(kClassCrypto, &Scripted);
    g_script = c.script;
    g_nextResult = 0;
    Sink sink;
    bool succeeded =
        c.encrypt
            ? ProtectPassword("password", kModuleId, host.callback(), sink.fn()).has_value()
            : UnprotectPassword("mzt58password", kModuleId, host.callback(), sink.fn()).has_value();
    EXPECT_EQ(succeeded, c.succeeds) << c.name;
    EXPECT_EQ(sink.texts, c.texts) << c.name;
    std::vector<uint32_t> lengths;
    for (const auto& request : host.Requests().OfClass(kClassCrypto)) {
      lengths.push_back(request.length);
    }
    EXPECT_EQ(lengths, c.bufferLengths) << c.name;
  }
}

TEST(CredentialsTest, FailsWithoutHostOrSink) {
  Sink sink;
  EXPECT_FALSE(ProtectPassword("p", kModuleId, nullptr, sink.fn()));
  EXPECT_EQ(sink.texts, std::vector<std::string>{"encryption error: no host"});
  FakeHost host;
  host.SetHandler(kClassCrypto, [](HostRequest&) { return -1; });
  EXPECT_FALSE(UnprotectPassword("x", kModuleId, host.callback(), ErrorSink()));
}

// The reference host's AES service behind the fake host's callback.
class RealCipherTest : public ::testing::Test {
 protected:
  void Use(refhost::PasswordService& service) {
    m_host.SetHandler(kClassCrypto,
                      [&service](HostRequest& request) { return service.Handle(request); });
  }
  std::optional<std::string> Protect(const std::string& password) {
    return ProtectPassword(password, kModuleId, m_host.callback(), m_sink.fn());
  }
  std::optional<std::string> Unprotect(const std::string& bytes) {
    return UnprotectPassword(bytes, kModuleId, m_host.callback(), m_sink.fn());
  }

  testsupport::TempDir m_dir;
  FakeHost m_host;
  Sink m_sink;
};

TEST_F(RealCipherTest, RoundTripsThroughBase64) {
  refhost::PasswordService service(m_dir.File("hostkey.bin"));
  Use(service);
  const std::string passwords[] = {"",
                                   "p",
                                   "p\xC3\xA4ss w\xC3\xB6rd",
                                   std::string(480, 'x'),
                                   std::string(2000, 'y'),
                                   std::string("nul\0inside", 10)};
  for (const std::string& password : passwords) {
    std::optional<std::string> sealed = Protect(password);
    ASSERT_TRUE(sealed) << password.size();
    EXPECT_EQ(sealed->size(), 5 + password.size() + 28);
    EXPECT_EQ(sealed->find("mzt58"), std::string::npos);
    EXPECT_EQ(Unprotect(Base64Decode(Base64Encode(*sealed))), password) << password.size();
  }
  // Only the 480-byte password needed a second, larger buffer (513 bytes).
  EXPECT_EQ(m_sink.texts, std::vector<std::string>{"Resizing encryption buffer: 513"});

  struct stat info {};
  ASSERT_EQ(stat(m_dir.File("hostkey.bin").c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 0777, 0600u);
  EXPECT_EQ(info.st_size, 32);
}

TEST_F(RealCipherTest, RefusesOtherKeysAndDamage) {
  refhost::PasswordService service(m_dir.File("hostkey.bin"));
  Use(service);
  std::optional<std::string> sealed = Protect("secret");
  ASSERT_TRUE(sealed);

  // The key file is kept: a new service with it still opens the password.
  refhost::PasswordService again(m_dir.File("hostkey.bin"));
  Use(again);
  EXPECT_EQ(Unprotect(*sealed), "secret");

  refhost::PasswordService other(m_dir.File("otherkey.bin"));
  Use(other);
  std::string damaged = *sealed;
  damaged[20] ^= 1;
  struct Case {
    refhost::PasswordService* service;
    std::string bytes;
  };
  const Case cases[] = {
      {&other, *sealed}, {&service, damaged}, {&service, sealed->substr(0, 27)}, {&service, ""}};
  for (const Case& c : cases) {
    Use(*c.service);
    m_sink.texts.clear();
    EXPECT_FALSE(Unprotect(c.bytes));
    EXPECT_EQ(m_sink.texts, std::vector<std::string>{"decyrption error: -4"});
  }
}

TEST_F(RealCipherTest, ServiceRefusesMalformedRequests) {
  refhost::PasswordService service(m_dir.File("hostkey.bin"));
  std::vector<char> buffer(64, 'a');
  struct Case {
    uint32_t code;
    uint32_t extSize;
    int32_t inputLength;
    bool withData;
  };
  const Case cases[] = {{0x01000002, 151, 5, true},
                        {0x01000002, 152, 65, true},
                        {0x01000002, 152, -1, true},
                        {0x01000002, 152, 5, false},
                        {0x01000003, 152, 5, true}};
  for (const Case& c : cases) {
    HostRequest request = core::MakeHostRequest(kModuleId, kClassCrypto, c.code);
    request.length = static_cast<uint32_t>(buffer.size());
    request.data = c.withData ? buffer.data() : nullptr;
    request.extSize = c.extSize;
    request.extVersion = 1;
    request.extValue = c.inputLength;
    EXPECT_EQ(service.Handle(request), refhost::PasswordService::kBadRequest);
  }
  // Too small a buffer is answered with the size needed.
  HostRequest request = core::MakeHostRequest(kModuleId, kClassCrypto, 0x01000002);
  request.length = static_cast<uint32_t>(buffer.size());
  request.data = buffer.data();
  request.extSize = 152;
  request.extVersion = 1;
  request.extValue = 40;
  EXPECT_EQ(service.Handle(request), 68);
}

}  // namespace
}  // namespace hx
