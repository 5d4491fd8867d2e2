#include "SignalHandler.h"

#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <mutex>
#include <thread>

#include "Logger.h"
#include "OsError.h"
#include "QNException.h"

namespace {
using QNTSignalFunction = void (*)(int);

std::mutex gsHandlersLock;  // guards gsHandlers and gsSignalPipe set-up
QNTSignalFunction gsHandlers[NSIG] = {};
int gsSignalPipe[2] = {-1, -1};

// Runs in asynchronous signal context: only async-signal-safe calls. The write end does not
// block, so a full pipe (a storm of signals nobody reads) drops the byte instead of hanging the
// interrupted thread; the dispatcher is then busy with the same requests anyway.
void onSignal(int aSignal) {
  const int lSavedErrno = errno;
  const unsigned char lSignal = static_cast<unsigned char>(aSignal);
  (void)!write(gsSignalPipe[1], &lSignal, 1);
  errno = lSavedErrno;
}

void dispatchSignals(int aReadFd) {
  for (;;) {
    unsigned char lSignal = 0;
    const ssize_t lRead = read(aReadFd, &lSignal, 1);
    if (lRead < 0 && errno == EINTR) continue;  // a signal landed on this thread: read again
    if (lRead <= 0) return;
    QNTSignalFunction lpHandler = nullptr;
    {
      std::lock_guard<std::mutex> lGuard(gsHandlersLock);
      lpHandler = gsHandlers[lSignal];
    }
    if (lpHandler == nullptr) continue;
    // The dispatcher must survive whatever a handler throws: it serves every later signal.
    try {
      lpHandler(lSignal);
    } catch (const QNCException& acrException) {
      QN_LOG_ERROR("Signal %d handler failed: %s", static_cast<int>(lSignal), acrException.what());
    } catch (...) {
      QN_LOG_ERROR("Signal %d handler failed with an unknown exception", static_cast<int>(lSignal));
    }
  }
}

// Creates the pipe and the dispatcher thread once; gsHandlersLock is held by the caller.
void startDispatcher() {
  if (gsSignalPipe[0] >= 0) return;
  int lPipe[2];
  if (pipe2(lPipe, O_CLOEXEC) != 0) OsThrowError<QNCOsException>(errno, "pipe2");
  if (fcntl(lPipe[1], F_SETFL, O_NONBLOCK) != 0) {
    const int lErrno = errno;
    close(lPipe[0]);
    close(lPipe[1]);
    OsThrowError<QNCOsException>(lErrno, "fcntl O_NONBLOCK");
  }
  try {
    std::thread(dispatchSignals, lPipe[0]).detach();
  } catch (const std::system_error& acrError) {
    close(lPipe[0]);
    close(lPipe[1]);
    OsThrowError<QNCOsException>(acrError.code().value(), "std::thread (signal dispatcher)");
  }
  gsSignalPipe[0] = lPipe[0];
  gsSignalPipe[1] = lPipe[1];
}
}  // namespace

void RegisterSignalHandler(int aSignal, void (*apHandler)(int)) {
  if (aSignal <= 0 || aSignal >= NSIG) throw QNCInvalidEx("RegisterSignalHandler: no such signal", EINVAL);
  std::lock_guard<std::mutex> lGuard(gsHandlersLock);
  startDispatcher();
  gsHandlers[aSignal] = apHandler;
  struct sigaction lAction = {};
  lAction.sa_handler = onSignal;
  sigemptyset(&lAction.sa_mask);
  lAction.sa_flags = SA_RESTART;  // other threads' system calls go on after the byte is written
  if (sigaction(aSignal, &lAction, nullptr) != 0) OsThrowError<QNCOsException>(errno, "sigaction");
}
