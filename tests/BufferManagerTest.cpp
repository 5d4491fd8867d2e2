#include <gtest/gtest.h>

#include <atomic>
#include <cstring>
#include <map>
#include <memory>
#include <mutex>
#include <new>
#include <set>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "AllocatedBuffer.h"
#include "BufferManager.h"
#include "Logger.h"
#include "Pointer.h"
#include "QNException.h"
#include "QNString.h"
#include "System.h"
#include "TestSupport.h"

namespace {

// A system object that only supplies the bucket list (and, on request, its manager).
class BucketSystem : public QNCSystem {
 public:
  explicit BucketSystem(const std::vector<unsigned int>& acrLengths) {
    for (const unsigned int lLength : acrLengths) mMemoryBufferList.pushBack(lLength);
  }
  void installManager() {
    mBufferManager = QNCPointer<QNCBufferManager>(new (std::nothrow) QNCBufferManager(this), QNPST_Individual,
                                                  QNPAT_New);
  }
  void setCommandLineArgumentDesc() override {}
  void parseConfigFile(QNCString&) override { throw QNCNotImplementedEx("no configuration file", 0); }
  void displayHelp() override {}
};

std::unique_ptr<QNCBufferManager> makeManager(const std::vector<unsigned int>& acrLengths) {
  BucketSystem lSystem(acrLengths);
  return std::make_unique<QNCBufferManager>(&lSystem);
}

QNCPointer<QNCBuffer> take(QNCBufferManager& arManager, unsigned int aLength) {
  QNCPointer<QNCBuffer> lBuffer;
  arManager.get(aLength, lBuffer);
  return lBuffer;
}

QNCPointer<QNCBuffer> foreignBuffer(unsigned int aLength) {
  return QNCPointer<QNCBuffer>(new (std::nothrow) QNCAllocatedBuffer(aLength, 0), QNPST_Individual,
                               QNPAT_New);
}

// Every test writes its own log, so that its lines can be checked.
class BufferManagerTest : public ::testing::Test {
 protected:
  void SetUp() override {
    setLogCode(255);
    CreateLogger(QNCString(mDir.file("pool.log").c_str()));
  }
  void TearDown() override { destroyLogger(); }

  // The lines of the log so far that contain acrText.
  std::vector<std::string> linesWith(const std::string& acrText) {
    flushLogger();
    std::istringstream lLog(qntest::readFile(mDir.file("pool.log")));
    std::vector<std::string> lLines;
    for (std::string lLine; std::getline(lLog, lLine);)
      if (lLine.find(acrText) != std::string::npos) lLines.push_back(lLine);
    return lLines;
  }

  qntest::TempDir mDir;
};

// The bucket is visible as the capacity of a new buffer: the manager makes it with the bucket's
// length as its maximum. The first bucket that fits wins, so on an unsorted list a later, smaller
// bucket is shadowed.
TEST_F(BufferManagerTest, FirstFittingBucketGivesTheCapacity) {
  const struct {
    std::vector<unsigned int> mBuckets;
    unsigned int mLength;
    unsigned int mCapacity;
  } kCases[] = {{{64, 256, 1024}, 1, 64},      {{64, 256, 1024}, 64, 64}, {{64, 256, 1024}, 65, 256},
                {{64, 256, 1024}, 1024, 1024}, {{256, 64}, 10, 256},      {{256, 64}, 64, 256}};
  for (const auto& lCase : kCases) {
    EXPECT_EQ(lCase.mCapacity, take(*makeManager(lCase.mBuckets), lCase.mLength)->getCapacity())
        << "length " << lCase.mLength << " from " << lCase.mBuckets.size() << " buckets";
  }
}

TEST_F(BufferManagerTest, LaterOfTwoEqualBucketsIsNeverUsed) {
  auto lDuplicate = makeManager({128, 128});
  QNCPointer<QNCBuffer> lBuffer = take(*lDuplicate, 100);
  lDuplicate->reuse(lBuffer);
  take(*lDuplicate, 128);
  EXPECT_FALSE(linesWith("Determined bucket number is 0").empty());
  EXPECT_TRUE(linesWith("Determined bucket number is 1").empty());
  EXPECT_TRUE(linesWith("bucket # 1").empty());
}

TEST_F(BufferManagerTest, ReusedBufferComesBackWithItsOldBytesAndTheNewLength) {
  auto lManager = makeManager({64, 256});
  QNCPointer<QNCBuffer> lFirst = take(*lManager, 100);
  EXPECT_EQ(256u, lFirst->getCapacity());
  memcpy(static_cast<unsigned char*>(*lFirst), "previous user", 13);
  QNCBuffer* const lObject = lFirst.get();

  lManager->reuse(lFirst);
  EXPECT_EQ(lObject, lFirst.get());  // reuse leaves the caller's pointer alone
  EXPECT_EQ(100u, lFirst->getLength());

  QNCPointer<QNCBuffer> lSecond = take(*lManager, 200);
  EXPECT_EQ(lObject, lSecond.get());
  EXPECT_EQ(200u, lSecond->getLength());
  EXPECT_EQ(0, memcmp("previous user", static_cast<const unsigned char*>(*lSecond), 13));
  EXPECT_EQ(1u, linesWith("No existing buffers.. creating new of 256 size").size());
  EXPECT_EQ(1u, linesWith("Got buffer of 256 length from bucket # 1").size());
}

TEST_F(BufferManagerTest, IdleBuffersComeBackFirstInFirstOut) {
  auto lManager = makeManager({64});
  QNCPointer<QNCBuffer> lA = take(*lManager, 10);
  QNCPointer<QNCBuffer> lB = take(*lManager, 10);
  QNCPointer<QNCBuffer> lC = take(*lManager, 10);
  // The first round fills fresh queue nodes, the second the recycled ones.
  QNCPointer<QNCBuffer>* const lRounds[2][3] = {{&lB, &lC, &lA}, {&lA, &lC, &lB}};
  for (const auto& lRound : lRounds) {
    for (QNCPointer<QNCBuffer>* lpBuffer : lRound) lManager->reuse(*lpBuffer);
    for (QNCPointer<QNCBuffer>* lpBuffer : lRound) EXPECT_EQ(lpBuffer->get(), take(*lManager, 1).get());
  }
  // The queue is empty again: the next buffer is new.
  const QNCPointer<QNCBuffer> lNew = take(*lManager, 1);
  EXPECT_TRUE(lNew.get() != lA.get() && lNew.get() != lB.get() && lNew.get() != lC.get());
}

// reuse files a buffer by its used length, not by the bucket it came from, and keeps none whose
// used length exceeds 4096; get has no such limit.
TEST_F(BufferManagerTest, ReuseSortsByUsedLengthUpTo4096) {
  auto lManager = makeManager({64, 8192});
  QNCPointer<QNCBuffer> lLarge = take(*lManager, 5000);
  EXPECT_EQ(8192u, lLarge->getCapacity());
  lLarge->setLength(4097);
  lManager->reuse(lLarge);
  EXPECT_EQ(1u, linesWith("Buffer too big... Need not be reused").size());
  EXPECT_NE(lLarge.get(), take(*lManager, 4097).get());

  lLarge->setLength(4096);
  lManager->reuse(lLarge);
  EXPECT_EQ(lLarge.get(), take(*lManager, 4096).get());

  lLarge->setLength(10);
  lManager->reuse(lLarge);
  EXPECT_EQ(1u, linesWith("Queuing buffer to be reused in bucket # 0").size());
  EXPECT_EQ(lLarge.get(), take(*lManager, 50).get());
  // Bucket 1 lost it: a request there makes a new buffer.
  EXPECT_NE(lLarge.get(), take(*lManager, 5000).get());
}

// get without a fitting bucket fails the caller; reuse of a buffer that no bucket takes only
// logs, since the caller is done with it anyway.
TEST_F(BufferManagerTest, NoFittingBucketThrowsFromGetButOnlyLogsFromReuse) {
  auto lManager = makeManager({64, 256, 1024});
  QNCPointer<QNCBuffer> lBuffer = take(*lManager, 5);
  QNCBuffer* const lBefore = lBuffer.get();
  const size_t lLocksBefore = linesWith("Locking bucket").size();
  try {
    lManager->get(1025, lBuffer);
    FAIL() << "get(1025) found a bucket";
  } catch (const QNCNoMemoryEx& acrException) {
    EXPECT_STREQ("Cannot find a buffer bucket", acrException.what());
    EXPECT_EQ(2u, acrException.getCode());
  }
  EXPECT_EQ(lBefore, lBuffer.get());
  EXPECT_EQ(lLocksBefore, linesWith("Locking bucket").size());  // no lock was taken
  // The failure left no bucket locked.
  EXPECT_EQ(1024u, take(*lManager, 1024)->getCapacity());

  QNCPointer<QNCBuffer> lForeign = foreignBuffer(4096);
  EXPECT_NO_THROW(lManager->reuse(lForeign));
  const auto lErrors = linesWith("-E-");
  ASSERT_EQ(4u, lErrors.size());
  EXPECT_NE(std::string::npos, lErrors[0].find("Failed to find a bucket for 1025 buffer size"));
  EXPECT_NE(std::string::npos, lErrors[1].find("Cannot allocate a buffer"));
  EXPECT_NE(std::string::npos, lErrors[2].find("Failed to find a bucket for 4096 buffer size"));
  EXPECT_NE(std::string::npos,
            lErrors[3].find("Failed to determine bucket no, error: Cannot find a buffer bucket"));
}

TEST_F(BufferManagerTest, ForeignBufferTooSmallForItsBucketIsNeverHandedOut) {
  auto lManager = makeManager({64, 256});
  // A message buffer: capacity equals its used length. 100 bytes would sort into bucket 1.
  QNCPointer<QNCBuffer> lMessage = foreignBuffer(100);
  lManager->reuse(lMessage);
  EXPECT_TRUE(linesWith("Queuing buffer").empty());
  EXPECT_NE(lMessage.get(), take(*lManager, 256).get());

  // One whose capacity reaches its bucket's length is pooled like any other.
  QNCPointer<QNCBuffer> lExact = foreignBuffer(64);
  lManager->reuse(lExact);
  EXPECT_EQ(lExact.get(), take(*lManager, 64).get());
}

TEST_F(BufferManagerTest, DestructionReportsTheUsedLengthsOfIdleBuffers) {
  auto lManager = makeManager({64, 256});
  QNCPointer<QNCBuffer> lA = take(*lManager, 10);
  QNCPointer<QNCBuffer> lB = take(*lManager, 20);
  QNCPointer<QNCBuffer> lOut = take(*lManager, 200);  // handed out, not idle: not counted
  lManager->reuse(lA);
  lManager->reuse(lB);
  lManager.reset();
  EXPECT_EQ(1u, linesWith("Memory Used by the memory slab 64 : 30").size());
  EXPECT_EQ(1u, linesWith("Memory Used by the memory slab 256 : 0").size());
  EXPECT_EQ(1u, linesWith("TOTAL Memory Used : 30").size());
  // The pool dropped its references; the caller's survive.
  EXPECT_EQ(10u, lA->getLength());
}

// The system object's buffer services reach its manager: clearBuffer returns a buffer to the pool
// as reuseBuffer does, re-bucketed by its used length.
TEST_F(BufferManagerTest, SystemServicesReachTheManager) {
  BucketSystem lSystem({64, 256});
  lSystem.installManager();
  QNCPointer<QNCBuffer> lBuffer;
  lSystem.getBuffer(100, lBuffer);
  QNCBuffer* const lObject = lBuffer.get();
  lSystem.reuseBuffer(lBuffer);
  QNCPointer<QNCBuffer> lAgain;
  lSystem.getBuffer(150, lAgain);
  EXPECT_EQ(lObject, lAgain.get());
  lSystem.clearBuffer(lAgain);
  lSystem.getBuffer(30, lAgain);
  EXPECT_NE(lObject, lAgain.get());  // 150 went back to the 256 bucket
  lSystem.getBuffer(256, lAgain);
  EXPECT_EQ(lObject, lAgain.get());
}

// Threads take and return buffers of every bucket, also lowering the used length so buffers
// move between buckets. A buffer handed to two threads at once, or lost, must show.
TEST(BufferManagerThreadTest, ConcurrentTakersNeitherLoseNorShareABuffer) {
  setLogCode(255u & ~static_cast<unsigned int>(QNLL_Trace));
  auto lManager = makeManager({64, 256, 1024});
  constexpr unsigned int kThreads = 4;
  constexpr unsigned int kRounds = 2000;
  const unsigned int lLengths[] = {64, 256, 1024};

  std::mutex lGuard;  // guards lOut and lSeen
  std::set<QNCBuffer*> lOut;
  // Every distinct buffer, kept alive so addresses stay unique.
  std::map<QNCBuffer*, QNCPointer<QNCBuffer>> lSeen;
  std::atomic<unsigned int> lFailures{0};

  std::vector<std::thread> lThreads;
  for (unsigned int lThread = 0; lThread < kThreads; ++lThread) {
    lThreads.emplace_back([&, lThread] {
      for (unsigned int lRound = 0; lRound < kRounds; ++lRound) {
        const unsigned int lLength = lLengths[(lRound + lThread) % 3];
        QNCPointer<QNCBuffer> lBuffer;
        lManager->get(lLength, lBuffer);
        {
          std::lock_guard<std::mutex> lLock(lGuard);
          if (!lOut.insert(lBuffer.get()).second) ++lFailures;
          lSeen.emplace(lBuffer.get(), lBuffer);
        }
        const unsigned char lMark = static_cast<unsigned char>(lThread * 31 + lRound);
        memset(static_cast<unsigned char*>(*lBuffer), lMark, lLength);
        std::this_thread::yield();
        for (unsigned int lIndex = 0; lIndex < lLength; ++lIndex)
          if (lBuffer->byte(lIndex) != lMark) {
            ++lFailures;
            break;
          }
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

TEST(BufferManagerDeathTest, BrokenBucketSetupsAssert) {
  EXPECT_EXIT(makeManager({}), ::testing::ExitedWithCode(1),
              "Assertion \\[ lBufferList.size\\(\\) > 0 \\] failed");
  // Only a request for 0 can reach a bucket of length 0.
  EXPECT_EXIT(take(*makeManager({0, 64}), 0), ::testing::ExitedWithCode(1),
              "Assertion \\[ 0 != lBufferSize \\] failed");
  // Bucket 0 is empty, so get(0) makes a buffer of used length 0.
  EXPECT_EXIT(take(*makeManager({64}), 0), ::testing::ExitedWithCode(1),
              "Assertion \\[ acUseLength != 0 \\] failed");
}

}  // namespace
