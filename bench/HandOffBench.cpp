// Hand-off of shared objects between threads through the system object's lists and
// conditionals (enlist + signal / waitOnEmptyList + delist), against a baseline of a plain
// std::mutex + std::deque + std::condition_variable queue of std::shared_ptr.
//
// A third contender takes the same locks as the system object's calls, built from the standard
// library alone (a list with its own mutex, a separate conditional, the emptiness test under
// both, a separate delist): the floor for this sequence of calls. Its ratio to the system object
// (same_locks_ratio) is the cost of the library's own code; the ratio to the baseline is the
// cost of the call sequence.
//
// Each benchmark measures the contenders in the same run, round by round: every iteration
// hands one batch through each (Stream and PingPong rotate the order between rounds; OneThread,
// with nothing to contend for, keeps it). The counters give each
// contender's rate over all rounds and the ratios (system / baseline, system / same locks);
// the benchmark's own time is the system object's.
//
//   Stream/P:C   P producers hand kStreamBatch items in total to C consumers; items per second.
//   PingPong     one object goes back and forth between two threads; round trips per second.
//   OneThread    one thread hands items to itself: the calls' cost without contention.
//
// The objects exist before the clock starts and outlive the batch in both contenders, so each
// hand-off costs one reference taken by the producer and one dropped by the consumer, and no
// object is created or destroyed while measuring.

#include <benchmark/benchmark.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <deque>
#include <list>
#include <memory>
#include <mutex>
#include <new>
#include <thread>
#include <vector>

#include "BenchSupport.h"
#include "Conditional.h"
#include "QNException.h"
#include "Queueable.h"
#include "SynchList.h"
#include "System.h"

namespace {

using Clock = std::chrono::steady_clock;

constexpr int kStreamBatch = 20000;
constexpr int kPingPongBatch = 2000;

class Item : public QNCQueueable {};

// --- The baseline: what a careful programmer writes with the standard library alone.
class BaselineQueue {
 public:
  void push(const std::shared_ptr<Item>& acrItem) {
    {
      std::lock_guard<std::mutex> lGuard(mMutex);
      mItems.push_back(acrItem);
    }
    mNotEmpty.notify_one();
  }

  std::shared_ptr<Item> pop() {
    std::unique_lock<std::mutex> lGuard(mMutex);
    mNotEmpty.wait(lGuard, [this] { return !mItems.empty(); });
    std::shared_ptr<Item> lItem = std::move(mItems.front());
    mItems.pop_front();
    return lItem;
  }

 private:
  std::mutex mMutex;  // guards mItems
  std::condition_variable mNotEmpty;
  std::deque<std::shared_ptr<Item>> mItems;
};

// --- The system object's sequence of locks, with the standard library: enlist under the list's
// mutex, then signal under the conditional's; wait under the conditional's mutex with the
// emptiness test under the list's, then delist under the list's mutex again.
class SameLocksQueue {
 public:
  void push(const std::shared_ptr<Item>& acrItem) {
    {
      std::lock_guard<std::mutex> lGuard(mListMutex);
      mItems.push_back(acrItem);
    }
    std::lock_guard<std::mutex> lGuard(mConditionMutex);
    mNotEmpty.notify_one();
  }

  std::shared_ptr<Item> pop() {
    for (;;) {
      {
        std::unique_lock<std::mutex> lGuard(mConditionMutex);
        while (_isEmpty()) mNotEmpty.wait(lGuard);
      }
      std::lock_guard<std::mutex> lGuard(mListMutex);
      if (mItems.empty()) continue;  // another consumer was first
      std::shared_ptr<Item> lItem = mItems.front();
      mItems.pop_front();
      return lItem;
    }
  }

 private:
  bool _isEmpty() {
    std::lock_guard<std::mutex> lGuard(mListMutex);
    return mItems.empty();
  }

  std::mutex mConditionMutex;
  std::condition_variable mNotEmpty;
  std::mutex mListMutex;  // guards mItems
  std::list<std::shared_ptr<Item>> mItems;
};

// --- The system object with the tables the hand-offs use: lists 0 and 1, each paired with the
// conditional of the same number.
class HandOffSystem : public QNCSystem {
 public:
  HandOffSystem() {
    for (int lIndex = 0; lIndex < 2; ++lIndex) {
      mWaitConditionals.append(QNCPointer<QNCConditional>(new (std::nothrow) QNCConditional));
      mLists.append(QNCPointer<QNCSynchList>(new (std::nothrow) QNCSynchList));
    }
  }
  void setCommandLineArgumentDesc() override {}
  void parseConfigFile(QNCString&) override { throw QNCNotImplementedEx("no config file", 0); }
  void displayHelp() override {}

  void handOff(unsigned int aNumber, const QNCPointer<QNCQueueable>& acrItem) {
    enlist(aNumber, acrItem);
    signal(aNumber);
  }

  // Blocks until list aNumber holds an element and takes it (another consumer may be first).
  QNCPointer<QNCQueueable> take(unsigned int aNumber) {
    for (;;) {
      waitOnEmptyList(aNumber, aNumber);
      try {
        return delist(aNumber);
      } catch (const QNCNotFoundEx&) {
      }
    }
  }
};

// Starts the threads, releases them together and returns the seconds from the release until
// the last of them has finished its share.
template <class Body>
double runThreads(int aThreads, Body aBody) {
  std::atomic<bool> lGo{false};
  std::vector<Clock::time_point> lEnds(aThreads);
  std::vector<std::thread> lThreads;
  for (int lIndex = 0; lIndex < aThreads; ++lIndex) {
    lThreads.emplace_back([&, lIndex] {
      while (!lGo.load(std::memory_order_acquire)) std::this_thread::yield();
      aBody(lIndex);
      lEnds[lIndex] = Clock::now();
    });
  }
  const Clock::time_point lStart = Clock::now();
  lGo.store(true, std::memory_order_release);
  for (auto& lThread : lThreads) lThread.join();
  Clock::time_point lEnd = lStart;
  for (const auto& lThreadEnd : lEnds) lEnd = std::max(lEnd, lThreadEnd);
  return std::chrono::duration<double>(lEnd - lStart).count();
}

// Producers 0..P-1 hand their share and then one stop marker; consumers end at their first
// marker, so every item is taken before the last consumer ends.
template <class Queue>
double streamStandard(int aProducers, int aConsumers, const std::vector<std::shared_ptr<Item>>& acrItems,
                      const std::shared_ptr<Item>& acrStop) {
  Queue lQueue;
  const int lShare = kStreamBatch / aProducers;
  return runThreads(aProducers + aConsumers, [&](int aIndex) {
    if (aIndex < aProducers) {
      for (int lItem = aIndex * lShare; lItem < (aIndex + 1) * lShare; ++lItem) lQueue.push(acrItems[lItem]);
      lQueue.push(acrStop);
    } else {
      while (lQueue.pop() != acrStop) {
      }
    }
  });
}

double streamSystem(HandOffSystem& arSystem, int aProducers, int aConsumers,
                    const std::vector<QNCPointer<QNCQueueable>>& acrItems,
                    const QNCPointer<QNCQueueable>& acrStop) {
  const int lShare = kStreamBatch / aProducers;
  return runThreads(aProducers + aConsumers, [&](int aIndex) {
    if (aIndex < aProducers) {
      for (int lItem = aIndex * lShare; lItem < (aIndex + 1) * lShare; ++lItem)
        arSystem.handOff(0, acrItems[lItem]);
      arSystem.handOff(0, acrStop);
    } else {
      while (arSystem.take(0).get() != acrStop.get()) {
      }
    }
  });
}

void reportRates(benchmark::State& arState, double aBaselineSeconds, double aSystemSeconds, double aCount) {
  arState.counters["base_per_s"] = aCount / aBaselineSeconds;
  arState.counters["qn_per_s"] = aCount / aSystemSeconds;
  arState.counters["ratio"] = aBaselineSeconds / aSystemSeconds;
}

void reportSameLocks(benchmark::State& arState, double aSameLocksSeconds, double aSystemSeconds,
                     double aCount) {
  arState.counters["same_locks_per_s"] = aCount / aSameLocksSeconds;
  arState.counters["same_locks_ratio"] = aSameLocksSeconds / aSystemSeconds;
}

void BM_Stream(benchmark::State& arState) {
  qnbench::setTraceLogging(false);
  const int lProducers = static_cast<int>(arState.range(0));
  const int lConsumers = static_cast<int>(arState.range(1));
  std::vector<std::shared_ptr<Item>> lBaselineItems;
  std::vector<QNCPointer<QNCQueueable>> lSystemItems;
  for (int lIndex = 0; lIndex < kStreamBatch; ++lIndex) {
    lBaselineItems.push_back(std::make_shared<Item>());
    lSystemItems.emplace_back(new (std::nothrow) Item);
  }
  const auto lBaselineStop = std::make_shared<Item>();
  const QNCPointer<QNCQueueable> lSystemStop(new (std::nothrow) Item);
  HandOffSystem lSystem;
  double lSeconds[3] = {0, 0, 0};  // baseline, same locks, system object
  int lFirst = 0;
  for (auto _ : arState) {
    double lRound = 0;
    for (int lTurn = 0; lTurn < 3; ++lTurn) {
      const int lContender = (lFirst + lTurn) % 3;
      if (lContender == 0) {
        lSeconds[0] += streamStandard<BaselineQueue>(lProducers, lConsumers, lBaselineItems, lBaselineStop);
      } else if (lContender == 1) {
        lSeconds[1] += streamStandard<SameLocksQueue>(lProducers, lConsumers, lBaselineItems, lBaselineStop);
      } else {
        lRound = streamSystem(lSystem, lProducers, lConsumers, lSystemItems, lSystemStop);
        lSeconds[2] += lRound;
      }
    }
    arState.SetIterationTime(lRound);
    lFirst = (lFirst + 1) % 3;
  }
  const double lItems = static_cast<double>(arState.iterations()) * kStreamBatch;
  reportRates(arState, lSeconds[0], lSeconds[2], lItems);
  reportSameLocks(arState, lSeconds[1], lSeconds[2], lItems);
  qnbench::setTraceLogging(true);
}
BENCHMARK(BM_Stream)
    ->ArgNames({"producers", "consumers"})
    ->Args({1, 1})
    ->Args({2, 2})
    ->UseManualTime()
    ->Iterations(40);

void BM_PingPong(benchmark::State& arState) {
  qnbench::setTraceLogging(false);
  const auto lBaselineBall = std::make_shared<Item>();
  const QNCPointer<QNCQueueable> lSystemBall(new (std::nothrow) Item);
  HandOffSystem lSystem;
  auto lBaseline = [&] {
    BaselineQueue lThere;
    BaselineQueue lBack;
    return runThreads(2, [&](int aIndex) {
      for (int lTrip = 0; lTrip < kPingPongBatch; ++lTrip) {
        if (aIndex == 0) {
          lThere.push(lBaselineBall);
          benchmark::DoNotOptimize(lBack.pop());
        } else {
          lBack.push(lThere.pop());
        }
      }
    });
  };
  auto lQn = [&] {
    return runThreads(2, [&](int aIndex) {
      for (int lTrip = 0; lTrip < kPingPongBatch; ++lTrip) {
        if (aIndex == 0) {
          lSystem.handOff(1, lSystemBall);
          benchmark::DoNotOptimize(lSystem.take(0));
        } else {
          lSystem.handOff(0, lSystem.take(1));
        }
      }
    });
  };
  double lBaselineSeconds = 0;
  double lSystemSeconds = 0;
  bool lBaselineFirst = true;
  for (auto _ : arState) {
    if (lBaselineFirst) lBaselineSeconds += lBaseline();
    const double lRound = lQn();
    if (!lBaselineFirst) lBaselineSeconds += lBaseline();
    lSystemSeconds += lRound;
    arState.SetIterationTime(lRound);
    lBaselineFirst = !lBaselineFirst;
  }
  reportRates(arState, lBaselineSeconds, lSystemSeconds,
              static_cast<double>(arState.iterations()) * kPingPongBatch);
  qnbench::setTraceLogging(true);
}
BENCHMARK(BM_PingPong)->UseManualTime()->Iterations(20);

// One thread hands items to itself: the cost of the calls without any contention, which shows how
// much of the stream's gap is the number of locks per item rather than the hand-off between cores.
void BM_OneThread(benchmark::State& arState) {
  qnbench::setTraceLogging(false);
  constexpr int kBatch = 10000;
  HandOffSystem lSystem;
  BaselineQueue lBaseline;
  SameLocksQueue lSameLocks;
  const QNCPointer<QNCQueueable> lSystemItem(new (std::nothrow) Item);
  const auto lBaselineItem = std::make_shared<Item>();
  auto lTime = [](auto aBody) {
    const Clock::time_point lStart = Clock::now();
    for (int lItem = 0; lItem < kBatch; ++lItem) aBody();
    return std::chrono::duration<double>(Clock::now() - lStart).count();
  };
  double lBaselineSeconds = 0;
  double lSameLocksSeconds = 0;
  double lSystemSeconds = 0;
  for (auto _ : arState) {
    lBaselineSeconds += lTime([&] {
      lBaseline.push(lBaselineItem);
      benchmark::DoNotOptimize(lBaseline.pop());
    });
    lSameLocksSeconds += lTime([&] {
      lSameLocks.push(lBaselineItem);
      benchmark::DoNotOptimize(lSameLocks.pop());
    });
    const double lRound = lTime([&] {
      lSystem.handOff(0, lSystemItem);
      benchmark::DoNotOptimize(lSystem.take(0));
    });
    lSystemSeconds += lRound;
    arState.SetIterationTime(lRound);
  }
  const double lItems = static_cast<double>(arState.iterations()) * kBatch;
  reportRates(arState, lBaselineSeconds, lSystemSeconds, lItems);
  reportSameLocks(arState, lSameLocksSeconds, lSystemSeconds, lItems);
  qnbench::setTraceLogging(true);
}
BENCHMARK(BM_OneThread)->UseManualTime()->Iterations(200);

}  // namespace

QN_BENCHMARK_MAIN();
