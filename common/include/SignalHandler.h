#pragma once
// RegisterSignalHandler: run a function each time a signal arrives, in ordinary thread context.
//
// The process-level handler installed for the signal is async-signal-safe: it only writes the
// signal number to a pipe. One dispatcher thread, started by the first registration, reads the
// pipe and calls the registered function with the signal number. So the function may take locks
// and log, and the signal is handled whichever thread it lands on, also threads the application
// created itself. Registering again for the same signal replaces the function.
//
// Throws QNCOsException family members when the pipe, the thread or sigaction cannot be set up.
// Any thread; registrations are serialised.

void RegisterSignalHandler(int aSignal, void (*apHandler)(int));
