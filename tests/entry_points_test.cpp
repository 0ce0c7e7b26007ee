// The seven exports as the host sees them: the built file's symbol table, the
// records they read and write, and the lifecycle of the lent threads.
#include <gtest/gtest.h>

#include <cstdio>
#include <cstring>
#include <set>
#include <string>

#include "host/module_library.h"
#include "tests/support/host_fixture.h"

namespace {

using namespace std::chrono_literals;
using hx::core::HostRequest;

std::set<std::string> DefinedDynamicSymbols(const std::string& path) {
  std::string command = "nm -D --defined-only '" + path + "'";
  FILE* pipe = popen(command.c_str(), "r");
  EXPECT_NE(pipe, nullptr) << "nm is needed for this test";
  std::set<std::string> names;
  if (pipe == nullptr) return names;
  char line[512];
  while (fgets(line, sizeof(line), pipe) != nullptr) {
    char address[64], type[8], name[256];
    if (sscanf(line, "%63s %7s %255s", address, type, name) == 3) names.insert(name);
  }
  EXPECT_EQ(pclose(pipe), 0) << command;
  return names;
}

TEST(ExportedSymbolsTest, TheModuleExportsExactlyTheSevenEntryPoints) {
  std::set<std::string> expected = {"Load", "Unload", "Open", "Close", "Read", "Write", "IOCTL"};
  EXPECT_EQ(DefinedDynamicSymbols(testsupport::ProductionModulePath()), expected);
}

// Direct calls into the module, without a reference host, for the cases that
// need exact control of the records.
class RawExportsTest : public ::testing::Test {
 protected:
  void SetUp() override {
    std::string error;
    m_module = refhost::ModuleLibrary::Open(testsupport::TestingModulePath(), &error);
    ASSERT_TRUE(m_module) << error;
  }
  void TearDown() override {
    if (m_loaded) {
      m_module->close();
      m_module->unload();
    }
  }
  void LoadWith(hx::core::LoadParmsOut* out) {
    hx::core::LoadParmsIn in{};
    in.callback = &RawExportsTest::Callback;
    EXPECT_EQ(m_module->load(&in, out), 0);
    m_loaded = true;
  }
  static int32_t Callback(HostRequest* request, void*) {
    return request->requestClass == hx::core::kClassLog ? 100 : 0;  // log nothing
  }

  std::unique_ptr<refhost::ModuleLibrary> m_module;
  bool m_loaded = false;
};

TEST_F(RawExportsTest, LoadFillsOnlyItsFieldsOfTheOutRecord) {
  hx::core::LoadParmsOut out;
  memset(&out, 0xAB, sizeof(out));
  LoadWith(&out);
  EXPECT_EQ(out.moduleId, 0xC0000u);
  EXPECT_EQ(out.capabilityWord1, 0x0200006Cu);
  EXPECT_EQ(out.capabilityWord2, 0x02000010u);
  EXPECT_EQ(out.capabilityWord3, 0x02000000u);
  EXPECT_EQ(out.flag34, 1);
  EXPECT_EQ(out.flag36, 1);
  EXPECT_EQ(out.flag37, 1);
  const auto* bytes = reinterpret_cast<const uint8_t*>(&out);
  std::set<size_t> written;
  for (size_t field : {0x08, 0x0C, 0x14, 0x20}) {
    for (size_t i = 0; i < 4; ++i) written.insert(field + i);
  }
  written.insert({0x34, 0x36, 0x37});
  for (size_t i = 0; i < sizeof(out); ++i) {
    if (written.count(i) == 0) {
      EXPECT_EQ(bytes[i], 0xAB) << "byte " << i;
    }
  }
}

TEST_F(RawExportsTest, WriteSetsFrameKeptOnlyForFrames) {
  hx::core::LoadParmsOut loadOut{};
  LoadWith(&loadOut);
  const uint8_t frame[64] = {0};
  struct Case {
    uint32_t requestClass;
    uint32_t source;
    uint32_t expected;
  };
  const Case cases[] = {
      {hx::core::kWriteClassFrame, 0x123, 0},  // an unknown stream is refused
      {hx::core::kWriteClassTick, hx::core::kModuleId, 0xABABABAB},
      {7, hx::core::kModuleId, 0xABABABAB},  // ignored
      {hx::core::kWriteClassTick, 0x50000, 0xABABABAB},
  };
  for (const Case& c : cases) {
    hx::core::WriteParmsIn in{};
    in.requestClass = c.requestClass;
    in.source = c.source;
    in.data = frame;
    in.length = sizeof(frame);
    hx::core::WriteParmsOut out;
    memset(&out, 0xAB, sizeof(out));
    EXPECT_EQ(m_module->write(&in, &out), 0);
    EXPECT_EQ(out.frameKept, c.expected) << "class " << c.requestClass;
  }
}

TEST_F(RawExportsTest, UnknownCodesAndModesReturnAtOnce) {
  hx::core::LoadParmsOut loadOut{};
  LoadWith(&loadOut);
  for (uint32_t code : {0u, 3u, 5u, 6u, 99u, 0xFFFFFFFFu}) {
    hx::core::IoctlParmsIn in{};
    in.code = code;
    EXPECT_EQ(m_module->ioctl(&in), 0) << code;
  }
  for (uint32_t mode : {1u, 2u, 0x80000000u}) {
    hx::core::ReadParmsIn in{};
    in.mode = mode;
    EXPECT_EQ(m_module->read(&in), 0) << mode;  // would block forever in mode 0
  }
  EXPECT_EQ(m_module->write(nullptr, nullptr), 0);
  EXPECT_EQ(m_module->ioctl(nullptr), 0);
  EXPECT_EQ(m_module->read(nullptr), 0);
}

TEST_F(RawExportsTest, WithoutLoadEveryEntryPointDoesNothing) {
  EXPECT_EQ(m_module->unload(), 0);
  EXPECT_EQ(m_module->unload(), 0);
  EXPECT_EQ(m_module->open(), 0);
  hx::core::IoctlParmsIn worker{};
  worker.code = hx::core::kIoctlRunWorker;
  EXPECT_EQ(m_module->ioctl(&worker), 0);  // no manager: returns at once
  hx::core::ReadParmsIn watchdog{};
  EXPECT_EQ(m_module->read(&watchdog), 0);
  hx::core::WriteParmsIn frame{};
  frame.requestClass = hx::core::kWriteClassFrame;
  hx::core::WriteParmsOut out{};
  out.frameKept = 7;
  EXPECT_EQ(m_module->write(&frame, &out), 0);
  EXPECT_EQ(out.frameKept, 0u);
  EXPECT_EQ(m_module->close(), 0);
}

TEST_F(RawExportsTest, UnloadTwiceAfterLoad) {
  hx::core::LoadParmsOut loadOut{};
  LoadWith(&loadOut);
  EXPECT_EQ(m_module->close(), 0);
  EXPECT_EQ(m_module->unload(), 0);
  EXPECT_EQ(m_module->unload(), 0);
  m_loaded = false;
}

class LifecycleTest : public testsupport::ModuleHostTest {
 protected:
  size_t TickRequests() { return host().Requests().OfClass(hx::core::kClassWatchdogTick).size(); }
  bool WaitForTicks(size_t n) {
    return host().Requests().WaitFor(
        [&](const auto& requests) {
          size_t ticks = 0;
          for (const auto& r : requests) ticks += r.requestClass == hx::core::kClassWatchdogTick;
          return ticks >= n;
        },
        20s);
  }
};

TEST_F(LifecycleTest, WatchdogTicksUntilClose) {
  StartHost(/*watchdogPeriodMs=*/5);
  ASSERT_TRUE(WaitForTicks(3));
  for (const auto& tick : host().Requests().OfClass(hx::core::kClassWatchdogTick)) {
    EXPECT_EQ(tick.code, 0x01000000u);
    EXPECT_EQ(tick.requester, 0xC0000u);
    EXPECT_EQ(tick.length, 0u);
  }
  // Stop returns only once Close has woken the watchdog and its lent thread
  // has left the module; a watchdog that kept ticking would hang it here.
  host().Stop();
}

TEST_F(LifecycleTest, AFailingTickIsReportedAndTickingGoesOn) {
  CreateHost(/*watchdogPeriodMs=*/5);
  host().SetTickResult(-7);
  testing::internal::CaptureStderr();
  std::string error;
  ASSERT_TRUE(host().Start(&error)) << error;
  bool ticked = WaitForTicks(3);
  host().Stop();
  std::string err = testing::internal::GetCapturedStderr();
  ASSERT_TRUE(ticked);
  EXPECT_NE(err.find("Alertmod: watch dog event ret -7Alertmod: watch dog event ret -7"),
            std::string::npos)
      << err;
}

TEST_F(LifecycleTest, CloseBeforeTheThreadsAreLent) {
  CreateHost();
  std::string error;
  ASSERT_TRUE(host().LoadModule(&error)) << error;
  host().OpenModule();
  host().CloseModule();
  host().LendThreads();
  host().JoinThreads();  // both return: the stop item was waiting at the head
  host().Stop();
}

TEST_F(LifecycleTest, StopsWhileIdleWithTheDefaultPeriod) {
  StartHost();
  host().Stop();
  EXPECT_EQ(TickRequests(), 0u);
}

}  // namespace
