#include <gtest/gtest.h>
#include <sys/wait.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <cstring>
#include <filesystem>
#include <future>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "tests/support/host_fixture.h"
#include "tests/support/module_hooks.h"

namespace {

using testhooks::ProcessRunResult;
using testsupport::ReadFile;

constexpr auto kRunTimeout = std::chrono::seconds(30);

using hx::core::ProcessMessageHeader;

ProcessMessageHeader HeaderOf(const std::string& message) {
  ProcessMessageHeader header{};
  memcpy(&header, message.data(), std::min(message.size(), sizeof(header)));
  return header;
}

std::string Message(uint32_t length, uint32_t id, uint32_t type, uint32_t value,
                    const std::string& payload) {
  const ProcessMessageHeader header{length, id, type, value};
  return std::string(reinterpret_cast<const char*>(&header), sizeof(header)) + payload;
}

std::string Message(uint32_t id, uint32_t type, uint32_t value, const std::string& payload) {
  return Message(static_cast<uint32_t>(16 + payload.size()), id, type, value, payload);
}

class HostProcessTest : public testsupport::ModuleHostTest {
 protected:
  void Start() {
    StartHost();
    m_run = reinterpret_cast<testhooks::RunProcessFn>(host().Hook("RunProcess"));
    ASSERT_NE(m_run, nullptr);
  }

  ProcessRunResult Run(const std::vector<std::string>& arguments, const std::string& input = "") {
    ProcessRunResult result;
    m_run(arguments, input, result);
    return result;
  }

  // Runs on another thread; the result must be taken within the time-out.
  std::future<ProcessRunResult> RunAsync(std::vector<std::string> arguments,
                                         std::string input = "") {
    return std::async(std::launch::async,
                      [this, arguments, input] { return Run(arguments, input); });
  }

  // The result of a run started by RunAsync. A run that does not end is a
  // failure; Close then releases it, so that the test ends.
  ProcessRunResult Await(std::future<ProcessRunResult>& run) {
    if (run.wait_for(kRunTimeout) != std::future_status::ready) {
      ADD_FAILURE() << "the run did not end";
      host().CloseModule();
    }
    return run.get();
  }

  std::vector<ProcessMessageHeader> SentMessages() {
    std::vector<ProcessMessageHeader> messages;
    for (const auto& request : host().Requests().OfClass(hx::core::kClassProcess)) {
      messages.push_back(HeaderOf(request.bytes));
    }
    return messages;
  }

  // Waits until the module has sent `count` messages of `type`.
  bool WaitForSent(uint32_t type, size_t count) {
    return host().Requests().WaitFor(
        [&](const std::vector<refhost::RecordedRequest>& requests) {
          size_t seen = 0;
          for (const auto& request : requests) {
            if (request.requestClass == hx::core::kClassProcess &&
                HeaderOf(request.bytes).type == type) {
              ++seen;
            }
          }
          return seen >= count;
        },
        std::chrono::seconds(20));
  }

  testhooks::RunProcessFn m_run = nullptr;
};

TEST_F(HostProcessTest, ProgramsReportOutputAndExitCode) {
  ASSERT_NO_FATAL_FAILURE(Start());
  struct Case {
    const char* script;
    std::string input;
    int32_t exitCode;
    std::vector<std::string> errorLines;
    std::string output;
  };
  const Case cases[] = {
      {"echo out1; echo err1 >&2; printf 'err2\\r\\n' >&2; exit 3",
       "",
       3,
       {"err1", "err2"},
       "out1\n"},
      {"printf last >&2", "", 0, {"last"}, ""},
      // The carriage return and its line feed arrive in different pieces.
      {"printf 'ab\\r' >&2; sleep 0.2; printf '\\ncd\\n' >&2", "", 0, {"ab", "cd"}, ""},
      {"cat >&2", "x\ny", 0, {"x", "y"}, ""},
      {"kill -TERM $$", "", 128 + 15, {}, ""},
      // Input the program never reads is dropped, not fatal to the host.
      {"exit 5", std::string(300000, 'i'), 5, {}, ""},
      // A child left behind does not hold the run open.
      {"sleep 30 & echo started", "", 0, {}, "started\n"},
  };
  for (const Case& c : cases) {
    ProcessRunResult result = Run({"/bin/sh", "-c", c.script}, c.input);
    EXPECT_TRUE(result.ran) << c.script;
    EXPECT_EQ(result.exitCode, c.exitCode) << c.script;
    EXPECT_EQ(result.errorLines, c.errorLines) << c.script;
    EXPECT_EQ(result.output, c.output) << c.script;
  }
}

TEST_F(HostProcessTest, LargeInputArrivesWhole) {
  ASSERT_NO_FATAL_FAILURE(Start());
  for (size_t length : {size_t{70000}, size_t{65520}, size_t{2 * 65520}}) {
    std::string input(length, '\0');
    for (size_t i = 0; i < length; ++i) input[i] = static_cast<char>('a' + i % 26);
    host().Requests().Clear();
    // A program that reads to the end of its input ends only when the host
    // closes it, also when the input fills whole messages.
    auto run = RunAsync({"/bin/sh", "-c", "cat > got.bin"}, input);
    ProcessRunResult result = Await(run);
    EXPECT_TRUE(result.ran);
    EXPECT_EQ(result.exitCode, 0);
    EXPECT_EQ(ReadFile(dir().File("got.bin")), input) << length;
    std::vector<uint32_t> inputLengths;
    for (const ProcessMessageHeader& message : SentMessages()) {
      if (message.type == 0) inputLengths.push_back(message.length);
    }
    std::vector<uint32_t> expected = length == 70000 ? std::vector<uint32_t>{65536, 4496}
                                                     : std::vector<uint32_t>(length / 65520, 65536);
    if (length % 65520 == 0) expected.push_back(16);
    EXPECT_EQ(inputLengths, expected) << length;
  }
}

TEST_F(HostProcessTest, TransferToolNameRunsTheConfiguredTool) {
  Options().transferTool = "/bin/echo";
  ASSERT_NO_FATAL_FAILURE(Start());
  ProcessRunResult echoed = Run({"./curl", "--url", "smtp://x"});
  EXPECT_TRUE(echoed.ran);
  EXPECT_EQ(echoed.output, "--url smtp://x\n");
}

TEST_F(HostProcessTest, TransferToolIsCurlByDefault) {
  ASSERT_NO_FATAL_FAILURE(Start());
  ProcessRunResult version = Run({"./curl", "-V"});
  ASSERT_TRUE(version.ran);
  EXPECT_EQ(version.exitCode, 0);
  EXPECT_EQ(version.output.rfind("curl ", 0), 0u) << version.output;
  EXPECT_NE(version.output.find("smtp"), std::string::npos);
}

TEST_F(HostProcessTest, MissingProgramsFailToStart) {
  ASSERT_NO_FATAL_FAILURE(Start());
  for (const char* program : {"/nonexistent/tool", "no-such-program-on-path", ""}) {
    ProcessRunResult result = Run({program, "x"});
    EXPECT_FALSE(result.ran) << program;
  }
  // The service is still usable afterwards.
  EXPECT_TRUE(Run({"/bin/true"}).ran);
}

TEST_F(HostProcessTest, StartAfterCloseSendsNothing) {
  ASSERT_NO_FATAL_FAILURE(Start());
  host().CloseModule();
  const size_t sent = SentMessages().size();
  EXPECT_FALSE(Run({"/bin/true"}).ran);
  EXPECT_EQ(SentMessages().size(), sent);
}

TEST_F(HostProcessTest, CloseReleasesAWaitingRun) {
  ASSERT_NO_FATAL_FAILURE(Start());
  auto run = RunAsync({"/bin/sh", "-c", "sleep 60"});
  ASSERT_TRUE(WaitForSent(0, 1));  // the input follows the answered start
  host().CloseModule();
  EXPECT_FALSE(Await(run).ran);
  // Stopping the host ends the program and reaps it.
  host().Stop();
  errno = 0;
  EXPECT_EQ(waitpid(-1, nullptr, WNOHANG), -1);
  EXPECT_EQ(errno, ECHILD);
}

size_t OpenDescriptors() {
  size_t count = 0;
  for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
    (void)entry;
    ++count;
  }
  return count;
}

TEST_F(HostProcessTest, RunsLeaveNoDescriptorsOrProcessesBehind) {
  const size_t before = OpenDescriptors();
  ASSERT_NO_FATAL_FAILURE(Start());
  for (int i = 0; i < 10; ++i) EXPECT_TRUE(Run({"/bin/sh", "-c", "echo x >&2"}, "in").ran);
  EXPECT_FALSE(Run({"/nonexistent/tool"}).ran);
  host().Stop();
  EXPECT_EQ(OpenDescriptors(), before);
  errno = 0;
  EXPECT_EQ(waitpid(-1, nullptr, WNOHANG), -1);
  EXPECT_EQ(errno, ECHILD);
}

TEST_F(HostProcessTest, LoadAfterStopOpensTheServiceAgain) {
  ASSERT_NO_FATAL_FAILURE(Start());
  host().Stop();
  ASSERT_NO_FATAL_FAILURE(Start());
  ProcessRunResult result = Run({"/bin/sh", "-c", "exit 4"});
  EXPECT_TRUE(result.ran);
  EXPECT_EQ(result.exitCode, 4);
}

TEST_F(HostProcessTest, ConcurrentRunsKeepTheirOwnOutput) {
  ASSERT_NO_FATAL_FAILURE(Start());
  std::vector<std::future<bool>> workers;
  for (int worker = 0; worker < 4; ++worker) {
    workers.push_back(std::async(std::launch::async, [this, worker] {
      bool allRight = true;
      for (int i = 0; i < 8; ++i) {
        std::string tag = std::to_string(worker) + "-" + std::to_string(i);
        ProcessRunResult result = Run({"/bin/sh", "-c", "cat >&2; exit " + std::to_string(i)}, tag);
        allRight = allRight && result.ran && result.exitCode == i &&
                   result.errorLines == std::vector<std::string>{tag};
      }
      return allRight;
    }));
  }
  for (auto& worker : workers) {
    if (worker.wait_for(kRunTimeout) != std::future_status::ready) {
      ADD_FAILURE() << "a worker did not end";
      host().CloseModule();
    }
    EXPECT_TRUE(worker.get());
  }
}

// The host's service alone, fed with requests the module would never make.
TEST(HostProcessServiceTest, RefusesMalformedRequests) {
  std::mutex mutex;
  std::condition_variable arrived;
  std::vector<std::string> delivered;
  refhost::ProcessService service("curl", [&](const void* data, uint32_t length) {
    std::lock_guard<std::mutex> lock(mutex);
    delivered.emplace_back(static_cast<const char*>(data), length);
    arrived.notify_all();
  });
  auto handle = [&service](std::string bytes) {
    hx::core::HostRequest request =
        hx::core::MakeHostRequest(hx::core::kModuleId, hx::core::kClassProcess, 0);
    request.data = bytes.data();
    request.length = static_cast<uint32_t>(bytes.size());
    return service.Handle(request);
  };
  struct Case {
    const char* name;
    std::string bytes;
    int32_t result;
  };
  const Case cases[] = {
      {"shorter than a header", Message(7, 6, 2, "/bin/true").substr(0, 15), -1},
      {"length field disagrees", Message(99, 7, 6, 2, "/bin/true"), -1},
      {"unknown type", Message(7, 9, 2, "/bin/true"), -1},
      {"answer type from the module", Message(7, 5, 0, ""), -1},
      {"start without program", Message(7, 6, 2, ""), -1},
      {"only the optional texts", Message(7, 6, 2 | 8 | 16, std::string("a\0b", 3)), -1},
      {"longer than the maximum", Message(7, 0, 1, std::string(65521, 'x')), -1},
      {"input for no run", Message(7, 0, 1, "x"), 0},
  };
  for (const Case& c : cases) EXPECT_EQ(handle(c.bytes), c.result) << c.name;
  EXPECT_EQ(service.ActiveRuns(), 0u);

  // An id is not started twice while its program runs.
  EXPECT_EQ(handle(Message(7, 6, 2, std::string("/bin/sh\0-c\0read line", 20))), 0);
  EXPECT_EQ(handle(Message(7, 6, 2, "/bin/true")), -1);
  EXPECT_EQ(handle(Message(7, 0, 1, "go\n")), 0);
  std::unique_lock<std::mutex> lock(mutex);
  ASSERT_TRUE(arrived.wait_for(lock, kRunTimeout, [&] {
    return !delivered.empty() && HeaderOf(delivered.back()).type == 5;
  }));
  EXPECT_EQ(HeaderOf(delivered.front()).type, 3u);
  EXPECT_EQ(HeaderOf(delivered.back()).value, 0u);
}

}  // namespace
