#pragma once
// The system calls behind the log: opening the log file safely and recognising systemd's journal
// on a descriptor. Whole lines are written with OsWriteFully (OsStream.h), closed with
// ClibCloseQuietly (Clib.h).
//
// Every function may be called from any thread; none keeps state of its own. None throws: the log
// is where failures are reported, so its own failures come back as results.

// Opens apPath for appending, close-on-exec, and returns the descriptor; -1 on failure, with a
// NUL-terminated reason (at most aReasonSize bytes) in apReason: the system's error text, or
// "is a symbolic link (not followed)", "is not a regular file", "is owned by another user (uid N)".
// - The last component of the path is never followed when it is a symbolic link: a link planted
//   where the log will be cannot redirect the service's writes into a file of the link's choice.
// - Only a regular file owned by the effective user is accepted. The check is made on the opened
//   descriptor (fstat), so the file cannot be swapped between check and use; a FIFO is refused
//   without waiting for a reader.
// - A file this call creates gets mode 0640 whatever the umask (a daemon runs with umask 0, and
//   the log carries host data and what peers sent). An existing file keeps its mode, as logrotate's
//   "create" set it.
int OsOpenLogFile(const char* apPath, char* apReason, unsigned long aReasonSize) noexcept;

// True when aFd is the stream that systemd describes in JOURNAL_STREAM: apJournalStream (the
// variable's value, or null) reads "<device>:<inode>" and equals fstat's st_dev and st_ino of aFd.
// A service whose standard error was redirected elsewhere after systemd started it keeps the
// variable, so the comparison, not the variable alone, tells.
bool OsIsJournalStream(int aFd, const char* apJournalStream) noexcept;
