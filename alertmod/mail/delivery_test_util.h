// Test doubles for the delivery side of the mail subsystem: a NotifyHelper
// whose program runs follow a script, and a file stream whose free space the
// test sets. Test-only; single-threaded.
#ifndef ALERTMOD_MAIL_DELIVERY_TEST_UTIL_H_
#define ALERTMOD_MAIL_DELIVERY_TEST_UTIL_H_

#include <algorithm>
#include <deque>
#include <string>
#include <utility>
#include <vector>

#include "alertmod/mail/notify_file_stream.h"
#include "alertmod/mail/notify_helper.h"
#include "alertmod/platform/file_system.h"
#include "alertmod/platform/testing/manual_env.h"
#include "tests/support/fake_host.h"
#include "tests/support/temp_dir.h"

namespace hx {

// Exit codes for successive runs; kNotStarted makes a run fail to start.
constexpr int32_t kNotStarted = -1000;

class ScriptedHelper final : public NotifyHelper {
 public:
  explicit ScriptedHelper(testsupport::FakeHost& host,
                          platform::Env& env = *platform::SystemEnvForTests())
      : NotifyHelper(host.callback(), env) {}

  void ReportStatus(int32_t profileId, int32_t status) override {
    statuses.emplace_back(profileId, status);
  }
  bool RunProcess(const std::vector<std::string>& arguments, const std::string& input,
                  int32_t& exitCode, std::vector<std::string>& errorLines) override {
    runs.push_back(arguments);
    inputs.push_back(input);
    // The job removes a message file once it is sent; keep what was sent.
    auto file = std::find(arguments.begin(), arguments.end(), "-T");
    bool named = file != arguments.end() && file + 1 != arguments.end();
    messages.push_back(named ? testsupport::ReadFile(*(file + 1)) : std::string());
    int32_t next = exitCodes.empty() ? 0 : exitCodes.front();
    if (!exitCodes.empty()) exitCodes.pop_front();
    if (next == kNotStarted) return false;
    exitCode = next;
    errorLines = output;
    return true;
  }

  std::deque<int32_t> exitCodes;
  std::vector<std::string> output;
  std::vector<std::vector<std::string>> runs;
  std::vector<std::string> inputs;
  std::vector<std::string> messages;  // the message file's content at each run
  std::vector<std::pair<int32_t, int32_t>> statuses;
};

// Writes nothing; removes real files; reports the free bytes the test sets,
// one value per query (the last one repeats).
class FakeStream final : public INotifyFileStream {
 public:
  bool Open(const std::string&, std::ios_base::openmode) override { return true; }
  void Close() override {}
  bool IsGood() const override { return true; }
  bool Failed() const override { return false; }
  INotifyFileStream& WriteStream(std::streambuf*) override { return *this; }
  INotifyFileStream& WriteUInt(uint32_t) override { return *this; }
  INotifyFileStream& WriteText(const char*) override { return *this; }
  INotifyFileStream& WriteString(const std::string&) override { return *this; }
  uint64_t Position() override { return 0; }
  uint64_t FreeBytes(const std::string&) override {
    uint64_t bytes = freeBytes.front();
    if (freeBytes.size() > 1) freeBytes.pop_front();
    return bytes;
  }
  bool CreateDirectory(const std::string&) override { return true; }
  bool RemoveFile(const std::string& path) override {
    removed.push_back(path);
    return platform::DeleteFile(path).ok();
  }

  std::deque<uint64_t> freeBytes{uint64_t{1} << 40};
  std::vector<std::string> removed;
};

}  // namespace hx

#endif  // ALERTMOD_MAIL_DELIVERY_TEST_UTIL_H_
