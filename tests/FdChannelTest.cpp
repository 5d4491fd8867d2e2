// The descriptor-based channel ends, over real socket pairs, pipes and TCP loopback, with the
// framing helper on top.

#include <gtest/gtest.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <thread>
#include <vector>

#include "AllocatedBuffer.h"
#include "FdReader.h"
#include "FdWriter.h"
#include "ProtocolHelper.h"

namespace {

using Bytes = std::vector<unsigned char>;

QNCPointer<QNCBuffer> bufferOf(const Bytes& acrBytes) {
  const unsigned int lLength = acrBytes.empty() ? 1 : static_cast<unsigned int>(acrBytes.size());
  QNCPointer<QNCBuffer> lBuffer(new (std::nothrow) QNCAllocatedBuffer(lLength, 0), QNPST_Individual,
                                QNPAT_New);
  unsigned char* lpTarget = *lBuffer;
  for (size_t i = 0; i < acrBytes.size(); ++i) lpTarget[i] = acrBytes[i];
  lBuffer->setLength(static_cast<unsigned int>(acrBytes.size()));
  return lBuffer;
}

Bytes bytesOf(const QNCPointer<QNCBuffer>& acrBuffer) {
  const QNCBuffer& lBuffer = *acrBuffer;
  const unsigned char* lpBytes = lBuffer;
  return Bytes(lpBytes, lpBytes + lBuffer.getLength());
}

Bytes message(unsigned int aIndex) {
  // Sizes from empty to beyond the reader's staging buffer, contents tied to the index.
  static const unsigned int kSizes[] = {0, 1, 3, 4, 5, 64, 1000, 4096, 65535, 65536, 70001};
  const unsigned int lSize = kSizes[aIndex % (sizeof kSizes / sizeof kSizes[0])];
  Bytes lBytes(lSize);
  for (unsigned int i = 0; i < lSize; ++i) lBytes[i] = static_cast<unsigned char>(aIndex * 31 + i);
  return lBytes;
}

// Writes aCount framed messages on one thread and reads them back on another.
void roundTrip(int aReadFd, int aWriteFd, unsigned int aCount) {
  QNCPointer<QNCReader> lReader(new QNCFdReader(aReadFd), QNPST_Individual, QNPAT_New);
  QNCPointer<QNCWriter> lWriter(new QNCFdWriter(aWriteFd), QNPST_Individual, QNPAT_New);
  QNCProtocolHelper lHelper(10);
  std::thread lProducer([&] {
    for (unsigned int i = 0; i < aCount; ++i) lHelper.write(lWriter, bufferOf(message(i)), false);
  });
  for (unsigned int i = 0; i < aCount; ++i) {
    ASSERT_TRUE(lReader->waitForActivity(10000));
    QNCPointer<QNCBuffer> lReceived;
    lHelper.read(lReader, lReceived, 0);
    ASSERT_EQ(message(i), bytesOf(lReceived)) << "message " << i;
  }
  lProducer.join();
}

TEST(FdChannelTest, FramedMessagesRoundTripOverASocketPairAndAPipe) {
  int lPair[2];
  ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, lPair));
  roundTrip(lPair[0], lPair[1], 60);
  int lPipe[2];
  ASSERT_EQ(0, pipe(lPipe));
  roundTrip(lPipe[0], lPipe[1], 60);
}

TEST(FdChannelTest, ReaderReportsTryAgainThenEndOfStream) {
  int lPair[2];
  ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, lPair));
  QNCFdReader lReader(lPair[0]);
  QNCPointer<QNCBuffer> lBuffer = bufferOf(Bytes(8));
  unsigned int lCount = 99;
  EXPECT_THROW(lReader.read(lBuffer, lCount), QNCTryAgainEx);
  EXPECT_FALSE(lReader.waitForActivity(20));
  ASSERT_EQ(3, write(lPair[1], "abc", 3));
  EXPECT_TRUE(lReader.waitForActivity(1000));
  lReader.read(lBuffer, lCount);
  EXPECT_EQ(3u, lCount);
  ASSERT_EQ(2, write(lPair[1], "de", 2));
  close(lPair[1]);
  EXPECT_TRUE(lReader.waitForActivity(1000));
  EXPECT_FALSE(lReader.atEndOfStream());  // two bytes are still to be delivered
  lReader.read(lBuffer, lCount);
  EXPECT_EQ(2u, lCount);
  EXPECT_TRUE(lReader.atEndOfStream());
  lReader.read(lBuffer, lCount);
  EXPECT_EQ(0u, lCount);
}

TEST(FdChannelTest, StagedBytesAreServedAcrossSmallReadsWithoutLoss) {
  int lPair[2];
  ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, lPair));
  QNCFdReader lReader(lPair[0], true, 16);
  const Bytes lSent = message(6);  // 1000 bytes through a 16-byte staging buffer
  ASSERT_EQ(static_cast<ssize_t>(lSent.size()), write(lPair[1], lSent.data(), lSent.size()));
  Bytes lReceived;
  QNCPointer<QNCBuffer> lBuffer = bufferOf(Bytes(5));
  while (lReceived.size() < lSent.size()) {
    unsigned int lCount = 0;
    lBuffer->setLength(5);
    lReader.read(lBuffer, lCount);
    ASSERT_GT(lCount, 0u);
    ASSERT_LE(lCount, 5u);
    const Bytes lChunk = bytesOf(lBuffer);
    lReceived.insert(lReceived.end(), lChunk.begin(), lChunk.begin() + lCount);
  }
  EXPECT_EQ(lSent, lReceived);
  close(lPair[1]);
}

// With a read wait, bytes that arrive within it are delivered instead of QNCTryAgainEx, and an
// idle stream still answers QNCTryAgainEx once the wait has passed.
TEST(FdChannelTest, ReadWaitDeliversBytesThatArriveWithinIt) {
  int lPair[2];
  ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, lPair));
  QNCFdReader lReader(lPair[0], true, QNCFdReader::kDefaultStagingSize, 5000);
  std::thread lLate([&] {
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    ASSERT_EQ(3, write(lPair[1], "xyz", 3));
  });
  QNCPointer<QNCBuffer> lBuffer = bufferOf(Bytes(8));
  unsigned int lCount = 0;
  lReader.read(lBuffer, lCount);
  lLate.join();
  EXPECT_EQ(3u, lCount);

  QNCFdReader lImpatient(lPair[1], false, QNCFdReader::kDefaultStagingSize, 20);
  EXPECT_THROW(lImpatient.read(lBuffer, lCount), QNCTryAgainEx);
  close(lPair[1]);
}

// A write to a peer that has gone must be an exception, not a SIGPIPE that kills the process
// (SIGPIPE keeps its default action here).
TEST(FdChannelTest, WriteToAGonePeerThrowsInsteadOfRaisingSigpipe) {
  signal(SIGPIPE, SIG_DFL);
  int lPair[2];
  ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, lPair));
  int lPipe[2];
  ASSERT_EQ(0, pipe(lPipe));
  for (const int* lpEnds : {lPair, lPipe}) {
    close(lpEnds[0]);
    QNCFdWriter lWriter(lpEnds[1]);
    unsigned int lCount = 0;
    EXPECT_THROW(lWriter.write(bufferOf(Bytes(10, 1)), lCount), QNCWriteFailedEx);
  }
  sigset_t lPending;
  sigpending(&lPending);
  EXPECT_EQ(0, sigismember(&lPending, SIGPIPE));
}

// Without TCP_NODELAY the helper's two writes per message meet the peer's delayed
// acknowledgement on every round trip.
TEST(FdChannelTest, WriterDisablesNagleOnTcpSockets) {
  const int lListener = socket(AF_INET, SOCK_STREAM, 0);
  ASSERT_GE(lListener, 0);
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
