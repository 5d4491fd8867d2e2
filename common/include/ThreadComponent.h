#pragma once
// QNCThreadComponent: one named thread of the application.
//
// The application derives from it and writes the thread's body in run(). The system object
// starts the component with init(), asks it to end with requestExit() and joins it with
// waitForExit(). A body learns of the request either by testing isExitRequested() or, better,
// by sleeping in waitForExitRequest(), which the request interrupts at once: a body never has
// to poll faster than its own work needs.
//
// A thread that dies is never forgotten. An exception that escapes run() is logged at error level
// "Thread '<name>' ended by an exception: <message>", then restartAfterFailure() decides. By
// default the run is marked failed and the orderly exit of the whole service starts
// (QNFailRun(), RunStatus.h: the system object's makeThreadsToExit), so the service does not
// run on degraded: SystemMain returns normally and getRunExitStatus() gives main the status 1 for
// a supervisor to act on. A component that can recover overrides the hook to run run() again.
// (An exception leaving a thread function would otherwise call std::terminate.)
//
// Threads: init() and waitForExit() are for the owner (the main thread in the system's
// lifecycle); requestExit(), isExitRequested() and isInited() may be called from any thread at
// any time, also concurrently with each other. mLock guards mExitRequested and mStarted only and
// is never held while the body or a virtual operation runs. mThreads keeps the thread and its
// join lock (ThreadGroup.h).
//
// Lifetime: the owner joins the thread (waitForExit) before the object is destroyed. As a last
// resort the destructor requests exit and joins a thread that is still running, so the process
// never reaches std::terminate; but by then the derived part is gone, so a body that still runs
// at that point must not touch members of the derived class. A body never destroys its own
// component.

#include <condition_variable>
#include <mutex>

#include "QNString.h"
#include "ThreadGroup.h"

class QNCThreadComponent {
 public:
  explicit QNCThreadComponent(const QNCString& acrName);
  QNCThreadComponent(const QNCThreadComponent&) = delete;
  QNCThreadComponent& operator=(const QNCThreadComponent&) = delete;
  virtual ~QNCThreadComponent();

  // Asks the thread to end: wakes waitForExitRequest() and makes isExitRequested() true for good.
  // Does not block. A request to a thread that has already ended has no effect. May be called
  // more than once. An override (to also wake a body blocked elsewhere) calls this operation.
  // Throws QNCInvalidEx "Thread '<name>' was never started" before init() has succeeded: there is
  // no thread to tell, and the request is not remembered.
  virtual void requestExit();

  // Starts the thread, which runs run(). Throws QNCInvalidEx "Thread '<name>' already started"
  // on a second call, QNCOsException when the system cannot create the thread (the component then
  // stays not started).
  void init();

  // True once init() has started the thread; stays true after the thread has ended.
  bool isInited() const;

  // Blocks until the thread has ended. Returns at once when it was never started or has already
  // been joined. Throws QNCInvalidEx when called from the component's own thread.
  void waitForExit();

  // True once requestExit() has been called on the started thread.
  bool isExitRequested() const;

  QNCString& getName() { return mName; }

 protected:
  // The thread's body. It returns when its work is done or when an exit has been requested.
  virtual void run() = 0;

  // Sleeps until exit is requested or aMilliseconds have passed (a steady clock: changes of the
  // wall clock neither shorten nor stretch it). Returns true when exit has been requested, also
  // when the request came before the call. Spurious wake-ups are absorbed.
  bool waitForExitRequest(unsigned int aMilliseconds);

  // Called on the component's thread after run() ended by the exception whose text is apWhat
  // (already logged at error level). Returns true to run run() again: the restart then happens
  // unless exit has been requested meanwhile, and is logged at notice level "Thread '<name>'
  // restarts its work". The default marks the run failed and starts the orderly exit
  // (QNFailRun()), then returns false so the thread ends. An override that restarts bounds its
  // restarts itself (a body that fails at once would otherwise spin), and may call the base to
  // give up.
  virtual bool restartAfterFailure(const char* apWhat);

 private:
  void _body();

  QNCString mName;
  mutable std::mutex mLock;  // guards mExitRequested, mStarted
  std::condition_variable mExitRequest;
  bool mExitRequested;
  bool mStarted;
  QNCThreadGroup mThreads;  // the one thread; declared last, so it is joined first
};
