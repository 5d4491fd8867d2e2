#include "LoggerSink.h"

#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <time.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <cstring>

#include "Logger.h"
#include "LoggerLine.h"

namespace {

// How long lines gather before the flusher writes them: well inside the promised second.
constexpr auto kFlushDelay = std::chrono::milliseconds(200);

bool isUrgent(unsigned int aLevel) { return (aLevel & (QNLL_Halt | QNLL_Error | QNLL_Warning)) != 0; }

// Retries after EINTR and short writes. A failing log device drops the rest: there is nowhere
// left to report it. Async-signal-safe.
void writeAll(int aFd, const char* apData, size_t aLength) {
  while (aLength > 0) {
    const ssize_t lWritten = ::write(aFd, apData, aLength);
    if (lWritten < 0 && errno == EINTR) continue;
    if (lWritten <= 0) return;
    apData += lWritten;
    aLength -= static_cast<size_t>(lWritten);
  }
}

// Spins on try_lock for at most about 50 ms; the crash handler must not wait for a lock that the
// crashing thread itself may hold. pthread_mutex_trylock never blocks, and nanosleep is
// async-signal-safe.
bool lockWithin50Ms(std::mutex& arLock) {
  for (int lTry = 0; lTry < 100; ++lTry) {
    if (arLock.try_lock()) return true;
    const struct timespec lPause = {0, 500 * 1000};
    nanosleep(&lPause, nullptr);
  }
  return false;
}

const int gsCrashSignals[] = {SIGSEGV, SIGBUS, SIGABRT, SIGFPE};

void onCrashSignal(int aSignal) {
  QNCLogSink::instance().flushFromCrash();
  // Default action, then the same signal again: it is blocked while this handler runs and is
  // delivered on return, so the process dies of it (a fault that re-executes dies the same way).
  struct sigaction lDefault = {};
  lDefault.sa_handler = SIG_DFL;
  sigemptyset(&lDefault.sa_mask);
  sigaction(aSignal, &lDefault, nullptr);
  raise(aSignal);
}

void installCrashHandlers() {
  struct sigaction lAction = {};
  lAction.sa_handler = onCrashSignal;
  sigemptyset(&lAction.sa_mask);
  lAction.sa_flags = SA_ONSTACK;  // a thread with an alternate stack survives its stack overflow here
  for (const int lSignal : gsCrashSignals) sigaction(lSignal, &lAction, nullptr);
}

}  // namespace

QNCLogSink& QNCLogSink::instance() {
  // Never destroyed: exit handlers, static destructors of other objects and crash handlers may
  // log or flush after every destructor of this library has run.
  static QNCLogSink* const lpSink = new QNCLogSink;
  return *lpSink;
}

QNCLogSink::QNCLogSink() : mpSpare(mBatches[1]), mpActive(mBatches[0]) {
  // A fork must not find the locks held by a thread that does not exist in the child.
  pthread_atfork(__forkPrepare, __forkParent, __forkChild);
}

void QNCLogSink::write(unsigned int aLevel, const char* apLine, size_t aLength) {
  const bool lUrgent = isUrgent(aLevel);
  std::unique_lock<std::mutex> lGuard(mLock);
  if (mState != QNSS_Open) {
    if (mState == QNSS_Memory) mStartup.keep(aLevel, apLine, aLength);
    // Under the lock, so that urgent lines of several threads reach standard error whole.
    if (lUrgent) writeAll(STDERR_FILENO, apLine, aLength);
    return;
  }
  while (kBatch - mUsed < aLength) {
    lGuard.unlock();
    _writeBatch();
    lGuard.lock();
    if (mState != QNSS_Open) return;  // closed meanwhile: the line is one of the last, dropped
  }
  const bool lWasEmpty = mUsed == 0;
  memcpy(mpActive + mUsed, apLine, aLength);
  mUsed += aLength;
  const bool lWriteNow = lUrgent || mWriteThrough;
  const bool lWakeFlusher = lWasEmpty && mFlusherRunning;
  lGuard.unlock();
  if (lWriteNow) {
    _writeBatch();
  } else if (lWakeFlusher) {
    mFlusherWake.notify_all();
  }
}

void QNCLogSink::_writeBatch() {
  std::lock_guard<std::mutex> lWriteGuard(mWriteLock);
  size_t lLength = 0;
  int lFd = -1;
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    char* lpFull = mpActive;
    mpActive = mpSpare;
    mpSpare = lpFull;
    lLength = mUsed;
    mUsed = 0;
    lFd = mFd;
  }
  // mFd stays open while mWriteLock is held: close() takes it before closing.
  if (lFd >= 0) writeAll(lFd, mpSpare, lLength);
}

bool QNCLogSink::open(const char* apPath, unsigned int aMask) {
  const int lFd = ::open(apPath, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0640);
  if (lFd < 0) return false;
  _writeBatch();  // what belongs to a log already open goes there
  {
    std::lock_guard<std::mutex> lWriteGuard(mWriteLock);
    std::lock_guard<std::mutex> lGuard(mLock);
    if (mState == QNSS_Open) {
      writeAll(mFd, mpActive, mUsed);  // lines that came between the write above and the locks
      mUsed = 0;
      ::close(mFd);
    }
    mFd = lFd;
    mState = QNSS_Open;
    const char* lpKept = nullptr;
    const size_t lKeptLength = mStartup.takeSelected(aMask, &lpKept);
    writeAll(mFd, lpKept, lKeptLength);
    if (mStartup.dropped() != 0 && (aMask & QNLL_Warning) != 0) {
      char lLine[kQNLogMaxLine];
      const size_t lLength = QNFormatLogLineV(lLine, sizeof lLine, "-W-", __LINE__, __func__, __FILE__,
                                              "%lu start-up lines did not fit in memory and are missing above",
                                              mStartup.dropped());
      writeAll(mFd, lLine, lLength);
    }
    mStartup.release();
  }
  static std::once_flag sProcessHooks;
  std::call_once(sProcessHooks, [] {
    installCrashHandlers();
    atexit(__onExit);
  });
  _startFlusher();
  return true;
}

void QNCLogSink::close() {
  pthread_t lFlusher{};
  bool lJoin = false;
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    if (mState != QNSS_Open) return;
    if (mFlusherRunning) {
      mStopFlusher = true;
      lFlusher = mFlusher;
      lJoin = true;
    }
  }
  if (lJoin) {
    mFlusherWake.notify_all();
    pthread_join(lFlusher, nullptr);
  }
  std::lock_guard<std::mutex> lWriteGuard(mWriteLock);
  std::lock_guard<std::mutex> lGuard(mLock);
  mFlusherRunning = false;
  mStopFlusher = false;
  writeAll(mFd, mpActive, mUsed);
  mUsed = 0;
  ::close(mFd);
  mFd = -1;
  mState = QNSS_Closed;
}

void QNCLogSink::flush() { _writeBatch(); }

void QNCLogSink::flushFromCrash() {
  // Locks that cannot be had in time are passed by: a half-copied line past mUsed is never
  // written, and what lies before mUsed is complete.
  const bool lHaveWriteLock = lockWithin50Ms(mWriteLock);
  const bool lHaveLock = lockWithin50Ms(mLock);
  if (mState == QNSS_Open && mFd >= 0) writeAll(mFd, mpActive, mUsed);
  mUsed = 0;
  if (lHaveLock) mLock.unlock();
  if (lHaveWriteLock) mWriteLock.unlock();
}

void QNCLogSink::_startFlusher() {
  std::lock_guard<std::mutex> lGuard(mLock);
  if (mFlusherRunning || mState != QNSS_Open || mWriteThrough) return;
  // Without a flusher, lines still reach the file when a batch fills, at an urgent line and at
  // exit; only the one-second promise is lost, so a failed start is not worth failing a caller.
  if (pthread_create(&mFlusher, nullptr, __flusherMain, this) == 0) mFlusherRunning = true;
}

void* QNCLogSink::__flusherMain(void* apSink) {
  static_cast<QNCLogSink*>(apSink)->_runFlusher();
  return nullptr;
}

void QNCLogSink::_runFlusher() {
  std::unique_lock<std::mutex> lGuard(mLock);
  for (;;) {
    mFlusherWake.wait(lGuard, [this] { return mStopFlusher || mUsed != 0; });
    if (mStopFlusher) return;
    // Let a batch gather, so that a steady trickle of lines costs one write per period.
    mFlusherWake.wait_for(lGuard, kFlushDelay, [this] { return mStopFlusher; });
    if (mStopFlusher) return;  // close() writes what is left
    lGuard.unlock();
    _writeBatch();
    lGuard.lock();
  }
}

void QNCLogSink::__onExit() { instance()._atExit(); }

void QNCLogSink::_atExit() {
  // The flusher thread is not stopped: exit() may be running on any thread, and the flusher only
  // ever waits for mLock, which no thread holds for longer than one write.
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    mWriteThrough = true;
  }
  _writeBatch();
}

void QNCLogSink::__forkPrepare() {
  QNCLogSink& lrSink = instance();
  lrSink.mWriteLock.lock();
  lrSink.mLock.lock();
}

void QNCLogSink::__forkParent() {
  QNCLogSink& lrSink = instance();
  lrSink.mLock.unlock();
  lrSink.mWriteLock.unlock();
}

void QNCLogSink::__forkChild() {
  QNCLogSink& lrSink = instance();
  // The parent writes its own buffered lines; the child writing them too would double them.
  // Lines kept in memory before the log is open are the child's to keep (daemonizing).
  // The parent's flusher does not exist here, and a thread started in the child of a
  // multi-threaded process is unsafe until exec: the child writes each line at once instead.
  if (lrSink.mState == QNSS_Open) {
    lrSink.mUsed = 0;
    lrSink.mWriteThrough = true;
  }
  lrSink.mFlusherRunning = false;
  lrSink.mStopFlusher = false;
  lrSink.mLock.unlock();
  lrSink.mWriteLock.unlock();
}
