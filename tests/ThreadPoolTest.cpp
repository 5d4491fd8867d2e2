#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <stdexcept>
#include <string>
#include <vector>

#include "LogSupport.h"
#include "Logger.h"
#include "QNException.h"
#include "TestSupport.h"
#include "ThreadPool.h"

namespace {

// A latch the tests open by hand; tasks block on it.
class Gate {
 public:
  void open() {
    {
      std::lock_guard<std::mutex> lGuard(mLock);
      mOpen = true;
    }
    mChanged.notify_all();
  }
  void pass() {
    std::unique_lock<std::mutex> lGuard(mLock);
    mChanged.wait(lGuard, [this] { return mOpen; });
  }

 private:
  std::mutex mLock;
  std::condition_variable mChanged;
  bool mOpen = false;
};

// Tasks submitted before init() wait for the workers; every task runs exactly once.
TEST(ThreadPoolTest, EveryTaskRunsExactlyOnce) {
  constexpr unsigned int kTasks = 2000;
  std::vector<std::atomic<int>> lRuns(kTasks);
  QNCThreadPool lPool("counters", 3);
  for (unsigned int lIndex = 0; lIndex < kTasks; ++lIndex) {
    if (lIndex == 2) lPool.init();
    lPool.submit([&lRuns, lIndex] { ++lRuns[lIndex]; });
  }
  lPool.finish();
  lPool.waitForThreads();
  for (unsigned int lIndex = 0; lIndex < kTasks; ++lIndex)
    ASSERT_EQ(1, lRuns[lIndex].load()) << "task " << lIndex;
}

// Two tasks that each wait for the other can only both finish if two workers run at once.
// The waits are bounded so that a pool that serialises its tasks fails instead of hanging.
TEST(ThreadPoolTest, WorkersRunTasksAtTheSameTime) {
  std::mutex lLock;
  std::condition_variable lArrived;
  int lCount = 0;
  std::atomic<int> lMet{0};
  auto lRendezvous = [&] {
    std::unique_lock<std::mutex> lGuard(lLock);
    ++lCount;
    lArrived.notify_all();
    if (lArrived.wait_for(lGuard, std::chrono::seconds(30), [&] { return lCount == 2; })) ++lMet;
  };
  QNCThreadPool lPool("pair", 2);
  lPool.init();
  lPool.submit(lRendezvous);
  lPool.submit(lRendezvous);
  lPool.finish();
  lPool.waitForThreads();
  EXPECT_EQ(2, lMet);
}

// finish() while every worker is busy: what was queued before still runs, a submission after
// it is refused with a clear exception, and the workers then end.
TEST(ThreadPoolTest, FinishWhileTasksRunDrainsTheQueueAndRefusesLaterTasks) {
  Gate lGate;
  std::atomic<int> lBusy{0};
  std::atomic<int> lBlockersDone{0};
  std::atomic<int> lQueuedDone{0};
  QNCThreadPool lPool("drain", 2);
  lPool.init();
  for (int lIndex = 0; lIndex < 2; ++lIndex) {
    lPool.submit([&] {
      ++lBusy;
      lGate.pass();
      ++lBlockersDone;
    });
  }
  for (int lIndex = 0; lIndex < 5; ++lIndex) lPool.submit([&] { ++lQueuedDone; });
  while (lBusy.load() < 2) std::this_thread::yield();  // both workers are inside a task

  lPool.finish();
  EXPECT_EQ("ThreadPool 'drain' is finished: task refused",
            qntest::thrown<QNCExitConditionEx>([&] { lPool.submit([] {}); }));
  lGate.open();
  lPool.waitForThreads();
  EXPECT_EQ(2, lBlockersDone);
  EXPECT_EQ(5, lQueuedDone);
}

class ThreadPoolLogTest : public qntest::LoggedTest {};

TEST_F(ThreadPoolLogTest, AFailingTaskIsLoggedAndItsWorkerGoesOn) {
  std::atomic<int> lAfter{0};
  {
    QNCThreadPool lPool("fragile", 1);  // one worker: the tasks after the failures need it
    lPool.init();
    lPool.submit([] { throw QNCInvalidEx("bad sample", 6); });
    lPool.submit([] { throw std::runtime_error("bad reading"); });
    lPool.submit([] { throw 7; });
    lPool.submit([&] { ++lAfter; });
    lPool.finish();
    lPool.waitForThreads();
  }
  const std::string lText = log();
  EXPECT_EQ(1, lAfter);
  EXPECT_NE(std::string::npos, lText.find("-E-")) << lText;
  EXPECT_NE(std::string::npos, lText.find("ThreadPool 'fragile': task failed: bad sample")) << lText;
  EXPECT_NE(std::string::npos, lText.find("ThreadPool 'fragile': task failed: bad reading")) << lText;
  EXPECT_NE(std::string::npos, lText.find("ThreadPool 'fragile': task failed: unknown exception")) << lText;
}

TEST(ThreadPoolTest, MisuseIsRefusedWithClearErrors) {
  EXPECT_EQ("ThreadPool 'none' needs at least one thread",
            qntest::thrown<QNCInvalidEx>([] { QNCThreadPool lEmpty("none", 0); }));
  QNCThreadPool lPool("twice", 1);
  EXPECT_THROW(lPool.submit(QNCThreadPool::QNTTask()), QNCInvalidEx);
  lPool.waitForThreads();  // never started: returns at once
  lPool.init();
  EXPECT_THROW(lPool.init(), QNCInvalidEx);
  lPool.finish();
  lPool.finish();  // idempotent
  lPool.waitForThreads();
  lPool.waitForThreads();  // already joined
  EXPECT_STREQ("twice", lPool.getName().get());
}

// Fault pinned: the owner joins (holding the join lock) while a task of the pool asks to wait for
// the pool too; the task blocked on that lock and the join never finished.
TEST(ThreadPoolTest, AWorkerWaitingForItsOwnPoolIsRefused) {
  std::atomic<int> lRefused{0};
  QNCThreadPool lPool("self", 1);
  lPool.init();
  lPool.submit([&] {
    try {
      lPool.waitForThreads();
    } catch (const QNCInvalidEx&) {
      ++lRefused;
    }
  });
  lPool.finish();
  lPool.waitForThreads();
  EXPECT_EQ(1, lRefused);
}

// Destroying a started pool that was never finished must neither terminate the process (joinable
// threads destroyed) nor drop the queued work.
TEST(ThreadPoolTest, DestructorFinishesDrainsAndJoins) {
  Gate lGate;
  std::atomic<int> lDone{0};
  {
    QNCThreadPool lPool("abandoned", 2);
    lPool.init();
    lPool.submit([&] {
      lGate.pass();
      ++lDone;
    });
    for (int lIndex = 0; lIndex < 10; ++lIndex) lPool.submit([&] { ++lDone; });
    lGate.open();
  }
  EXPECT_EQ(11, lDone);
}

}  // namespace
