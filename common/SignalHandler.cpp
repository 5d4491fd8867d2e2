#include "SignalHandler.h"

#include <fcntl.h>
#include <pthread.h>
#include <signal.h>
#include <unistd.h>

#include <atomic>
#include <future>
#include <cerrno>
#include <mutex>
#include <thread>

#include "Logger.h"
#include "OsError.h"
#include "QNException.h"

namespace {
using QNTSignalFunction = void (*)(int);

std::mutex gsHandlersLock;  // guards gsHandlers and the set-up of the pipe and the dispatcher
QNTSignalFunction gsHandlers[NSIG] = {};

// Read by the asynchronous handler, so lock-free atomics rather than members of the lock above.
// gsDispatcherPid names the process whose dispatcher reads gsSignalWriteFd: a child of fork shares
// the pipe but not the thread, and a byte it wrote would run the parent's handler in the parent.
std::atomic<int> gsSignalWriteFd{-1};
std::atomic<pid_t> gsDispatcherPid{0};
static_assert(std::atomic<int>::is_always_lock_free, "the signal handler needs lock-free atomics");

// Runs in asynchronous signal context: only async-signal-safe calls. The write end does not
// block, so a full pipe (a storm of signals nobody reads) drops the byte instead of hanging the
// interrupted thread; the dispatcher is then busy with the same requests anyway.
void onSignal(int aSignal) {
  const int lSavedErrno = errno;
  if (gsDispatcherPid.load() != getpid()) {
    // A child forked after registration, which has no dispatcher: the signal takes the effect it
    // would have without a registration, in this process only.
    struct sigaction lDefault = {};
    lDefault.sa_handler = SIG_DFL;
    sigemptyset(&lDefault.sa_mask);
    sigaction(aSignal, &lDefault, nullptr);
    raise(aSignal);
  } else {
    const unsigned char lSignal = static_cast<unsigned char>(aSignal);
    (void)!write(gsSignalWriteFd.load(), &lSignal, 1);
  }
  errno = lSavedErrno;
}

void dispatchSignals(int aReadFd, std::promise<void> aStarted) {
  aStarted.set_value();
  for (;;) {
    unsigned char lSignal = 0;
    const ssize_t lRead = read(aReadFd, &lSignal, 1);
    if (lRead < 0 && errno == EINTR) continue;  // a signal landed on this thread: read again
    if (lRead <= 0) return;                     // the write end never closes; this is unreachable
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
  if (gsDispatcherPid.load() == getpid()) return;
  int lPipe[2];
  if (pipe2(lPipe, O_CLOEXEC) != 0) OsThrowError<QNCOsException>(errno, "pipe2");
  if (fcntl(lPipe[1], F_SETFL, O_NONBLOCK) != 0) {
    const int lErrno = errno;
    close(lPipe[0]);
    close(lPipe[1]);
    OsThrowError<QNCOsException>(lErrno, "fcntl O_NONBLOCK");
  }
  // The registration returns only once the dispatcher runs: a fork right after it then never
  // copies a thread that is half-way through its start (holding the allocator's or a runtime's
  // locks, which the child could never get back).
  std::promise<void> lStarted;
  std::future<void> lRunning = lStarted.get_future();
  try {
    std::thread(dispatchSignals, lPipe[0], std::move(lStarted)).detach();
    lRunning.wait();
  } catch (const std::system_error& acrError) {
    close(lPipe[0]);
    close(lPipe[1]);
    OsThrowError<QNCOsException>(acrError.code().value(), "std::thread (signal dispatcher)");
  }
  // The parent's pipe, inherited by a child, stays open there: its read end may be in use by
  // nothing, but closing descriptors behind the application's back is worse.
  gsSignalWriteFd.store(lPipe[1]);
  gsDispatcherPid.store(getpid());
}
}  // namespace

void RegisterSignalHandler(int aSignal, void (*apHandler)(int)) {
  if (aSignal <= 0 || aSignal >= NSIG) throw QNCInvalidEx("RegisterSignalHandler: no such signal", EINVAL);
  static std::once_flag sForkHooks;
  std::call_once(sForkHooks, [] { pthread_atfork(lockForFork, unlockAfterFork, unlockAfterFork); });
  std::lock_guard<std::mutex> lGuard(gsHandlersLock);
  startDispatcher();
  const QNTSignalFunction lpPrevious = gsHandlers[aSignal];
  gsHandlers[aSignal] = apHandler;
  struct sigaction lAction = {};
  lAction.sa_handler = onSignal;
  sigemptyset(&lAction.sa_mask);
  lAction.sa_flags = SA_RESTART;  // other threads' system calls go on after the byte is written
  if (sigaction(aSignal, &lAction, nullptr) != 0) {
    const int lErrno = errno;
    gsHandlers[aSignal] = lpPrevious;
    OsThrowError<QNCOsException>(lErrno, "sigaction");
  }
}
