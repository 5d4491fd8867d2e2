// Waiting on the system object's numbered conditionals, alone and paired with queues and lists:
// wake-ups, time-outs, locks released on every way out, and a stress run of many producers and
// consumers.

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
  SystemWaitTest() : mQueue(new (std::nothrow) ObservedQueue) {
    mSystem.addQueue(QNCPointer<QNCSynchQueue>(mQueue));
  }

  qntest::TableSystem mSystem{2, 0, 1};
  QNCPointer<ObservedQueue> mQueue;
};

TEST_F(SystemWaitTest, WaitAndTimedWaitReturnOnlyAfterASignal) {
  // A time-out first: the conditional must still serve the waits that follow.
  EXPECT_THROW(mSystem.timedWait(0, 20), QNCTimeOutEx);
  const std::function<void()> lWaits[] = {[&] { mSystem.wait(0); }, [&] { mSystem.timedWait(0, 20000); }};
  for (const auto& lWait : lWaits) {
    std::atomic<bool> lReturned{false};
    std::thread lWaiter([&] {
      EXPECT_NO_THROW(lWait());
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
}

// A signal is not remembered for a later waiter, and a time-out leaves the conditional unlocked.
TEST_F(SystemWaitTest, UnwaitedSignalIsForgottenAndATimeOutReleasesTheConditional) {
  mSystem.signal(0);
  EXPECT_THROW(mSystem.timedWait(0, 30), QNCTimeOutEx);
  QNCConditional& lConditional = mSystem.conditional(0);
  EXPECT_TRUE(qntest::returnsWithin(
      [&] {
        lConditional.lock();
        lConditional.unlock();
        mSystem.signal(0);
      },
      10s));
}

// Signals on conditional 0 all through the wait on conditional 1 must not end that wait.
TEST_F(SystemWaitTest, ConditionalsWithDifferentNumbersAreIndependent) {
  std::atomic<bool> lTimedOut{false};
  std::thread lWaiter([&] {
    EXPECT_THROW(mSystem.timedWait(1, 300), QNCTimeOutEx);
    lTimedOut = true;
  });
  while (!lTimedOut.load()) {
    mSystem.signal(0);
    std::this_thread::sleep_for(5ms);
  }
  lWaiter.join();
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
  EXPECT_TRUE(
      qntest::returnsWithin([&] { mSystem.waitOnEmptyQueue(0, 0); }, 10s, [&] { mSystem.signal(0); }));
  lProducer.join();
  EXPECT_EQ(1, idOf(mSystem.dequeue(0)));
}

TEST_F(SystemWaitTest, WaitOnEmptyListReturnsAtOnceWhenTheListHoldsAnElement) {
  mSystem.enlist(0, makeItem(3));
  EXPECT_TRUE(qntest::returnsWithin([&] { mSystem.waitOnEmptyList(0, 0); }, 10s, [&] { mSystem.signal(0); }));
  EXPECT_EQ(1u, mSystem.listSize(0));
}

TEST_F(SystemWaitTest, FailedEmptinessTestReleasesTheConditional) {
  mQueue->mFailTest = true;
  EXPECT_THROW(mSystem.waitOnEmptyQueue(0, 0), QNCOsException);
  EXPECT_TRUE(qntest::returnsWithin([&] { mSystem.signal(0); }, 10s));
}

// --- Many producers and many consumers on one list (or queue) and one conditional.

class HandOffStressTest : public ::testing::TestWithParam<bool> {
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
  const bool lUseQueue = GetParam();
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

  std::vector<std::atomic<int>> lArrivals(kItems);
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
        lArrivals[lId].fetch_add(1);
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

  int lWrong = 0;
  for (const auto& lArrival : lArrivals) lWrong += lArrival.load() != 1;
  EXPECT_EQ(0, lWrong) << "items lost or delivered twice";
  EXPECT_EQ(kItems + kConsumers, lDestroyed.load());
  EXPECT_TRUE(lUseQueue ? lSystem.isQueueEmpty(0) : lSystem.isListEmpty(0));
}

INSTANTIATE_TEST_SUITE_P(ListAndQueue, HandOffStressTest, ::testing::Bool(),
                         [](const ::testing::TestParamInfo<bool>& acrInfo) {
                           return std::string(acrInfo.param ? "Queue" : "List");
                         });

}  // namespace
