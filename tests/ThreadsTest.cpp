// The application's threads: a thread component (one thread with an exit request) and a thread
// pool (workers running submitted tasks).

#include <gtest/gtest.h>

#include <atomic>
#include <condition_variable>
#include <future>
#include <mutex>

#include "LogSupport.h"
#include "TableSystem.h"
#include "ThreadComponent.h"
#include "ThreadPool.h"

namespace {

constexpr unsigned int kHour = 3600u * 1000u;

using qntest::ScriptedComponent;

// Fault pinned for the request made first: a wait that only listens for notifications would
// sleep the whole period instead of seeing the request already given.
TEST(ThreadComponentTest, RequestExitWakesABodyInALongWaitEvenWhenMadeBeforeIt) {
  for (const bool lRequestFirst : {false, true}) {
    std::promise<void> lStarted, lGate;
    std::shared_future<void> lGateOpen = lGate.get_future().share();
    std::atomic<bool> lWoken{false};
    ScriptedComponent lComponent([&](ScriptedComponent& arSelf) {
      lStarted.set_value();
      if (lRequestFirst) lGateOpen.wait();
      lWoken = arSelf.waitForExitRequest(kHour);
    });
    lComponent.init();
    lStarted.get_future().wait();
    lComponent.requestExit();
    lGate.set_value();
    lComponent.waitForExit();  // would block for an hour if the request did not end the wait
    EXPECT_TRUE(lWoken) << lRequestFirst;
  }
}

// A request before init() is refused; init() runs once; joins and requests after the end are
// no-ops. Fault pinned: the owner joins (holding the join lock) while the body waits for its own
// exit; the body blocked on that lock and the join never finished.
TEST(ThreadComponentTest, LifecycleStatesAndRepeatedCalls) {
  std::atomic<int> lSeen{0};
  ScriptedComponent lComponent([&](ScriptedComponent& arSelf) {
    lSeen += arSelf.isExitRequested() ? 100 : 1;
    lSeen += arSelf.waitForExitRequest(1) ? 100 : 1;
    lSeen += qntest::thrown<QNCInvalidEx>([&] { arSelf.waitForExit(); }) == "(nothing thrown)" ? 100 : 1;
  });
  EXPECT_EQ("Thread 'scripted' was never started",
            qntest::thrown<QNCInvalidEx>([&] { lComponent.requestExit(); }));
  lComponent.waitForExit();  // never started: returns at once
  lComponent.init();
  EXPECT_THROW(lComponent.init(), QNCInvalidEx);
  lComponent.waitForExit();
  EXPECT_EQ(3, lSeen.load());
  EXPECT_FALSE(lComponent.isExitRequested());
  lComponent.waitForExit();            // already joined: returns at once
  EXPECT_TRUE(lComponent.isInited());  // started once, stays so after the end
  lComponent.requestExit();            // the thread has ended: no effect, no failure
}

// Destroying a started, never-joined component must not reach std::terminate (a joinable
// std::thread destroyed) nor leave the thread behind: the base destructor wakes and joins it.
std::atomic<bool> gsSleeperReturned{false};

TEST(ThreadComponentTest, DestructorEndsAndJoinsARunningThread) {
  std::promise<void> lAsleep;
  auto* lpComponent = new ScriptedComponent(
      [&](ScriptedComponent& arSelf) {
        lAsleep.set_value();
        while (!arSelf.waitForExitRequest(kHour)) {
        }
        gsSleeperReturned = true;
      },
      "scripted", false);
  lpComponent->init();
  lAsleep.get_future().wait();
  delete lpComponent;
  EXPECT_TRUE(gsSleeperReturned);
}

// Tasks submitted before init() wait for the workers; every task runs exactly once; two tasks
// that wait for each other both finish, so the workers run at the same time.
TEST(ThreadPoolTest, EveryTaskRunsExactlyOnceOnWorkersRunningTogether) {
  std::vector<std::atomic<int>> lRuns(2000);
  std::mutex lLock;
  std::condition_variable lArrived;
  int lCount = 0;
  std::atomic<int> lMet{0};
  QNCThreadPool lPool("counters", 3);
  for (unsigned int lIndex = 0; lIndex < lRuns.size(); ++lIndex) {
    if (lIndex == 2) lPool.init();
    lPool.submit([&lRuns, lIndex] { ++lRuns[lIndex]; });
  }
  for (int lIndex = 0; lIndex < 2; ++lIndex) {
    lPool.submit([&] {
      std::unique_lock<std::mutex> lGuard(lLock);
      ++lCount;
      lArrived.notify_all();
      if (lArrived.wait_for(lGuard, std::chrono::seconds(30), [&] { return lCount == 2; })) ++lMet;
    });
  }
  lPool.finish();
  lPool.waitForThreads();
  for (unsigned int lIndex = 0; lIndex < lRuns.size(); ++lIndex) ASSERT_EQ(1, lRuns[lIndex].load()) << lIndex;
  EXPECT_EQ(2, lMet);
}

// finish() while every worker is busy, called directly or by the destructor of a pool that was
// never finished: what was queued before still runs, a later submission is refused, and the
// workers end (destroying joinable threads would terminate the process).
TEST(ThreadPoolTest, FinishWhileTasksRunDrainsTheQueueAndRefusesLaterTasks) {
  for (const bool lByDestructor : {false, true}) {
    std::promise<void> lGate;
    std::shared_future<void> lGateOpen = lGate.get_future().share();
    std::atomic<int> lBusy{0}, lDone{0};
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
    EXPECT_EQ(7, lDone) << lByDestructor;
  }
}

// Fault pinned: the owner joins (holding the join lock) while a task asks to wait for the pool
// too; the task blocked on that lock and the join never finished.
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
    lRefused += qntest::thrown<QNCInvalidEx>([&] { lPool.waitForThreads(); }) != "(nothing thrown)";
  });
  lPool.finish();
  lPool.finish();  // idempotent
  lPool.waitForThreads();
  lPool.waitForThreads();  // already joined
  EXPECT_EQ(1, lRefused);
}

}  // namespace
