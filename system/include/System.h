#pragma once
// QNCSystem: the base of the application's system object, and the meeting point of its threads.
//
// One instance exists per process. The application derives from it, creates its object with
// new, hands it to setSystemObject() and calls SystemMain() (SystemGlobals.h); from then on the
// driver owns the object and calls the lifecycle operations below in a fixed order on the main
// thread. Every operation is virtual with a working default, except the three the application
// must provide: setCommandLineArgumentDesc(), parseConfigFile() and displayHelp(). An override of
// preInit(), init() or processCommandLine() calls the base operation.
//
// What the application provides, at construction or in its overrides:
//   construction    mName, mVersion, mProcessInstanceManager (with its PID file path); the base
//                   constructor creates mExitLock and leaves mExitFlag false
//   construction or init()   mMemoryBufferList and mBufferManager, the numbered tables
//                   mWaitConditionals, mQueues, mLists, mReaders, mWriters
//   createThreads() mThreadComponents and mThreadPools
// The library never adds to these tables. They are complete before the first thread starts and
// do not change while threads run, so they are read without a lock.
//
// Threads: the lifecycle operations run on the main thread. The services (buffers, identifiers,
// conditionals, channels, queues, lists, settings reads, the exit flag) may be called from any
// thread once start-up has finished. Locks: mExitLock guards mExitFlag only; mNidCreationLock
// guards mNumericIdManager only; each conditional, queue, list, buffer bucket and channel end has
// its own. Where two are held together, the order is, outermost first:
//   1. a conditional's lock (waitOnEmptyQueue/waitOnEmptyList hold it around their emptiness
//      test, the exit-aware waits around their test and take; an application may test its own
//      condition under it);
//   2. a list's or queue's lock for that test or take, or mExitLock for the exit test
//      (isSetForExit(), which an application may also call under a conditional's lock);
//   3. the logger's own locks: a line may be logged while any other lock is held.
// No lock is taken while one of a later rank is held. The library never holds two locks of one
// rank together, and a bucket's lock, mNidCreationLock and a channel end's lock only ever have
// the logger's locks inside them.
//
// Numbers given to the numbered services are checked by assertions: a number out of range is a
// bug of the caller and ends the process with exit status 1.

#include "CommandLineParser.h"
#include "Os.h"
#include "Pointer.h"
#include "QNList.h"
#include "QNMap.h"
#include "QNString.h"
#include "QNVector.h"
#include "SystemInterface.h"

class QNCBuffer;
class QNCBufferManager;
class QNCConditional;
class QNCIpAddress;
class QNCKeyValueFormatParser;
class QNCMultiType;
class QNCMutex;
class QNCNumericIdManager;
class QNCProcessInstanceManager;
class QNCProtocolHelper;
class QNCQueueable;
class QNCReader;
class QNCSynchList;
class QNCSynchQueue;
class QNCThreadComponent;
class QNCThreadPool;
class QNCVersion;
class QNCWriter;

// The elements of a synchronised list and the iterators that walk it.
using QNCQueueableList = QNCList<QNCPointer<QNCQueueable>>;

// How an exit-aware wait ended (waitOnEmptyListOrExit and its kin).
enum QNEWaitStatus : unsigned char {
  QNWS_Ready = 0,     // the list or queue holds an element (the take: it has been removed)
  QNWS_Exit = 1,      // the process is marked for exit and the list or queue is empty
  QNWS_TimedOut = 2,  // the time limit passed with the list or queue still empty
};

class QNCSystem : public QNCSystemInterface {
 public:
  ~QNCSystem() override;

  // --- Pooled buffers (BufferManager.h). mBufferManager must be set.
  void getBuffer(unsigned int aLength, QNCPointer<QNCBuffer>& arBuffer) override;
  void reuseBuffer(QNCPointer<QNCBuffer>& arBuffer) override;
  void clearBuffer(QNCPointer<QNCBuffer>& arBuffer) override;  // the same as reuseBuffer

  // --- Numeric identifiers, serialised by mNidCreationLock. Available after init().
  void generateNumericId(unsigned int& arId) override;

  // Wakes one thread waiting on conditional acConditionNo; a signal while nobody waits is lost.
  // Takes the conditional's lock for the signal, so it cannot fall between a waiter's emptiness
  // test and its wait (see waitOnEmptyList): a producer's enlist/enqueue followed by signal()
  // always wakes a waiter that found the list or queue empty. The caller must not hold that
  // conditional's lock itself. Blocks only for the lock.
  // When no waiter is counted on the conditional (QNCConditional::hasWaiters) it takes no lock
  // and wakes nobody: every waiter counts itself in lock() before a test that a wait may follow
  // (a woken waiter's first test runs uncounted, and ends its wait when it succeeds), so none
  // can have missed what the caller changed before the call, provided the change and the test
  // meet under one lock (the list's or queue's, as in every wait of this class, or the
  // conditional's) or in sequentially consistent atomics. With the trace level on it passes
  // the lock every time.
  void signal(unsigned int acConditionNo) override;

  // --- Host facts and the exit flag.
  virtual QNCPointer<QNCIpAddress>& getAddress();
  // The exit flag, read under mExitLock. Once true it stays true.
  virtual bool isSetForExit() const;
  virtual void setAddress(const QNCPointer<QNCIpAddress>& acrAddress);
  virtual QNCString& getHostName();
  virtual void setForExit();
  virtual QNEOperatingSystem getOs();
  virtual QNCString& getOsVariant();
  virtual QNCPointer<QNCVersion>& getVersion();
  virtual QNCPointer<QNCReader>& getReader(unsigned int acReaderNo);
  virtual QNCPointer<QNCWriter>& getWriter(unsigned int acWriterNo);
  virtual QNCPointer<QNCProtocolHelper>& getProtocolHelper();

  // --- Lifecycle (main thread, called by the driver in this order: preInit, processCommandLine,
  // parseConfigFile, applySettings, markAsRunning, init, createThreads, startThreads,
  // postThreadsInit, createStartUpEvent; at the end waitForThreads, exitInstanceManagement,
  // destroy, postDestroy).
  virtual void preInit();
  virtual void init();
  virtual void postDestroy();
  virtual void destroy();
  virtual void processCommandLine(int argc, char** argv);
  // Fills mCommandLineArgumentDesc with every option the application accepts, the common ones
  // included. Called last in preInit().
  virtual void setCommandLineArgumentDesc() = 0;
  // Parses the configuration file and adds its settings; throws QNCNotImplementedEx when the
  // application reads no file (the driver logs that and goes on).
  virtual void parseConfigFile(QNCString& arConfFilePath) = 0;
  virtual void displayVersionAndExit();
  virtual void displayHelpAndExit();
  virtual void displayHelp() = 0;

  // --- Single running instance (ProcessInstanceManager.h).
  virtual bool isAnInstanceRunning();
  virtual void markAsRunning();
  virtual void killRunningInstance();
  virtual void exitInstanceManagement();
  virtual void getProcStatus(QNCString aPidFilePath);

  virtual void returnNumericId(const unsigned int& acrId);

  // --- Threads.
  virtual void createThreads();
  virtual void startThreads();
  virtual void startThread(unsigned int aIndex);
  virtual void postThreadsInit();
  virtual void waitForThreads();
  // Sets the exit flag, asks every component to exit and finishes every pool. Safe to call more
  // than once and from the signal dispatcher thread.
  virtual void makeThreadsToExit();
  virtual bool isInited(unsigned int aIndex) const;

  // --- Numbered wait conditionals and buffer channels. Numbers are asserted before any lock.
  // wait(): one wait on conditional acConditionNo, returning after the first wake-up (a caller
  // that needs a condition keeps it itself). timedWait(): the same, at most aWaitTime
  // milliseconds on the monotonic clock; a time-out throws QNCTimeOutEx. Both release the
  // conditional's lock before any exception leaves, so the conditional stays usable.
  // Neither looks at the exit flag; makeThreadsToExit wakes every waiter once (wait() then
  // returns as after any wake-up). A thread that must end on request uses the exit-aware waits
  // below (delistOrExit, waitOnEmptyListOrExit, ...).
  virtual void wait(unsigned int acConditionNo);
  virtual void timedWait(unsigned int acConditionNo, unsigned int aWaitTime);
  // send/receive: write/read on writer/reader acWriterNo/acReaderNo (separate objects); no lock
  // is taken, the channel's exceptions reach the caller. waitForActivity: the reader's own
  // wait, at most acWaitTime milliseconds (asserted > 0); its answer is not passed on.
  virtual void send(unsigned int acWriterNo, const QNCPointer<QNCBuffer>& acrBuffer, unsigned int& arCount);
  virtual void receive(unsigned int acReaderNo, QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount);
  virtual void waitForActivity(unsigned int acReaderNo, unsigned int acWaitTime);

  // --- Numbered synchronised queues (SynchQueue.h) and lists (SynchList.h). Every operation is
  // safe from any thread; element order, exceptions and locking are the companion's.
  // waitOnEmptyQueue/waitOnEmptyList: block without a time limit until queue/list n holds an
  // element, testing it under conditional acConditionNo's lock and waiting on that conditional.
  // When it already holds one they still take that lock for the one test, then release it and
  // return without waiting; a busy consumer therefore meets its producers' signal() on that lock.
  // They neither remove the element (another consumer may take it before the caller's
  // dequeue/delist) nor look at the exit flag (see delistOrExit for a wait that ends on request).
  // The conditional's lock is released before any exception leaves.
  // enqueue/enlist/enlistFront signal nothing: the producer follows them with signal(c).
  // The exit-aware waits are declared after destroyThreads (they came later).
  virtual void waitOnEmptyQueue(unsigned int acConditionNo, unsigned int acQueueNo);
  virtual void enqueue(unsigned int acQueueNo, const QNCPointer<QNCQueueable>& acrElement);
  virtual QNCPointer<QNCQueueable> dequeue(unsigned int acQueueNo);
  virtual QNCPointer<QNCQueueable> queueFront(unsigned int acQueueNo);
  virtual void queueClear(unsigned int acQueueNo);
  virtual bool isQueueEmpty(unsigned int acQueueNo);

  // listBegin/listEnd take no lock: the walker keeps other threads from changing the list until
  // its walk (with listErase) is over.
  virtual void waitOnEmptyList(unsigned int acConditionNo, unsigned int acListNo);
  virtual void enlist(unsigned int acListNo, const QNCPointer<QNCQueueable>& acrElement);
  virtual void enlistFront(unsigned int acListNo, const QNCPointer<QNCQueueable>& acrElement);
  virtual QNCPointer<QNCQueueable> delist(unsigned int acListNo);
  virtual QNCPointer<QNCQueueable> delistBack(unsigned int acListNo);
  virtual QNCPointer<QNCQueueable> listFront(unsigned int acListNo);
  virtual void listClear(unsigned int acListNo);
  virtual unsigned int listSize(unsigned int acListNo);
  virtual bool isListEmpty(unsigned int acListNo);
  virtual void listErase(unsigned int acListNo, QNCQueueableList::iterator& arIterator);
  virtual QNCQueueableList::const_iterator listBegin(unsigned int acListNo) const;
  virtual QNCQueueableList::const_iterator listEnd(unsigned int acListNo) const;
  virtual QNCQueueableList::iterator listBegin(unsigned int acListNo);
  virtual QNCQueueableList::iterator listEnd(unsigned int acListNo);

  // --- Settings.
  virtual void applySettings();
  virtual void getSetting(const QNCString& acrKey, QNCPointer<QNCMultiType>& arValue);
  virtual void addSetting(const QNCString& acrKey, const QNCPointer<QNCMultiType>& acrValue);
  virtual void processCommandLineArguments();

  // --- Application hooks.
  virtual void createStartUpEvent();
  virtual void createShutDownEvent();
  // Moves the process into the background; called by applySettings() before the logger exists
  // and before any thread is started (fork copies only the calling thread, and every descriptor
  // is closed). Returns only in the daemon: a grandchild in a session of its own but not its
  // leader, SIGHUP ignored, umask 0, working directory acDir (must not be empty: asserted),
  // descriptors 0, 1, 2 open on acStdIn, acStdOut, acStdErr and no other descriptor open.
  // The starting process and the first child leave by QNCParentExitEx (19). Throws
  // QNCProcessCreationFailedEx (345) when fork fails, QNCExitConditionEx (19) when the descriptor
  // limit cannot be read, SIGHUP cannot be ignored or the three files cannot become 0, 1, 2, and
  // what ClibChdir throws.
  virtual void systemDaemonize(QNCString acDir, QNCString acStdIn, QNCString acStdOut, QNCString acStdErr);
  virtual void destroyThreads();

  // --- Exit-aware waits. They wait on conditional acConditionNo (numbers asserted first) until
  // list/queue n holds an element (QNWS_Ready), the process is marked for exit (QNWS_Exit) or
  // aMaxWaitMs milliseconds have passed on the monotonic clock (QNWS_TimedOut; 0: no limit), and
  // say which. An element wins over the exit request, so consumers drain what was handed over
  // before they end. makeThreadsToExit wakes them at once; the producer's enlist/enqueue and
  // signal(c) wake them as for waitOnEmptyList. Thread-safe; the conditional's lock is released
  // before any exception (the list's or queue's) leaves.
  // waitOn...OrExit only wait: another consumer may take the element before the caller does.
  virtual QNEWaitStatus waitOnEmptyListOrExit(unsigned int acConditionNo, unsigned int acListNo,
                                              unsigned int aMaxWaitMs);
  virtual QNEWaitStatus waitOnEmptyQueueOrExit(unsigned int acConditionNo, unsigned int acQueueNo,
                                               unsigned int aMaxWaitMs);
  // delistOrExit/dequeueOrExit wait the same way and take the head in the same call: on
  // QNWS_Ready arElement holds the removed head, otherwise it is empty (its former object is
  // released on entry, before any lock). An element that is there already costs one pass through
  // the list's or queue's lock and none through the conditional's.
  virtual QNEWaitStatus delistOrExit(unsigned int acConditionNo, unsigned int acListNo,
                                     unsigned int aMaxWaitMs, QNCPointer<QNCQueueable>& arElement);
  virtual QNEWaitStatus dequeueOrExit(unsigned int acConditionNo, unsigned int acQueueNo,
                                      unsigned int aMaxWaitMs, QNCPointer<QNCQueueable>& arElement);

  // --- Non-virtual members.
  void checkCommandLine(int argc, char** argv, QNCString& aCommandLine);
  void processVersionCommandLineArgument();
  void processHelpCommandLineArgument();
  void processShutdownCommandLineArgument();
  void processConfigFileCommandLineArgument();
  void processDebugLevelCommandLineArgument();
  void processHbTimeoutCommandLineArgument();
  void processDaemonizeCommandLineArgument();
  void processDBReopenIntervalCommandLineArgument();
  // Sleeps about aSeconds, checking the exit flag every 5 seconds and at the end, so a request to
  // stop is noticed within 5 seconds (plus the last remainder). Throws QNCHaltEx "Process is
  // marked for exit." (1) once the flag is set. Any thread; holds no lock while it sleeps.
  void waitAndCheckExit(unsigned int aSeconds);
  void getMemoryBufferList(QNCList<unsigned int>& arList) { arList = mMemoryBufferList; }

 protected:
  // Creates mExitLock; mExitFlag starts false.
  QNCSystem();

  QNCString mName;
  QNCPointer<QNCProcessInstanceManager> mProcessInstanceManager;
  QNCPointer<QNCVersion> mVersion;
  QNCPointer<QNCIpAddress> mAddress;
  QNCString mHostName;
  bool mExitFlag;  // guarded by mExitLock
  QNEOperatingSystem mOs;
  QNCString mOsVariant;
  QNCPointer<QNCProtocolHelper> mProtocolHelper;
  QNCPointer<QNCCommandLineParser> mCommandLineParser;
  QNCVector<QNSCommandLineArgumentDesc> mCommandLineArgumentDesc;
  QNCPointer<QNCKeyValueFormatParser> mConfigFileParser;
  QNCMap<QNCString, QNCPointer<QNCMultiType>> mSettings;
  QNCPointer<QNCBufferManager> mBufferManager;
  QNCPointer<QNCNumericIdManager> mNumericIdManager;  // guarded by mNidCreationLock
  QNCVector<QNCPointer<QNCThreadComponent>> mThreadComponents;
  QNCVector<QNCPointer<QNCThreadPool>> mThreadPools;
  QNCVector<QNCPointer<QNCConditional>> mWaitConditionals;
  QNCVector<QNCPointer<QNCSynchQueue>> mQueues;
  QNCVector<QNCPointer<QNCSynchList>> mLists;
  QNCVector<QNCPointer<QNCReader>> mReaders;
  QNCVector<QNCPointer<QNCWriter>> mWriters;
  QNCPointer<QNCMutex> mNidCreationLock;
  QNCPointer<QNCMutex> mExitLock;
  QNCList<unsigned int> mMemoryBufferList;
};
