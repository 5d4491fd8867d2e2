#pragma once
// Signal dispositions and the pipe from signal handlers to a dispatching thread: the system
// calls behind RegisterSignalHandler and the logger's crash handlers.
//
// Every function may be called from any thread; none keeps state of its own.

// Installs apHandler for aSignal. Other signals stay deliverable while it runs (empty mask); it
// runs on the thread's alternate stack when the thread has one (a thread that overflowed its
// stack can still run it); system calls it interrupts go on afterwards (SA_RESTART). Returns 0,
// or the error number when the system refuses (EINVAL for SIGKILL, SIGSTOP or a bad number).
int OsSetSignalHandler(int aSignal, void (*apHandler)(int)) noexcept;

// Async-signal-safe. Gives aSignal its default action again and raises it. Called from a handler
// of aSignal, the signal is blocked until the handler returns and is delivered then, so the
// process ends (or stops) exactly as it would have without the handler; a fault that re-executes
// on return dies the same way.
void OsRaiseWithDefaultAction(int aSignal) noexcept;
