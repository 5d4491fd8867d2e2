#pragma once
// Operating-system services: mutexes, condition variables, file locks, signals to other
// processes, host facts. Failures are exceptions of the family with the call and the system's
// error text in the message. Every function may be called from any thread; none keeps state.

#include <pthread.h>

class QNCString;

// The kind of operating system, from uname(2).
enum QNEOperatingSystem : unsigned char {
  QNOS_Unknown = 0,
  QNOS_Linux = 1,
  QNOS_OtherUnix = 2,
};

// The lock state of a file as this process knows it (one byte).
enum QNEFileLockStatus : unsigned char {
  QNFLS_None = 0,           // not examined yet
  QNFLS_Unlocked = 2,       // free, or released by this process
  QNFLS_Locked = 3,         // this process holds the lock
  QNFLS_LockedByOther = 4,  // another process holds the lock
};

void OsInitMutex(pthread_mutex_t& arMutex);
void OsLockMutex(pthread_mutex_t& arMutex);
void OsUnlockMutex(pthread_mutex_t& arMutex);
// Throws QNCOsException family when the system refuses (for example a mutex still locked).
void OsDestroyMutex(pthread_mutex_t& arMutex);

// Condition variables wait against the monotonic clock, so a change of the wall clock neither
// ends a timed wait early nor stretches it.
void OsInitConditional(pthread_cond_t& arCondition);
void OsDestroyConditional(pthread_cond_t& arCondition);
void OsWait(pthread_cond_t& arCondition, pthread_mutex_t& arMutex);
// Waits at most aMilliseconds. Returns 0 when woken; on time-out throws QNCTimeOutEx with the
// mutex held again, as after a wake-up.
int OsConditionalTimedWait(pthread_cond_t& arCondition, pthread_mutex_t& arMutex, unsigned int aMilliseconds);
void OsSignal(pthread_cond_t& arCondition);
void OsBroadcast(pthread_cond_t& arCondition);

// Exclusive lock on the whole open file, never waited for. Open-file-description locks
// (F_OFD_SETLK): exclusive between processes, dropped when the holder ends, and -- unlike classic
// fcntl record locks -- not dropped when the process closes some other descriptor of the file.
// Throws QNCFileLockFailedEx when another process (or another open of the file) holds it.
void OsLockFile(int aFd);
void OsUnlockFile(int aFd);
// Writes QNFLS_LockedByOther when another open of the file holds a lock, else QNFLS_Unlocked.
void OsFileLockStatus(int aFd, QNEFileLockStatus& arStatus);

// kill(2); returns its result: negative on failure.
int OsKill(int aPid, int aSignal);

// The kind (QNOS_Linux on Linux) and a variant text "<sysname> <release>" from uname(2).
void OsGetOsName(QNEOperatingSystem& arOs, QNCString& arVariant);

// The first configured non-loopback IPv4 address of the host, else 127.0.0.1, as one 32-bit
// number in host byte order: 192.168.1.2 is 0xC0A80102.
void OsGetIpAddress(unsigned int& arAddress);
