// Waiting on the system object's numbered conditionals, alone and paired with queues and lists:
// wake-ups, time-outs, locks released on every way out, the shut-down pattern, and a stress run
// of many producers and consumers.

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <thread>
#include <vector>

#include "Logger.h"
#include "TableSystem.h"

namespace {

using namespace std::chrono_literals;
using qntest::idOf;
using qntest::makeItem;

// Polls acrCondition until it holds or acLimit passes; says whether it held.
bool eventually(const std::function<bool()>& acrCondition, std::chrono::milliseconds acLimit = 10s) {
  const auto lDeadline = std::chrono::steady_clock::now() + acLimit;
  while (!acrCondition()) {
    if (std::chrono::steady_clock::now() > lDeadline) return false;
    std::this_thread::sleep_for(1ms);
  }
  return true;
}

// A queue that counts its emptiness tests and can run a step right after one that found it
// empty, while the waiter still holds the conditional's lock.
class ObservedQueue : public QNCSynchQueue {
 public:
  bool isEmpty() override {
    const bool lEmpty = QNCSynchQueue::isEmpty();
    mTests.fetch_add(1);
    if (lEmpty && mAfterEmptyTest) {
      std::function<void()> lStep;
      lStep.swap(mAfterEmptyTest);
      lStep();
    }
    if (mFailTest) throw QNCOsException("emptiness test failed", 5);
    return lEmpty;
  }

  std::atomic<int> mTests{0};
  std::function<void()> mAfterEmptyTest;  // set before the waiter starts
  bool mFailTest = false;                 // set before the waiter starts
};

class SystemWaitTest : public ::testing::Test {
 protected:
  SystemWaitTest() : mQueue(new (std::nothrow) ObservedQueue) { mSystem.addQueue(QNCPointer<QNCSynchQueue>(mQueue)); }

  qntest::TableSystem mSystem{2, 0, 1};
  QNCPointer<ObservedQueue> mQueue;
};

TEST_F(SystemWaitTest, WaitReturnsOnlyAfterASignal) {
  std::atomic<bool> lReturned{false};
  std::thread lWaiter([&] {
    mSystem.wait(0);
    lReturned = true;
  });
  std::this_thread::sleep_for(50ms);
  EXPECT_FALSE(lReturned.load());
  // The waiter may not be inside its wait yet when the first signal comes (that one is lost).
  EXPECT_TRUE(eventually([&] {
    mSystem.signal(0);
    return lReturned.load();
  }));
  lWaiter.join();
}

TEST_F(SystemWaitTest, SignalWhileNobodyWaitsIsNotRemembered) {
  mSystem.signal(0);
  EXPECT_THROW(mSystem.timedWait(0, 30), QNCTimeOutEx);
}

TEST_F(SystemWaitTest, TimeOutReleasesTheConditionalForOtherThreads) {
  EXPECT_THROW(mSystem.timedWait(0, 20), QNCTimeOutEx);
  QNCConditional& lConditional = mSystem.conditional(0);
  ASSERT_TRUE(qntest::returnsWithin(
      [&] {
        lConditional.lock();
        lConditional.unlock();
        mSystem.signal(0);
      },
      10s));
  // And a timed wait that is signalled in time returns normally.
  std::atomic<int> lOutcome{0};  // 1 woken, 2 timed out
  std::thread lWaiter([&] {
    try {
      mSystem.timedWait(0, 20000);
      lOutcome = 1;
    } catch (const QNCTimeOutEx&) {
      lOutcome = 2;
    }
  });
  EXPECT_TRUE(eventually([&] {
    mSystem.signal(0);
    return lOutcome.load() != 0;
  }));
  lWaiter.join();
  EXPECT_EQ(1, lOutcome.load());
}

TEST_F(SystemWaitTest, ConditionalsWithDifferentNumbersAreIndependent) {
  std::atomic<bool> lReturned{false};
  std::thread lWaiter([&] {
    try {
      mSystem.timedWait(1, 300);
    } catch (const QNCTimeOutEx&) {
      lReturned = true;
    }
  });
  for (int lRound = 0; lRound < 20; ++lRound) {
    mSystem.signal(0);
    std::this_thread::sleep_for(5ms);
  }
  lWaiter.join();
  EXPECT_TRUE(lReturned.load());  // it timed out: signals on 0 never reached 1
}

TEST_F(SystemWaitTest, WaiterOnQueueStaysBlockedAfterEnqueueAloneAndReturnsAfterSignal) {
  std::atomic<bool> lReturned{false};
  std::thread lConsumer([&] {
    mSystem.waitOnEmptyQueue(0, 0);
    lReturned = true;
  });
  ASSERT_TRUE(eventually([&] { return mQueue->mTests.load() >= 1; }));
  // The waiter holds the conditional's lock from its test until it is inside the wait.
  mSystem.conditional(0).lock();
  mSystem.conditional(0).unlock();
  const QNCPointer<QNCQueueable> lItem = makeItem(7);
  mSystem.enqueue(0, lItem);
  std::this_thread::sleep_for(50ms);
  EXPECT_FALSE(lReturned.load());
  EXPECT_EQ(1, mQueue->mTests.load());
  mSystem.signal(0);
  EXPECT_TRUE(eventually([&] { return lReturned.load(); }));
  lConsumer.join();
  ASSERT_FALSE(mSystem.isQueueEmpty(0));  // waiting does not take the element
  EXPECT_EQ(lItem.get(), mSystem.dequeue(0).get());
}

// Regression: a signal given without the conditional's lock between the waiter's emptiness test
// and its wait found no waiter and was lost; the waiter slept although the queue held an element.
// Sequence forced here: waiter tests (empty) -> producer enqueues and signals -> waiter waits.
TEST_F(SystemWaitTest, SignalBetweenEmptinessTestAndWaitIsNotLost) {
  std::atomic<bool> lAboutToSignal{false};
  std::thread lProducer;
  mQueue->mAfterEmptyTest = [&] {
    lProducer = std::thread([&] {
      mSystem.enqueue(0, makeItem(1));
      lAboutToSignal = true;
      mSystem.signal(0);
    });
    while (!lAboutToSignal.load()) std::this_thread::yield();
    std::this_thread::sleep_for(50ms);  // room for an unguarded signal to pass before the wait
  };
  EXPECT_TRUE(qntest::returnsWithin([&] { mSystem.waitOnEmptyQueue(0, 0); }, 10s, [&] { mSystem.signal(0); }));
  lProducer.join();
  EXPECT_EQ(1, idOf(mSystem.dequeue(0)));
}

TEST_F(SystemWaitTest, WaitOnEmptyListReturnsAtOnceWhenTheListHoldsAnElement) {
  mSystem.enlist(0, makeItem(3));
  EXPECT_TRUE(qntest::returnsWithin([&] { mSystem.waitOnEmptyList(0, 0); }, 10s, [&] { mSystem.signal(0); }));
  EXPECT_EQ(1u, mSystem.listSize(0));
}

TEST_F(SystemWaitTest, WaiterOnListReturnsAfterEnlistAndSignal) {
  std::atomic<bool> lReturned{false};
  std::thread lConsumer([&] {
    mSystem.waitOnEmptyList(1, 0);
    lReturned = true;
  });
  std::this_thread::sleep_for(20ms);
  mSystem.enlist(0, makeItem(4));
  mSystem.signal(1);
  // The signal is given under the conditional's lock, so it cannot be lost whether the waiter
  // was already waiting or still about to test the list.
  EXPECT_TRUE(eventually([&] { return lReturned.load(); }));
  if (!lReturned.load()) mSystem.signal(1);
  lConsumer.join();
  EXPECT_EQ(4, idOf(mSystem.delist(0)));
}

TEST_F(SystemWaitTest, FailedEmptinessTestReleasesTheConditional) {
  mQueue->mFailTest = true;
  EXPECT_THROW(mSystem.waitOnEmptyQueue(0, 0), QNCOsException);
  EXPECT_TRUE(qntest::returnsWithin([&] { mSystem.signal(0); }, 10s));
}

// The documented way for a consumer to end on request: waits in slices, checks the exit flag
// between them. No conditional is signalled for the exit.
TEST_F(SystemWaitTest, ConsumerWaitingInSlicesEndsAfterTheExitRequest) {
  std::vector<int> lHandled;
  std::atomic<int> lCount{0};
  std::thread lConsumer([&] {
    while (!mSystem.isSetForExit()) {
      if (mSystem.isListEmpty(0)) {
        try {
          mSystem.timedWait(0, 20);
        } catch (const QNCTimeOutEx&) {
          continue;
        }
      }
      try {
        lHandled.push_back(idOf(mSystem.delist(0)));
        lCount.fetch_add(1);
      } catch (const QNCNotFoundEx&) {
      }
    }
  });
  for (int lId = 1; lId <= 3; ++lId) {
    mSystem.enlist(0, makeItem(lId));
    mSystem.signal(0);
  }
  EXPECT_TRUE(eventually([&] { return lCount.load() == 3; }));
  mSystem.setForExit();
  lConsumer.join();
  EXPECT_EQ((std::vector<int>{1, 2, 3}), lHandled);
}

// --- Many producers and many consumers on one list (or queue) and one conditional.

struct StressShape {
  bool mUseQueue;
};

class HandOffStressTest : public ::testing::TestWithParam<StressShape> {
 protected:
  void SetUp() override {
    getLogCode(mSavedLogCode);
    setLogCode(mSavedLogCode & ~static_cast<unsigned int>(QNLL_Trace));
  }
  void TearDown() override { setLogCode(mSavedLogCode); }

  unsigned int mSavedLogCode = 255;
};

TEST_P(HandOffStressTest, EveryItemArrivesExactlyOnce) {
  constexpr int kProducers = 4;
  constexpr int kConsumers = 4;
  constexpr int kPerProducer = 3000;
  constexpr int kItems = kProducers * kPerProducer;
  const bool lUseQueue = GetParam().mUseQueue;
  qntest::TableSystem lSystem(1, 1, 1);
  std::atomic<int> lDestroyed{0};
  std::atomic<int> lConsumersDone{0};

  auto lPut = [&](int aId) {
    if (lUseQueue) {
      lSystem.enqueue(0, makeItem(aId, &lDestroyed));
    } else if (aId % 7 == 0) {
      lSystem.enlistFront(0, makeItem(aId, &lDestroyed));  // order is not the point here
    } else {
      lSystem.enlist(0, makeItem(aId, &lDestroyed));
    }
    lSystem.signal(0);
  };

  std::vector<std::vector<int>> lSeen(kConsumers);
  std::vector<std::thread> lThreads;
  for (int lConsumer = 0; lConsumer < kConsumers; ++lConsumer) {
    lThreads.emplace_back([&, lConsumer] {
      for (;;) {
        QNCPointer<QNCQueueable> lItem;
        try {
          if (lUseQueue) {
            lSystem.waitOnEmptyQueue(0, 0);
            lItem = lSystem.dequeue(0);
          } else {
            lSystem.waitOnEmptyList(0, 0);
            lItem = lConsumer % 2 ? lSystem.delist(0) : lSystem.delistBack(0);
          }
        } catch (const QNCNotFoundEx&) {
          continue;  // another consumer took it between the wait and the removal
        }
        const int lId = idOf(lItem);
        if (lId < 0) break;
        lSeen[lConsumer].push_back(lId);
      }
      lConsumersDone.fetch_add(1);
    });
  }
  std::vector<std::thread> lProducers;
  for (int lProducer = 0; lProducer < kProducers; ++lProducer) {
    lProducers.emplace_back([&, lProducer] {
      for (int lIndex = 0; lIndex < kPerProducer; ++lIndex) lPut(lProducer * kPerProducer + lIndex);
    });
  }
  for (auto& lThread : lProducers) lThread.join();
  for (int lConsumer = 0; lConsumer < kConsumers; ++lConsumer) lPut(-1);  // one stop marker each

  // A lost wake-up leaves a consumer asleep beside a non-empty list: report it, then rescue.
  EXPECT_TRUE(eventually([&] { return lConsumersDone.load() == kConsumers; }, 60s));
  while (lConsumersDone.load() != kConsumers) {
    lSystem.signal(0);
    std::this_thread::sleep_for(1ms);
  }
  for (auto& lThread : lThreads) lThread.join();

  std::vector<int> lArrivals(kItems, 0);
  for (const auto& lIds : lSeen)
    for (int lId : lIds) ++lArrivals[lId];
  int lWrong = 0;
  for (int lId = 0; lId < kItems; ++lId) lWrong += lArrivals[lId] != 1;
  EXPECT_EQ(0, lWrong) << "items lost or delivered twice";
  EXPECT_EQ(kItems + kConsumers, lDestroyed.load());
  EXPECT_TRUE(lUseQueue ? lSystem.isQueueEmpty(0) : lSystem.isListEmpty(0));
}

INSTANTIATE_TEST_SUITE_P(ListAndQueue, HandOffStressTest, ::testing::Values(StressShape{false}, StressShape{true}),
                         [](const ::testing::TestParamInfo<StressShape>& acrInfo) {
                           return std::string(acrInfo.param.mUseQueue ? "Queue" : "List");
                         });

}  // namespace
