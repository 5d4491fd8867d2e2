#include "SignalHandler.h"

#include <atomic>
#include <cerrno>
#include <csignal>
#include <future>
#include <mutex>
#include <thread>

#include "Clib.h"
#include "Logger.h"
#include "OsError.h"
#include "OsSignal.h"
#include "OsStream.h"
#include "OsThread.h"
#include "QNException.h"

namespace {
using QNTSignalFunction = void (*)(int);

std::mutex gsHandlersLock;  // guards gsHandlers and the set-up of the pipe and the dispatcher
QNTSignalFunction gsHandlers[NSIG] = {};

// Read by the asynchronous handler, so lock-free atomics rather than members of the lock above.
// gsDispatcherPid names the process whose dispatcher reads gsSignalWriteFd: a child of fork shares
// the pipe but not the thread, and a byte it wrote would run the parent's handler in the parent.
std::atomic<int> gsSignalWriteFd{-1};
std::atomic<int> gsDispatcherPid{0};
static_assert(std::atomic<int>::is_always_lock_free, "the signal handler needs lock-free atomics");

// Runs in asynchronous signal context: only async-signal-safe calls. The write end does not
// block, so a full pipe (a storm of signals nobody reads) drops the byte instead of hanging the
// interrupted thread; the dispatcher is then busy with the same requests anyway.
void onSignal(int aSignal) {
  const int lSavedErrno = errno;
  if (gsDispatcherPid.load() != ClibGetpid()) {
    // A child forked after registration, which has no dispatcher: the signal takes the effect it
    // would have without a registration, in this process only.
    OsRaiseWithDefaultAction(aSignal);
  } else {
    const unsigned char lSignal = static_cast<unsigned char>(aSignal);
    unsigned long lWritten = 0;  // a full pipe drops it (above)
    (void)OsWriteFully(gsSignalWriteFd.load(), &lSignal, 1, QNPS_Raise, lWritten);
  }
  errno = lSavedErrno;
}

void dispatchSignals(int aReadFd, std::promise<void> aStarted) {
  aStarted.set_value();
  for (;;) {
    unsigned char lSignal = 0;
    try {
      // The read end blocks, so there is no -1 for "nothing yet"; the write end never closes.
      if (OsReadSome(aReadFd, &lSignal, 1) != 1) return;
    } catch (const QNCException&) {
      return;  // a broken pipe end: nothing more can arrive
    }
    QNTSignalFunction lpHandler = nullptr;
    {
      std::lock_guard<std::mutex> lGuard(gsHandlersLock);
      lpHandler = gsHandlers[lSignal];
    }
    if (lpHandler == nullptr) continue;
    // The dispatcher must survive whatever a handler throws: it serves every later signal.
    try {
      lpHandler(lSignal);
    } catch (...) {
      QN_LOG_ERROR("Signal %d handler failed: %s", static_cast<int>(lSignal), QNCurrentExceptionText());
    }
  }
}

// A fork while another thread registers must not leave gsHandlersLock held in the child.
void lockForFork() { gsHandlersLock.lock(); }
void unlockAfterFork() { gsHandlersLock.unlock(); }

// Creates the pipe and the dispatcher thread once per process; gsHandlersLock is held by the
// caller. In a child forked after the first registration it makes the child's own.
void startDispatcher() {
  if (gsDispatcherPid.load() == ClibGetpid()) return;
  int lPipe[2];
  OsOpenWakePipe(lPipe[0], lPipe[1]);
  // The registration returns only once the dispatcher runs: a fork right after it then never
  // copies a thread that is half-way through its start (holding the allocator's or a runtime's
  // locks, which the child could never get back).
  std::promise<void> lStarted;
  std::future<void> lRunning = lStarted.get_future();
  try {
    std::thread(dispatchSignals, lPipe[0], std::move(lStarted)).detach();
    lRunning.wait();
  } catch (const std::system_error& acrError) {
    ClibCloseQuietly(lPipe[0]);
    ClibCloseQuietly(lPipe[1]);
    OsThrowError<QNCOsException>(acrError.code().value(), "std::thread (signal dispatcher)");
  }
  // The parent's pipe, inherited by a child, stays open there: its read end may be in use by
  // nothing, but closing descriptors behind the application's back is worse.
  gsSignalWriteFd.store(lPipe[1]);
  gsDispatcherPid.store(ClibGetpid());
}
}  // namespace

void RegisterSignalHandler(int aSignal, void (*apHandler)(int)) {
  if (aSignal <= 0 || aSignal >= NSIG) throw QNCInvalidEx("RegisterSignalHandler: no such signal", EINVAL);
  static std::once_flag sForkHooks;
  // Fails only when the system has no memory for the hook; registration itself still works.
  std::call_once(sForkHooks, [] { (void)OsAtFork(lockForFork, unlockAfterFork, unlockAfterFork); });
  std::lock_guard<std::mutex> lGuard(gsHandlersLock);
  startDispatcher();
  const QNTSignalFunction lpPrevious = gsHandlers[aSignal];
  gsHandlers[aSignal] = apHandler;
  const int lErrno = OsSetSignalHandler(aSignal, onSignal);
  if (lErrno != 0) {
    gsHandlers[aSignal] = lpPrevious;
    OsThrowError<QNCOsException>(lErrno, "sigaction");
  }
}
