// The system object's numbered services: synchronised queues and lists (one set of cases run on
// both, the exit-aware waits among them), waits on the numbered conditionals, a stress run of
// many producers and consumers, the one table of assertions (numbers, pointers, buffers), and the
// error line that names a member the application's system class left unset.

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <thread>
#include <vector>

#include "AllocatedBuffer.h"
#include "BufferManager.h"
#include "DeathTestSupport.h"
#include "Logger.h"
#include "Mutex.h"
#include "SystemGlobals.h"
#include "TableSystem.h"

namespace {

using namespace std::chrono_literals;
using qntest::idOf;
using qntest::makeItem;
using Element = QNCPointer<QNCQueueable>;

// The operations a queue (parameter true) and a list share, by the system object's numbered
// services.
class SystemContainerTest : public ::testing::TestWithParam<bool> {
 protected:
  void put(unsigned int aNo, const Element& acrElement) {
    GetParam() ? mSystem.enqueue(aNo, acrElement) : mSystem.enlist(aNo, acrElement);
  }
  Element take(unsigned int aNo) { return GetParam() ? mSystem.dequeue(aNo) : mSystem.delist(aNo); }
  Element front() { return GetParam() ? mSystem.queueFront(0) : mSystem.listFront(0); }
  void clear() { GetParam() ? mSystem.queueClear(0) : mSystem.listClear(0); }
  bool isEmpty() { return GetParam() ? mSystem.isQueueEmpty(0) : mSystem.isListEmpty(0); }
  void waitOnEmpty() { GetParam() ? mSystem.waitOnEmptyQueue(0, 0) : mSystem.waitOnEmptyList(0, 0); }
  QNEWaitStatus takeOrExit(unsigned int aMaxWaitMs, Element& arElement) {
    return GetParam() ? mSystem.dequeueOrExit(0, 0, aMaxWaitMs, arElement)
                      : mSystem.delistOrExit(0, 0, aMaxWaitMs, arElement);
  }
  QNEWaitStatus waitOrExit(unsigned int aMaxWaitMs) {
    return GetParam() ? mSystem.waitOnEmptyQueueOrExit(0, 0, aMaxWaitMs)
                      : mSystem.waitOnEmptyListOrExit(0, 0, aMaxWaitMs);
  }
  // Runs takeOrExit without a limit on another thread while acrAction runs here; the take must
  // end within 1 s of the action.
  QNEWaitStatus takeWhile(const std::function<void()>& acrAction, Element& arElement) {
    QNEWaitStatus lStatus = QNWS_TimedOut;
    std::thread lTaker([&] { lStatus = takeOrExit(0, arElement); });
    std::this_thread::sleep_for(50ms);  // let it block
    const auto lStart = std::chrono::steady_clock::now();
    acrAction();
    lTaker.join();
    EXPECT_LT(std::chrono::steady_clock::now() - lStart, 1s);
    return lStatus;
  }

  qntest::TableSystem mSystem{1, 2, 2};
};

// Each removal from an empty container releases its lock on the way out (the put that follows
// would otherwise block for ever); the front stays in place; a take hands its reference over and
// a clear releases each of the container's own once.
TEST_P(SystemContainerTest, OrderEmptyTakesAndReleasedReferences) {
  const std::function<void()> lTakesFromEmpty[] = {[&] { take(0); }, [&] { front(); },
                                                   [&] { mSystem.delistBack(0); }};
  for (const auto& lrTake : lTakesFromEmpty) {
    EXPECT_EQ("Not Found (code 8)", qntest::thrown<QNCNotFoundEx>(lrTake, true));
    ASSERT_TRUE(qntest::returnsWithin([&] { put(0, makeItem(0)); }, 10s));
    EXPECT_EQ(0, idOf(take(0)));
  }
  std::atomic<int> lDestroyed{0};
  for (int lId = 1; lId <= 3; ++lId) put(0, makeItem(lId, &lDestroyed));
  put(1, makeItem(5));
  EXPECT_EQ(1, idOf(front()));
  Element lTaken = take(0);
  EXPECT_EQ(1, idOf(lTaken));
  EXPECT_EQ(2, idOf(take(0)));
  const Element lKept = makeItem(4, &lDestroyed);
  put(0, lKept);
  put(0, makeItem(6, &lDestroyed));
  EXPECT_EQ(3, idOf(take(0)));
  EXPECT_EQ(2, lDestroyed.load());  // 2 and 3, taken and dropped
  clear();
  EXPECT_TRUE(isEmpty());
  EXPECT_EQ(3, lDestroyed.load());  // 6; the two this test holds survive
  lTaken.reset();
  EXPECT_EQ(4, lDestroyed.load());
  EXPECT_EQ(5, idOf(take(1)));
}

// An element whose destructor uses the container it leaves: removing it must not hold the lock
// while the element is destroyed, or the destructor would deadlock on it.
class Reentering : public QNCQueueable {
 public:
  explicit Reentering(std::function<void()> aOnDestroy) : mOnDestroy(std::move(aOnDestroy)) {}
  ~Reentering() override { mOnDestroy(); }

 private:
  std::function<void()> mOnDestroy;
};

TEST_P(SystemContainerTest, ElementsAreDestroyedOutsideTheLock) {
  auto lReentering = [&] { return Element(new (std::nothrow) Reentering([&] { put(0, makeItem(99)); })); };
  ASSERT_TRUE(qntest::returnsWithin(
      [&] {
        put(0, lReentering());
        put(0, makeItem(1));
        clear();  // leaves the element the destructor put
        EXPECT_EQ(99, idOf(take(0)));
        put(0, lReentering());
        auto lIt = mSystem.listBegin(0);
        if (lIt != mSystem.listEnd(0)) {
          mSystem.listErase(0, lIt);
        } else {
          take(0);
        }
        EXPECT_EQ(99, idOf(take(0)));
      },
      10s));
}

// --- The exit-aware waits: each ends with the element, the exit request or the time limit, says
// which, and is woken at once by the producer's signal or by makeThreadsToExit.
class ExitAwareWaitTest : public SystemContainerTest {};

TEST_P(ExitAwareWaitTest, EndsWithElementTimeOutOrExitAndSaysWhich) {
  Element lElement;
  const auto lStart = std::chrono::steady_clock::now();
  EXPECT_EQ(QNWS_TimedOut, takeOrExit(60, lElement));  // empty: the time limit ends it, not earlier
  EXPECT_GE(std::chrono::steady_clock::now() - lStart, 60ms);
  EXPECT_TRUE(lElement.isNull());
  EXPECT_EQ(QNWS_TimedOut, waitOrExit(10));
  // A blocked take is woken by the producer's hand-over and signal, and removes the element.
  EXPECT_EQ(QNWS_Ready, takeWhile(
                            [this] {
                              put(0, makeItem(7));
                              mSystem.signal(0);
                            },
                            lElement));
  EXPECT_EQ(7, idOf(lElement));
  EXPECT_EQ(QNWS_TimedOut, takeOrExit(1, lElement));  // it was removed
  // Elements handed over before the exit request are still taken (in order); then Exit.
  put(0, makeItem(8));
  EXPECT_EQ(QNWS_Ready, waitOrExit(0));
  put(0, makeItem(9));
  mSystem.makeThreadsToExit();
  for (int lId : {8, 9}) {
    EXPECT_EQ(QNWS_Ready, takeOrExit(0, lElement));
    EXPECT_EQ(lId, idOf(lElement));
  }
  EXPECT_EQ(QNWS_Exit, takeOrExit(0, lElement));
  EXPECT_TRUE(lElement.isNull());
  EXPECT_EQ(QNWS_Exit, waitOrExit(0));
}

// A take blocked without a time limit ends at once on the exit request: makeThreadsToExit wakes
// the conditional. Before, only a time-out let a waiter see the exit flag.
TEST_P(ExitAwareWaitTest, ExitRequestWakesBlockedTakeAtOnce) {
  Element lElement;
  EXPECT_EQ(QNWS_Exit, takeWhile([this] { mSystem.makeThreadsToExit(); }, lElement));
}

std::string nameOf(const ::testing::TestParamInfo<bool>& acrInfo) { return acrInfo.param ? "Queue" : "List"; }
INSTANTIATE_TEST_SUITE_P(QueueAndList, SystemContainerTest, ::testing::Bool(), nameOf);
INSTANTIATE_TEST_SUITE_P(ListsAndQueues, ExitAwareWaitTest, ::testing::Bool(), nameOf);

// The list's own operations: both ends, and a walk whose listErase moves the iterator on.
TEST(SystemListsTest, BothEndsAndAWalkThatErasesEveryOtherElement) {
  qntest::TableSystem lSystem(0, 0, 1);
  for (int lId = 1; lId < 7; ++lId) lSystem.enlist(0, makeItem(lId));
  lSystem.enlistFront(0, makeItem(0));
  EXPECT_EQ(6, idOf(lSystem.delistBack(0)));
  for (auto lIt = lSystem.listBegin(0); lIt != lSystem.listEnd(0);) {
    if (idOf(*lIt) % 2 == 0) {
      lSystem.listErase(0, lIt);
    } else {
      ++lIt;
    }
  }
  std::vector<int> lIds;
  const QNCSystem& lrConst = lSystem;
  for (auto lIt = lrConst.listBegin(0); lIt != lrConst.listEnd(0); ++lIt) lIds.push_back(idOf(*lIt));
  EXPECT_EQ((std::vector<int>{1, 3, 5}), lIds);
  EXPECT_EQ(3u, lSystem.listSize(0));
}

// --- Waits. A queue that can run a step right after an emptiness test that found it empty,
// while the waiter still holds the conditional's lock, or fail the test.
class ObservedQueue : public QNCSynchQueue {
 public:
  bool isEmpty() override {
    const bool lEmpty = QNCSynchQueue::isEmpty();
    if (lEmpty && mAfterEmptyTest) {
      std::function<void()> lStep;
      lStep.swap(mAfterEmptyTest);
      lStep();
    }
    if (mFailTest) throw QNCOsException("emptiness test failed", 5);
    return lEmpty;
  }

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

// A signal is not remembered for a later waiter, and a wait without a limit ends only on a
// signal; the time-out and a failed emptiness test leave the conditional unlocked and usable; a
// list that holds an element needs no wait.
TEST_F(SystemWaitTest, WaitsEndOnASignalAndEveryWayOutReleasesTheConditional) {
  const auto lReleased = [&] {
    return qntest::returnsWithin(
        [&] {
          mSystem.conditional(0).lock();
          mSystem.conditional(0).unlock();
        },
        10s);
  };
  mSystem.signal(0);
  EXPECT_THROW(mSystem.timedWait(0, 30), QNCTimeOutEx);
  ASSERT_TRUE(lReleased()) << "the time-out kept the conditional's lock";
  std::atomic<bool> lReturned{false};
  std::thread lWaiter([&] {
    EXPECT_NO_THROW(mSystem.wait(0));
    lReturned = true;
  });
  std::this_thread::sleep_for(50ms);
  EXPECT_FALSE(lReturned.load());
  // The waiter may not be inside its wait yet when the first signal comes (that one is lost).
  EXPECT_TRUE(qntest::eventually([&] {
    mSystem.signal(0);
    return lReturned.load();
  }));
  lWaiter.join();
  mSystem.enlist(0, makeItem(3));
  EXPECT_TRUE(qntest::returnsWithin([&] { mSystem.waitOnEmptyList(0, 0); }, 10s, [&] { mSystem.signal(0); }));
  mQueue->mFailTest = true;
  EXPECT_THROW(mSystem.waitOnEmptyQueue(0, 0), QNCOsException);
  EXPECT_TRUE(lReleased()) << "the failed test kept the conditional's lock";
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

// Many producers and consumers on one queue (or list) and one conditional: every item arrives
// exactly once, and no consumer sleeps beside a non-empty container.
TEST_P(SystemContainerTest, HandOffUnderStressDeliversEveryItemExactlyOnce) {
  setLogCode(127);  // no trace lines: with them, signal() passes the lock every time
  constexpr int kProducers = 4, kConsumers = 4, kPerProducer = 3000, kItems = kProducers * kPerProducer;
  const bool lQueue = GetParam();
  std::atomic<int> lDestroyed{0}, lConsumersDone{0};
  auto lPut = [&](int aId) {
    if (!lQueue && aId % 7 == 0) {
      mSystem.enlistFront(0, makeItem(aId, &lDestroyed));  // order is not the point here
    } else {
      put(0, makeItem(aId, &lDestroyed));
    }
    mSystem.signal(0);
  };
  std::vector<std::atomic<int>> lArrivals(kItems);
  std::vector<std::thread> lThreads;
  for (int lConsumer = 0; lConsumer < kConsumers; ++lConsumer) {
    lThreads.emplace_back([&, lConsumer] {
      for (;;) {
        Element lItem;
        try {
          waitOnEmpty();
          lItem = !lQueue && lConsumer % 2 ? mSystem.delistBack(0) : take(0);
        } catch (const QNCNotFoundEx&) {
          continue;  // another consumer took it between the wait and the removal
        }
        if (idOf(lItem) < 0) break;
        lArrivals[idOf(lItem)].fetch_add(1);
      }
      lConsumersDone.fetch_add(1);
    });
  }
  std::vector<std::thread> lProducers;
  for (int lProducer = 0; lProducer < kProducers; ++lProducer)
    lProducers.emplace_back([&, lProducer] {
      for (int lIndex = 0; lIndex < kPerProducer; ++lIndex) lPut(lProducer * kPerProducer + lIndex);
    });
  for (auto& lThread : lProducers) lThread.join();
  for (int lConsumer = 0; lConsumer < kConsumers; ++lConsumer) lPut(-1);  // one stop marker each
  // A lost wake-up leaves a consumer asleep beside a non-empty container: report it, then rescue.
  EXPECT_TRUE(qntest::eventually([&] { return lConsumersDone.load() == kConsumers; }, 60s));
  while (lConsumersDone.load() != kConsumers) {
    lPut(-1);  // the stop markers may be what was lost
    std::this_thread::sleep_for(1ms);
  }
  for (auto& lThread : lThreads) lThread.join();
  int lWrong = 0;
  for (const auto& lArrival : lArrivals) lWrong += lArrival.load() != 1;
  EXPECT_EQ(0, lWrong) << "items lost or delivered twice";
  EXPECT_EQ(kItems + kConsumers, lDestroyed.load());
  EXPECT_TRUE(isEmpty());
}

// Misuse is a programming error: the process ends with exactly one "-H-" line naming the broken
// condition and exit status 1, rather than crash or go on with a null object. One representative
// per table of the system object and per value type.
const QNCPointer<int> gsEmpty;

TEST(MisuseDeathTest, EveryBrokenConditionIsAnAssertion) {
  qntest::TableSystem lSystem(2, 2, 2);
  QNCPointer<QNCBuffer> lBuffer;
  unsigned int lCount = 0;
  const struct {
    std::function<void()> mCall;
    const char* mCondition;
  } lCases[] = {
      // The conditional's number is checked before the queue's.
      {[&] { lSystem.waitOnEmptyQueue(2, 9); }, "acConditionNo < this->mWaitConditionals.numberOfElements()"},
      {[&] { lSystem.dequeue(2); }, "acQueueNo < this->mQueues.numberOfElements()"},
      {[&] { lSystem.waitOnEmptyList(0, 2); }, "acListNo < this->mLists.numberOfElements()"},
      {[&] { lSystem.send(0, lBuffer, lCount); }, "acWriterNo < this->mWriters.numberOfElements()"},
      // A bad reader number is reported before a missing wait time.
      {[&] { lSystem.waitForActivity(0, 0); }, "acReaderNo < this->mReaders.numberOfElements()"},
      {[] { setSystemObject(nullptr); }, "0UL != apSystem"},
      {[] { QNCPointer<int> lCopy(gsEmpty); }, "0 != acrCopy.mPointer"},
      {[] { (void)*gsEmpty; }, "0 != mPointer"},
      {[] { (void)QNCPointer<QNCString>(new QNCString[2], QNPST_Array, QNPAT_New)->get(); },
       "QNPST_Individual == mSizeType"},
      {[] { QNCString lText(static_cast<const char*>(nullptr)); }, "0 != apString"},
      {[] { QNCAllocatedBuffer lEmpty(0, 64); }, "acUseLength != 0"},
      {[] { QNCAllocatedBuffer lOver(65, 64); }, "acMaxLength == 0 || acUseLength <= acMaxLength"},
      {[] {
         qntest::TableSystem lNoBuckets;
         QNCBufferManager lManager(&lNoBuckets);
       },
       "lBufferList.size() > 0"},
  };
  for (const auto& lrCase : lCases)
    EXPECT_EXIT(lrCase.mCall(), ::testing::ExitedWithCode(1), qntest::assertionFailure(lrCase.mCondition));
}

// A system class that lacks a member an operation needs still ends by the pointer's assertion
// (status 1), but an error line names the member and where to set it first: without it, the
// newcomer sees only "Assertion [ 0 != mPointer ] failed" at Pointer.h. (A missing instance
// manager or version at start-up: the Consumer.newcomer test.) The tests' system object has no
// buffer manager; this one can lose its exit lock as well.
class BareSystem : public qntest::TableSystem {
 public:
  void dropExitLock() { mExitLock = QNCPointer<QNCMutex>(); }
};

void expectNamedBeforeAssertion(void (*apCall)(BareSystem&), const char* apMember) {
  BareSystem lSystem;
  EXPECT_EXIT(apCall(lSystem), ::testing::ExitedWithCode(1),
              std::string("-E- .*QNCSystem::") + apMember +
                  " is not set: [^\n]*\n.*-H- .*Assertion \\[ 0 != mPointer \\] failed");
}

TEST(SystemNewcomerTest, MissingMemberIsNamedAtErrorLevelBeforeTheAssertion) {
  static QNCPointer<QNCBuffer> lsBuffer;
  expectNamedBeforeAssertion([](BareSystem& arSystem) { arSystem.getBuffer(64, lsBuffer); },
                             "mBufferManager");
  expectNamedBeforeAssertion(
      [](BareSystem& arSystem) {
        arSystem.dropExitLock();
        arSystem.setForExit();
      },
      "mExitLock");
}

}  // namespace
