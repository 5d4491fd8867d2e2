// Lost wake-ups between a producer's hand-over and a consumer's wait. Producer n (threads 0-3)
// hands one item at a time to list n (n < 2) or queue n (n >= 2) with enlist/enqueue +
// signal(n), and waits until it has arrived, so every hand-over must wake a consumer that sleeps
// or is about to. Consumer n (threads 4-7), the only one of number n, takes with the classic
// wait (n even: waitOnEmptyList/waitOnEmptyQueue, then delist/dequeue) or the exit-aware take
// without a time limit (n odd). A signal that skips a consumer which has tested the container
// but not yet waited leaves it asleep beside the item for good: the watchdog then ends the test
// program with a failure instead of letting it hang.

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <vector>

#include "TableSystem.h"

// Yields between the exit-aware waits' emptiness test and their wait (the exit test comes in
// between), so that hand-overs often land in that window.
struct YieldingSystem : qntest::TableSystem {
  using TableSystem::TableSystem;
  bool isSetForExit() const override {
    std::this_thread::yield();
    return TableSystem::isSetForExit();
  }
};

TEST(WakeupRaceTest, EveryHandOverWakesASleepingConsumer) {
  setLogCode(127);               // no trace lines: with them, signal() passes the lock every time
  constexpr int kRounds = 3000;  // items per producer
  YieldingSystem lSys(4, 4, 4);
  std::vector<std::atomic<int>> lArrived(4 * kRounds);
  std::vector<std::future<void>> lThreads;
  for (int lThread = 0; lThread < 8; ++lThread)
    lThreads.push_back(
        std::async(std::launch::async, [&, lThread, lN = lThread % 4, lList = lThread % 4 < 2] {
          for (int lId = lN * kRounds; lThread < 4 && lId < (lN + 1) * kRounds; ++lId) {
            lList ? lSys.enlist(lN, qntest::makeItem(lId)) : lSys.enqueue(lN, qntest::makeItem(lId));
            lSys.signal(lN);
            while (lArrived[lId].load() == 0) std::this_thread::yield();
          }
          for (QNCPointer<QNCQueueable> lItem; lThread >= 4 && lArrived[(lN + 1) * kRounds - 1].load() == 0;
               lArrived[qntest::idOf(lItem)].fetch_add(1)) {
            if (lN % 2 == 0) lList ? lSys.waitOnEmptyList(lN, lN) : lSys.waitOnEmptyQueue(lN, lN);
            if (lN % 2 == 0) lItem = lList ? lSys.delist(lN) : lSys.dequeue(lN);
            ASSERT_TRUE(lN % 2 == 0 || QNWS_Ready == (lList ? lSys.delistOrExit(lN, lN, 0, lItem)
                                                            : lSys.dequeueOrExit(lN, lN, 0, lItem)));
          }
        }));
  for (auto& lThread : lThreads)  // the watchdog
    if (lThread.wait_for(std::chrono::seconds(60)) != std::future_status::ready)
      std::_Exit((std::fputs("a consumer slept beside an item for 60 s: a lost wake-up\n", stderr), 1));
  for (const auto& lArrival : lArrived) ASSERT_EQ(1, lArrival.load()) << "items lost or delivered twice";
}
