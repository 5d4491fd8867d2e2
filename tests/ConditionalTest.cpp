#include <gtest/gtest.h>
#include <pthread.h>

#include <cerrno>
#include <chrono>
#include <string>
#include <thread>

#include "Conditional.h"
#include "Os.h"
#include "QNException.h"
#include "TestSupport.h"

namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

// Generous upper bound for a time-out: the machine is shared, only "never" is a fault.
constexpr milliseconds kMuchLater(5000);

// The deadline is computed on the monotonic clock; a condition variable left on the wall clock
// would see it as long past and time out at once, so the lower bound also pins the clock. The
// signals given before the wait, with and without the mutex, found nobody waiting: they are lost
// and must not end the wait early.
TEST(ConditionalTest, TimedWaitNobodySignalsThrowsAfterTheTimeWithTheMutexHeld) {
  pthread_mutex_t lMutex;
  pthread_cond_t lCondition;
  OsInitMutex(lMutex);
  OsInitConditional(lCondition);
  OsSignal(lCondition);
  OsLockMutex(lMutex);
  OsSignal(lCondition);
  const auto lStart = Clock::now();
  const std::string lThrown =
      qntest::thrown<QNCTimeOutEx>([&] { OsConditionalTimedWait(lCondition, lMutex, 200); }, true);
  const auto lElapsed = Clock::now() - lStart;
  EXPECT_NE(std::string::npos, lThrown.find(" (code " + std::to_string(ETIMEDOUT) + ")")) << lThrown;
  EXPECT_GE(lElapsed, milliseconds(200));
  EXPECT_LT(lElapsed, milliseconds(200) + kMuchLater);
  // An ordinary mutex refuses a second lock even to the thread that holds it.
  EXPECT_EQ(EBUSY, pthread_mutex_trylock(&lMutex)) << "the time-out arrived without the mutex";
  OsUnlockMutex(lMutex);
  OsDestroyConditional(lCondition);
  OsDestroyMutex(lMutex);
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
