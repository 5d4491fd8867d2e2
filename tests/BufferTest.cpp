// Buffers and the buffer pool (QNCBufferManager): lengths within the capacity, bucket choice,
// reuse, and hand-out under contention.

#include <gtest/gtest.h>

#include <atomic>
#include <cstring>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <thread>

#include "AllocatedBuffer.h"
#include "BufferManager.h"
#include "LocalBuffer.h"
#include "Logger.h"
#include "TableSystem.h"
#include "TestSupport.h"

namespace {

QNCPointer<QNCBuffer> makeBuffer(unsigned int aUseLength, unsigned int aMaxLength) {
  return QNCPointer<QNCBuffer>(new (std::nothrow) QNCAllocatedBuffer(aUseLength, aMaxLength),
                               QNPST_Individual, QNPAT_New);
}

TEST(BufferTest, LengthMovesWithinTheCapacityTheBytesStayAndNothingBeyondIsReachable) {
  EXPECT_EQ(10u, makeBuffer(10, 0)->getCapacity());  // a maximum of 0: exactly the used length
  QNCPointer<QNCBuffer> lBuffer = makeBuffer(10, 64);
  lBuffer->setLength(64);
  for (unsigned int lIndex = 0; lIndex < 64; ++lIndex)
    (*lBuffer)[lIndex] = static_cast<unsigned char>(lIndex + 1);
  lBuffer->setLength(0);
  lBuffer->setLength(1);  // the storage never moves
  EXPECT_EQ(1, lBuffer->byte(0));
  EXPECT_EQ("Buffer length beyond its capacity (code 6)",
            qntest::thrown<QNCInvalidEx>([&] { lBuffer->setLength(65); }, true));
  EXPECT_EQ(1u, lBuffer->getLength());
  EXPECT_THROW(lBuffer->byte(1), QNCInvalidEx);  // inside the storage, beyond the contents
  unsigned int lValue = 0x04030201u;
  const QNCLocalBuffer lLocal(reinterpret_cast<const unsigned char*>(&lValue), sizeof lValue);
  lValue = 0;  // the local buffer holds a copy, in memory order
  EXPECT_EQ(0x01, lLocal.byte(0));
  EXPECT_EQ(0x04, lLocal.byte(3));
}

// A system object that only supplies the bucket list.
std::unique_ptr<QNCBufferManager> makeManager(const std::vector<unsigned int>& acrLengths) {
  qntest::TableSystem lSystem;
  for (const unsigned int lLength : acrLengths) lSystem.addBucket(lLength);
  return std::make_unique<QNCBufferManager>(&lSystem);
}

QNCPointer<QNCBuffer> take(QNCBufferManager& arManager, unsigned int aLength) {
  QNCPointer<QNCBuffer> lBuffer;
  arManager.get(aLength, lBuffer);
  return lBuffer;
}

// The bucket shows as the capacity of a new buffer. The first bucket that fits wins, so on an
// unsorted list a later, smaller bucket is shadowed.
TEST(BufferManagerTest, FirstFittingBucketGivesTheCapacity) {
  const struct {
    std::vector<unsigned int> mBuckets;
    unsigned int mLength, mCapacity;
  } kCases[] = {{{64, 256, 1024}, 1, 64},      {{64, 256, 1024}, 64, 64}, {{64, 256, 1024}, 65, 256},
                {{64, 256, 1024}, 1024, 1024}, {{256, 64}, 10, 256},      {{256, 64}, 64, 256}};
  for (const auto& lCase : kCases)
    EXPECT_EQ(lCase.mCapacity, take(*makeManager(lCase.mBuckets), lCase.mLength)->getCapacity())
        << "length " << lCase.mLength << " from " << lCase.mBuckets.size() << " buckets";
}

TEST(BufferManagerTest, ReusedBufferComesBackWithItsOldBytesAndTheNewLengthFirstInFirstOut) {
  auto lManager = makeManager({64, 256});
  QNCPointer<QNCBuffer> lFirst = take(*lManager, 100);
  memcpy(static_cast<unsigned char*>(*lFirst), "previous user", 13);
  QNCBuffer* const lObject = lFirst.get();
  lManager->reuse(lFirst);
  EXPECT_EQ(lObject, lFirst.get());  // reuse leaves the caller's pointer alone
  QNCPointer<QNCBuffer> lSecond = take(*lManager, 200);
  EXPECT_EQ(lObject, lSecond.get());
  EXPECT_EQ(200u, lSecond->getLength());
  EXPECT_EQ(0, memcmp("previous user", static_cast<const unsigned char*>(*lSecond), 13));

  QNCPointer<QNCBuffer> lA = take(*lManager, 10), lB = take(*lManager, 10), lC = take(*lManager, 10);
  // The first round fills fresh queue nodes, the second the recycled ones.
  QNCPointer<QNCBuffer>* const lRounds[2][3] = {{&lB, &lC, &lA}, {&lA, &lC, &lB}};
  for (const auto& lRound : lRounds) {
    for (QNCPointer<QNCBuffer>* lpBuffer : lRound) lManager->reuse(*lpBuffer);
    for (QNCPointer<QNCBuffer>* lpBuffer : lRound) EXPECT_EQ(lpBuffer->get(), take(*lManager, 1).get());
  }
  const QNCPointer<QNCBuffer> lNew = take(*lManager, 1);  // the bucket is empty again
  EXPECT_TRUE(lNew.get() != lA.get() && lNew.get() != lB.get() && lNew.get() != lC.get());
}

// reuse files a buffer by its used length, not by the bucket it came from, and keeps none whose
// used length exceeds 4096, nor one whose capacity is below its bucket's length.
TEST(BufferManagerTest, ReuseSortsByUsedLengthUpTo4096) {
  auto lManager = makeManager({64, 8192});
  QNCPointer<QNCBuffer> lLarge = take(*lManager, 5000);
  lLarge->setLength(4097);
  lManager->reuse(lLarge);
  EXPECT_NE(lLarge.get(), take(*lManager, 4097).get());
  lLarge->setLength(4096);
  lManager->reuse(lLarge);
  EXPECT_EQ(lLarge.get(), take(*lManager, 4096).get());
  lLarge->setLength(10);
  lManager->reuse(lLarge);
  EXPECT_EQ(lLarge.get(), take(*lManager, 50).get());
  EXPECT_NE(lLarge.get(), take(*lManager, 5000).get());  // bucket 1 lost it

  QNCPointer<QNCBuffer> lMessage = makeBuffer(100, 0);  // would sort into bucket 1, too small for it
  lManager->reuse(lMessage);
  EXPECT_NE(lMessage.get(), take(*lManager, 8192).get());
  QNCPointer<QNCBuffer> lExact = makeBuffer(64, 0);
  lManager->reuse(lExact);
  EXPECT_EQ(lExact.get(), take(*lManager, 64).get());
}

// get without a fitting bucket fails the caller and leaves no bucket locked; reuse of a buffer
// that no bucket takes only logs, since the caller is done with it anyway.
TEST(BufferManagerTest, NoFittingBucketThrowsFromGetButOnlyLogsFromReuse) {
  auto lManager = makeManager({64, 256, 1024});
  QNCPointer<QNCBuffer> lBuffer = take(*lManager, 5);
  QNCBuffer* const lBefore = lBuffer.get();
  EXPECT_EQ("Cannot find a buffer bucket (code 2)",
            qntest::thrown<QNCNoMemoryEx>([&] { lManager->get(1025, lBuffer); }, true));
  EXPECT_EQ(lBefore, lBuffer.get());
  EXPECT_EQ(1024u, take(*lManager, 1024)->getCapacity());
  QNCPointer<QNCBuffer> lForeign = makeBuffer(4096, 0);
  EXPECT_NO_THROW(lManager->reuse(lForeign));
}

// Threads take and return buffers of every bucket, also lowering the used length so buffers
// move between buckets. A buffer handed to two threads at once, or lost, must show.
TEST(BufferManagerThreadTest, ConcurrentTakersNeitherLoseNorShareABuffer) {
  setLogCode(255u & ~static_cast<unsigned int>(QNLL_Trace));
  auto lManager = makeManager({64, 256, 1024});
  const unsigned int lLengths[] = {64, 256, 1024};
  std::mutex lGuard;  // guards lOut and lSeen
  std::set<QNCBuffer*> lOut;
  std::map<QNCBuffer*, QNCPointer<QNCBuffer>> lSeen;  // kept alive so addresses stay unique
  std::atomic<unsigned int> lFailures{0};
  std::vector<std::thread> lThreads;
  for (unsigned int lThread = 0; lThread < 4; ++lThread) {
    lThreads.emplace_back([&, lThread] {
      for (unsigned int lRound = 0; lRound < 2000; ++lRound) {
        const unsigned int lLength = lLengths[(lRound + lThread) % 3];
        QNCPointer<QNCBuffer> lBuffer = take(*lManager, lLength);
        {
          std::lock_guard<std::mutex> lLock(lGuard);
          if (!lOut.insert(lBuffer.get()).second) ++lFailures;
          lSeen.emplace(lBuffer.get(), lBuffer);
        }
        memset(static_cast<unsigned char*>(*lBuffer), static_cast<int>(lRound),
               lLength);  // races show in TSan
        std::this_thread::yield();
        if (lRound % 5 == 0) lBuffer->setLength(lLength / 2);
        {
          std::lock_guard<std::mutex> lLock(lGuard);
          lOut.erase(lBuffer.get());
        }
        lManager->reuse(lBuffer);
      }
    });
  }
  for (std::thread& lThread : lThreads) lThread.join();
  EXPECT_EQ(0u, lFailures.load());
  // Drain every bucket until it makes a new buffer: each buffer ever seen comes back exactly once.
  std::set<QNCBuffer*> lDrained;
  for (const unsigned int lLength : lLengths) {
    for (;;) {
      QNCPointer<QNCBuffer> lBuffer = take(*lManager, lLength);
      if (lSeen.count(lBuffer.get()) == 0) break;
      EXPECT_TRUE(lDrained.insert(lBuffer.get()).second) << "a buffer was pooled twice";
    }
  }
  EXPECT_EQ(lSeen.size(), lDrained.size());
  setLogCode(255);
}

}  // namespace
