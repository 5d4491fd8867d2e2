#pragma once
// QNCLogSink: where formatted log lines go. One per process, created at the first line and never
// destroyed, so that exit handlers, static destructors and crash handlers can always reach it.
//
// States: kept in memory (before CreateLogger, or while no log could be opened), open (lines are
// buffered and written to the log file), closed (after destroyLogger: only urgent lines, to
// standard error). Urgent lines are those of "-H-", "-E-" and "-W-".
//
// Buffering: lines are copied into the active batch under mLock; a batch is written by swapping it
// with the spare one under mLock and writing the spare under mWriteLock, so writers keep appending
// while a batch is on its way to the kernel. Lock order: mWriteLock, then mLock.
//
// Journal copy: while it is on, write() also sends each line to standard error with its priority
// prefix, as one write(2) of at most kQNLogMaxLine + 3 bytes made outside the locks: pipes take
// such a write whole (PIPE_BUF is 4096), and so does the journal's stream socket and a file, so
// copies of concurrent lines never tear there either. While it is off the cost is one relaxed load.
//
// Any thread, at any time. write() blocks only for the copy, or for a batch write when the batch is
// full or the line is urgent. mLock is a spin lock (see QNCLineLock) since the copy it guards
// takes nanoseconds and a thread put to sleep and woken again would cost both threads far more;
// the flusher is woken only when it waits for a first line, not for every line.

#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <mutex>
#include <string>
#include <thread>

#include "LoggerStartupLines.h"

class QNCLogSink {
 public:
  static QNCLogSink& instance();

  // Takes one formatted line (newline included) of level aLevel.
  void write(unsigned int aLevel, const char* apLine, size_t aLength);

  // Opens apPath for appending (OsOpenLogFile) and makes it the log; writes the lines kept in
  // memory whose level is in aMask at its head. Starts the flusher, installs the crash handlers and
  // the exit handler. Returns false, leaving everything as it was, when the file cannot be opened
  // or is refused; apReason (aReasonSize bytes) then says why.
  bool open(const char* apPath, unsigned int aMask, char* apReason, size_t aReasonSize);

  // Opens the log's path again and writes on there (the old file was moved away): the lines
  // buffered so far go to the old file, every later one to the new file, none to both. Returns
  // true when there is nothing to do (no log open). When the path cannot be opened, returns false
  // with the reason and goes on writing to the old file. Blocks for one batch write and the open.
  bool reopen(char* apReason, size_t aReasonSize);

  // Turns the journal copy on or off; lines already written are not copied.
  void setJournal(bool aOn) { mJournal.store(aOn, std::memory_order_relaxed); }

  // Writes out and closes the log; stops the flusher. Nothing happens when no log is open.
  void close();

  // Writes out every buffered line; blocks until the bytes are handed to the kernel.
  void flush();

  // For the crash handlers: writes out the buffered lines with async-signal-safe calls only.
  // Waits a bounded time for the locks and then writes regardless: the process is dying.
  void flushFromCrash();

 private:
  enum QNESinkState { QNSS_Memory, QNSS_Open, QNSS_Closed };
  static constexpr size_t kBatch = 64 * 1024;

  QNCLogSink();
  void _writeBatch();
  void _startFlusher();
  void _runFlusher();
  void _atExit();
  static void __onExit();
  static void __forkPrepare();
  static void __forkParent();
  static void __forkChild();

  std::atomic<bool> mJournal{false};

  std::mutex mWriteLock;  // guards mpSpare, mPath and the order of batch writes to mFd
  char* mpSpare;
  std::string mPath;  // of the open log; written under both locks

  // The lock every line is copied under. Held for nanoseconds by writers, so a thread that finds
  // it taken spins, reading it until it looks free (reads do not pull the cache line away from the
  // holder); after about a microsecond it yields its processor, and after about a hundred yields
  // it sleeps a millisecond between tries (open, reopen and close hold it for a file write).
  class QNCLineLock {
   public:
    void lock();
    bool try_lock() {
      return !mTaken.load(std::memory_order_relaxed) && !mTaken.exchange(true, std::memory_order_acquire);
    }
    void unlock() { mTaken.store(false, std::memory_order_release); }

   private:
    std::atomic<bool> mTaken{false};
  };

  // The members every line touches share one cache line with the lock.
  alignas(64) QNCLineLock mLock;  // guards every member below; mState and mFd are written under both locks
  QNESinkState mState = QNSS_Memory;
  int mFd = -1;
  char* mpActive;
  size_t mUsed = 0;
  bool mWriteThrough = false;    // after the exit handler, in a child of fork: lines written at once
  bool mFlusherRunning = false;  // a flusher thread exists in this process
  bool mStopFlusher = false;
  bool mFlusherIdle = false;  // the flusher waits for a first line; only then is it woken
  // Joinable only while mFlusherRunning in the process that started it: a child of fork inherits
  // the object but not the thread, and neither joins nor replaces it (it never starts a flusher).
  std::thread mFlusher;
  std::condition_variable_any mFlusherWake;  // a first line in an empty batch, or a stop request
  QNCLogStartupLines mStartup;
  alignas(64) char mBatches[2][kBatch];
};
