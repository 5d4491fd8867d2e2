// A consumer woken with nothing to take (a signal without a hand-over, as after a spurious
// wake-up) tests once without being counted as a waiter; it must count itself again before it
// sleeps. Otherwise the next hand-over's signal() finds no waiter, skips the wake-up, and the
// consumer sleeps beside the item: signal(0) x3 with empty containers, then enlist + signal(0).

#include <gtest/gtest.h>

#include "Logger.h"
#include "TableSystem.h"

TEST(ConditionalWaitTest, ConsumerWokenWithNothingToTakeWakesForTheNextHandOver) {
  for (const bool lQueue : {false, true})
    for (const bool lExitAware : {false, true}) {
      setLogCode(127);  // no trace lines: with them, signal() passes the lock every time
      qntest::TableSystem lSys(1, 1, 1);
      auto lTaken = std::async(std::launch::async, [&] {
        QNCPointer<QNCQueueable> lItem;
        if (!lExitAware) return lQueue ? lSys.waitOnEmptyQueue(0, 0) : lSys.waitOnEmptyList(0, 0);
        EXPECT_EQ(QNWS_Ready,
                  lQueue ? lSys.dequeueOrExit(0, 0, 0, lItem) : lSys.delistOrExit(0, 0, 0, lItem));
      });
      for (int lGhost = 0; lGhost < 3; ++lGhost, std::this_thread::sleep_for(std::chrono::milliseconds(20)))
        lSys.signal(0);
      lQueue ? lSys.enqueue(0, qntest::makeItem(1)) : lSys.enlist(0, qntest::makeItem(1));
      lSys.signal(0);
      const bool lInTime = lTaken.wait_for(std::chrono::seconds(5)) == std::future_status::ready;
      EXPECT_TRUE(lInTime) << "queue " << lQueue << ", exit-aware " << lExitAware;
      if (!lInTime) setLogCode(255), lSys.signal(0);  // trace on: signal() wakes whatever the count
      lTaken.get();
    }
}
