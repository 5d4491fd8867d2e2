// The exit-aware waits of lists and queues: each ends with the element, the exit request or the
// time limit, says which, and is woken at once by the producer's signal or by makeThreadsToExit.

#include <gtest/gtest.h>

#include <chrono>
#include <thread>

#include "TableSystem.h"

namespace {

using Clock = std::chrono::steady_clock;
using qntest::makeItem;

// One case per container: how to hand over an element, and the take and the wait to test.
struct QNSContainer {
  const char* mName;
  void (QNCSystem::*mPut)(unsigned int, const QNCPointer<QNCQueueable>&);
  QNEWaitStatus (QNCSystem::*mTake)(unsigned int, unsigned int, unsigned int, QNCPointer<QNCQueueable>&);
  QNEWaitStatus (QNCSystem::*mWait)(unsigned int, unsigned int, unsigned int);
};

class ExitAwareWaitTest : public ::testing::TestWithParam<QNSContainer> {
 protected:
  QNEWaitStatus take(unsigned int aMaxWaitMs, QNCPointer<QNCQueueable>& arElement) {
    return (mSystem.*GetParam().mTake)(0, 0, aMaxWaitMs, arElement);
  }
  void put(int aId) { (mSystem.*GetParam().mPut)(0, makeItem(aId)); }
  // Runs the take on another thread while acrAction runs here; the take must end within 1 s.
  QNEWaitStatus takeWhile(const std::function<void()>& acrAction, QNCPointer<QNCQueueable>& arElement) {
    QNEWaitStatus lStatus = QNWS_TimedOut;
    std::thread lTaker([&] { lStatus = take(0, arElement); });
    std::this_thread::sleep_for(std::chrono::milliseconds(50));  // let it block
    const auto lStart = Clock::now();
    acrAction();
    lTaker.join();
    EXPECT_LT(Clock::now() - lStart, std::chrono::seconds(1));
    return lStatus;
  }
  qntest::TableSystem mSystem{1, 1, 1};
};

TEST_P(ExitAwareWaitTest, EndsWithElementTimeOutOrExitAndSaysWhich) {
  QNCPointer<QNCQueueable> lElement;
  // Empty: the time limit ends the wait, not earlier.
  const auto lStart = Clock::now();
  EXPECT_EQ(QNWS_TimedOut, take(60, lElement));
  EXPECT_GE(Clock::now() - lStart, std::chrono::milliseconds(60));
  EXPECT_TRUE(lElement.isNull());
  EXPECT_EQ(QNWS_TimedOut, (mSystem.*GetParam().mWait)(0, 0, 10));

  // A blocked take is woken by the producer's hand-over and signal, and removes the element.
  EXPECT_EQ(QNWS_Ready, takeWhile(
                            [this] {
                              put(7);
                              mSystem.signal(0);
                            },
                            lElement));
  EXPECT_EQ(7, qntest::idOf(lElement));
  EXPECT_EQ(QNWS_TimedOut, take(1, lElement));  // it was removed

  // Elements handed over before the exit request are still taken (in order); then Exit.
  put(8);
  EXPECT_EQ(QNWS_Ready, (mSystem.*GetParam().mWait)(0, 0, 0));
  put(9);
  mSystem.makeThreadsToExit();
  EXPECT_EQ(QNWS_Ready, take(0, lElement));
  EXPECT_EQ(8, qntest::idOf(lElement));
  EXPECT_EQ(QNWS_Ready, take(0, lElement));
  EXPECT_EQ(9, qntest::idOf(lElement));
  EXPECT_EQ(QNWS_Exit, take(0, lElement));
  EXPECT_TRUE(lElement.isNull());
  EXPECT_EQ(QNWS_Exit, (mSystem.*GetParam().mWait)(0, 0, 0));
}

// A take blocked without a time limit ends at once on the exit request: makeThreadsToExit wakes
// the conditional. Before, only a time-out let a waiter see the exit flag.
TEST_P(ExitAwareWaitTest, ExitRequestWakesBlockedTakeAtOnce) {
  QNCPointer<QNCQueueable> lElement;
  EXPECT_EQ(QNWS_Exit, takeWhile([this] { mSystem.makeThreadsToExit(); }, lElement));
}

INSTANTIATE_TEST_SUITE_P(
    ListsAndQueues, ExitAwareWaitTest,
    ::testing::Values(QNSContainer{"List", &QNCSystem::enlist, &QNCSystem::delistOrExit,
                                   &QNCSystem::waitOnEmptyListOrExit},
                      QNSContainer{"Queue", &QNCSystem::enqueue, &QNCSystem::dequeueOrExit,
                                   &QNCSystem::waitOnEmptyQueueOrExit}),
    [](const ::testing::TestParamInfo<QNSContainer>& acrInfo) { return std::string(acrInfo.param.mName); });

}  // namespace
