#pragma once
// The outcome of the process's run, shared by its threads and the start-up and shut-down driver.
//
// A thread component or pool thread that ends by an exception (and whose owner does not override
// the policy, see ThreadComponent.h and ThreadPool.h) calls QNFailRun(): the run is marked failed
// for good and the orderly exit starts through the handler the driver registered (it calls the
// system object's makeThreadsToExit). The application's main learns the outcome from
// getRunExitStatus() (SystemGlobals.h).
//
// Threads: any thread. The failure mark is one atomic flag, so QNHasRunFailed() costs one load
// and takes no lock (a watchdog may poll it). The handler is registered on the main thread
// before any thread starts.

// Marks the run failed, then calls the registered exit request (nothing when none is set).
// Never throws from the mark; the handler's exceptions pass to the caller.
void QNFailRun();

// True once QNFailRun() has been called in this process.
bool QNHasRunFailed() noexcept;

// The function QNFailRun() calls to start the orderly exit; nullptr for none.
void QNSetExitRequest(void (*apRequest)());
