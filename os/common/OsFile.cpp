#include <fcntl.h>

#include <cerrno>
#include <cstdio>

#include "Os.h"
#include "OsError.h"

namespace {
struct flock wholeFile(short aType) {
  struct flock lLock = {};
  lLock.l_type = aType;
  lLock.l_whence = SEEK_SET;
  lLock.l_start = 0;
  lLock.l_len = 0;  // to the end of the file, however it grows
  lLock.l_pid = 0;  // must be 0 for open-file-description locks, or fcntl reports EINVAL
  return lLock;
}

// fcntl with a lock command, retried on EINTR: the non-waiting commands are not expected to be
// interrupted, and repeating one is harmless. Returns 0 or the saved errno.
int lockCommand(int aFd, int aCommand, struct flock& arLock) {
  for (;;) {
    if (fcntl(aFd, aCommand, &arLock) == 0) return 0;
    const int lErrno = errno;
    if (lErrno != EINTR) return lErrno;
  }
}
}  // namespace

void OsLockFile(int aFd) {
  struct flock lLock = wholeFile(F_WRLCK);
  const int lErrno = lockCommand(aFd, F_OFD_SETLK, lLock);
  if (lErrno == 0) return;
  // EAGAIN (or EACCES on some systems) means another open of the file holds a lock; say so, as
  // "Resource temporarily unavailable" alone would leave the reader guessing.
  if (lErrno != EAGAIN && lErrno != EACCES)
    OsThrowFdError<QNCFileLockFailedEx>(lErrno, "fcntl(F_OFD_SETLK)", aFd);
  char lFd[QNCException::kMaxMessage / 2];
  OsDescribeFd(lFd, sizeof lFd, aFd);
  char lObject[QNCException::kMaxMessage / 2 + 32];
  snprintf(lObject, sizeof lObject, "%s (locked by another process)", lFd);
  OsThrowError<QNCFileLockFailedEx>(lErrno, "fcntl(F_OFD_SETLK)", lObject);
}

void OsUnlockFile(int aFd) {
  struct flock lLock = wholeFile(F_UNLCK);
  const int lErrno = lockCommand(aFd, F_OFD_SETLK, lLock);
  if (lErrno != 0) OsThrowFdError<QNCFileLockFailedEx>(lErrno, "fcntl(F_OFD_SETLK, F_UNLCK)", aFd);
}

void OsFileLockStatus(int aFd, QNEFileLockStatus& arStatus) {
  struct flock lLock = wholeFile(F_WRLCK);
  const int lErrno = lockCommand(aFd, F_OFD_GETLK, lLock);
  if (lErrno != 0) OsThrowFdError<QNCFileLockFailedEx>(lErrno, "fcntl(F_OFD_GETLK)", aFd);
  // F_OFD_GETLK reports only locks that would conflict with one taken through aFd: a lock held
  // through aFd's own open file description reads as free.
  arStatus = lLock.l_type == F_UNLCK ? QNFLS_Unlocked : QNFLS_LockedByOther;
}
