// The framing of length-prefixed messages, against scripted readers and writers that record what
// the helper offers and sends.

#include <gtest/gtest.h>

#include <chrono>
#include <deque>
#include <vector>

#include "AllocatedBuffer.h"
#include "Logger.h"
#include "ProtocolHelper.h"
#include "QNString.h"
#include "Reader.h"
#include "TestSupport.h"
#include "Writer.h"

namespace {

using Bytes = std::vector<unsigned char>;

// A reader that plays a script: each step delivers bytes (possibly none) or throws QNCTryAgainEx.
class ScriptedReader : public QNCReader {
 public:
  struct Step {
    bool mTryAgain;
    Bytes mBytes;
  };
  void deliver(const Bytes& acrBytes) { mScript.push_back({false, acrBytes}); }
  void tryAgain(unsigned int aTimes = 1) {
    for (unsigned int i = 0; i < aTimes; ++i) mScript.push_back({true, {}});
  }

  void read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) override {
    mOffered.push_back(arBuffer->getLength());
    ++mCalls;
    if (mScript.empty()) throw QNCTryAgainEx("script exhausted", 11);
    Step lStep = mScript.front();
    mScript.pop_front();
    if (lStep.mTryAgain) throw QNCTryAgainEx("Resource temporarily unavailable", 11);
    unsigned char* lpTarget = *arBuffer;
    // Deliberately trusts the script: a test may make the reader deliver more than offered.
    const size_t lRoom = arBuffer->getCapacity();
    for (size_t i = 0; i < lStep.mBytes.size() && i < lRoom; ++i) lpTarget[i] = lStep.mBytes[i];
    arCount = static_cast<unsigned int>(lStep.mBytes.size());
  }
  bool waitForActivity(unsigned int) override { return !mScript.empty(); }

  std::deque<Step> mScript;
  std::vector<unsigned int> mOffered;
  unsigned int mCalls = 0;
};

class RecordingWriter : public QNCWriter {
 public:
  void write(const QNCPointer<QNCBuffer>& acrBuffer, unsigned int& arCount) override {
    const QNCBuffer& lBuffer = *acrBuffer;
    const unsigned char* lpBytes = lBuffer;
    mWrites.emplace_back(lpBytes, lpBytes + lBuffer.getLength());
    arCount = lBuffer.getLength();
  }
  std::vector<Bytes> mWrites;
};

Bytes sequence(unsigned int aLength, unsigned char aFirst = 1) {
  Bytes lBytes(aLength);
  for (unsigned int i = 0; i < aLength; ++i) lBytes[i] = static_cast<unsigned char>(aFirst + i);
  return lBytes;
}

QNCPointer<QNCBuffer> bufferOf(const Bytes& acrBytes) {
  QNCPointer<QNCBuffer> lBuffer(new (std::nothrow) QNCAllocatedBuffer(static_cast<unsigned int>(acrBytes.size()), 0),
                                QNPST_Individual, QNPAT_New);
  unsigned char* lpTarget = *lBuffer;
  for (size_t i = 0; i < acrBytes.size(); ++i) lpTarget[i] = acrBytes[i];
  return lBuffer;
}

Bytes bytesOf(const QNCPointer<QNCBuffer>& acrBuffer) {
  const QNCBuffer& lBuffer = *acrBuffer;
  const unsigned char* lpBytes = lBuffer;
  return Bytes(lpBytes, lpBytes + lBuffer.getLength());
}

class ProtocolHelperTest : public ::testing::Test {
 protected:
  QNCProtocolHelper mHelper{0};
  ScriptedReader* mpReader = new ScriptedReader;
  QNCPointer<QNCReader> mReader{mpReader, QNPST_Individual, QNPAT_New};
  RecordingWriter* mpWriter = new RecordingWriter;
  QNCPointer<QNCWriter> mWriter{mpWriter, QNPST_Individual, QNPAT_New};
  QNCPointer<QNCBuffer> mResult;
};

TEST_F(ProtocolHelperTest, WriteSendsLittleEndianPrefixThenTheBufferItself) {
  const QNCPointer<QNCBuffer> lBody = bufferOf(sequence(10));
  mHelper.write(mWriter, lBody, false);
  ASSERT_EQ(2u, mpWriter->mWrites.size());
  EXPECT_EQ((Bytes{0x0A, 0x00, 0x00, 0x00}), mpWriter->mWrites[0]);
  EXPECT_EQ(sequence(10), mpWriter->mWrites[1]);
}

TEST_F(ProtocolHelperTest, WriteWithoutSizeSendsOnlyTheBody) {
  mHelper.write(mWriter, bufferOf(sequence(3)), true);
  ASSERT_EQ(1u, mpWriter->mWrites.size());
  EXPECT_EQ(sequence(3), mpWriter->mWrites[0]);
}

TEST_F(ProtocolHelperTest, ReadsPrefixThenBodyIntoOneBuffer) {
  mpReader->deliver({0x0A, 0, 0, 0});
  mpReader->deliver(sequence(10));
  mHelper.read(mReader, mResult, 0);
  EXPECT_EQ(sequence(10), bytesOf(mResult));
  EXPECT_EQ((std::vector<unsigned int>{4, 10}), mpReader->mOffered);
}

TEST_F(ProtocolHelperTest, GivenSizeReadsTheBodyWithoutPrefix) {
  mpReader->deliver(sequence(10));
  mHelper.read(mReader, mResult, 10);
  EXPECT_EQ(sequence(10), bytesOf(mResult));
  EXPECT_EQ((std::vector<unsigned int>{10}), mpReader->mOffered);
}

// Each chunk read is offered only what is still missing, so a reader never delivers bytes of the
// next message into this one.
TEST_F(ProtocolHelperTest, BodyGatheredInOrderFromPartialReadsOfferedOnlyTheMissingBytes) {
  const Bytes lBody = sequence(10);
  mpReader->deliver({0x0A, 0, 0, 0});
  mpReader->deliver(Bytes(lBody.begin(), lBody.begin() + 4));
  mpReader->deliver(Bytes(lBody.begin() + 4, lBody.end()));
  mHelper.read(mReader, mResult, 0);
  EXPECT_EQ(lBody, bytesOf(mResult));
  EXPECT_EQ((std::vector<unsigned int>{4, 10, 6}), mpReader->mOffered);
}

TEST_F(ProtocolHelperTest, PrefixSplitAcrossReadsIsCompleted) {
  mpReader->deliver({0x03, 0});
  mpReader->deliver({0});
  mpReader->deliver({0});
  mpReader->deliver(sequence(3));
  mHelper.read(mReader, mResult, 0);
  EXPECT_EQ(sequence(3), bytesOf(mResult));
  EXPECT_EQ((std::vector<unsigned int>{4, 2, 1, 3}), mpReader->mOffered);
}

TEST_F(ProtocolHelperTest, TryAgainIsRetriedAndSleepsBetweenAttempts) {
  QNCProtocolHelper lSleepy(30);
  mpReader->tryAgain(2);
  mpReader->deliver(sequence(5));
  const auto lStart = std::chrono::steady_clock::now();
  lSleepy.read(mReader, mResult, 5);
  const auto lElapsed = std::chrono::steady_clock::now() - lStart;
  EXPECT_EQ(sequence(5), bytesOf(mResult));
  EXPECT_EQ(3u, mpReader->mCalls);
  EXPECT_GE(lElapsed, std::chrono::milliseconds(60));  // two sleeps of 30 ms
}

TEST_F(ProtocolHelperTest, ReaderThatNeverDeliversFailsAfter301AttemptsAndLeavesTheBuffer) {
  mResult = bufferOf(sequence(2, 7));
  mpReader->tryAgain(400);
  try {
    mHelper.read(mReader, mResult, 0);
    FAIL() << "expected QNCReadFailedEx";
  } catch (const QNCReadFailedEx& acrFailure) {
    EXPECT_STREQ("Failed in reading the chunk", acrFailure.what());
    EXPECT_EQ(328u, acrFailure.getCode());
  }
  EXPECT_EQ(301u, mpReader->mCalls);
  EXPECT_EQ(sequence(2, 7), bytesOf(mResult));
}

TEST_F(ProtocolHelperTest, BodyReadOfZeroBytesFailsAtOnceWithTheErrorLine) {
  qntest::TempDir lDir;
  CreateLogger(QNCString(lDir.file("p.log").c_str()));
  mpReader->deliver({0x0A, 0, 0, 0});
  mpReader->deliver({1, 2, 3});
  mpReader->deliver({});
  mpReader->deliver(sequence(7));  // never asked for
  EXPECT_THROW(mHelper.read(mReader, mResult, 0), QNCReadFailedEx);
  EXPECT_EQ(3u, mpReader->mCalls);
  flushLogger();
  destroyLogger();
  EXPECT_NE(std::string::npos, qntest::readFile(lDir.file("p.log")).find("Failed in reading 10 read 3"));
}

TEST_F(ProtocolHelperTest, EmptyMessageYieldsAnEmptyBuffer) {
  mpReader->deliver({0, 0, 0, 0});
  mHelper.read(mReader, mResult, 0);
  ASSERT_FALSE(mResult.isNull());
  EXPECT_EQ(0u, mResult->getLength());
  EXPECT_EQ(1u, mpReader->mCalls);
}

TEST_F(ProtocolHelperTest, ReaderDeliveringMoreThanOfferedIsRefused) {
  mpReader->deliver({0x02, 0, 0, 0});
  mpReader->deliver(sequence(5));
  EXPECT_THROW(mHelper.read(mReader, mResult, 0), QNCReadFailedEx);
}

TEST_F(ProtocolHelperTest, PrefixAboveTheMaximumIsRefusedBeforeTheBodyIsRead) {
  QNCProtocolHelper lGuarded(0, 100);
  mpReader->deliver({0x00, 0x00, 0x00, 0x40});  // 1 GiB announced
  mpReader->deliver(sequence(10));
  try {
    lGuarded.read(mReader, mResult, 0);
    FAIL() << "expected QNCReadFailedEx";
  } catch (const QNCReadFailedEx& acrFailure) {
    EXPECT_EQ(328u, acrFailure.getCode());
  }
  EXPECT_EQ(1u, mpReader->mCalls);
  EXPECT_TRUE(mResult.isNull());
  // At the limit the message is accepted.
  mpReader->mScript.clear();
  mpReader->deliver({100, 0, 0, 0});
  mpReader->deliver(sequence(100));
  lGuarded.read(mReader, mResult, 0);
  EXPECT_EQ(100u, mResult->getLength());
}

// A reader may hand its bytes back in a buffer of its own instead of the one it was offered.
TEST_F(ProtocolHelperTest, BytesInAReadersOwnBufferAreGatheredToo) {
  class SwappingReader : public QNCReader {
   public:
    void read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) override {
      const Bytes lPart = mCalls++ == 0 ? Bytes{6, 0, 0, 0} : sequence(3, static_cast<unsigned char>(mCalls * 10));
      arBuffer = bufferOf(lPart);
      arCount = static_cast<unsigned int>(lPart.size());
    }
    bool waitForActivity(unsigned int) override { return true; }
    unsigned int mCalls = 0;
  };
  QNCPointer<QNCReader> lReader(new SwappingReader, QNPST_Individual, QNPAT_New);
  mHelper.read(lReader, mResult, 0);
  EXPECT_EQ((Bytes{20, 21, 22, 30, 31, 32}), bytesOf(mResult));
}

TEST_F(ProtocolHelperTest, ReaderExceptionsOtherThanTryAgainPassUnchanged) {
  class FailingReader : public QNCReader {
   public:
    void read(QNCPointer<QNCBuffer>&, unsigned int&) override { throw QNCInvalidEx("reader broke", 77); }
    bool waitForActivity(unsigned int) override { return true; }
  };
  QNCPointer<QNCReader> lReader(new FailingReader, QNPST_Individual, QNPAT_New);
  try {
    mHelper.read(lReader, mResult, 0);
    FAIL() << "expected QNCInvalidEx";
  } catch (const QNCInvalidEx& acrFailure) {
    EXPECT_EQ(77u, acrFailure.getCode());
  }
}

}  // namespace
