// The descriptor-based channel ends (QNCFdReader, QNCFdWriter) over real socket pairs, pipes and
// TCP loopback, with the framing helper (QNCProtocolHelper) on top. The fuzz targets run the
// framing against arbitrary streams and misbehaving readers in every build.

#include <gtest/gtest.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <thread>

#include "FdReader.h"
#include "FdWriter.h"
#include "ProtocolHelper.h"
#include "TestSupport.h"

namespace {

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
  QNCPointer<QNCWriter> lBare(new QNCFdWriter(mPair[1], false), QNPST_Individual, QNPAT_New);
  QNCProtocolHelper(0).write(lBare, bufferOf({7, 8, 9}), true);
  char lRaw[8];
  EXPECT_EQ(3, read(mPair[0], lRaw, sizeof lRaw)) << "a prefix was sent";
  int lPipe[2];
  ASSERT_EQ(0, pipe(lPipe));
  for (const auto& lrEnds : {std::make_pair(mPair[0], dup(mPair[1])), std::make_pair(lPipe[0], lPipe[1])}) {
    QNCPointer<QNCReader> lReader(new QNCFdReader(lrEnds.first), QNPST_Individual, QNPAT_New);
    QNCPointer<QNCWriter> lWriter(new QNCFdWriter(lrEnds.second), QNPST_Individual, QNPAT_New);
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
  QNCPointer<QNCReader> lReader(lpReader, QNPST_Individual, QNPAT_New);
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
