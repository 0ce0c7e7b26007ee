#include "alertmod/manager/notify_manager.h"

#include <gtest/gtest.h>

#include <atomic>
#include <condition_variable>
#include <mutex>
#include <set>
#include <stdexcept>
#include <thread>
#include <vector>

#include "alertmod/platform/testing/manual_env.h"
#include "tests/support/fake_host.h"

namespace hx {
namespace {

using namespace std::chrono_literals;

// Records what the worker asks of its job. Items carry their number in
// eventTime. Run may be held until the test releases it.
class RecordingJob final : public IWorkerJob {
 public:
  struct Shared {
    std::mutex mutex;
    std::condition_variable signal;
    std::vector<int64_t> ran;
    std::vector<WorkerSettings> settingsChanges;
    int retryPasses = 0;
    bool started = false;
    bool stopped = false;
    bool ranAfterStop = false;
    bool holdRuns = false;
    bool pendingRetries = false;
    bool throwOnRun = false;

    template <typename Pred>
    bool WaitUntil(Pred pred) {
      std::unique_lock<std::mutex> lock(mutex);
      return signal.wait_for(lock, 20s, pred);
    }
    void Release() {
      {
        std::lock_guard<std::mutex> lock(mutex);
        holdRuns = false;
      }
      signal.notify_all();
    }
  };

  explicit RecordingJob(Shared* shared) : m_shared(shared) {}

  void Start(const WorkerSettings&) override {
    Update([&] { m_shared->started = true; });
  }
  bool HasPendingRetries() const override {
    std::lock_guard<std::mutex> lock(m_shared->mutex);
    return m_shared->pendingRetries;
  }
  void OnSettingsChanged(const WorkerSettings& settings, bool) override {
    Update([&] { m_shared->settingsChanges.push_back(settings); });
  }
  void Run(NotifyWorkItem& item) override {
    std::unique_lock<std::mutex> lock(m_shared->mutex);
    if (m_shared->stopped) m_shared->ranAfterStop = true;
    m_shared->ran.push_back(item.eventTime);
    m_shared->signal.notify_all();
    m_shared->signal.wait(lock, [this] { return !m_shared->holdRuns; });
    if (m_shared->throwOnRun) throw std::runtime_error("boom");
  }
  void RetryPass() override {
    Update([&] { ++m_shared->retryPasses; });
  }
  void Stop() override {
    Update([&] { m_shared->stopped = true; });
  }

 private:
  template <typename Fn>
  void Update(Fn fn) {
    {
      std::lock_guard<std::mutex> lock(m_shared->mutex);
      fn();
    }
    m_shared->signal.notify_all();
  }

  Shared* m_shared;
};

std::shared_ptr<NotifyWorkItem> Item(int64_t number) {
  auto item = std::make_shared<NotifyWorkItem>(kWorkItemNotification);
  item->eventTime = number;
  return item;
}

class NotifyManagerTest : public ::testing::Test {
 protected:
  NotifyManagerTest()
      : m_manager(m_host.callback(), m_env,
                  [this] { return std::make_unique<RecordingJob>(&m_job); }) {
    m_env.Reset(0, 1000);
  }
  ~NotifyManagerTest() override {
    if (m_worker.joinable()) {
      m_manager.Stop();
      m_worker.join();
    }
  }

  void StartWorker() {
    m_worker = std::thread([this] { m_manager.RunWorker(); });
  }
  void StopWorker() {
    m_manager.Stop();
    m_worker.join();
  }
  std::shared_ptr<SNOTIFY_CALLBACK> Pending(int64_t number, int64_t deadline) {
    auto callback = std::make_shared<SNOTIFY_CALLBACK>(&m_manager, Item(number), deadline);
    m_manager.Park(callback);
    return callback;
  }

  testsupport::FakeHost m_host;
  RecordingJob::Shared m_job;
  platform::ManualEnv m_env;
  NotifyManager m_manager;
  std::thread m_worker;
};

TEST_F(NotifyManagerTest, SoakManyProducersNothingLostNothingAfterStop) {
  constexpr int kThreads = 5;
  constexpr int kPerThread = 2000;
  StartWorker();
  std::vector<std::thread> producers;
  for (int t = 0; t < kThreads; ++t) {
    producers.emplace_back([this, t] {
      for (int i = 0; i < kPerThread; ++i) m_manager.QueueWorkItem(Item(t * kPerThread + i), false);
    });
  }
  for (auto& p : producers) p.join();
  ASSERT_TRUE(m_job.WaitUntil([&] { return m_job.ran.size() == kThreads * kPerThread; }));

  // Late producers race with the stop: whatever the worker took before the
  // stop item runs once, the rest stays queued and never runs.
  std::atomic<int> late{0};
  std::vector<std::thread> racers;
  for (int t = 0; t < kThreads; ++t) {
    racers.emplace_back([&, t] {
      for (int i = 0; i < 200; ++i) {
        m_manager.QueueWorkItem(Item(100000 + t * 200 + i), false);
        late.fetch_add(1);
      }
    });
  }
  StopWorker();
  for (auto& r : racers) r.join();

  std::set<int64_t> distinct(m_job.ran.begin(), m_job.ran.end());
  EXPECT_EQ(distinct.size(), m_job.ran.size()) << "an item ran twice";
  EXPECT_FALSE(m_job.ranAfterStop);
  EXPECT_EQ(m_job.ran.size() + m_manager.QueuedCount(),
            static_cast<size_t>(kThreads * kPerThread + late.load()));
  for (int64_t n = 0; n < kThreads * kPerThread; ++n) EXPECT_EQ(distinct.count(n), 1u) << n;
}

TEST_F(NotifyManagerTest, ItemsBehindTheStopItemNeverRun) {
  m_job.holdRuns = true;
  StartWorker();
  m_manager.QueueWorkItem(Item(1), false);
  ASSERT_TRUE(m_job.WaitUntil([&] { return m_job.ran.size() == 1; }));
  // The worker is busy with item 1: the stop item goes ahead of 2 and 3.
  m_manager.QueueWorkItem(Item(2), false);
  m_manager.Stop();
  m_manager.QueueWorkItem(Item(3), false);
  m_job.Release();
  m_worker.join();
  EXPECT_EQ(m_job.ran, std::vector<int64_t>{1});
  EXPECT_TRUE(m_job.stopped);
  EXPECT_EQ(m_manager.QueuedCount(), 2u);
}

TEST_F(NotifyManagerTest, CloseBeforeTheWorkerStartsStopsItAtOnce) {
  m_manager.QueueWorkItem(Item(1), false);
  m_manager.Stop();
  m_manager.RunWorker();
  EXPECT_TRUE(m_job.started);
  EXPECT_TRUE(m_job.stopped);
  EXPECT_TRUE(m_job.ran.empty());
  // A second entry after the stop returns at once, and so does the watchdog.
  m_manager.RunWorker();
  m_manager.RunWatchdog();
}

TEST_F(NotifyManagerTest, AFailingJobDoesNotEndTheWorker) {
  m_job.throwOnRun = true;
  StartWorker();
  m_manager.QueueWorkItem(Item(1), false);
  m_manager.QueueWorkItem(Item(2), false);
  ASSERT_TRUE(m_job.WaitUntil([&] { return m_job.ran.size() == 2; }));
  StopWorker();
  EXPECT_FALSE(m_host.LogTexts(75).empty());
}

TEST_F(NotifyManagerTest, NewSettingsReachTheJobBeforeItsNextItem) {
  m_job.holdRuns = true;
  StartWorker();
  m_manager.QueueWorkItem(Item(1), false);
  ASSERT_TRUE(m_job.WaitUntil([&] { return m_job.ran.size() == 1; }));
  m_manager.PublishWorkerSettings(WorkerSettings{60, 2}, true);
  m_manager.QueueWorkItem(Item(2), false);
  m_job.Release();
  ASSERT_TRUE(m_job.WaitUntil([&] { return m_job.ran.size() == 2; }));
  StopWorker();
  ASSERT_EQ(m_job.settingsChanges.size(), 1u);
  EXPECT_EQ(m_job.settingsChanges[0].maxRetrySeconds, 60);
  EXPECT_EQ(m_job.settingsChanges[0].maxRetryQueue, 2);
}

TEST_F(NotifyManagerTest, PendingRetriesMakeTheWorkerPoll) {
  m_job.pendingRetries = true;
  StartWorker();
  ASSERT_TRUE(m_job.WaitUntil([&] { return m_job.retryPasses >= 2; }));
  m_manager.QueueWorkItem(Item(7), false);
  ASSERT_TRUE(m_job.WaitUntil([&] { return m_job.ran.size() == 1; }));
  StopWorker();
}

TEST_F(NotifyManagerTest, TickReleasesOnlyNotificationsPastTheirDeadline) {
  Pending(1, 999);   // past
  Pending(2, 1000);  // due only when the deadline is earlier than now
  Pending(3, 2000);
  m_manager.OnTick();
  EXPECT_EQ(m_manager.QueuedCount(), 1u);
  EXPECT_EQ(m_manager.PendingCount(), 2u);
  m_env.Reset(0, 1001);
  m_manager.OnTick();
  EXPECT_EQ(m_manager.QueuedCount(), 2u);
  // Ticks with nothing due change nothing.
  m_manager.OnTick();
  m_manager.OnTick();
  EXPECT_EQ(m_manager.QueuedCount(), 2u);
  EXPECT_EQ(m_manager.PendingCount(), 1u);
  EXPECT_EQ(m_manager.ReadyCount(), 0u);
}

TEST_F(NotifyManagerTest, ReadyAfterADeadlineTickDoesNothing) {
  auto late = Pending(1, 900);
  m_manager.OnTick();
  ASSERT_EQ(m_manager.QueuedCount(), 1u);
  late->OnReady();
  m_manager.ReleaseReady();
  EXPECT_EQ(m_manager.QueuedCount(), 1u);
  EXPECT_EQ(m_manager.ReadyCount(), 0u);
}

TEST_F(NotifyManagerTest, ReadyNotificationIsQueuedOnceByTheNextRelease) {
  auto early = Pending(1, 5000);
  Pending(2, 5000);
  early->OnReady();
  EXPECT_EQ(m_manager.QueuedCount(), 0u) << "OnReady must not queue by itself";
  EXPECT_EQ(m_manager.ReadyCount(), 1u);
  early->OnReady();
  m_manager.ReleaseReady();
  m_manager.OnTick();
  EXPECT_EQ(m_manager.QueuedCount(), 1u);
  EXPECT_EQ(m_manager.PendingCount(), 1u);
}

}  // namespace
}  // namespace hx
