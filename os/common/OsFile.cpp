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
  lLock.l_pid = 0;  // must be 0 for open-file-description locks
  return lLock;
}

void fdText(char* apBuffer, size_t aSize, int aFd) { snprintf(apBuffer, aSize, "fd %d", aFd); }
}  // namespace

void OsLockFile(int aFd) {
  struct flock lLock = wholeFile(F_WRLCK);
  // F_OFD_SETLK never waits; EINTR is not expected but harmless to retry.
  while (fcntl(aFd, F_OFD_SETLK, &lLock) != 0) {
    if (errno == EINTR) continue;
    char lText[24];
    fdText(lText, sizeof lText, aFd);
    OsThrowError<QNCFileLockFailedEx>(errno, "fcntl(F_OFD_SETLK)", lText);
  }
}

void OsUnlockFile(int aFd) {
  struct flock lLock = wholeFile(F_UNLCK);
  while (fcntl(aFd, F_OFD_SETLK, &lLock) != 0) {
    if (errno == EINTR) continue;
    char lText[24];
    fdText(lText, sizeof lText, aFd);
    OsThrowError<QNCFileLockFailedEx>(errno, "fcntl(F_OFD_SETLK unlock)", lText);
  }
}

void OsFileLockStatus(int aFd, QNEFileLockStatus& arStatus) {
  struct flock lLock = wholeFile(F_WRLCK);
  while (fcntl(aFd, F_OFD_GETLK, &lLock) != 0) {
    if (errno == EINTR) continue;
    char lText[24];
    fdText(lText, sizeof lText, aFd);
    OsThrowError<QNCFileLockFailedEx>(errno, "fcntl(F_OFD_GETLK)", lText);
  }
  // F_OFD_GETLK reports locks held through other open file descriptions only: a lock this
  // descriptor holds itself reads as free.
  arStatus = lLock.l_type == F_UNLCK ? QNFLS_Unlocked : QNFLS_LockedByOther;
}
