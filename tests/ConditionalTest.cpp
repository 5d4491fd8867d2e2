#include <gtest/gtest.h>
#include <pthread.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <thread>

#include "Conditional.h"
#include "Os.h"
#include "QNException.h"

namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

// Generous upper bound for a time-out: the machine is shared, only "never" is a fault.
constexpr milliseconds kMuchLater(5000);

// The deadline is computed on the monotonic clock; a condition variable left on the wall clock
// would see it as long past and time out at once, so the lower bound also pins the clock.
TEST(ConditionalTest, TimedWaitNobodySignalsThrowsAfterTheTimeWithTheMutexHeld) {
  pthread_mutex_t lMutex;
  pthread_cond_t lCondition;
  OsInitMutex(lMutex);
  OsInitConditional(lCondition);
  std::atomic<bool> lTimedOut{false};
  std::atomic<bool> lProbed{false};
  milliseconds lElapsed(0);
  unsigned int lCode = 0;

  std::thread lWaiter([&] {
    OsLockMutex(lMutex);
    const auto lStart = Clock::now();
    try {
      OsConditionalTimedWait(lCondition, lMutex, 200);
    } catch (QNCTimeOutEx& arTimeOut) {
      lElapsed = std::chrono::duration_cast<milliseconds>(Clock::now() - lStart);
      lCode = arTimeOut.getCode();
      lTimedOut = true;
    }
    while (!lProbed) std::this_thread::sleep_for(milliseconds(1));
    OsUnlockMutex(lMutex);
  });
  while (!lTimedOut) std::this_thread::sleep_for(milliseconds(1));
  EXPECT_EQ(EBUSY, pthread_mutex_trylock(&lMutex)) << "the time-out arrived without the mutex";
  lProbed = true;
  lWaiter.join();
  EXPECT_EQ(0, pthread_mutex_trylock(&lMutex)) << "the waiter's unlock did not release it";
  OsUnlockMutex(lMutex);

  EXPECT_EQ(static_cast<unsigned int>(ETIMEDOUT), lCode);
  EXPECT_GE(lElapsed, milliseconds(200));
  EXPECT_LT(lElapsed, milliseconds(200) + kMuchLater);
  OsDestroyConditional(lCondition);
  OsDestroyMutex(lMutex);
}

// The same through the class: after the time-out a second thread's lock() must wait until the
// waiter unlocks, which it does only after announcing it.
TEST(ConditionalTest, ClassTimedWaitThrowsWithTheMutexHeld) {
  QNCConditional lConditional;
  std::atomic<bool> lTimedOut{false};
  std::atomic<bool> lUnlocking{false};
  std::thread lWaiter([&] {
    lConditional.lock();
    EXPECT_THROW(lConditional.timedWait(100), QNCTimeOutEx);
    lTimedOut = true;
    std::this_thread::sleep_for(milliseconds(100));
    lUnlocking = true;
    lConditional.unlock();
  });
  while (!lTimedOut) std::this_thread::sleep_for(milliseconds(1));
  lConditional.lock();
  EXPECT_TRUE(lUnlocking) << "got the mutex while the timed-out waiter should hold it";
  lConditional.unlock();
  lWaiter.join();
}

TEST(ConditionalTest, SignalWithNobodyWaitingIsNotRemembered) {
  QNCConditional lConditional;
  lConditional.signal();
  lConditional.lock();
  lConditional.signal();  // held mutex, still nobody waiting
  const auto lStart = Clock::now();
  EXPECT_THROW(lConditional.timedWait(150), QNCTimeOutEx);
  EXPECT_GE(Clock::now() - lStart, milliseconds(150));
  lConditional.unlock();
}

// Ping-pong between two threads: every hand-over needs one wake-up. Ping waits with wait(), pong
// with timedWait(); a wake-up lost to pong ends in a time-out, one lost to ping in a hang that
// the test's time limit ends.
TEST(ConditionalTest, SignalWakesTheWaiterForEveryHandOver) {
  QNCConditional lConditional;
  int lTurn = 0;  // guarded by lConditional's mutex; even: ping's turn, odd: pong's
  constexpr int kRounds = 2000;
  auto lPlayer = [&](int aParity) {
    for (int lRound = 0; lRound < kRounds; ++lRound) {
      lConditional.lock();
      try {
        while (lTurn % 2 != aParity) {
          if (aParity == 0) {
            lConditional.wait();
          } else {
            lConditional.timedWait(10000);
          }
        }
      } catch (QNCTimeOutEx&) {
        lConditional.unlock();
        ADD_FAILURE() << "wake-up lost at turn " << lTurn;
        return;
      }
      ++lTurn;
      lConditional.signal();
      lConditional.unlock();
    }
  };
  std::thread lPing(lPlayer, 0);
  std::thread lPong(lPlayer, 1);
  lPing.join();
  lPong.join();
  EXPECT_EQ(2 * kRounds, lTurn);
}

}  // namespace
