#pragma once
// Operating-system services: mutexes, condition variables, file locks, signals to other
// processes, host facts.
//
// Failures are thrown as exceptions of the family (OsError.h). The message names the failing
// call, the descriptor where there is one (with its path when the system still knows it), and the
// system's error text; the code is the error number of the failing call. A time-out is
// QNCTimeOutEx with code ETIMEDOUT.
//
// Every function may be called from any thread; none keeps state of its own.

#include <pthread.h>

class QNCString;

// The kind of operating system, from uname(2). One byte.
enum QNEOperatingSystem : unsigned char {
  QNOS_Unknown = 0,    // uname failed
  QNOS_Linux = 1,      // sysname "Linux"
  QNOS_OtherUnix = 2,  // any other sysname
};

// The lock state of a file as this process knows it. One byte; the value 1 is not used.
enum QNEFileLockStatus : unsigned char {
  QNFLS_None = 0,           // not examined yet
  QNFLS_Unlocked = 2,       // free, or released by this process
  QNFLS_Locked = 3,         // this process holds the lock
  QNFLS_LockedByOther = 4,  // another process holds the lock
};

// ---- Mutexes: ordinary (non-recursive, no error checking), so a thread that locks a mutex it
// already holds blocks itself. None of these waits except OsLockMutex.

// Initialises a mutex. Throws QNCOsException when the system has no resources for it.
void OsInitMutex(pthread_mutex_t& arMutex);
// Throws the QNCOsException for a mutex call apCall that returned the error number aResult.
[[noreturn, gnu::cold]] void OsThrowMutexError(int aResult, const char* apCall);
// Blocks until the calling thread holds the mutex. Throws QNCOsException on a broken mutex.
// Inline, as is OsUnlockMutex: every lock of the system passes here, and an uncontended lock
// should cost the system call's user-space part and nothing more.
inline void OsLockMutex(pthread_mutex_t& arMutex) {
  const int lResult = pthread_mutex_lock(&arMutex);
  if (__builtin_expect(lResult != 0, 0)) OsThrowMutexError(lResult, "pthread_mutex_lock");
}
// Releases a mutex the calling thread holds. Throws QNCOsException on a broken mutex.
inline void OsUnlockMutex(pthread_mutex_t& arMutex) {
  const int lResult = pthread_mutex_unlock(&arMutex);
  if (__builtin_expect(lResult != 0, 0)) OsThrowMutexError(lResult, "pthread_mutex_unlock");
}
// Destroys a mutex. Throws QNCOsException when the system refuses, for example with EBUSY for a
// mutex that is still locked; the mutex is then left as it was.
void OsDestroyMutex(pthread_mutex_t& arMutex);

// ---- Condition variables. They measure timed waits against the monotonic clock, so a change of
// the wall clock neither ends a wait early nor stretches it. A wake-up can be spurious: wait in a
// loop that re-tests the awaited condition.

// Initialises a condition variable bound to the monotonic clock. Throws QNCOsException.
void OsInitConditional(pthread_cond_t& arCondition);
// Destroys a condition variable nobody waits on. Never throws (it runs in destructors).
void OsDestroyConditional(pthread_cond_t& arCondition) noexcept;
// The caller holds arMutex. Releases it while the thread waits; holds it again on return.
// Blocks until woken (or spuriously). Throws QNCOsException on a broken mutex or condition.
void OsWait(pthread_cond_t& arCondition, pthread_mutex_t& arMutex);
// As OsWait, but waits at most aMilliseconds (milliseconds). Returns 0 when woken. When the time
// has passed, throws QNCTimeOutEx (code ETIMEDOUT) with the mutex held again, as after a wake-up;
// the caller unlocks it.
int OsConditionalTimedWait(pthread_cond_t& arCondition, pthread_mutex_t& arMutex, unsigned int aMilliseconds);
// Wakes one thread waiting on the condition variable; none if none waits, and the signal is not
// remembered for a later wait. Needs no mutex held. Never throws.
void OsSignal(pthread_cond_t& arCondition) noexcept;
// As OsSignal, but wakes every waiting thread.
void OsBroadcast(pthread_cond_t& arCondition) noexcept;

// ---- File locks: one exclusive lock on the whole file (however it grows), never waited for.
// They are open-file-description locks (F_OFD_SETLK): the lock belongs to the open file behind
// aFd, not to the process, so
//  - it conflicts with every other open of the file, in other processes and in this one;
//  - closing some other descriptor of the file does not drop it (as it would classic fcntl
//    record locks);
//  - it disappears when the last descriptor of that open file closes, at the latest when the
//    holder ends. A child forked while the lock is held shares it until it closes the descriptor.
// aFd must be open for writing for OsLockFile.

// Takes the lock. Throws QNCFileLockFailedEx at once when another open of the file holds a lock
// (code EAGAIN), or when aFd cannot be locked (code of the failure, e.g. EBADF).
void OsLockFile(int aFd);
// Releases the lock aFd holds; releasing a lock not held does nothing. Throws QNCFileLockFailedEx.
void OsUnlockFile(int aFd);
// Writes QNFLS_LockedByOther when another open of the file (another process) holds a lock, else
// QNFLS_Unlocked. A lock that aFd itself holds reads as QNFLS_Unlocked: ask before locking.
// Throws QNCFileLockFailedEx when aFd cannot be examined.
void OsFileLockStatus(int aFd, QNEFileLockStatus& arStatus);

// ---- Processes and host.

// True when aPid can name one process, that is when it is positive. kill(2) reads 0 as the
// caller's process group, -1 as every process it may signal and -n as group n, so a pid of 0 or
// below (a PID file with bad contents) must never reach it. The one place that tells.
bool OsNamesOneProcess(int aPid);

// Sends aSignal to the one process aPid; aSignal 0 only checks that it may be sent. Returns 0, or
// -1 with errno set on failure. A pid that names no single process is refused with EINVAL.
int OsKill(int aPid, int aSignal);

// Writes the kind (QNOS_Linux on Linux) and the variant text "<sysname> <release> <machine>" from
// uname(2), for example "Linux 6.1.0-18-amd64 x86_64"; QNOS_Unknown and "unknown" when uname fails.
void OsGetOsName(QNEOperatingSystem& arOs, QNCString& arVariant);

// Writes the first IPv4 address of an interface that is up and not a loopback interface, in the
// order the system lists them; the loopback address 127.0.0.1 when there is none. One 32-bit
// number in host byte order, most significant byte first in the dotted form: 192.168.1.2 is
// 0xC0A80102.
void OsGetIpAddress(unsigned int& arAddress);
