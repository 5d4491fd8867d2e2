// Framed messages through the descriptor channel ends against raw read/write of the same bytes,
// and the round-trip rate over TCP loopback against a socket pair.
//
// Beside each, the same traffic made raw with the system calls a framed message needs (a prefix
// write, a body write, the reader's staged reads): what the operating system charges for the
// message's shape, so that framed / split-raw is the cost of the library's own code.
//
// Run with --benchmark_enable_random_interleaving=true --benchmark_repetitions=N so the
// contenders alternate through the run (scripts/bench.sh does).

#include <arpa/inet.h>
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>
#include <thread>
#include <vector>

#include "AllocatedBuffer.h"
#include "BenchSupport.h"
#include "FdReader.h"
#include "FdWriter.h"
#include "ProtocolHelper.h"

namespace {

QNCPointer<QNCBuffer> makeBody(unsigned int aSize) {
  QNCPointer<QNCBuffer> lBody(new (std::nothrow) QNCAllocatedBuffer(aSize, 0), QNPST_Individual, QNPAT_New);
  unsigned char* lpBytes = *lBody;
  for (unsigned int i = 0; i < aSize; ++i) lpBytes[i] = static_cast<unsigned char>(i);
  return lBody;
}

void enlargeBuffers(int aFd) {
  const int lSize = 1 << 20;
  setsockopt(aFd, SOL_SOCKET, SO_SNDBUF, &lSize, sizeof lSize);
  setsockopt(aFd, SOL_SOCKET, SO_RCVBUF, &lSize, sizeof lSize);
}

// One thread writes a message and reads it back: the cost of the calls, without thread hand-off.
void BM_FramedSocketPair(benchmark::State& arState) {
  qnbench::setTraceLogging(false);
  const unsigned int lSize = static_cast<unsigned int>(arState.range(0));
  int lPair[2];
  socketpair(AF_UNIX, SOCK_STREAM, 0, lPair);
  enlargeBuffers(lPair[0]);
  enlargeBuffers(lPair[1]);
  QNCPointer<QNCWriter> lWriter(new QNCFdWriter(lPair[0]), QNPST_Individual, QNPAT_New);
  QNCPointer<QNCReader> lReader(new QNCFdReader(lPair[1]), QNPST_Individual, QNPAT_New);
  QNCProtocolHelper lHelper(0);
  const QNCPointer<QNCBuffer> lBody = makeBody(lSize);
  QNCPointer<QNCBuffer> lReceived;
  for (auto _ : arState) {
    lHelper.write(lWriter, lBody, false);
    lHelper.read(lReader, lReceived, 0);
    benchmark::DoNotOptimize(lReceived.get());
  }
  arState.SetItemsProcessed(arState.iterations());
  arState.SetBytesProcessed(arState.iterations() * static_cast<int64_t>(lSize));
  qnbench::setTraceLogging(true);
}

void BM_RawSocketPair(benchmark::State& arState) {
  const size_t lSize = static_cast<size_t>(arState.range(0));
  int lPair[2];
  socketpair(AF_UNIX, SOCK_STREAM, 0, lPair);
  enlargeBuffers(lPair[0]);
  enlargeBuffers(lPair[1]);
  std::vector<unsigned char> lOut(lSize, 7), lIn(lSize);
  for (auto _ : arState) {
    size_t lDone = 0;
    while (lDone < lSize) lDone += static_cast<size_t>(write(lPair[0], lOut.data() + lDone, lSize - lDone));
    lDone = 0;
    while (lDone < lSize) lDone += static_cast<size_t>(read(lPair[1], lIn.data() + lDone, lSize - lDone));
    benchmark::DoNotOptimize(lIn.data());
  }
  arState.SetItemsProcessed(arState.iterations());
  arState.SetBytesProcessed(arState.iterations() * static_cast<int64_t>(lSize));
  close(lPair[0]);
  close(lPair[1]);
}

void writeAll(int aFd, const void* apBytes, size_t aCount) {
  size_t lDone = 0;
  while (lDone < aCount) {
    const ssize_t lWritten = write(aFd, static_cast<const unsigned char*>(apBytes) + lDone, aCount - lDone);
    if (lWritten > 0) lDone += static_cast<size_t>(lWritten);
  }
}

// Reads exactly aCount bytes from a non-blocking descriptor, waiting with poll as the framed
// reader does; false at end of stream.
bool pollReadAll(int aFd, unsigned char* apBytes, size_t aCount) {
  size_t lDone = 0;
  while (lDone < aCount) {
    const ssize_t lRead = read(aFd, apBytes + lDone, aCount - lDone);
    if (lRead == 0) return false;
    if (lRead > 0) {
      lDone += static_cast<size_t>(lRead);
      continue;
    }
    struct pollfd lPoll = {aFd, POLLIN, 0};
    poll(&lPoll, 1, 100);
  }
  return true;
}

// The framed message's system calls without the library: a 4-byte write, a body write, one read
// of up to the reader's staging size, then the rest of a large body straight into place.
void BM_RawSplitSocketPair(benchmark::State& arState) {
  const size_t lSize = static_cast<size_t>(arState.range(0));
  int lPair[2];
  socketpair(AF_UNIX, SOCK_STREAM, 0, lPair);
  enlargeBuffers(lPair[0]);
  enlargeBuffers(lPair[1]);
  std::vector<unsigned char> lOut(lSize, 7), lIn(lSize), lStaging(QNCFdReader::kDefaultStagingSize);
  const unsigned int lPrefix = static_cast<unsigned int>(lSize);
  for (auto _ : arState) {
    writeAll(lPair[0], &lPrefix, sizeof lPrefix);
    writeAll(lPair[0], lOut.data(), lSize);
    const size_t lStaged = static_cast<size_t>(read(lPair[1], lStaging.data(), lStaging.size()));
    size_t lDone = lStaged - sizeof lPrefix;
    memcpy(lIn.data(), lStaging.data() + sizeof lPrefix, lDone);
    while (lDone < lSize) lDone += static_cast<size_t>(read(lPair[1], lIn.data() + lDone, lSize - lDone));
    benchmark::DoNotOptimize(lIn.data());
  }
  arState.SetItemsProcessed(arState.iterations());
  arState.SetBytesProcessed(arState.iterations() * static_cast<int64_t>(lSize));
  close(lPair[0]);
  close(lPair[1]);
}

void tcpPair(int aFds[2]) {
  const int lListener = socket(AF_INET, SOCK_STREAM, 0);
  sockaddr_in lAddress = {};
  lAddress.sin_family = AF_INET;
  lAddress.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  bind(lListener, reinterpret_cast<sockaddr*>(&lAddress), sizeof lAddress);
  listen(lListener, 1);
  socklen_t lLength = sizeof lAddress;
  getsockname(lListener, reinterpret_cast<sockaddr*>(&lAddress), &lLength);
  aFds[0] = socket(AF_INET, SOCK_STREAM, 0);
  connect(aFds[0], reinterpret_cast<sockaddr*>(&lAddress), sizeof lAddress);
  aFds[1] = accept(lListener, nullptr, nullptr);
  close(lListener);
}

// A 64-byte framed request is echoed by a second thread; each iteration is one round trip.
// The readers wait up to 50 ms for bytes, so a body that trails its prefix costs no retry sleep.
void roundTrips(benchmark::State& arState, int aFds[2]) {
  qnbench::setTraceLogging(false);
  const int lClientDup = dup(aFds[0]);
  const int lServerDup = dup(aFds[1]);
  QNCPointer<QNCWriter> lClientWriter(new QNCFdWriter(aFds[0]), QNPST_Individual, QNPAT_New);
  QNCPointer<QNCReader> lClientReader(new QNCFdReader(lClientDup, true, QNCFdReader::kDefaultStagingSize, 50),
                                      QNPST_Individual, QNPAT_New);
  QNCPointer<QNCWriter> lServerWriter(new QNCFdWriter(aFds[1]), QNPST_Individual, QNPAT_New);
  QNCFdReader* lpServerReader = new QNCFdReader(lServerDup, true, QNCFdReader::kDefaultStagingSize, 50);
  QNCPointer<QNCReader> lServerReader(lpServerReader, QNPST_Individual, QNPAT_New);
  QNCProtocolHelper lHelper(1);
  std::thread lEcho([&] {
    QNCPointer<QNCBuffer> lRequest;
    for (;;) {
      while (!lServerReader->waitForActivity(100)) {
      }
      if (lpServerReader->atEndOfStream()) return;  // the client closed its end
      lHelper.read(lServerReader, lRequest, 0);
      lHelper.write(lServerWriter, lRequest, false);
    }
  });
  const QNCPointer<QNCBuffer> lBody = makeBody(64);
  QNCPointer<QNCBuffer> lReply;
  for (auto _ : arState) {
    lHelper.write(lClientWriter, lBody, false);
    while (!lClientReader->waitForActivity(100)) {
    }
    lHelper.read(lClientReader, lReply, 0);
  }
  shutdown(aFds[0], SHUT_WR);
  lEcho.join();
  arState.SetItemsProcessed(arState.iterations());
  qnbench::setTraceLogging(true);
}

// The same round trips made raw: prefix and body written separately (Nagle off on TCP, as the
// framed writer sets it), read back with non-blocking reads and poll.
void rawRoundTrips(benchmark::State& arState, int aFds[2]) {
  const int lOne = 1;
  for (int lIndex = 0; lIndex < 2; ++lIndex) {
    // Fails harmlessly on a socket pair, which has no Nagle's algorithm to turn off.
    setsockopt(aFds[lIndex], IPPROTO_TCP, TCP_NODELAY, &lOne, sizeof lOne);
    fcntl(aFds[lIndex], F_SETFL, fcntl(aFds[lIndex], F_GETFL) | O_NONBLOCK);
  }
  constexpr size_t kBody = 64;
  std::thread lEcho([&] {
    unsigned char lMessage[sizeof(unsigned int) + kBody];
    while (pollReadAll(aFds[1], lMessage, sizeof lMessage)) {
      writeAll(aFds[1], lMessage, sizeof(unsigned int));
      writeAll(aFds[1], lMessage + sizeof(unsigned int), kBody);
    }
  });
  unsigned char lMessage[sizeof(unsigned int) + kBody] = {kBody};
  for (auto _ : arState) {
    writeAll(aFds[0], lMessage, sizeof(unsigned int));
    writeAll(aFds[0], lMessage + sizeof(unsigned int), kBody);
    pollReadAll(aFds[0], lMessage, sizeof lMessage);
  }
  shutdown(aFds[0], SHUT_WR);
  lEcho.join();
  close(aFds[0]);
  close(aFds[1]);
  arState.SetItemsProcessed(arState.iterations());
}

void BM_RoundTripTcpLoopback(benchmark::State& arState) {
  int lFds[2];
  tcpPair(lFds);
  roundTrips(arState, lFds);
}

void BM_RoundTripSocketPair(benchmark::State& arState) {
  int lFds[2];
  socketpair(AF_UNIX, SOCK_STREAM, 0, lFds);
  roundTrips(arState, lFds);
}

void BM_RawRoundTripTcpLoopback(benchmark::State& arState) {
  int lFds[2];
  tcpPair(lFds);
  rawRoundTrips(arState, lFds);
}

void BM_RawRoundTripSocketPair(benchmark::State& arState) {
  int lFds[2];
  socketpair(AF_UNIX, SOCK_STREAM, 0, lFds);
  rawRoundTrips(arState, lFds);
}

}  // namespace

BENCHMARK(BM_FramedSocketPair)->Arg(64)->Arg(1024)->Arg(65536);
BENCHMARK(BM_RawSocketPair)->Arg(64)->Arg(1024)->Arg(65536);
BENCHMARK(BM_RawSplitSocketPair)->Arg(64)->Arg(1024)->Arg(65536);
BENCHMARK(BM_RoundTripTcpLoopback)->UseRealTime();
BENCHMARK(BM_RoundTripSocketPair)->UseRealTime();
BENCHMARK(BM_RawRoundTripTcpLoopback)->UseRealTime();
BENCHMARK(BM_RawRoundTripSocketPair)->UseRealTime();

QN_BENCHMARK_MAIN()
