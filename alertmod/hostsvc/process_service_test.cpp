#include "alertmod/hostsvc/process_service.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstring>
#include <future>
#include <mutex>
#include <string>
#include <vector>

#include "alertmod/platform/testing/manual_env.h"

namespace hx {
namespace ipc {
namespace {

constexpr uint32_t kModuleId = 0xC0000;
constexpr auto kWait = std::chrono::seconds(20);

using core::ProcessMessageHeader;

ProcessMessageHeader HeaderOf(const std::string& message) {
  ProcessMessageHeader header{};
  memcpy(&header, message.data(), std::min(message.size(), sizeof(header)));
  return header;
}

std::string Message(uint32_t id, uint32_t type, int32_t value, const std::string& payload = "") {
  const ProcessMessageHeader header{static_cast<uint32_t>(16 + payload.size()), id, type,
                                    static_cast<uint32_t>(value)};
  return std::string(reinterpret_cast<const char*>(&header), sizeof(header)) + payload;
}

ProcessOptions Opts(std::vector<std::string> arguments, uint32_t flags = kFlagsDefault,
                    std::string firstText = "", std::string secondText = "") {
  return ProcessOptions{std::move(arguments), flags, std::move(firstText), std::move(secondText)};
}

int Deliver(const std::string& message) {
  return OnProcessMessage(message.data(), message.size());
}

// Plays the host: keeps every message the module sends and answers with the
// configured result. The test delivers the host's answers itself.
class FakeService {
 public:
  static FakeService& Instance() {
    static FakeService* service = new FakeService();
    return *service;
  }
  static bool Send(const void* data, uint64_t length) {
    return Instance().Take(std::string(static_cast<const char*>(data), length));
  }

  void Reset() {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_messages.clear();
    m_accept = true;
  }
  void SetAccept(bool accept) {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_accept = accept;
  }
  std::vector<std::string> Messages() {
    std::lock_guard<std::mutex> lock(m_mutex);
    return m_messages;
  }
  // The `count`th message (1-based), waiting for it.
  std::string WaitForMessage(size_t count) {
    std::unique_lock<std::mutex> lock(m_mutex);
    if (!m_arrived.wait_for(lock, kWait, [&] { return m_messages.size() >= count; })) return "";
    return m_messages[count - 1];
  }

 private:
  bool Take(std::string message) {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_messages.push_back(std::move(message));
    m_arrived.notify_all();
    return m_accept;
  }

  std::mutex m_mutex;
  std::condition_variable m_arrived;
  std::vector<std::string> m_messages;
  bool m_accept = true;
};

class ProcessServiceTest : public ::testing::Test {
 protected:
  void SetUp() override {
    FakeService::Instance().Reset();
    Register(&FakeService::Send);
  }
  // Registers again (as a new Load does), with the Env's current values.
  void Register(SendFunction send) { RegisterProcessService(kModuleId, send, nullptr, m_env); }
  void TearDown() override { ShutdownProcessService(false); }

  FakeService& service() { return FakeService::Instance(); }

  hx::platform::ManualEnv m_env;

  // Starts `arguments` on another thread and answers the start with
  // `answerType`; returns the started client.
  std::shared_ptr<client> Start(ProcessOptions options, uint32_t answerType = 3,
                                int32_t answerValue = 0) {
    size_t before = service().Messages().size();
    auto started = std::async(std::launch::async, [options] { return StartProcess(options); });
    std::string start = service().WaitForMessage(before + 1);
    EXPECT_EQ(HeaderOf(start).type, 6u);
    EXPECT_EQ(Deliver(Message(HeaderOf(start).id, answerType, answerValue)), 1);
    return started.get();
  }
};

TEST_F(ProcessServiceTest, StartSendsCommandAndFlags) {
  struct Case {
    ProcessOptions options;
    std::string payload;
    bool endInputAtWait;
  };
  const Case cases[] = {
      {Opts({"./curl", "-V"}), std::string("./curl\0-V", 9), false},
      {Opts({"a.ps1"}), "a.ps1", true},
      {Opts({"A.PS1"}), "A.PS1", false},
      {Opts({".ps1"}), ".ps1", false},
      {Opts({"a.ps1", "x"}, 2 | 4), std::string("a.ps1\0x", 7), false},
      {Opts({"p", ""}, 2 | 8 | 16, "one", "two"), std::string("one\0two\0p\0", 10), false},
      {Opts({"p"}, 8, "", "ignored"), std::string("\0p", 2), false},
  };
  for (const Case& c : cases) {
    std::shared_ptr<client> process = Start(c.options);
    std::string start = service().Messages().back();
    EXPECT_EQ(start.substr(16), c.payload);
    EXPECT_EQ(HeaderOf(start).length, start.size());
    EXPECT_EQ(HeaderOf(start).value, c.options.flags);
    EXPECT_EQ(process->State(), kStateRunning);
    EXPECT_EQ(process->EndsInputAtWait(), c.endInputAtWait) << c.payload;
    EXPECT_EQ(Deliver(Message(process->Id(), 5, 0)), 1);
  }
}

TEST_F(ProcessServiceTest, FailedStarts) {
  // No arguments: nothing is sent.
  EXPECT_EQ(StartProcess(Opts({}))->State(), kStateFailed);
  EXPECT_TRUE(service().Messages().empty());

  // The host answers "failed": its value is kept and the id forgotten.
  std::shared_ptr<client> failed = Start(Opts({"/missing"}), 4, 2);
  EXPECT_EQ(failed->State(), kStateFailed);
  EXPECT_EQ(failed->Value(), 2);
  EXPECT_EQ(Deliver(Message(failed->Id(), 5, 0)), 0);

  // The host takes the start and never answers: once the answer is overdue
  // the start has failed, and a late answer is dropped.
  m_env.SetProcessStartTimeout(std::chrono::milliseconds(50));
  Register(&FakeService::Send);
  std::shared_ptr<client> unanswered = StartProcess(Opts({"/bin/true"}));
  m_env.SetProcessStartTimeout(hx::platform::kDefaultProcessStartTimeout);
  Register(&FakeService::Send);
  EXPECT_EQ(unanswered->State(), kStateFailed);
  EXPECT_EQ(Deliver(Message(unanswered->Id(), 3, 0)), 0);

  // The host refuses the request: the id is never registered.
  service().SetAccept(false);
  std::shared_ptr<client> refused = StartProcess(Opts({"/bin/true"}));
  EXPECT_EQ(refused->State(), kStateFailed);
  EXPECT_EQ(Deliver(Message(refused->Id(), 3, 0)), 0);

  // No send function.
  Register(nullptr);
  EXPECT_EQ(StartProcess(Opts({"/bin/true"}))->State(), kStateFailed);
}

TEST_F(ProcessServiceTest, MalformedMessagesAreIgnored) {
  std::shared_ptr<client> process = Start(Opts({"p"}));
  const std::string header = Message(process->Id(), 1, 0, "x");
  // Exactly as long as given, so that a read past it is caught.
  for (size_t length = 0; length < 16; ++length) {
    std::vector<char> shortMessage(header.begin(), header.begin() + length);
    EXPECT_EQ(OnProcessMessage(length ? shortMessage.data() : nullptr, length), 0) << length;
  }
  EXPECT_EQ(OnProcessMessage(nullptr, 20), 0);
  EXPECT_EQ(Deliver(Message(process->Id(), 0, 0, "x")), 0);
  EXPECT_EQ(Deliver(Message(process->Id(), 6, 0, "x")), 0);
  EXPECT_EQ(Deliver(Message(process->Id() + 1, 1, 0, "x")), 0);
  // The header's own length is not consulted.
  std::string lying = Message(process->Id(), 1, 0, "ok\n");
  lying[0] = 99;
  EXPECT_EQ(Deliver(lying), 1);
  std::string line;
  EXPECT_TRUE(ReadOutputLine(*process, line, 0));
  EXPECT_EQ(line, "ok");
}

TEST_F(ProcessServiceTest, OutputBecomesLines) {
  struct Case {
    std::vector<std::string> pieces;
    std::vector<std::string> lines;
  };
  const Case cases[] = {
      {{"ab\r", "\ncd\n"}, {"ab", "cd"}},
      {{"one\ntwo"}, {"one", "two"}},
      {{"\r\n\r\n", "x\r"}, {"", "", "x"}},
      {{}, {}},
  };
  for (const Case& c : cases) {
    std::shared_ptr<client> process = Start(Opts({"p"}));
    for (const std::string& piece : c.pieces) {
      EXPECT_EQ(Deliver(Message(process->Id(), 2, 0, piece)), 1);
    }
    EXPECT_EQ(Deliver(Message(process->Id(), 5, 7)), 1);
    std::vector<std::string> lines;
    std::string line;
    while (ReadOutputLine(*process, line, 1)) lines.push_back(line);
    EXPECT_EQ(lines, c.lines);
    EXPECT_EQ(process->Value(), 7);
    EXPECT_FALSE(ReadOutputLine(*process, line, 2));
  }
}

TEST_F(ProcessServiceTest, InputIsCutIntoMessages) {
  struct Case {
    uint32_t type;
    size_t length;
    bool sent;
    std::vector<uint32_t> messageLengths;
  };
  const Case cases[] = {
      {0, 0, true, {16}},        {0, 70000, true, {65536, 4496}},
      {0, 65520, true, {65536}}, {0, 2 * 65520 + 1, true, {65536, 65536, 17}},
      {6, 65520, true, {65536}}, {6, 65521, false, {}},
  };
  for (const Case& c : cases) {
    service().Reset();
    std::string data(c.length, 'x');
    EXPECT_EQ(SendProcessMessage(0xC00042, c.type, 1, data.data(), data.size()), c.sent);
    std::vector<uint32_t> lengths;
    for (const std::string& message : service().Messages()) {
      EXPECT_EQ(HeaderOf(message).id, 0xC00042u);
      EXPECT_EQ(HeaderOf(message).type, c.type);
      EXPECT_EQ(HeaderOf(message).value, 1u);
      lengths.push_back(HeaderOf(message).length);
      EXPECT_EQ(message.size(), lengths.back());
    }
    EXPECT_EQ(lengths, c.messageLengths) << c.length;
  }
  // A refused piece ends the message.
  service().Reset();
  service().SetAccept(false);
  std::string data(70000, 'x');
  EXPECT_FALSE(SendProcessMessage(1, 0, 1, data.data(), data.size()));
  EXPECT_EQ(service().Messages().size(), 1u);
}

// Runs a program against the fake and returns the input messages' lengths.
std::vector<uint32_t> RunAndCollectInput(FakeService& service, size_t inputLength) {
  int32_t exitCode = -1;
  std::vector<std::string> errorLines;
  std::string input(inputLength, 'i');
  auto run = std::async(std::launch::async,
                        [&] { return RunProcess({"p"}, input, exitCode, errorLines); });
  const uint32_t id = HeaderOf(service.WaitForMessage(1)).id;
  Deliver(Message(id, 3, 0));
  // Input messages up to the first one shorter than the maximum, which ends
  // the program's input.
  std::vector<uint32_t> lengths;
  for (size_t n = 2;; ++n) {
    std::string message = service.WaitForMessage(n);
    if (message.empty()) break;
    lengths.push_back(HeaderOf(message).length);
    if (lengths.back() < 65536) break;
  }
  Deliver(Message(id, 2, 0, "warn\n"));
  Deliver(Message(id, 5, 3));
  EXPECT_TRUE(run.get());
  EXPECT_EQ(exitCode, 3);
  EXPECT_EQ(errorLines, std::vector<std::string>{"warn"});
  return lengths;
}

TEST_F(ProcessServiceTest, RunProcessAlwaysEndsTheInput) {
  struct Case {
    size_t inputLength;
    std::vector<uint32_t> messageLengths;
  };
  const Case cases[] = {
      {0, {16}},
      {100, {116}},
      {70000, {65536, 4496}},
      {65520, {65536, 16}},
      {2 * 65520, {65536, 65536, 16}},
  };
  for (const Case& c : cases) {
    service().Reset();
    EXPECT_EQ(RunAndCollectInput(service(), c.inputLength), c.messageLengths) << c.inputLength;
  }
}

// A host that takes the start and refuses the input: a program still
// running would never see its input end, so the run is given up at once; one
// that has already exited keeps its result.
TEST_F(ProcessServiceTest, RunProcessGivesUpWhenTheHostRefusesTheInput) {
  struct Case {
    uint32_t answerType;
    bool ran;
  };
  for (const Case& c : {Case{3, false}, Case{5, true}}) {
    service().Reset();
    int32_t exitCode = -1;
    std::vector<std::string> errorLines;
    auto run = std::async(std::launch::async, [&] {
      return RunProcess({"./curl"}, "user = \"u:p\"", exitCode, errorLines);
    });
    const uint32_t id = HeaderOf(service().WaitForMessage(1)).id;
    service().SetAccept(false);
    ASSERT_EQ(Deliver(Message(id, c.answerType, 4)), 1);
    ASSERT_EQ(run.wait_for(kWait), std::future_status::ready) << c.answerType;
    EXPECT_EQ(run.get(), c.ran) << c.answerType;
    EXPECT_EQ(exitCode, c.ran ? 4 : -1);
    EXPECT_EQ(Deliver(Message(id, 5, 0)), 0) << "the id is forgotten";
  }
}

TEST_F(ProcessServiceTest, WaitForExitEndsInputOfPs1Programs) {
  std::shared_ptr<client> process = Start(Opts({"run.ps1"}));
  auto waited = std::async(std::launch::async, [process] { WaitForExit(*process); });
  std::string end = service().WaitForMessage(2);
  EXPECT_EQ(HeaderOf(end).type, 0u);
  EXPECT_EQ(HeaderOf(end).length, 16u);
  EXPECT_EQ(HeaderOf(end).value, 1u);
  Deliver(Message(process->Id(), 5, 0));
  waited.get();
  EXPECT_FALSE(process->EndsInputAtWait());
}

TEST_F(ProcessServiceTest, ShutdownReleasesWaitersAndRefusesStarts) {
  std::shared_ptr<client> running = Start(Opts({"p"}));
  int32_t exitCode = -1;
  std::vector<std::string> errorLines;
  auto run =
      std::async(std::launch::async, [&] { return RunProcess({"q"}, "", exitCode, errorLines); });
  Deliver(Message(HeaderOf(service().WaitForMessage(2)).id, 3, 0));
  service().WaitForMessage(3);  // its input
  auto starting = std::async(std::launch::async, [] { return StartProcess(Opts({"r"})); });
  service().WaitForMessage(4);

  ShutdownProcessService(true);
  EXPECT_FALSE(run.get());
  EXPECT_EQ(exitCode, -1);
  EXPECT_EQ(starting.get()->State(), kStateFailed);
  EXPECT_EQ(running->State(), kStateFailed);
  EXPECT_EQ(Deliver(Message(running->Id(), 5, 0)), 0);

  const size_t sent = service().Messages().size();
  EXPECT_EQ(StartProcess(Opts({"p"}))->State(), kStateFailed);
  EXPECT_FALSE(RunProcess({"p"}, "x", exitCode, errorLines));
  EXPECT_EQ(service().Messages().size(), sent);

  // A new Load opens the service again.
  Register(&FakeService::Send);
  EXPECT_EQ(Start(Opts({"p"}))->State(), kStateRunning);
}

TEST_F(ProcessServiceTest, IdsWrapAroundToTheNextFreeOne) {
  m_env.SetInitialProcessIdCounter(0xC00000 | 0xFFFFE);
  Register(&FakeService::Send);
  std::shared_ptr<client> last = Start(Opts({"p"}));
  EXPECT_EQ(last->Id(), 0xCFFFFFu);
  std::shared_ptr<client> wrapped = Start(Opts({"p"}));
  EXPECT_EQ(wrapped->Id(), 0xC00000u);
  // 0xC00000 still runs: the next start after another wrap skips it.
  m_env.SetInitialProcessIdCounter(0xCFFFFF);
  Register(&FakeService::Send);
  EXPECT_EQ(Start(Opts({"p"}))->Id(), 0xC00001u);
}

}  // namespace
}  // namespace ipc
}  // namespace hx
