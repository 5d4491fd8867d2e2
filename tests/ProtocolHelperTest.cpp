// The framing of length-prefixed messages, against scripted readers and writers that record what
// the helper offers and sends.

#include <gtest/gtest.h>

#include <chrono>
#include <deque>
#include <optional>
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

Bytes sequence(unsigned int aLength, unsigned char aFirst = 1) {
  Bytes lBytes(aLength);
  for (unsigned int i = 0; i < aLength; ++i) lBytes[i] = static_cast<unsigned char>(aFirst + i);
  return lBytes;
}

QNCPointer<QNCBuffer> bufferOf(const Bytes& acrBytes) {
  QNCPointer<QNCBuffer> lBuffer(new (std::nothrow)
                                    QNCAllocatedBuffer(static_cast<unsigned int>(acrBytes.size()), 0),
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

// A reader that plays a script: each step delivers bytes (possibly none) or, when empty,
// throws QNCTryAgainEx. With mOwnBuffers it hands the bytes back in a buffer of its own instead of
// the one it was offered.
class ScriptedReader : public QNCReader {
 public:
  void deliver(const Bytes& acrBytes) { mScript.push_back(acrBytes); }
  void tryAgain(unsigned int aTimes) {
    for (unsigned int i = 0; i < aTimes; ++i) mScript.push_back(std::nullopt);
  }

  void read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) override {
    mOffered.push_back(arBuffer->getLength());
    if (mScript.empty()) throw QNCTryAgainEx("script exhausted", 11);
    const std::optional<Bytes> lStep = mScript.front();
    mScript.pop_front();
    if (!lStep) throw QNCTryAgainEx("Resource temporarily unavailable", 11);
    if (mOwnBuffers) arBuffer = bufferOf(*lStep);
    unsigned char* lpTarget = *arBuffer;
    // Deliberately trusts the script: a test may make the reader deliver more than offered.
    const size_t lRoom = arBuffer->getCapacity();
    for (size_t i = 0; i < lStep->size() && i < lRoom; ++i) lpTarget[i] = (*lStep)[i];
    arCount = static_cast<unsigned int>(lStep->size());
  }
  bool waitForActivity(unsigned int) override { return !mScript.empty(); }

  std::deque<std::optional<Bytes>> mScript;
  std::vector<unsigned int> mOffered;  // one entry per call
  bool mOwnBuffers = false;
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

class ProtocolHelperTest : public ::testing::Test {
 protected:
  QNCProtocolHelper mHelper{0};
  ScriptedReader* mpReader = new ScriptedReader;
  QNCPointer<QNCReader> mReader{mpReader, QNPST_Individual, QNPAT_New};
  RecordingWriter* mpWriter = new RecordingWriter;
  QNCPointer<QNCWriter> mWriter{mpWriter, QNPST_Individual, QNPAT_New};
  QNCPointer<QNCBuffer> mResult;
};

TEST_F(ProtocolHelperTest, WriteSendsLittleEndianPrefixThenTheBufferUnlessToldWithoutSize) {
  mHelper.write(mWriter, bufferOf(sequence(10)), false);
  mHelper.write(mWriter, bufferOf(sequence(3)), true);
  EXPECT_EQ((std::vector<Bytes>{{0x0A, 0x00, 0x00, 0x00}, sequence(10), sequence(3)}), mpWriter->mWrites);
}

// Each read is offered only what is still missing, so a reader never delivers bytes of the next
// message into this one; the parts land in order.
TEST_F(ProtocolHelperTest, ReadGathersPrefixAndBodyFromPartialReadsOfferingOnlyWhatIsMissing) {
  const struct {
    const char* mName;
    unsigned int mGivenSize;
    std::vector<Bytes> mReads;
    unsigned int mBodyLength;
    std::vector<unsigned int> mOffered;
  } kCases[] = {
      {"prefix then body", 0, {{10, 0, 0, 0}, sequence(10)}, 10, {4, 10}},
      {"given size, no prefix", 10, {sequence(10)}, 10, {10}},
      {"body in two parts", 0, {{10, 0, 0, 0}, sequence(4), sequence(6, 5)}, 10, {4, 10, 6}},
      {"prefix in three parts", 0, {{3, 0}, {0}, {0}, sequence(3)}, 3, {4, 2, 1, 3}},
      {"empty message", 0, {{0, 0, 0, 0}}, 0, {4}},
  };
  for (const auto& lCase : kCases) {
    SCOPED_TRACE(lCase.mName);
    auto* lpReader = new ScriptedReader;
    QNCPointer<QNCReader> lReader(lpReader, QNPST_Individual, QNPAT_New);
    for (const Bytes& lRead : lCase.mReads) lpReader->deliver(lRead);
    QNCPointer<QNCBuffer> lResult;
    mHelper.read(lReader, lResult, lCase.mGivenSize);
    ASSERT_FALSE(lResult.isNull());
    EXPECT_EQ(sequence(lCase.mBodyLength), bytesOf(lResult));
    EXPECT_EQ(lCase.mOffered, lpReader->mOffered);
  }
}

TEST_F(ProtocolHelperTest, TryAgainIsRetriedAndSleepsBetweenAttempts) {
  QNCProtocolHelper lSleepy(30);
  mpReader->tryAgain(2);
  mpReader->deliver(sequence(5));
  const auto lStart = std::chrono::steady_clock::now();
  lSleepy.read(mReader, mResult, 5);
  const auto lElapsed = std::chrono::steady_clock::now() - lStart;
  EXPECT_EQ(sequence(5), bytesOf(mResult));
  EXPECT_EQ(3u, mpReader->mOffered.size());
  EXPECT_GE(lElapsed, std::chrono::milliseconds(60));  // two sleeps of 30 ms
}

// The bound is far above 301 attempts without sleeping, far below 301 sleeps of a few ms.
TEST_F(ProtocolHelperTest, ReaderThatNeverDeliversFailsAfter301AttemptsWithoutSleepingAndLeavesTheBuffer) {
  mResult = bufferOf(sequence(2, 7));
  mpReader->tryAgain(400);
  const auto lStart = std::chrono::steady_clock::now();
  try {
    mHelper.read(mReader, mResult, 0);
    FAIL() << "expected QNCReadFailedEx";
  } catch (const QNCReadFailedEx& acrFailure) {
    EXPECT_STREQ("Failed in reading the chunk", acrFailure.what());
    EXPECT_EQ(328u, acrFailure.getCode());
  }
  EXPECT_LT(std::chrono::steady_clock::now() - lStart, std::chrono::milliseconds(1500));
  EXPECT_EQ(301u, mpReader->mOffered.size());
  EXPECT_EQ(sequence(2, 7), bytesOf(mResult));
}

// A body read that delivers nothing, or more than it was offered, fails at once with the error
// line; the reader is not asked again.
TEST_F(ProtocolHelperTest, BodyReadOfNothingOrTooMuchFailsAtOnceWithTheErrorLine) {
  qntest::TempDir lDir;
  CreateLogger(QNCString(lDir.file("p.log").c_str()));
  mpReader->deliver({0x0A, 0, 0, 0});
  mpReader->deliver({1, 2, 3});
  mpReader->deliver({});
  mpReader->deliver(sequence(7));  // never asked for
  EXPECT_THROW(mHelper.read(mReader, mResult, 0), QNCReadFailedEx);
  EXPECT_EQ(3u, mpReader->mOffered.size());
  mpReader->mScript.clear();
  mpReader->deliver({0x02, 0, 0, 0});
  mpReader->deliver(sequence(5));
  EXPECT_THROW(mHelper.read(mReader, mResult, 0), QNCReadFailedEx);
  flushLogger();
  destroyLogger();
  const std::string lLog = qntest::readFile(lDir.file("p.log"));
  EXPECT_NE(std::string::npos, lLog.find("Failed in reading 10 read 3"));
  EXPECT_NE(std::string::npos, lLog.find("Failed in reading 2 read 0"));
}

TEST_F(ProtocolHelperTest, PrefixAboveTheMaximumIsRefusedBeforeTheBodyIsRead) {
  QNCProtocolHelper lGuarded(0, 100);
  mpReader->deliver({0x00, 0x00, 0x00, 0x40});  // 1 GiB announced
  mpReader->deliver(sequence(10));
  EXPECT_THROW(lGuarded.read(mReader, mResult, 0), QNCReadFailedEx);
  EXPECT_EQ(1u, mpReader->mOffered.size());
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
  mpReader->mOwnBuffers = true;
  mpReader->deliver({6, 0, 0, 0});
  mpReader->deliver({20, 21, 22});
  mpReader->deliver({30, 31, 32});
  mHelper.read(mReader, mResult, 0);
  EXPECT_EQ((Bytes{20, 21, 22, 30, 31, 32}), bytesOf(mResult));
}

TEST_F(ProtocolHelperTest, ReaderExceptionsOtherThanTryAgainPassUnchanged) {
  class FailingReader : public QNCReader {
   public:
    void read(QNCPointer<QNCBuffer>&, unsigned int&) override { throw QNCInvalidEx("reader broke", 77); }
    bool waitForActivity(unsigned int) override { return true; }
  };
  QNCPointer<QNCReader> lReader(new FailingReader, QNPST_Individual, QNPAT_New);
  EXPECT_THROW(mHelper.read(lReader, mResult, 0), QNCInvalidEx);
}

}  // namespace
