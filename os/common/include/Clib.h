#pragma once
// Wrappers of the system's standard runtime calls.
//
// Failures are thrown as exceptions of the family (OsError.h). The message names the call, the
// path or descriptor (with its path when the system still knows it) and the system's error text,
// for example "open '/run/x.pid': Permission denied"; the code is the error number of the failing
// call, EINVAL for an argument refused before any call.
//
// EINTR never surfaces as a failure: a call interrupted by a signal handler before it did
// anything is made again, a sleep goes on for the rest of its time. close() is the exception: it
// is never repeated (see ClibClose).
//
// Every function may be called from any thread; none keeps state of its own.

struct stat;

// open(2) with the given flags and mode; returns the descriptor. Blocks only where open does
// (a FIFO without a peer). Throws QNCOpenFailedEx.
int ClibOpen(const char* apPath, int aFlags, int aMode);

// read(2) of at most aCount bytes; returns the number read, 0 at end of file. Blocks as read does.
// Throws QNCReadFailedEx (EAGAIN included, on a non-blocking descriptor with nothing to read).
unsigned int ClibRead(int aFd, void* apBuffer, unsigned int aCount);

// write(2) of the whole count through OsWriteFully (OsStream.h): partial writes are continued
// until every byte is written. Returns aCount. Blocks as write does. Throws QNCWriteFailedEx,
// EAGAIN included (a full non-blocking descriptor); bytes written before the failure stay
// written.
unsigned int ClibWrite(int aFd, const void* apBuffer, unsigned int aCount);

// close(2). Throws QNCCloseFailedEx (EBADF, EIO). An EINTR is taken as success: Linux has already
// released the descriptor, and closing again could close one another thread was just given.
void ClibClose(int aFd);

// close(2) of a descriptor its owner is done with, where a failure could change nothing (a
// destructor, the clean-up after the result is decided). Ignores every error and, like
// ClibClose, never retries. Never throws.
void ClibCloseQuietly(int aFd) noexcept;

// stat(2). Throws QNCClibStatFailedEx, also when the file does not exist (code ENOENT).
void ClibStat(const char* apPath, struct stat* apOut);

// The calling process's id.
int ClibGetpid();

// Returns 0 when process aPid exists, also when it belongs to another user (the system then
// refuses the probe with EPERM). Throws QNCClibGetProcStatusFailedEx when it does not exist
// (ESRCH), and when aPid names no single process (EINVAL, see OsNamesOneProcess). Sends no
// signal.
int ClibGetProcStatus(int aPid);

// Sleep the calling thread for the whole time, measured on the monotonic clock, going on after
// signal handlers have run.
void ClibSleep(unsigned int aSeconds);
void ClibSleepMS(unsigned long aMilliseconds);

// chdir(2). Throws QNCOpenFailedEx naming the directory.
void ClibChdir(const char* apDir);

// The text of the calling thread's errno, NUL-terminated, at most aSize bytes (cut to fit).
void ClibStrerror(char* apBuffer, unsigned long aSize);

// The host name, NUL-terminated, at most aSize bytes (cut to fit); "localhost" when it cannot be
// read.
void ClibGethostname(char* apBuffer, unsigned int aSize);

// memcpy, strcmp and snprintf with their usual meaning; they never throw.
void ClibMemcpy(void* apDestination, const void* apSource, unsigned long aCount);
int ClibStrcmp(const char* apFirst, const char* apSecond);
int ClibSnprintf(char* apBuffer, unsigned long aSize, const char* apFormat, ...)
    __attribute__((format(printf, 3, 4)));
