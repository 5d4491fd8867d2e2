#pragma once
// Wrappers of the system's standard runtime calls. Failures are exceptions of the family whose
// message names the call, the path or descriptor and the system's error text, for example
//   "open '/run/x.pid': Permission denied".
// EINTR never surfaces: calls that can be restarted are retried. close() is never retried
// (Linux releases the descriptor even when close reports EINTR).
// Every function may be called from any thread; none keeps state.

struct stat;

// open(2); returns the descriptor. Throws QNCOpenFailedEx.
int ClibOpen(const char* apPath, int aFlags, int aMode);

// read(2); returns the number of bytes read, 0 at end of file. Throws QNCReadFailedEx.
unsigned int ClibRead(int aFd, void* apBuffer, unsigned int aCount);

// write(2) of the whole count, looping over partial writes. Returns aCount.
// Throws QNCWriteFailedEx.
unsigned int ClibWrite(int aFd, const void* apBuffer, unsigned int aCount);

// close(2). Throws QNCCloseFailedEx.
void ClibClose(int aFd);

// stat(2). Throws QNCClibStatFailedEx (also when the file does not exist).
void ClibStat(const char* apPath, struct stat* apOut);

int ClibGetpid();

// Returns 0 when process aPid exists, also when it belongs to another user (EPERM).
// Throws QNCClibGetProcStatusFailedEx when it does not exist or aPid is not positive.
int ClibGetProcStatus(int aPid);

// Sleep the calling thread for the whole time, resuming after signals.
void ClibSleep(unsigned int aSeconds);
void ClibSleepMS(unsigned long aMilliseconds);

// chdir(2). Throws QNCOpenFailedEx naming the directory.
void ClibChdir(const char* apDir);

// The text of the calling thread's errno, NUL-terminated, at most aSize bytes.
void ClibStrerror(char* apBuffer, unsigned long aSize);

// The host name, NUL-terminated, at most aSize bytes ("localhost" when it cannot be read).
void ClibGethostname(char* apBuffer, unsigned int aSize);

void ClibMemcpy(void* apDestination, const void* apSource, unsigned long aCount);
int ClibStrcmp(const char* apFirst, const char* apSecond);
int ClibSnprintf(char* apBuffer, unsigned long aSize, const char* apFormat, ...)
    __attribute__((format(printf, 3, 4)));
