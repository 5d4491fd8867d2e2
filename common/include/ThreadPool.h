#pragma once
// QNCThreadPool: a named pool of worker threads that run submitted tasks in submission order
// (each task on whichever worker is free, so tasks of one pool may run at the same time).
//
// Life of a pool: construction (threads counted, none running) -> init() (workers start and
// take tasks) -> finish() (no new task accepted; the workers run what is queued, then end) ->
// waitForThreads() (joins them).
//
// Decisions a user relies on:
// - finish() drains: every task submitted before finish() runs before the workers end. It does
//   not interrupt a running task; a long task should watch its own exit condition.
// - A submission after finish() is refused with QNCExitConditionEx
//   "ThreadPool '<name>' is finished: task refused"; a task is never dropped silently.
// - Tasks submitted before init() wait in the queue and run once the workers start.
// - A task that throws is logged at error level "ThreadPool '<name>': task failed: <message>",
//   then onTaskFailure() decides. By default the failure is that of the run, as for a thread
//   component that dies (ThreadComponent.h): the run is marked failed and the orderly exit starts
//   (QNFailRun(), RunStatus.h), and getRunExitStatus() later gives main the status 1. The worker
//   itself goes on, so the queue still drains. A pool whose tasks may fail overrides the hook
//   (to resubmit, count or ignore the failure).
//
// Threads: submit(), finish() and getName() may be called from any thread, also from a task and
// from the signal dispatcher; finish() never blocks. init() and waitForThreads() are for the
// owner. mLock guards mTasks, mFinished, mStarted and is never held while a task runs; mThreads
// keeps the workers and their join lock (ThreadGroup.h).
//
// Lifetime: the owner calls finish() and waitForThreads() before destroying the pool; the
// destructor does both if they were not done, so the process never reaches std::terminate.

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>

#include "QNString.h"
#include "ThreadGroup.h"

class QNCThreadPool {
 public:
  using QNTTask = std::function<void()>;

  // aThreadCount workers; throws QNCInvalidEx "ThreadPool '<name>' needs at least one thread"
  // for 0.
  QNCThreadPool(const QNCString& acrName, unsigned int aThreadCount);
  QNCThreadPool(const QNCThreadPool&) = delete;
  QNCThreadPool& operator=(const QNCThreadPool&) = delete;
  virtual ~QNCThreadPool();

  // Starts the workers. Throws QNCInvalidEx "ThreadPool '<name>' already started" on a second
  // call; QNCOsException when a thread cannot be created (the workers already made are then
  // finished and joined, and the pool counts as started: a further init() is refused).
  virtual void init();

  // Stops accepting tasks and lets the workers end once the queue is empty. Does not block.
  // Idempotent.
  virtual void finish();

  // Blocks until every worker has ended, that is until finish() has been called and the queue
  // has drained. Returns at once when the pool was never started or has been joined already.
  // Throws QNCInvalidEx when called from one of the pool's own workers.
  virtual void waitForThreads();

  // Queues a task. Throws QNCInvalidEx for an empty function, QNCExitConditionEx after finish(),
  // QNCNoMemoryEx when the queue cannot grow.
  virtual void submit(QNTTask aTask);

  QNCString& getName() { return mName; }

 protected:
  // Called on the worker after a task threw the exception whose text is apWhat (already logged
  // at error level). The default marks the run failed and starts the orderly exit (QNFailRun()).
  // The worker takes the next task whatever the hook does.
  virtual void onTaskFailure(const char* apWhat);

 private:
  void _work();
  void _run(QNTTask& arTask);

  QNCString mName;
  const unsigned int mThreadCount;
  std::mutex mLock;  // guards mTasks, mFinished, mStarted
  std::condition_variable mWork;
  std::deque<QNTTask> mTasks;
  bool mFinished;
  bool mStarted;
  QNCThreadGroup mThreads;  // the workers; declared last, so they are joined first
};
