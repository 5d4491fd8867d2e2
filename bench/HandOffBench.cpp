// Hand-off of shared objects between threads: the system object's lists and conditionals against
// what a user would pick instead. Contenders, each registered as HandOff/<case>/<contender>:
//
//   ours_parts  enlist + signal / waitOnEmptyList + delist (retried on QNCNotFoundEx, which a
//               consumer meets when another one took the element first)
//   ours_exit   enlist + signal / delistOrExit without a time limit
//   std_queue   std::mutex + std::deque + std::condition_variable, notify after the unlock
//   moodycamel  moodycamel::BlockingConcurrentQueue
//   floor       what the exit-aware take's contract requires, written with the standard library:
//               the list's own mutex for every hand-over and take, the conditional's mutex only
//               for a consumer that found the list empty (it counts itself before its test, and a
//               producer that sees nobody counted takes no other lock; a woken consumer's first
//               test runs uncounted), the exit flag read under
//               its own mutex before each wait. The elements sit in a std::list, as the list's
//               iterators (listBegin, listErase) require, whose nodes are recycled through a
//               bounded spare list, as the library's are, so that a steady hand-off allocates
//               nothing.
//
// Cases: stream1to1, stream2to2 (P producers hand kStreamBatch items in all to C consumers;
// items/s), pingpong (one object back and forth between two threads through two channels; round
// trips/s), 1thread (a thread hands items to itself: the calls' cost without contention).
// Every element is an object made before measuring, so a hand-off costs one counted reference
// taken by the producer and one dropped by the consumer, for every contender alike.
//
// The threads of a case are started before its timed region and live for the whole benchmark;
// each iteration releases one batch to them and is timed (manual time) from the release until
// the last thread has finished its share. Trace logging is masked off.

#include <benchmark/benchmark.h>
#include <concurrentqueue/blockingconcurrentqueue.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdlib>
#include <deque>
#include <functional>
#include <list>
#include <memory>
#include <mutex>
#include <new>
#include <string>
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

constexpr int kObjects = 1024;  // distinct objects the producers cycle through
constexpr int kStreamBatch = 8000;
constexpr int kPingPongBatch = 400;
constexpr int kOneThreadBatch = 10000;

class Item : public QNCQueueable {};
using StdElement = std::shared_ptr<Item>;
using OurElement = QNCPointer<QNCQueueable>;

// Every contender offers two channels (0 and 1): put hands an element over, take blocks until it
// can remove one.

class StdQueue {
 public:
  using Element = StdElement;
  void put(int aChannel, const Element& acrElement) {
    Channel& lrChannel = mChannels[aChannel];
    {
      std::lock_guard<std::mutex> lGuard(lrChannel.mMutex);
      lrChannel.mItems.push_back(acrElement);
    }
    lrChannel.mNotEmpty.notify_one();
  }
  Element take(int aChannel) {
    Channel& lrChannel = mChannels[aChannel];
    std::unique_lock<std::mutex> lGuard(lrChannel.mMutex);
    lrChannel.mNotEmpty.wait(lGuard, [&] { return !lrChannel.mItems.empty(); });
    Element lElement = std::move(lrChannel.mItems.front());
    lrChannel.mItems.pop_front();
    return lElement;
  }

 private:
  struct Channel {
    std::mutex mMutex;  // guards mItems
    std::condition_variable mNotEmpty;
    std::deque<Element> mItems;
  };
  Channel mChannels[2];
};

class Moodycamel {
 public:
  using Element = StdElement;
  void put(int aChannel, const Element& acrElement) { mChannels[aChannel].enqueue(acrElement); }
  Element take(int aChannel) {
    Element lElement;
    mChannels[aChannel].wait_dequeue(lElement);
    return lElement;
  }

 private:
  moodycamel::BlockingConcurrentQueue<Element> mChannels[2];
};

class Floor {
 public:
  using Element = StdElement;
  void put(int aChannel, const Element& acrElement) {
    Channel& lrChannel = mChannels[aChannel];
    Element lElement(acrElement);
    std::list<Element> lNode;
    if (lrChannel.mSpareCount.load(std::memory_order_relaxed) == 0) lNode.push_back(std::move(lElement));
    {
      std::lock_guard<std::mutex> lGuard(lrChannel.mListMutex);
      if (lNode.empty() && !lrChannel.mSpare.empty()) {
        lrChannel.mSpare.front() = std::move(lElement);
        lrChannel.mItems.splice(lrChannel.mItems.end(), lrChannel.mSpare, lrChannel.mSpare.begin());
        lrChannel.mSpareCount.store(lrChannel.mSpare.size(), std::memory_order_relaxed);
      } else {
        if (lNode.empty()) lNode.push_back(std::move(lElement));
        lrChannel.mItems.splice(lrChannel.mItems.end(), lNode, lNode.begin());
      }
    }
    if (lrChannel.mWaiters.load() != 0) {
      { std::lock_guard<std::mutex> lGuard(lrChannel.mConditionMutex); }
      lrChannel.mNotEmpty.notify_one();
    }
  }
  Element take(int aChannel) {
    Channel& lrChannel = mChannels[aChannel];
    Element lElement;
    if (_tryTake(lrChannel, lElement)) return lElement;
    lrChannel.mWaiters.fetch_add(1);
    std::unique_lock<std::mutex> lGuard(lrChannel.mConditionMutex);
    while (!_tryTake(lrChannel, lElement) && !_isSetForExit()) {
      lrChannel.mNotEmpty.wait(lGuard);
      lrChannel.mWaiters.fetch_sub(1);  // the first test after a wake-up runs uncounted
      const bool lTaken = _tryTake(lrChannel, lElement);
      lrChannel.mWaiters.fetch_add(1);
      if (lTaken) break;
    }
    lGuard.unlock();
    lrChannel.mWaiters.fetch_sub(1);
    return lElement;
  }

 private:
  static constexpr std::size_t kMaxSpare = 1024;  // the library's bound on spare nodes per list
  struct Channel {
    std::atomic<int> mWaiters{0};  // consumers between their registration and their unlock
    std::mutex mConditionMutex;
    std::condition_variable mNotEmpty;
    std::mutex mListMutex;  // guards mItems and mSpare
    std::list<Element> mItems;
    std::list<Element> mSpare;  // emptied nodes for the next put
    std::atomic<std::size_t> mSpareCount{0};
  };
  static bool _tryTake(Channel& arChannel, Element& arElement) {
    std::list<Element> lFreed;
    std::lock_guard<std::mutex> lGuard(arChannel.mListMutex);
    if (arChannel.mItems.empty()) return false;
    arElement = std::move(arChannel.mItems.front());
    if (arChannel.mSpare.size() < kMaxSpare) {
      arChannel.mSpare.splice(arChannel.mSpare.begin(), arChannel.mItems, arChannel.mItems.begin());
      arChannel.mSpareCount.store(arChannel.mSpare.size(), std::memory_order_relaxed);
    } else {
      lFreed.splice(lFreed.end(), arChannel.mItems, arChannel.mItems.begin());
    }
    return true;
  }
  bool _isSetForExit() {
    std::lock_guard<std::mutex> lGuard(mExitMutex);
    return mExitFlag;
  }
  Channel mChannels[2];
  std::mutex mExitMutex;  // guards mExitFlag
  bool mExitFlag = false;
};

// The system object with lists 0 and 1, each paired with the conditional of the same number.
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
};

// Both of ours hand over with enlist + signal; they differ in the take.
class OursPut {
 public:
  using Element = OurElement;
  void put(int aChannel, const Element& acrElement) {
    mSystem.enlist(aChannel, acrElement);
    mSystem.signal(aChannel);
  }

 protected:
  HandOffSystem mSystem;
};

class OursParts : public OursPut {
 public:
  Element take(int aChannel) {
    for (;;) {
      mSystem.waitOnEmptyList(aChannel, aChannel);
      try {
        return mSystem.delist(aChannel);
      } catch (const QNCNotFoundEx&) {
      }
    }
  }
};

class OursExit : public OursPut {
 public:
  Element take(int aChannel) {
    Element lElement;
    if (mSystem.delistOrExit(aChannel, aChannel, 0, lElement) != QNWS_Ready) std::abort();
    return lElement;
  }
};

template <class Element>
Element makeElement();
template <>
StdElement makeElement<StdElement>() {
  return std::make_shared<Item>();
}
template <>
OurElement makeElement<OurElement>() {
  return OurElement(new (std::nothrow) Item);
}

// The contender and its objects live for the whole program (never destroyed: the system object's
// destructor would log after the benchmarks), so every run starts from the same warm state; each
// run takes every element it hands over.
template <class Contender>
Contender& contender() {
  static Contender* const spContender = new Contender;
  return *spContender;
}
template <class Contender>
const std::vector<typename Contender::Element>& objects() {
  static const auto* const spObjects = [] {
    auto* lpObjects = new std::vector<typename Contender::Element>;
    for (int lIndex = 0; lIndex < kObjects; ++lIndex)
      lpObjects->push_back(makeElement<typename Contender::Element>());
    return lpObjects;
  }();
  return *spObjects;
}

// Threads started once, before the timed region; runBatch() releases them together and returns
// the seconds from the release until the last of them has finished its share.
class Crew {
 public:
  Crew(int aThreads, std::function<void(int)> aShare) : mShare(std::move(aShare)), mEnds(aThreads) {
    for (int lIndex = 0; lIndex < aThreads; ++lIndex) mThreads.emplace_back([this, lIndex] { _run(lIndex); });
  }
  ~Crew() {
    {
      std::lock_guard<std::mutex> lGuard(mMutex);
      mStop = true;
    }
    mGo.notify_all();
    for (auto& lThread : mThreads) lThread.join();
  }
  double runBatch() {
    std::unique_lock<std::mutex> lGuard(mMutex);
    mFinished = 0;
    ++mRound;
    const Clock::time_point lStart = Clock::now();
    mGo.notify_all();
    mDone.wait(lGuard, [this] { return mFinished == static_cast<int>(mThreads.size()); });
    Clock::time_point lEnd = lStart;
    for (const auto& lThreadEnd : mEnds) lEnd = std::max(lEnd, lThreadEnd);
    return std::chrono::duration<double>(lEnd - lStart).count();
  }

 private:
  void _run(int aIndex) {
    long lSeen = 0;
    for (;;) {
      {
        std::unique_lock<std::mutex> lGuard(mMutex);
        mGo.wait(lGuard, [&] { return mStop || mRound != lSeen; });
        if (mStop) return;
        lSeen = mRound;
      }
      mShare(aIndex);
      std::lock_guard<std::mutex> lGuard(mMutex);
      mEnds[aIndex] = Clock::now();
      if (++mFinished == static_cast<int>(mThreads.size())) mDone.notify_one();
    }
  }

  std::function<void(int)> mShare;
  std::mutex mMutex;  // guards mRound, mFinished, mStop, mEnds
  std::condition_variable mGo;
  std::condition_variable mDone;
  long mRound = 0;
  int mFinished = 0;
  bool mStop = false;
  std::vector<Clock::time_point> mEnds;
  std::vector<std::thread> mThreads;
};

void runCrew(benchmark::State& arState, int aThreads, const std::function<void(int)>& acrShare, int aBatch) {
  qnbench::setTraceLogging(false);
  Crew lCrew(aThreads, acrShare);
  for (auto _ : arState) arState.SetIterationTime(lCrew.runBatch());
  arState.SetItemsProcessed(arState.iterations() * aBatch);
  qnbench::setTraceLogging(true);
}

// Threads 0..P-1 produce kStreamBatch / P items each; threads P..P+C-1 take kStreamBatch / C each.
template <class Contender>
void stream(benchmark::State& arState, int aProducers, int aConsumers) {
  Contender& lrContender = contender<Contender>();
  const auto& lrObjects = objects<Contender>();
  runCrew(
      arState, aProducers + aConsumers,
      [&, aProducers, aConsumers](int aIndex) {
        if (aIndex < aProducers) {
          const int lShare = kStreamBatch / aProducers;
          for (int lItem = aIndex * lShare; lItem < (aIndex + 1) * lShare; ++lItem)
            lrContender.put(0, lrObjects[lItem % kObjects]);
        } else {
          for (int lItem = 0; lItem < kStreamBatch / aConsumers; ++lItem)
            benchmark::DoNotOptimize(lrContender.take(0));
        }
      },
      kStreamBatch);
}

template <class Contender>
void pingPong(benchmark::State& arState) {
  Contender& lrContender = contender<Contender>();
  const auto& lrBall = objects<Contender>()[0];
  runCrew(
      arState, 2,
      [&](int aIndex) {
        for (int lTrip = 0; lTrip < kPingPongBatch; ++lTrip) {
          if (aIndex == 0) {
            lrContender.put(1, lrBall);
            benchmark::DoNotOptimize(lrContender.take(0));
          } else {
            lrContender.put(0, lrContender.take(1));
          }
        }
      },
      kPingPongBatch);
}

template <class Contender>
void oneThread(benchmark::State& arState) {
  qnbench::setTraceLogging(false);
  Contender& lrContender = contender<Contender>();
  const auto& lrObjects = objects<Contender>();
  for (auto _ : arState) {
    const Clock::time_point lStart = Clock::now();
    for (int lItem = 0; lItem < kOneThreadBatch; ++lItem) {
      lrContender.put(0, lrObjects[lItem % kObjects]);
      benchmark::DoNotOptimize(lrContender.take(0));
    }
    arState.SetIterationTime(std::chrono::duration<double>(Clock::now() - lStart).count());
  }
  arState.SetItemsProcessed(arState.iterations() * kOneThreadBatch);
  qnbench::setTraceLogging(true);
}

template <class Contender>
void registerContender(const std::string& acrName) {
  const std::string lPrefix = "HandOff/";
  const std::pair<const char*, std::function<void(benchmark::State&)>> lCases[] = {
      {"stream1to1", [](benchmark::State& arState) { stream<Contender>(arState, 1, 1); }},
      {"stream2to2", [](benchmark::State& arState) { stream<Contender>(arState, 2, 2); }},
      {"pingpong", [](benchmark::State& arState) { pingPong<Contender>(arState); }},
      {"1thread", [](benchmark::State& arState) { oneThread<Contender>(arState); }},
  };
  for (const auto& lrCase : lCases)
    benchmark::RegisterBenchmark((lPrefix + lrCase.first + "/" + acrName).c_str(), lrCase.second)
        ->UseManualTime()
        ->MinTime(0.1);
}

const bool kRegistered = [] {
  registerContender<OursParts>("ours_parts");
  registerContender<OursExit>("ours_exit");
  registerContender<StdQueue>("std_queue");
  registerContender<Moodycamel>("moodycamel");
  registerContender<Floor>("floor");
  return true;
}();

}  // namespace

QN_BENCHMARK_MAIN();
