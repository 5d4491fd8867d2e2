// Buffers and the buffer pool (QNCBufferManager): lengths within the capacity, bucket choice,
// reuse, and hand-out under contention. Then the channels that carry them: the descriptor-based
// channel ends (QNCFdReader, QNCFdWriter) over real socket pairs, pipes and TCP loopback, with the
// framing helper (QNCProtocolHelper) on top. The fuzz targets run the framing against arbitrary
// streams and misbehaving readers in every build.

#include <gtest/gtest.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <thread>

#include "AllocatedBuffer.h"
#include "BufferManager.h"
#include "FdReader.h"
#include "FdWriter.h"
#include "LocalBuffer.h"
#include "Logger.h"
#include "ProtocolHelper.h"
#include "TableSystem.h"
#include "TestSupport.h"

namespace {

QNCPointer<QNCBuffer> makeBuffer(unsigned int aUseLength, unsigned int aMaxLength) {
  return QNCPointer<QNCBuffer>(new (std::nothrow) QNCAllocatedBuffer(aUseLength, aMaxLength));
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

// --- Channels.
using namespace std::chrono_literals;
using qntest::bufferOf;
using qntest::Bytes;
using qntest::bytesOf;

Bytes message(unsigned int aIndex) {
  // Sizes from empty to beyond the reader's staging buffer, contents tied to the index.
  static const unsigned int kSizes[] = {0, 1, 3, 4, 5, 64, 1000, 4096, 65535, 65536, 70001};
  Bytes lBytes(kSizes[aIndex % (sizeof kSizes / sizeof kSizes[0])]);
  for (unsigned int i = 0; i < lBytes.size(); ++i) lBytes[i] = static_cast<unsigned char>(aIndex * 31 + i);
  return lBytes;
}

// A reader on a real descriptor that counts the calls the helper makes.
class CountingReader : public QNCFdReader {
 public:
  explicit CountingReader(int aFd) : QNCFdReader(aFd) {}
  void read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) override {
    ++mCalls;
    QNCFdReader::read(arBuffer, arCount);
  }
  unsigned int mCalls = 0;
};

class ChannelTest : public ::testing::Test {
 protected:
  ChannelTest() { EXPECT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, mPair)); }
  ~ChannelTest() override { close(mPair[1]); }  // mPair[0] belongs to a reader

  int mPair[2];
};

// Writes framed messages on one thread and reads them back on another: little-endian prefix,
// then the body; sizes around the staging buffer's.
TEST_F(ChannelTest, FramedMessagesRoundTripOverASocketPairAndAPipe) {
  // Without the prefix, as a reader given the size expects it.
  QNCPointer<QNCWriter> lBare(new QNCFdWriter(mPair[1], false));
  QNCProtocolHelper(0).write(lBare, bufferOf({7, 8, 9}), true);
  char lRaw[8];
  EXPECT_EQ(3, read(mPair[0], lRaw, sizeof lRaw)) << "a prefix was sent";
  int lPipe[2];
  ASSERT_EQ(0, pipe(lPipe));
  for (const auto& lrEnds : {std::make_pair(mPair[0], dup(mPair[1])), std::make_pair(lPipe[0], lPipe[1])}) {
    QNCPointer<QNCReader> lReader(new QNCFdReader(lrEnds.first));
    QNCPointer<QNCWriter> lWriter(new QNCFdWriter(lrEnds.second));
    QNCProtocolHelper lHelper(10);
    std::thread lProducer([&] {
      for (unsigned int i = 0; i < 60; ++i) lHelper.write(lWriter, bufferOf(message(i)), false);
    });
    for (unsigned int i = 0; i < 60; ++i) {
      ASSERT_TRUE(lReader->waitForActivity(10000));
      QNCPointer<QNCBuffer> lReceived;
      lHelper.read(lReader, lReceived, 0);
      ASSERT_EQ(message(i), bytesOf(lReceived)) << "message " << i;
    }
    lProducer.join();
  }
}

// A reader meeting "try again" is asked again after the retry time, up to 301 attempts; a
// message that arrives in between is read whole. Without the sleep the attempts run out first.
TEST_F(ChannelTest, TryAgainIsRetriedAfterTheRetryTimeUpTo301Attempts) {
  auto* lpReader = new CountingReader(mPair[0]);
  QNCPointer<QNCReader> lReader(lpReader);
  std::thread lLate([&] {
    std::this_thread::sleep_for(150ms);
    ASSERT_EQ(7, write(mPair[1], "\3\0\0\0abc", 7));
  });
  QNCPointer<QNCBuffer> lResult;
  const auto lStart = std::chrono::steady_clock::now();
  QNCProtocolHelper(30).read(lReader, lResult, 0);
  lLate.join();
  EXPECT_EQ((Bytes{'a', 'b', 'c'}), bytesOf(lResult));
  EXPECT_LE(lpReader->mCalls, 2u + (std::chrono::steady_clock::now() - lStart) / 30ms);
  lpReader->mCalls = 0;
  lResult = bufferOf({1, 2});
  EXPECT_EQ("Failed in reading the chunk (code 328)",
            qntest::thrown<QNCReadFailedEx>([&] { QNCProtocolHelper(0).read(lReader, lResult, 0); }, true));
  EXPECT_EQ(301u, lpReader->mCalls);
  EXPECT_EQ((Bytes{1, 2}), bytesOf(lResult));  // a failed read leaves the caller's buffer
}

// An idle stream answers QNCTryAgainEx once the read wait (if any) has passed; bytes that arrive
// within it are delivered instead. The end of the stream shows only after the bytes before it.
TEST_F(ChannelTest, ReaderReportsTryAgainThenBytesThenEndOfStream) {
  QNCFdReader lReader(mPair[0], true, QNCFdReader::kDefaultStagingSize, 5000);
  QNCFdReader lImpatient(dup(mPair[1]), true, QNCFdReader::kDefaultStagingSize, 20);
  QNCPointer<QNCBuffer> lBuffer = bufferOf(Bytes(8));
  unsigned int lCount = 99;
  EXPECT_THROW(lImpatient.read(lBuffer, lCount), QNCTryAgainEx);
  EXPECT_FALSE(lReader.waitForActivity(20));
  std::thread lLate([&] {
    std::this_thread::sleep_for(50ms);
    ASSERT_EQ(3, write(mPair[1], "abc", 3));
  });
  lReader.read(lBuffer, lCount);
  lLate.join();
  EXPECT_EQ(3u, lCount);
  ASSERT_EQ(2, write(mPair[1], "de", 2));
  shutdown(mPair[1], SHUT_WR);
  EXPECT_TRUE(lReader.waitForActivity(1000));
  QNCPointer<QNCBuffer> lOne = bufferOf(Bytes(1));
  for (const char lExpected : {'d', 'e'}) {  // 'e' waits in the staging buffer
    EXPECT_FALSE(lReader.atEndOfStream());
    lReader.read(lOne, lCount);
    EXPECT_EQ(1u, lCount);
    EXPECT_EQ(lExpected, lOne->byte(0));
  }
  EXPECT_TRUE(lReader.atEndOfStream());
  lReader.read(lBuffer, lCount);
  EXPECT_EQ(0u, lCount);
}

// A write to a peer that has gone must be an exception, not a SIGPIPE that kills the process
// (SIGPIPE keeps its default action here).
TEST_F(ChannelTest, WriteToAGonePeerThrowsInsteadOfRaisingSigpipe) {
  signal(SIGPIPE, SIG_DFL);
  int lPipe[2];
  ASSERT_EQ(0, pipe(lPipe));
  close(mPair[0]);
  close(lPipe[0]);
  for (const int lFd : {dup(mPair[1]), lPipe[1]}) {
    QNCFdWriter lWriter(lFd);
    unsigned int lCount = 0;
    EXPECT_THROW(lWriter.write(bufferOf(Bytes(10, 1)), lCount), QNCWriteFailedEx);
  }
  sigset_t lPending;
  sigpending(&lPending);
  EXPECT_EQ(0, sigismember(&lPending, SIGPIPE));
}

// The helper reuses one prefix buffer per thread. A writer that keeps the buffers it is given (one
// that queues them for later sending, say) must find each prefix as it was written: reusing a
// buffer that a writer still holds would rewrite an earlier message's length.
class KeepingWriter : public QNCWriter {
 public:
  void write(const QNCPointer<QNCBuffer>& acrBuffer, unsigned int& arCount) override {
    mKept.push_back(acrBuffer);
    arCount = acrBuffer->getLength();
  }
  std::vector<QNCPointer<QNCBuffer>> mKept;
};

TEST(ProtocolPrefixTest, PrefixesAWriterKeptStayAsTheyWereWritten) {
  auto* lpWriter = new KeepingWriter;
  QNCPointer<QNCWriter> lWriter(lpWriter);
  for (const unsigned int lLength : {3u, 5u})
    QNCProtocolHelper(0).write(lWriter, bufferOf(Bytes(lLength, 1)), false);
  ASSERT_EQ(4u, lpWriter->mKept.size());
  EXPECT_EQ((Bytes{3, 0, 0, 0}), bytesOf(lpWriter->mKept[0]));
  EXPECT_EQ((Bytes{5, 0, 0, 0}), bytesOf(lpWriter->mKept[2]));
}

// Without TCP_NODELAY the helper's two writes per message meet the peer's delayed
// acknowledgement on every round trip.
TEST(TcpChannelTest, WriterDisablesNagle) {
  const int lListener = socket(AF_INET, SOCK_STREAM, 0);
  sockaddr_in lAddress = {};
  lAddress.sin_family = AF_INET;
  lAddress.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  ASSERT_EQ(0, bind(lListener, reinterpret_cast<sockaddr*>(&lAddress), sizeof lAddress));
  ASSERT_EQ(0, listen(lListener, 1));
  socklen_t lLength = sizeof lAddress;
  ASSERT_EQ(0, getsockname(lListener, reinterpret_cast<sockaddr*>(&lAddress), &lLength));
  const int lClient = socket(AF_INET, SOCK_STREAM, 0);
  // Loopback connects complete against the listener's backlog; nobody needs to accept.
  ASSERT_EQ(0, connect(lClient, reinterpret_cast<sockaddr*>(&lAddress), sizeof lAddress));
  QNCFdWriter lWriter(lClient);
  int lNoDelay = 0;
  socklen_t lSize = sizeof lNoDelay;
  ASSERT_EQ(0, getsockopt(lClient, IPPROTO_TCP, TCP_NODELAY, &lNoDelay, &lSize));
  EXPECT_NE(0, lNoDelay);
  close(lListener);
}

}  // namespace
