// Framed messages through the descriptor channel ends, measured side by side in one run. Names
// are Framing/<case>/<contender>:
//
//   64B, 1KiB, 64KiB   one thread writes a framed message into a socket pair and reads it back
//                      (the cost of the calls, without a thread hand-off):
//     ours    QNCProtocolHelper::write through QNCFdWriter, read through QNCFdReader;
//     raw     one write(2) of the body and read(2) until it is back: no framing at all;
//     floor   the system calls a framed message needs, made raw: a prefix write, a body write,
//             one staged read, then the rest of a large body straight into place.
//   roundtriptcp, roundtripunix   64-byte framed requests echoed by a second thread over TCP
//             loopback or a socket pair, one round trip per item: ours (readers made with a
//             50 ms read wait), floor (the same split writes, non-blocking reads and poll).
//
// Logging is masked off. Run with
// --benchmark_enable_random_interleaving=true --benchmark_repetitions=N so the contenders
// alternate through the run.

#include <arpa/inet.h>
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>
#include <string>
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
void framedOurs(benchmark::State& arState, unsigned int aSize) {
  qnbench::setTraceLogging(false);
  int lPair[2];
  socketpair(AF_UNIX, SOCK_STREAM, 0, lPair);
  enlargeBuffers(lPair[0]);
  enlargeBuffers(lPair[1]);
  QNCPointer<QNCWriter> lWriter(new QNCFdWriter(lPair[0]), QNPST_Individual, QNPAT_New);
  QNCPointer<QNCReader> lReader(new QNCFdReader(lPair[1]), QNPST_Individual, QNPAT_New);
  QNCProtocolHelper lHelper(0);
  const QNCPointer<QNCBuffer> lBody = makeBody(aSize);
  QNCPointer<QNCBuffer> lReceived;
  for (auto _ : arState) {
    lHelper.write(lWriter, lBody, false);
    lHelper.read(lReader, lReceived, 0);
    benchmark::DoNotOptimize(lReceived.get());
  }
  arState.SetItemsProcessed(arState.iterations());
  arState.SetBytesProcessed(arState.iterations() * static_cast<int64_t>(aSize));
  qnbench::setTraceLogging(true);
}

void framedRaw(benchmark::State& arState, unsigned int aSize) {
  const size_t lSize = aSize;
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
void framedFloor(benchmark::State& arState, unsigned int aSize) {
  const size_t lSize = aSize;
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

void roundTripTcpOurs(benchmark::State& arState) {
  int lFds[2];
  tcpPair(lFds);
  roundTrips(arState, lFds);
}

void roundTripUnixOurs(benchmark::State& arState) {
  int lFds[2];
  socketpair(AF_UNIX, SOCK_STREAM, 0, lFds);
  roundTrips(arState, lFds);
}

void roundTripTcpFloor(benchmark::State& arState) {
  int lFds[2];
  tcpPair(lFds);
  rawRoundTrips(arState, lFds);
}

void roundTripUnixFloor(benchmark::State& arState) {
  int lFds[2];
  socketpair(AF_UNIX, SOCK_STREAM, 0, lFds);
  rawRoundTrips(arState, lFds);
}

// Fixed iteration counts (about 0.1 to 0.3 s per repetition here), so that many interleaved
// rounds fit in a short run and no time limit shows in the names.
const bool kRegistered = [] {
  const struct {
    const char* mpCase;
    unsigned int mSize;
    benchmark::IterationCount mIterations;
  } lSizes[] = {{"64B", 64, 20000}, {"1KiB", 1024, 20000}, {"64KiB", 65536, 8000}};
  for (const auto& lSize : lSizes) {
    const std::string lPrefix = std::string("Framing/") + lSize.mpCase;
    benchmark::RegisterBenchmark((lPrefix + "/ours").c_str(), framedOurs, lSize.mSize)
        ->Iterations(lSize.mIterations);
    benchmark::RegisterBenchmark((lPrefix + "/raw").c_str(), framedRaw, lSize.mSize)
        ->Iterations(lSize.mIterations);
    benchmark::RegisterBenchmark((lPrefix + "/floor").c_str(), framedFloor, lSize.mSize)
        ->Iterations(lSize.mIterations);
  }
  const struct {
    const char* mpName;
    void (*mpRun)(benchmark::State&);
  } lRoundTrips[] = {{"Framing/roundtriptcp/ours", roundTripTcpOurs},
                     {"Framing/roundtriptcp/floor", roundTripTcpFloor},
                     {"Framing/roundtripunix/ours", roundTripUnixOurs},
                     {"Framing/roundtripunix/floor", roundTripUnixFloor}};
  for (const auto& lRoundTrip : lRoundTrips)
    benchmark::RegisterBenchmark(lRoundTrip.mpName, lRoundTrip.mpRun)->Iterations(4000)->UseRealTime();
  return true;
}();

}  // namespace

QN_BENCHMARK_MAIN()
