#include "OsLogFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace {
constexpr mode_t kLogMode = 0640;

// The system's text for aErrno, except where the flags used here give the error a plain meaning:
// ELOOP is O_NOFOLLOW meeting a link ("Too many levels of symbolic links" otherwise), ENXIO a FIFO
// without reader or a socket file met with O_NONBLOCK.
void describeError(int aErrno, char* apReason, unsigned long aSize) {
  if (aErrno == ELOOP || aErrno == ENXIO) {
    snprintf(apReason, aSize, "%s",
             aErrno == ELOOP ? "is a symbolic link (not followed)" : "is not a regular file");
    return;
  }
  char lText[256];
  // The GNU strerror_r returns the text, which may or may not be lText.
  snprintf(apReason, aSize, "%s", strerror_r(aErrno, lText, sizeof lText));
}

// Refuses what is not a regular file of the effective user; true when the file is acceptable.
bool isOwnRegularFile(int aFd, char* apReason, unsigned long aSize) {
  struct stat lStat;
  if (fstat(aFd, &lStat) != 0) {
    describeError(errno, apReason, aSize);
    return false;
  }
  if (!S_ISREG(lStat.st_mode)) {
    snprintf(apReason, aSize, "is not a regular file");
    return false;
  }
  if (lStat.st_uid != geteuid()) {
    snprintf(apReason, aSize, "is owned by another user (uid %lu)", static_cast<unsigned long>(lStat.st_uid));
    return false;
  }
  return true;
}
}  // namespace

int OsOpenLogFile(const char* apPath, char* apReason, unsigned long aReasonSize) noexcept {
  // O_NONBLOCK: opening a FIFO for writing would otherwise wait for a reader; it is cleared below
  // (it means nothing to a regular file, but the descriptor should say what it is).
  const int lFlags = O_WRONLY | O_APPEND | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK;
  apReason[0] = '\0';
  int lFd = -1;
  // Create exclusively first, so that only a file made here is given the log's mode; when the
  // path exists, open it as it is. A file removed or created between the two tries once more.
  for (int lTry = 0; lTry < 3 && lFd < 0; ++lTry) {
    lFd = open(apPath, lFlags | O_CREAT | O_EXCL, kLogMode);
    if (lFd >= 0) {
      // open's mode passes through the umask (077 would leave 0600): set the log's mode exactly.
      (void)fchmod(lFd, kLogMode);  // the file stays usable with a narrower mode
      break;
    }
    if (errno == EINTR) continue;  // nothing was created
    if (errno != EEXIST) break;
    lFd = open(apPath, lFlags);
    if (lFd < 0 && errno != ENOENT && errno != EINTR) break;
  }
  if (lFd < 0) {
    describeError(errno, apReason, aReasonSize);
    return -1;
  }
  if (!isOwnRegularFile(lFd, apReason, aReasonSize) || fcntl(lFd, F_SETFL, O_APPEND) != 0) {
    if (apReason[0] == '\0') describeError(errno, apReason, aReasonSize);
    close(lFd);
    return -1;
  }
  return lFd;
}

bool OsIsJournalStream(int aFd, const char* apJournalStream) noexcept {
  if (apJournalStream == nullptr) return false;
  char* lpEnd = nullptr;
  errno = 0;
  const unsigned long long lDevice = strtoull(apJournalStream, &lpEnd, 10);
  if (errno != 0 || lpEnd == apJournalStream || *lpEnd != ':') return false;
  const char* const lpInode = lpEnd + 1;
  const unsigned long long lInode = strtoull(lpInode, &lpEnd, 10);
  if (errno != 0 || lpEnd == lpInode || *lpEnd != '\0') return false;
  struct stat lStat;
  if (fstat(aFd, &lStat) != 0) return false;
  return static_cast<unsigned long long>(lStat.st_dev) == lDevice &&
         static_cast<unsigned long long>(lStat.st_ino) == lInode;
}
