#pragma once
// Facts about the calling thread and hooks around fork(2).

// The kernel's id of the calling thread (gettid), as process-wide tools (ps -L, top -H) show it.
// Async-signal-safe; never fails.
long OsThreadId() noexcept;

// Registers functions that fork(2) calls in the forking thread: apPrepare before the fork,
// apParent and apChild after it in each process (pthread_atfork; any may be null). A library
// takes its locks in apPrepare and releases them in both others, so that a child never finds a
// lock held by a thread that does not exist there. Registrations are kept for the process's
// life; prepare functions run in the reverse order of registration, the others in order.
// Returns 0, or ENOMEM when the system cannot record one more.
int OsAtFork(void (*apPrepare)(), void (*apParent)(), void (*apChild)()) noexcept;
