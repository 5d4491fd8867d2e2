#include "LoggerSink.h"

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <cstring>

#include "Clib.h"
#include "Logger.h"
#include "LoggerLine.h"
#include "OsLogFile.h"
#include "OsSignal.h"
#include "OsStream.h"
#include "OsThread.h"

namespace {

constexpr int kStandardError = 2;

// How long lines gather before the flusher writes them: well inside the promised second.
constexpr auto kFlushDelay = std::chrono::milliseconds(200);

bool isUrgent(unsigned int aLevel) { return (aLevel & (QNLL_Halt | QNLL_Error | QNLL_Warning)) != 0; }

// A failing log device drops the rest: there is nowhere left to report it.
void writeAll(int aFd, const char* apData, size_t aLength) {
  unsigned long lWritten = 0;
  (void)OsWriteFully(aFd, apData, aLength, QNPS_Raise, lWritten);
}

// The syslog priority that sd-daemon(3) reads from a "<n>" prefix on a line of standard error.
char priorityOf(unsigned int aLevel) {
  switch (aLevel) {
    case QNLL_Halt:
      return '2';  // LOG_CRIT
    case QNLL_Error:
      return '3';  // LOG_ERR
    case QNLL_Warning:
      return '4';  // LOG_WARNING
    case QNLL_Notice:
      return '5';  // LOG_NOTICE
    case QNLL_Trace:
      return '7';  // LOG_DEBUG
    default:
      return '6';  // LOG_INFO
  }
}

// One write per line, so that the journal sees one record per line with its own priority.
void writeToJournal(unsigned int aLevel, const char* apLine, size_t aLength) {
  char lOut[3 + kQNLogMaxLine];
  if (aLength > kQNLogMaxLine) aLength = kQNLogMaxLine;
  lOut[0] = '<';
  lOut[1] = priorityOf(aLevel);
  lOut[2] = '>';
  memcpy(lOut + 3, apLine, aLength);
  writeAll(kStandardError, lOut, aLength + 3);
}

// Tries the lock for at most about 50 ms; the crash handler must not wait for a lock that the
// crashing thread itself may hold. try_lock never blocks, and the 1 ms sleeps are clock_nanosleep,
// which is async-signal-safe.
template <typename Lock>
bool lockWithin50Ms(Lock& arLock) {
  for (int lTry = 0; lTry < 50; ++lTry) {
    if (arLock.try_lock()) return true;
    ClibSleepMS(1);
  }
  return false;
}

const int gsCrashSignals[] = {SIGSEGV, SIGBUS, SIGABRT, SIGFPE};

void onCrashSignal(int aSignal) {
  QNCLogSink::instance().flushFromCrash();
  OsRaiseWithDefaultAction(aSignal);
}

void installCrashHandlers() {
  // A handler that cannot be installed costs only the lines buffered at a crash.
  for (const int lSignal : gsCrashSignals) (void)OsSetSignalHandler(lSignal, onCrashSignal);
}

}  // namespace

void QNCLogSink::QNCLineLock::lock() {
  for (unsigned int lTry = 0; !try_lock(); ++lTry) {
    if (lTry < 100) {
#if defined(__x86_64__) || defined(__i386__)
      __builtin_ia32_pause();  // lets the other hyper-thread run and the holder's unlock through
#endif
    } else if (lTry < 200) {
      std::this_thread::yield();
    } else {
      ClibSleepMS(1);
    }
  }
}

QNCLogSink& QNCLogSink::instance() {
  // Never destroyed: exit handlers, static destructors of other objects and crash handlers may
  // log or flush after every destructor of this library has run.
  static QNCLogSink* const lpSink = new QNCLogSink;
  return *lpSink;
}

QNCLogSink::QNCLogSink() : mpSpare(mBatches[1]), mpActive(mBatches[0]) {
  // A fork must not find the locks held by a thread that does not exist in the child.
  (void)OsAtFork(__forkPrepare, __forkParent, __forkChild);  // fails only without memory at start-up
}

void QNCLogSink::write(unsigned int aLevel, const char* apLine, size_t aLength) {
  const bool lUrgent = isUrgent(aLevel);
  const bool lJournal = mJournal.load(std::memory_order_relaxed);
  if (lJournal) writeToJournal(aLevel, apLine, aLength);
  std::unique_lock<QNCLineLock> lGuard(mLock);
  if (mState != QNSS_Open) {
    if (mState == QNSS_Memory) mStartup.keep(aLevel, apLine, aLength);
    // Under the lock, so that urgent lines of several threads reach standard error whole. The
    // journal copy above already took them there.
    if (lUrgent && !lJournal) writeAll(kStandardError, apLine, aLength);
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
  // An urgent line writes the batch itself; the flusher stays idle, and the next line wakes it.
  const bool lWakeFlusher = !lWriteNow && lWasEmpty && mFlusherIdle;
  if (lWakeFlusher) mFlusherIdle = false;
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
    std::lock_guard<QNCLineLock> lGuard(mLock);
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

bool QNCLogSink::open(const char* apPath, unsigned int aMask, char* apReason, size_t aReasonSize) {
  const int lFd = OsOpenLogFile(apPath, apReason, aReasonSize);
  if (lFd < 0) return false;
  _writeBatch();  // what belongs to a log already open goes there
  {
    std::lock_guard<std::mutex> lWriteGuard(mWriteLock);
    std::lock_guard<QNCLineLock> lGuard(mLock);
    if (mState == QNSS_Open) {
      writeAll(mFd, mpActive, mUsed);  // lines that came between the write above and the locks
      mUsed = 0;
      ClibCloseQuietly(mFd);
    }
    mFd = lFd;
    mState = QNSS_Open;
    mPath = apPath;
    const char* lpKept = nullptr;
    const size_t lKeptLength = mStartup.takeSelected(aMask, &lpKept);
    writeAll(mFd, lpKept, lKeptLength);
    if (mStartup.dropped() != 0 && (aMask & QNLL_Warning) != 0) {
      char lLine[kQNLogMaxLine];
      const size_t lLength = QNFormatLogLineV(
          lLine, sizeof lLine, "-W-", __LINE__, __func__, __FILE__,
          "%lu start-up lines did not fit in memory and are missing above", mStartup.dropped());
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

bool QNCLogSink::reopen(char* apReason, size_t aReasonSize) {
  // mWriteLock first: no batch is on its way to the old file while the descriptors change, and
  // mState and mPath (written under both locks) can be read.
  std::lock_guard<std::mutex> lWriteGuard(mWriteLock);
  if (mState != QNSS_Open) return true;
  const int lFd = OsOpenLogFile(mPath.c_str(), apReason, aReasonSize);
  if (lFd < 0) return false;
  std::lock_guard<QNCLineLock> lGuard(mLock);
  writeAll(mFd, mpActive, mUsed);  // what was logged before the switch ends the old file
  mUsed = 0;
  ClibCloseQuietly(mFd);
  mFd = lFd;
  return true;
}

void QNCLogSink::close() {
  bool lJoin = false;
  {
    std::lock_guard<QNCLineLock> lGuard(mLock);
    if (mState != QNSS_Open) return;
    if (mFlusherRunning) {
      mStopFlusher = true;
      lJoin = true;
    }
  }
  if (lJoin) {
    mFlusherWake.notify_all();
    mFlusher.join();
  }
  std::lock_guard<std::mutex> lWriteGuard(mWriteLock);
  std::lock_guard<QNCLineLock> lGuard(mLock);
  mFlusherRunning = false;
  mStopFlusher = false;
  writeAll(mFd, mpActive, mUsed);
  mUsed = 0;
  ClibCloseQuietly(mFd);
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
  std::lock_guard<QNCLineLock> lGuard(mLock);
  if (mFlusherRunning || mState != QNSS_Open || mWriteThrough) return;
  // Without a flusher, lines still reach the file when a batch fills, at an urgent line and at
  // exit; only the one-second promise is lost, so a failed start is not worth failing a caller.
  try {
    mFlusher = std::thread(&QNCLogSink::_runFlusher, this);
    mFlusherRunning = true;
  } catch (const std::system_error&) {
    // Left without a flusher (see above).
  }
}

void QNCLogSink::_runFlusher() {
  std::unique_lock<QNCLineLock> lGuard(mLock);
  for (;;) {
    mFlusherIdle = true;
    mFlusherWake.wait(lGuard, [this] { return mStopFlusher || mUsed != 0; });
    mFlusherIdle = false;
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
    std::lock_guard<QNCLineLock> lGuard(mLock);
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
  lrSink.mFlusherIdle = false;
  lrSink.mStopFlusher = false;
  lrSink.mLock.unlock();
  lrSink.mWriteLock.unlock();
}
