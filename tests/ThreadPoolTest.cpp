#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <future>
#include <mutex>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "LogSupport.h"
#include "QNException.h"
#include "TestSupport.h"
#include "ThreadPool.h"

namespace {

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

// finish() while every worker is busy, called directly or by the destructor of a pool that was
// never finished: what was queued before still runs, a submission after it is refused with a
// clear exception, and the workers end (destroying joinable threads would terminate the process).
TEST(ThreadPoolTest, FinishWhileTasksRunDrainsTheQueueAndRefusesLaterTasks) {
  for (const bool lByDestructor : {false, true}) {
    std::promise<void> lGate;
    std::shared_future<void> lGateOpen = lGate.get_future().share();
    std::atomic<int> lBusy{0};
    std::atomic<int> lDone{0};
    {
      QNCThreadPool lPool("drain", 2);
      lPool.init();
      for (int lIndex = 0; lIndex < 2; ++lIndex) {
        lPool.submit([&] {
          ++lBusy;
          lGateOpen.wait();
          ++lDone;
        });
      }
      for (int lIndex = 0; lIndex < 5; ++lIndex) lPool.submit([&] { ++lDone; });
      while (lBusy.load() < 2) std::this_thread::yield();  // both workers are inside a task
      if (!lByDestructor) {
        lPool.finish();
        EXPECT_EQ("ThreadPool 'drain' is finished: task refused",
                  qntest::thrown<QNCExitConditionEx>([&] { lPool.submit([] {}); }));
      }
      lGate.set_value();
    }
    EXPECT_EQ(7, lDone) << (lByDestructor ? "finished by the destructor" : "finished by hand");
  }
}

// A failing task is logged at error level with its message, and its worker (the only one) goes
// on to run the task after it.
class ThreadPoolLogTest : public qntest::LoggedTest {};

TEST_F(ThreadPoolLogTest, AFailingTaskIsLoggedAndItsWorkerGoesOn) {
  std::atomic<int> lAfter{0};
  {
    QNCThreadPool lPool("fragile", 1);
    lPool.init();
    lPool.submit([] { throw QNCInvalidEx("bad sample", 6); });
    lPool.submit([] { throw std::runtime_error("bad reading"); });
    lPool.submit([] { throw 7; });
    lPool.submit([&] { ++lAfter; });
    lPool.finish();
    lPool.waitForThreads();
  }
  EXPECT_EQ(1, lAfter);
  const std::string lText = log();
  for (const char* lpMessage : {"bad sample", "bad reading", "unknown exception"}) {
    EXPECT_EQ("-E-", qntest::levelOf(lText, std::string("ThreadPool 'fragile': task failed: ") + lpMessage))
        << lText;
  }
}

// Fault pinned: the owner joins (holding the join lock) while a task of the pool asks to wait for
// the pool too; the task blocked on that lock and the join never finished. The other calls are
// refused or harmless no-ops.
TEST(ThreadPoolTest, MisuseIsRefusedWithClearErrors) {
  EXPECT_EQ("ThreadPool 'none' needs at least one thread",
            qntest::thrown<QNCInvalidEx>([] { QNCThreadPool lEmpty("none", 0); }));
  std::atomic<int> lRefused{0};
  QNCThreadPool lPool("self", 1);
  EXPECT_THROW(lPool.submit(QNCThreadPool::QNTTask()), QNCInvalidEx);
  lPool.waitForThreads();  // never started: returns at once
  lPool.init();
  EXPECT_THROW(lPool.init(), QNCInvalidEx);
  lPool.submit([&] {
    try {
      lPool.waitForThreads();
    } catch (const QNCInvalidEx&) {
      ++lRefused;
    }
  });
  lPool.finish();
  lPool.finish();  // idempotent
  lPool.waitForThreads();
  lPool.waitForThreads();  // already joined
  EXPECT_EQ(1, lRefused);
}

}  // namespace
