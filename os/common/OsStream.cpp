#include "OsStream.h"

#include <fcntl.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>

#include "OsError.h"

namespace {
long long nowMs() {
  struct timespec lNow;
  clock_gettime(CLOCK_MONOTONIC, &lNow);
  return static_cast<long long>(lNow.tv_sec) * 1000 + lNow.tv_nsec / 1000000;
}

// write(2) to a descriptor that is not a socket raises SIGPIPE when the reader has gone. The
// signal is blocked in this thread for the call and a SIGPIPE the call raised is consumed, so the
// failure arrives as EPIPE only; a SIGPIPE that was already pending for another reason stays.
long writeWithoutSigpipe(int aFd, const void* apBuffer, unsigned long aCount) {
  sigset_t lPipeOnly, lOld, lPending;
  sigemptyset(&lPipeOnly);
  sigaddset(&lPipeOnly, SIGPIPE);
  sigpending(&lPending);
  const bool lWasPending = sigismember(&lPending, SIGPIPE) == 1;
  pthread_sigmask(SIG_BLOCK, &lPipeOnly, &lOld);
  const long lResult = write(aFd, apBuffer, aCount);
  const int lErrno = errno;
  if (lResult < 0 && lErrno == EPIPE && !lWasPending) {
    const struct timespec lNoWait = {0, 0};
    // Take back the SIGPIPE this write raised; EAGAIN means it went to the process instead.
    while (sigtimedwait(&lPipeOnly, nullptr, &lNoWait) < 0 && errno == EINTR) {
    }
  }
  pthread_sigmask(SIG_SETMASK, &lOld, nullptr);
  errno = lErrno;
  return lResult;
}

long writeSome(int aFd, QNEPipeSignal aPipeSignal, const void* apBuffer, unsigned long aCount) {
  if (aPipeSignal == QNPS_Socket) return send(aFd, apBuffer, aCount, MSG_NOSIGNAL);
  if (aPipeSignal == QNPS_Blocked) return writeWithoutSigpipe(aFd, apBuffer, aCount);
  return write(aFd, apBuffer, aCount);
}
}  // namespace

bool OsIsSocket(int aFd) {
  int lType = 0;
  socklen_t lLength = sizeof lType;
  return getsockopt(aFd, SOL_SOCKET, SO_TYPE, &lType, &lLength) == 0;
}

void OsOpenWakePipe(int& arReadFd, int& arWriteFd) {
  int lPipe[2];
  if (pipe2(lPipe, O_CLOEXEC) != 0) OsThrowError<QNCOsException>(errno, "pipe2");
  if (fcntl(lPipe[1], F_SETFL, O_NONBLOCK) != 0) {
    const int lErrno = errno;
    close(lPipe[0]);
    close(lPipe[1]);
    OsThrowError<QNCOsException>(lErrno, "fcntl O_NONBLOCK");
  }
  arReadFd = lPipe[0];
  arWriteFd = lPipe[1];
}

void OsSetNonBlocking(int aFd) {
  const int lFlags = fcntl(aFd, F_GETFL);
  if (lFlags < 0 || fcntl(aFd, F_SETFL, lFlags | O_NONBLOCK) != 0)
    OsThrowFdError<QNCOsException>(errno, "fcntl(O_NONBLOCK)", aFd);
}

long OsReadSome(int aFd, void* apBuffer, unsigned long aCount) {
  for (;;) {
    const long lRead = read(aFd, apBuffer, aCount);
    if (lRead >= 0) return lRead;
    if (errno == EINTR) continue;  // nothing was read: read again
    if (errno == EAGAIN || errno == EWOULDBLOCK) return -1;
    OsThrowFdError<QNCReadFailedEx>(errno, "read", aFd);
  }
}

int OsWriteFully(int aFd, const void* apBuffer, unsigned long aCount, QNEPipeSignal aPipeSignal,
                 unsigned long& arWritten) noexcept {
  const char* lpBytes = static_cast<const char*>(apBuffer);
  arWritten = 0;
  while (arWritten < aCount) {
    const long lResult = writeSome(aFd, aPipeSignal, lpBytes + arWritten, aCount - arWritten);
    if (lResult > 0) {
      // A signal during a blocked write ends it early with the bytes written so far: go on.
      arWritten += static_cast<unsigned long>(lResult);
      continue;
    }
    if (lResult == 0) return EIO;  // no byte taken for a non-zero count: no progress possible
    const int lErrno = errno;
    if (lErrno == EINTR) continue;  // interrupted before any byte went out
    return lErrno == EWOULDBLOCK ? EAGAIN : lErrno;
  }
  return 0;
}

void OsWriteAll(int aFd, bool aIsSocket, const void* apBuffer, unsigned long aCount,
                unsigned int aTimeoutMs) {
  const char* lpBytes = static_cast<const char*>(apBuffer);
  long long lDeadline = -1;  // set at the first full descriptor: most writes never wait
  unsigned long lWritten = 0;
  for (;;) {
    unsigned long lMore = 0;
    const int lErrno = OsWriteFully(aFd, lpBytes + lWritten, aCount - lWritten,
                                    aIsSocket ? QNPS_Socket : QNPS_Blocked, lMore);
    lWritten += lMore;
    if (lErrno == 0) return;
    if (lErrno != EAGAIN) OsThrowFdError<QNCWriteFailedEx>(lErrno, "write", aFd);
    if (lDeadline < 0) lDeadline = nowMs() + aTimeoutMs;
    const long long lLeft = aTimeoutMs == 0 ? -1 : lDeadline - nowMs();
    if (aTimeoutMs != 0 && lLeft <= 0) {
      char lFd[QNCException::kMaxMessage / 2];
      OsDescribeFd(lFd, sizeof lFd, aFd);
      char lMessage[QNCException::kMaxMessage];
      snprintf(lMessage, sizeof lMessage, "write %s: peer did not drain within %u ms", lFd, aTimeoutMs);
      throw QNCTimeOutEx(lMessage, ETIMEDOUT);
    }
    struct pollfd lPoll = {aFd, POLLOUT, 0};
    // Errors and hang-ups show in the next write's result, so poll's own result is not needed.
    (void)poll(&lPoll, 1, lLeft > INT_MAX ? INT_MAX : static_cast<int>(lLeft));
  }
}

bool OsWaitReadable(int aFd, unsigned int aTimeoutMs) {
  const long long lDeadline = nowMs() + aTimeoutMs;
  for (;;) {
    struct pollfd lPoll = {aFd, POLLIN, 0};
    const long long lLeft = lDeadline - nowMs();
    const int lReady = poll(&lPoll, 1, lLeft <= 0 ? 0 : lLeft > INT_MAX ? INT_MAX : static_cast<int>(lLeft));
    if (lReady > 0) return true;
    if (lReady == 0) return false;
    if (errno != EINTR) OsThrowFdError<QNCOsException>(errno, "poll", aFd);
    // Interrupted: wait on for the time that is left.
  }
}

void OsDisableNagleIfTcp(int aFd) {
  struct sockaddr_storage lAddress;
  socklen_t lLength = sizeof lAddress;
  if (getsockname(aFd, reinterpret_cast<struct sockaddr*>(&lAddress), &lLength) != 0) return;  // not a socket
  if (lAddress.ss_family != AF_INET && lAddress.ss_family != AF_INET6) return;
  int lType = 0;
  socklen_t lTypeLength = sizeof lType;
  if (getsockopt(aFd, SOL_SOCKET, SO_TYPE, &lType, &lTypeLength) != 0 || lType != SOCK_STREAM) return;
  const int lOn = 1;
  // The framing helper writes a prefix and a body per message; with Nagle's algorithm the body
  // waits for the peer's delayed acknowledgement of the prefix (about 40 ms each way).
  if (setsockopt(aFd, IPPROTO_TCP, TCP_NODELAY, &lOn, sizeof lOn) != 0)
    OsThrowFdError<QNCOsException>(errno, "setsockopt(TCP_NODELAY)", aFd);
}
