// The buffer pool against plain allocation, measured side by side in one run.
//
// Baseline ("Unpooled"): a QNCAllocatedBuffer made with new (std::nothrow) into a QNCPointer and
// dropped, which is what a caller without the pool does. Every case runs with trace logging
// masked off (trace:0) and with the default mask (trace:1); the log goes to /dev/null so the
// trace figures include formatting and the logger's write path but never fill a disk.
//
//   SameThread      get + reuse of one size from one thread. Beside the baseline, SameLocks:
//                   the work the pool's rules ask of every get + reuse (a first-fit scan, one
//                   std::mutex per call, a FIFO that holds its own counted reference and never
//                   allocates), built from the standard library: the floor for this design.
//   CrossThread     buffers taken on one thread and returned (or dropped) on another, as the
//                   service's threads do; handed over in batches of 512, so that few handovers
//                   happen and thread scheduling does not dominate the figure.
//   TwoThreads      two threads each taking and returning, on one bucket or on two.

#include <benchmark/benchmark.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <new>
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

void BM_SameThread_Pooled(benchmark::State& arState) {
  const unsigned int lLength = static_cast<unsigned int>(arState.range(0));
  prepareLogging(arState.range(1) != 0);
  BenchSystem lSystem;
  QNCBufferManager lManager(&lSystem);
  QNCPointer<QNCBuffer> lBuffer;
  lManager.get(lLength, lBuffer);
  lManager.reuse(lBuffer);
  for (auto _ : arState) {
    lManager.get(lLength, lBuffer);
    benchmark::DoNotOptimize(static_cast<unsigned char*>(*lBuffer));
    lManager.reuse(lBuffer);
  }
  arState.SetItemsProcessed(arState.iterations());
}

void BM_SameThread_Unpooled(benchmark::State& arState) {
  const unsigned int lLength = static_cast<unsigned int>(arState.range(0));
  prepareLogging(arState.range(1) != 0);
  for (auto _ : arState) {
    QNCPointer<QNCBuffer> lBuffer = allocate(lLength);
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

void BM_SameThread_SameLocks(benchmark::State& arState) {
  const unsigned int lLength = static_cast<unsigned int>(arState.range(0));
  prepareLogging(arState.range(1) != 0);
  SameLocksPool lPool;
  std::shared_ptr<QNCBuffer> lBuffer = lPool.get(lLength);
  lPool.reuse(lBuffer);
  for (auto _ : arState) {
    lBuffer = lPool.get(lLength);
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

void BM_CrossThread_Pooled(benchmark::State& arState) {
  const unsigned int lLength = static_cast<unsigned int>(arState.range(0));
  prepareLogging(arState.range(1) != 0);
  BenchSystem lSystem;
  QNCBufferManager lManager(&lSystem);
  {
    Handoff lHandoff(&lManager);
    for (auto _ : arState) {
      QNCPointer<QNCBuffer> lBuffer;
      lManager.get(lLength, lBuffer);
      benchmark::DoNotOptimize(static_cast<unsigned char*>(*lBuffer));
      lHandoff.push(std::move(lBuffer));
    }
  }
  arState.SetItemsProcessed(arState.iterations());
}

void BM_CrossThread_Unpooled(benchmark::State& arState) {
  const unsigned int lLength = static_cast<unsigned int>(arState.range(0));
  prepareLogging(arState.range(1) != 0);
  {
    Handoff lHandoff(nullptr);
    for (auto _ : arState) {
      QNCPointer<QNCBuffer> lBuffer = allocate(lLength);
      benchmark::DoNotOptimize(static_cast<unsigned char*>(*lBuffer));
      lHandoff.push(std::move(lBuffer));
    }
  }
  arState.SetItemsProcessed(arState.iterations());
}

// ---------------------------------------------------------------------------------------------
// Two threads at once. range(0) = 1: both use bucket 256; 0: thread 1 uses bucket 1024.

QNCBufferManager& sharedManager() {
  static BenchSystem sSystem;
  static QNCBufferManager sManager(&sSystem);
  return sManager;
}

unsigned int twoThreadLength(const benchmark::State& acrState) {
  return (acrState.range(0) != 0 || acrState.thread_index() == 0) ? 256u : 1024u;
}

void BM_TwoThreads_Pooled(benchmark::State& arState) {
  const unsigned int lLength = twoThreadLength(arState);
  prepareLogging(arState.range(1) != 0);
  QNCBufferManager& lManager = sharedManager();
  QNCPointer<QNCBuffer> lBuffer;
  for (auto _ : arState) {
    lManager.get(lLength, lBuffer);
    benchmark::DoNotOptimize(static_cast<unsigned char*>(*lBuffer));
    lManager.reuse(lBuffer);
  }
  arState.SetItemsProcessed(arState.iterations());
}

void BM_TwoThreads_Unpooled(benchmark::State& arState) {
  const unsigned int lLength = twoThreadLength(arState);
  prepareLogging(arState.range(1) != 0);
  for (auto _ : arState) {
    QNCPointer<QNCBuffer> lBuffer = allocate(lLength);
    benchmark::DoNotOptimize(static_cast<unsigned char*>(*lBuffer));
  }
  arState.SetItemsProcessed(arState.iterations());
}

void sizes(benchmark::internal::Benchmark* apBenchmark) {
  apBenchmark->ArgNames({"bytes", "trace"});
  for (const int lTrace : {0, 1})
    for (const int lBytes : {256, 4096}) apBenchmark->Args({lBytes, lTrace});
}

void crossSizes(benchmark::internal::Benchmark* apBenchmark) {
  apBenchmark->ArgNames({"bytes", "trace"})->Args({256, 0})->Args({256, 1})->UseRealTime();
}

void buckets(benchmark::internal::Benchmark* apBenchmark) {
  apBenchmark->ArgNames({"samebucket", "trace"});
  for (const int lTrace : {0, 1})
    for (const int lSame : {1, 0}) apBenchmark->Args({lSame, lTrace});
  apBenchmark->Threads(2)->UseRealTime();
}

BENCHMARK(BM_SameThread_Unpooled)->Apply(sizes);
BENCHMARK(BM_SameThread_Pooled)->Apply(sizes);
BENCHMARK(BM_SameThread_SameLocks)->ArgNames({"bytes", "trace"})->Args({256, 0})->Args({4096, 0});
BENCHMARK(BM_CrossThread_Unpooled)->Apply(crossSizes);
BENCHMARK(BM_CrossThread_Pooled)->Apply(crossSizes);
BENCHMARK(BM_TwoThreads_Unpooled)->Apply(buckets);
BENCHMARK(BM_TwoThreads_Pooled)->Apply(buckets);

}  // namespace

QN_BENCHMARK_MAIN();
