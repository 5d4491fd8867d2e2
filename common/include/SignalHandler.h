#pragma once
// RegisterSignalHandler: run a function each time a signal arrives, in ordinary thread context.
//
// The process-level handler installed for the signal is async-signal-safe: it only writes the
// signal number to a pipe. One dispatcher thread, started by the first registration, reads the
// pipe and calls the registered function with the signal number, one signal at a time, in the
// order they arrived. So the function may take locks and log, and the signal is handled
// whichever thread it lands on, also threads the application created itself. The first
// registration returns once the dispatcher runs, so a fork after it never copies a half-started
// thread. Registering again
// for the same signal replaces the function; a null function takes the signal and does nothing.
// An exception that leaves the function is logged as "-E-" and the dispatcher goes on.
//
// A signal is dropped when the pipe is full (64 KiB of signals wait): the dispatcher is then busy
// with the same requests anyway.
//
// fork: a child made after a registration has no dispatcher; a registered signal that reaches it
// takes its default action there (and never runs the parent's function in the parent). The
// child's own first registration starts the child's dispatcher.
//
// The logger registers SIGUSR1 at CreateLogger to reopen its file (Logger.h); an application that
// wants SIGUSR1 for itself registers after CreateLogger.
//
// Throws QNCInvalidEx for a number that is not a signal, and QNCOsException when the pipe, the
// thread or sigaction cannot be set up (the previous function then stays registered).
// Any thread; registrations are serialised.

void RegisterSignalHandler(int aSignal, void (*apHandler)(int));
