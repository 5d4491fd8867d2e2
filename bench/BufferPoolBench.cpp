// The buffer pool against glibc's allocator and against the floor of its own contract, measured
// side by side in one run. Names are Pool/<case>/<contender>:
//
//   ours     QNCBufferManager::get + reuse of one size.
//   malloc   a QNCAllocatedBuffer made with new (std::nothrow) into a QNCPointer and dropped:
//            what a caller without the pool does.
//   floor    the work the pool's rules ask of every get + reuse (a first-fit scan, one std::mutex
//            per call, a FIFO per bucket that holds its own counted reference and never
//            allocates), built from the standard library and nothing of ours.
//
// Cases: 256B and 4KiB on one thread; crossthread256B, buffers taken on one thread and returned
// (or dropped) on another, handed over in batches of 512 so that thread scheduling does not
// dominate; 2threads1bucket and 2threads2buckets, two threads each taking and returning. Trace
// logging is masked off everywhere except traced256B, which shows what the pool's trace lines
// cost with the default mask: the logger is pointed at /dev/null, which it refuses as a log file,
// so the figure holds formatting the lines but no file writes (it never fills a disk). Items are
// get + reuse pairs.

#include <benchmark/benchmark.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <new>
#include <string>
#include <thread>
#include <vector>

#include "AllocatedBuffer.h"
#include "BenchSupport.h"
#include "BufferManager.h"
#include "Logger.h"
#include "Pointer.h"
#include "QNException.h"
#include "QNString.h"
#include "System.h"

namespace {

// Supplies the bucket list of the example service.
class BenchSystem : public QNCSystem {
 public:
  BenchSystem() {
    for (const unsigned int lLength : {64u, 256u, 1024u, 4096u}) mMemoryBufferList.pushBack(lLength);
  }
  void setCommandLineArgumentDesc() override {}
  void parseConfigFile(QNCString&) override { throw QNCNotImplementedEx("no configuration file", 0); }
  void displayHelp() override {}
};

void prepareLogging(bool aTrace) {
  static const bool sLogOpen = [] {
    CreateLogger(QNCString("/dev/null"));
    return true;
  }();
  (void)sLogOpen;
  qnbench::setTraceLogging(aTrace);
}

QNCPointer<QNCBuffer> allocate(unsigned int aLength) {
  return QNCPointer<QNCBuffer>(new (std::nothrow) QNCAllocatedBuffer(aLength, aLength), QNPST_Individual,
                               QNPAT_New);
}

// ---------------------------------------------------------------------------------------------
// One thread.

void poolOurs(benchmark::State& arState, unsigned int aLength, bool aTrace) {
  prepareLogging(aTrace);
  BenchSystem lSystem;
  QNCBufferManager lManager(&lSystem);
  QNCPointer<QNCBuffer> lBuffer;
  lManager.get(aLength, lBuffer);
  lManager.reuse(lBuffer);
  for (auto _ : arState) {
    lManager.get(aLength, lBuffer);
    benchmark::DoNotOptimize(static_cast<unsigned char*>(*lBuffer));
    lManager.reuse(lBuffer);
  }
  arState.SetItemsProcessed(arState.iterations());
}

void poolMalloc(benchmark::State& arState, unsigned int aLength) {
  prepareLogging(false);
  for (auto _ : arState) {
    QNCPointer<QNCBuffer> lBuffer = allocate(aLength);
    benchmark::DoNotOptimize(static_cast<unsigned char*>(*lBuffer));
  }
  arState.SetItemsProcessed(arState.iterations());
}

// The pool's rules with nothing else: first fit over the same lengths, one lock per call, FIFO
// buckets of shared references in rings that never allocate (a full ring drops the buffer).
class SameLocksPool {
 public:
  SameLocksPool() {
    for (Bucket& lBucket : mBuckets) lBucket.mRing.resize(kRingSize);
  }

  std::shared_ptr<QNCBuffer> get(unsigned int aLength) {
    const unsigned int lIndex = _bucket(aLength);
    Bucket& lBucket = mBuckets[lIndex];
    std::shared_ptr<QNCBuffer> lBuffer;
    {
      std::lock_guard<std::mutex> lGuard(lBucket.mMutex);
      if (lBucket.mCount == 0) {
        lBuffer = std::make_shared<QNCAllocatedBuffer>(aLength, kLengths[lIndex]);
      } else {
        lBuffer = std::move(lBucket.mRing[lBucket.mHead]);
        lBucket.mHead = (lBucket.mHead + 1) % kRingSize;
        --lBucket.mCount;
        lBuffer->setLength(aLength);
      }
    }
    return lBuffer;
  }

  void reuse(const std::shared_ptr<QNCBuffer>& acrBuffer) {
    Bucket& lBucket = mBuckets[_bucket(acrBuffer->getLength())];
    std::shared_ptr<QNCBuffer> lQueued(acrBuffer);
    std::lock_guard<std::mutex> lGuard(lBucket.mMutex);
    if (lBucket.mCount == kRingSize) return;
    lBucket.mRing[(lBucket.mHead + lBucket.mCount) % kRingSize] = std::move(lQueued);
    ++lBucket.mCount;
  }

 private:
  static constexpr unsigned int kLengths[] = {64, 256, 1024, 4096};
  static constexpr size_t kRingSize = 16;

  struct Bucket {
    std::mutex mMutex;  // guards mRing, mHead and mCount
    std::vector<std::shared_ptr<QNCBuffer>> mRing;
    size_t mHead = 0;
    size_t mCount = 0;
  };

  static unsigned int _bucket(unsigned int aLength) {
    unsigned int lIndex = 0;
    while (kLengths[lIndex] < aLength) ++lIndex;  // the benchmark never asks beyond the last
    return lIndex;
  }

  Bucket mBuckets[4];
};

void poolFloor(benchmark::State& arState, unsigned int aLength) {
  prepareLogging(false);
  SameLocksPool lPool;
  std::shared_ptr<QNCBuffer> lBuffer = lPool.get(aLength);
  lPool.reuse(lBuffer);
  for (auto _ : arState) {
    lBuffer = lPool.get(aLength);
    benchmark::DoNotOptimize(static_cast<unsigned char*>(*lBuffer));
    lPool.reuse(lBuffer);
  }
  arState.SetItemsProcessed(arState.iterations());
}

// ---------------------------------------------------------------------------------------------
// Taken on the benchmark thread, returned on a consumer thread. Two batch slots let the producer
// fill one while the consumer empties the other.

class Handoff {
 public:
  static constexpr unsigned int kBatch = 512;

  explicit Handoff(QNCBufferManager* apManager) : mManager(apManager) {
    for (Slot& lSlot : mSlots) lSlot.mItems.reserve(kBatch);
    mConsumer = std::thread([this] { _consume(); });
  }

  ~Handoff() {
    for (Slot& lSlot : mSlots) _waitUntilEmpty(lSlot);
    mStop.store(true, std::memory_order_release);
    mConsumer.join();
  }

  // Adds one buffer to the batch being filled; hands the batch over when it is full.
  void push(QNCPointer<QNCBuffer>&& arBuffer) {
    Slot& lSlot = mSlots[mFill];
    lSlot.mItems.push_back(std::move(arBuffer));
    if (lSlot.mItems.size() < kBatch) return;
    lSlot.mFull.store(true, std::memory_order_release);
    mFill ^= 1;
    _waitUntilEmpty(mSlots[mFill]);
  }

 private:
  struct Slot {
    std::vector<QNCPointer<QNCBuffer>> mItems;
    std::atomic<bool> mFull{false};
  };

  // Spinning with yield: the handoff must cost the same in both variants and never sleep long.
  static void _waitUntilEmpty(Slot& arSlot) {
    while (arSlot.mFull.load(std::memory_order_acquire)) std::this_thread::yield();
  }

  void _consume() {
    unsigned int lTake = 0;
    for (;;) {
      Slot& lSlot = mSlots[lTake];
      while (!lSlot.mFull.load(std::memory_order_acquire)) {
        if (mStop.load(std::memory_order_acquire)) return;
        std::this_thread::yield();
      }
      for (QNCPointer<QNCBuffer>& lBuffer : lSlot.mItems) {
        if (mManager != nullptr) mManager->reuse(lBuffer);
        lBuffer.reset();
      }
      lSlot.mItems.clear();
      lSlot.mFull.store(false, std::memory_order_release);
      lTake ^= 1;
    }
  }

  QNCBufferManager* mManager;  // null: the buffers are dropped instead of returned
  Slot mSlots[2];
  unsigned int mFill = 0;  // the slot the producer fills
  std::atomic<bool> mStop{false};
  std::thread mConsumer;
};

void crossThreadOurs(benchmark::State& arState, unsigned int aLength) {
  prepareLogging(false);
  BenchSystem lSystem;
  QNCBufferManager lManager(&lSystem);
  {
    Handoff lHandoff(&lManager);
    for (auto _ : arState) {
      QNCPointer<QNCBuffer> lBuffer;
      lManager.get(aLength, lBuffer);
      benchmark::DoNotOptimize(static_cast<unsigned char*>(*lBuffer));
      lHandoff.push(std::move(lBuffer));
    }
  }
  arState.SetItemsProcessed(arState.iterations());
}

void crossThreadMalloc(benchmark::State& arState, unsigned int aLength) {
  prepareLogging(false);
  {
    Handoff lHandoff(nullptr);
    for (auto _ : arState) {
      QNCPointer<QNCBuffer> lBuffer = allocate(aLength);
      benchmark::DoNotOptimize(static_cast<unsigned char*>(*lBuffer));
      lHandoff.push(std::move(lBuffer));
    }
  }
  arState.SetItemsProcessed(arState.iterations());
}

// ---------------------------------------------------------------------------------------------
// Two threads at once, both on bucket 256, or thread 1 on bucket 1024.

QNCBufferManager& sharedManager() {
  static BenchSystem sSystem;
  static QNCBufferManager sManager(&sSystem);
  return sManager;
}

unsigned int twoThreadLength(const benchmark::State& acrState, bool aSameBucket) {
  return (aSameBucket || acrState.thread_index() == 0) ? 256u : 1024u;
}

void twoThreadsOurs(benchmark::State& arState, bool aSameBucket) {
  const unsigned int lLength = twoThreadLength(arState, aSameBucket);
  prepareLogging(false);
  QNCBufferManager& lManager = sharedManager();
  QNCPointer<QNCBuffer> lBuffer;
  for (auto _ : arState) {
    lManager.get(lLength, lBuffer);
    benchmark::DoNotOptimize(static_cast<unsigned char*>(*lBuffer));
    lManager.reuse(lBuffer);
  }
  arState.SetItemsProcessed(arState.iterations());
}

void twoThreadsMalloc(benchmark::State& arState, bool aSameBucket) {
  const unsigned int lLength = twoThreadLength(arState, aSameBucket);
  prepareLogging(false);
  for (auto _ : arState) {
    QNCPointer<QNCBuffer> lBuffer = allocate(lLength);
    benchmark::DoNotOptimize(static_cast<unsigned char*>(*lBuffer));
  }
  arState.SetItemsProcessed(arState.iterations());
}

// Fixed iteration counts (about 0.1 to 0.3 s per repetition here), so that many interleaved
// rounds fit in a short run and no time limit shows in the names.
const bool kRegistered = [] {
  const struct {
    const char* mpCase;
    unsigned int mLength;
  } lSizes[] = {{"256B", 256}, {"4KiB", 4096}};
  for (const auto& lSize : lSizes) {
    const std::string lPrefix = std::string("Pool/") + lSize.mpCase;
    benchmark::RegisterBenchmark((lPrefix + "/ours").c_str(), poolOurs, lSize.mLength, false)
        ->Iterations(2000000);
    benchmark::RegisterBenchmark((lPrefix + "/malloc").c_str(), poolMalloc, lSize.mLength)
        ->Iterations(2000000);
    benchmark::RegisterBenchmark((lPrefix + "/floor").c_str(), poolFloor, lSize.mLength)->Iterations(2000000);
  }
  benchmark::RegisterBenchmark("Pool/traced256B/ours", poolOurs, 256u, true)->Iterations(100000);
  benchmark::RegisterBenchmark("Pool/crossthread256B/ours", crossThreadOurs, 256u)
      ->Iterations(500000)
      ->UseRealTime();
  benchmark::RegisterBenchmark("Pool/crossthread256B/malloc", crossThreadMalloc, 256u)
      ->Iterations(500000)
      ->UseRealTime();
  for (const bool lSame : {true, false}) {
    const std::string lPrefix = lSame ? "Pool/2threads1bucket" : "Pool/2threads2buckets";
    for (const bool lOurs : {true, false})
      benchmark::RegisterBenchmark((lPrefix + (lOurs ? "/ours" : "/malloc")).c_str(),
                                   lOurs ? twoThreadsOurs : twoThreadsMalloc, lSame)
          ->Iterations(1000000)
          ->Threads(2)
          ->UseRealTime();
  }
  return true;
}();

}  // namespace

QN_BENCHMARK_MAIN();
