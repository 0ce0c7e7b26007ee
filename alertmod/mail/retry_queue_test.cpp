#include "alertmod/mail/retry_queue.h"

#include <gtest/gtest.h>

#include "alertmod/diag/log.h"
#include "alertmod/mail/delivery_test_util.h"
#include "alertmod/platform/testing/manual_env.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace {

constexpr uint64_t kMiB = 1048576;
constexpr int32_t kTwoDays = 172800;

// An Env whose tick is the test's variable.
class VariableTickEnv final : public platform::EnvWrapper {
 public:
  explicit VariableTickEnv(const uint32_t* tick)
      : EnvWrapper(platform::SystemEnvForTests()), m_tick(tick) {}
  uint32_t TickMs() override { return *m_tick; }

 private:
  const uint32_t* const m_tick;
};

class RetryQueueTest : public ::testing::Test {
 protected:
  RetryQueueTest() : m_chdir(m_dir.path()), m_helper(m_host) {}

  // A message file on disk of `size` bytes, as a failed delivery leaves it.
  MailFile Message(const std::string& name, uint64_t size = 100, uint32_t profileId = 3) {
    MailFile mail;
    mail.path = m_dir.File(name);
    mail.size = size;
    mail.profileId = profileId;
    mail.profileDescription = "profile-" + name;
    testsupport::WriteFile(mail.path, "x");
    return mail;
  }
  void Enqueue(const MailFile& mail, int32_t limit = 100) {
    m_queue.Enqueue(m_helper, mail, {SmtpServer{}}, limit, m_stream);
  }
  void Pass(int32_t maxRetrySeconds = kTwoDays) {
    m_queue.RetryPass(m_helper, m_stream, maxRetrySeconds);
  }
  void AdvanceSeconds(uint64_t seconds) { m_tick += static_cast<uint32_t>(seconds * 1000); }
  bool LogHas(const std::string& text) { return m_host.Log().Contains(text); }

  uint32_t m_tick = 5000;
  VariableTickEnv m_env{&m_tick};
  testsupport::TempDir m_dir;
  testsupport::ScopedChdir m_chdir;
  testsupport::FakeHost m_host;
  ScriptedHelper m_helper;
  FakeStream m_stream;
  RetryQueue m_queue{m_env};
};

TEST_F(RetryQueueTest, QueueLimitDropsTheOldestOnly) {
  MailFile first = Message("m1"), second = Message("m2"), third = Message("m3");
  Enqueue(first, 2);
  Enqueue(second, 2);
  Enqueue(third, 2);
  EXPECT_EQ(m_queue.Size(), 2u);
  EXPECT_TRUE(LogHas("Maximum failed message queue limit of 2 is exceeded."));
  EXPECT_TRUE(LogHas("Message for profile profile-m1 will be discarded"));
  EXPECT_FALSE(testsupport::FileExists(first.path));
  EXPECT_TRUE(testsupport::FileExists(second.path));
  EXPECT_TRUE(testsupport::FileExists(third.path));
  EXPECT_EQ(m_queue.Sequence(), 3u);
}

TEST_F(RetryQueueTest, LowFreeSpacePurgesLargeOldMessages) {
  struct Case {
    uint64_t freshQuery;
    bool queued;
  };
  for (Case c : {Case{100 * kMiB, true}, Case{99 * kMiB, false}}) {
    RetryQueue queue(m_env);
    FakeStream stream;
    MailFile small = Message("small", 2048), six = Message("six", 6 * kMiB),
             eight = Message("eight", 8 * kMiB), fresh = Message("new", 5 * kMiB);
    for (const MailFile& m : {small, six, eight}) queue.Enqueue(m_helper, m, {}, 100, stream);
    stream.freeBytes = {90 * kMiB, c.freshQuery};
    queue.Enqueue(m_helper, fresh, {}, 100, stream);
    EXPECT_TRUE(testsupport::FileExists(small.path));
    EXPECT_FALSE(testsupport::FileExists(six.path));
    EXPECT_FALSE(testsupport::FileExists(eight.path));
    EXPECT_EQ(testsupport::FileExists(fresh.path), c.queued);
    EXPECT_EQ(queue.Size(), c.queued ? 2u : 1u);
  }
  EXPECT_TRUE(
      LogHas("Available bytes 94371840 are less than threshold of 104857600. Attempting "
             "to purge failed notifications"));
  EXPECT_TRUE(LogHas("Minimum free space threshold exceeded. Message for profile profile-six"));
  EXPECT_TRUE(
      LogHas("Unable to free up space by removing items from notification retry queue. "
             "Message ("));
}

TEST_F(RetryQueueTest, NothingToPurgeDiscardsTheNewMessage) {
  m_stream.freeBytes = {50 * kMiB};
  MailFile mail = Message("m1", 10 * kMiB);
  Enqueue(mail);
  EXPECT_TRUE(m_queue.Empty());
  EXPECT_FALSE(testsupport::FileExists(mail.path));
  EXPECT_EQ(m_host.LogTexts(LogLevelWarning).size(), 1u);
}

TEST_F(RetryQueueTest, BackoffDoublesAfterEachCompletedCycle) {
  Enqueue(Message("m1"));
  m_helper.exitCodes = {7, 7, 7, 7};
  uint32_t start = m_tick;
  struct Step {
    uint32_t atMs;  // after the enqueue
    size_t runs;    // attempts so far
  };
  const Step steps[] = {
      {59999, 0},           // not yet due
      {60000, 1},           // first retry
      {60001, 1},           // the cycle is complete: back-off 2 min
      {60001 + 119999, 1},  // not yet
      {60001 + 120000, 2},  // second retry
      {60002 + 120000, 2},  // cycle complete: back-off 4 min
      {60002 + 360000, 3},  // third retry
  };
  for (const Step& step : steps) {
    m_tick = start + step.atMs;
    Pass();
    EXPECT_EQ(m_helper.runs.size(), step.runs) << step.atMs;
  }
  EXPECT_EQ(m_queue.Size(), 1u);
  EXPECT_TRUE(LogHas("Retrying failed notification for file "));
}

TEST_F(RetryQueueTest, BackoffSurvivesTickWrapAround) {
  m_tick = 0xFFFFFFFFu - 30000;
  Enqueue(Message("m1"));
  m_helper.exitCodes = {0};
  m_tick += 59999;  // wrapped, still 1 ms early
  Pass();
  EXPECT_TRUE(m_helper.runs.empty());
  m_tick += 1;
  Pass();
  EXPECT_EQ(m_helper.runs.size(), 1u);
  EXPECT_TRUE(m_queue.Empty());
}

TEST_F(RetryQueueTest, SuccessReportsStatusAndRemovesTheFile) {
  MailFile mail = Message("m1", 100, 4);
  Enqueue(mail);
  m_helper.exitCodes = {0};
  AdvanceSeconds(60);
  Pass();
  EXPECT_TRUE(m_queue.Empty());
  EXPECT_FALSE(testsupport::FileExists(mail.path));
  EXPECT_EQ(m_helper.statuses, (std::vector<std::pair<int32_t, int32_t>>{{4, 0}}));
  EXPECT_TRUE(LogHas("Retry for notification file (" + mail.path + ") suceeded."));
}

TEST_F(RetryQueueTest, PermanentFailureOnRetryDiscards) {
  MailFile mail = Message("m1");
  Enqueue(mail);
  m_helper.exitCodes = {67};
  AdvanceSeconds(60);
  Pass();
  EXPECT_TRUE(m_queue.Empty());
  EXPECT_FALSE(testsupport::FileExists(mail.path));
  EXPECT_TRUE(m_helper.statuses.empty());
  EXPECT_TRUE(LogHas("Retry timeout reached for notification file (" + mail.path +
                     ").  Message for profile profile-m1 will be discarded"));
}

// Drives passes every minute until the message leaves the queue; returns how
// many seconds after the first failure that happened.
uint64_t SecondsUntilDiscarded(RetryQueue& queue, ScriptedHelper& helper, FakeStream& stream,
                               uint32_t& tick, int32_t maxRetrySeconds) {
  uint64_t elapsed = 0;
  while (!queue.Empty() && elapsed < 400ull * 86400) {
    helper.exitCodes = {7};
    tick += 60000;
    elapsed += 60;
    queue.RetryPass(helper, stream, maxRetrySeconds);
  }
  return elapsed;
}

TEST_F(RetryQueueTest, RetryWindowEndsTheRetries) {
  struct Case {
    int32_t maxRetrySeconds;
    uint64_t atLeast;
    uint64_t atMost;
  };
  const Case cases[] = {
      {kTwoDays, kTwoDays, kTwoDays + 3 * 86400},
      // Longer than the tick's signed range: still measured correctly.
      {40 * 86400, 40 * 86400, 60 * 86400},
      {0, 60, 60},
  };
  for (const Case& c : cases) {
    RetryQueue queue(m_env);
    queue.Enqueue(m_helper, Message("w" + std::to_string(c.maxRetrySeconds)), {SmtpServer{}}, 100,
                  m_stream);
    uint64_t seconds = SecondsUntilDiscarded(queue, m_helper, m_stream, m_tick, c.maxRetrySeconds);
    EXPECT_GE(seconds, c.atLeast) << c.maxRetrySeconds;
    EXPECT_LE(seconds, c.atMost) << c.maxRetrySeconds;
  }
}

TEST_F(RetryQueueTest, BackoffStopsGrowingBeforeItOverflows) {
  Enqueue(Message("m1"));
  for (int cycle = 0; cycle < 40; ++cycle) {
    m_helper.exitCodes = {7};
    m_tick = m_queue.NextRetry();
    Pass(0x7FFFFFFF);
    m_tick += 1;
    Pass(0x7FFFFFFF);
  }
  EXPECT_EQ(m_queue.Backoff(), kLongestBackoffMs);
  // The next cycle is still in the future, not taken for the past.
  size_t runs = m_helper.runs.size();
  m_tick += 1;
  Pass(0x7FFFFFFF);
  EXPECT_EQ(m_helper.runs.size(), runs);
}

TEST_F(RetryQueueTest, ClearDiscardsEveryMessage) {
  MailFile a = Message("a"), b = Message("b"), c = Message("c");
  for (const MailFile& m : {a, b, c}) Enqueue(m);
  m_queue.Clear(m_helper, m_stream);
  EXPECT_TRUE(m_queue.Empty());
  EXPECT_TRUE(
      LogHas("Clearing retry notifications queue. 3 failed notifications will be "
             "discarded"));
  for (const MailFile& m : {a, b, c}) EXPECT_FALSE(testsupport::FileExists(m.path));
  EXPECT_EQ(m_queue.Sequence(), 3u);
}

}  // namespace
}  // namespace hx
