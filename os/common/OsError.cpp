#include "OsError.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

void OsFormatError(char* apBuffer, unsigned long aSize, int aErrno, const char* apCall,
                   const char* apObject) {
  char lText[256];
  // The GNU strerror_r returns the text, which may or may not be lText.
  const char* lpText = strerror_r(aErrno, lText, sizeof lText);
  if (apObject != nullptr) {
    snprintf(apBuffer, aSize, "%s %s: %s", apCall, apObject, lpText);
  } else {
    snprintf(apBuffer, aSize, "%s: %s", apCall, lpText);
  }
}

void OsDescribeFd(char* apBuffer, unsigned long aSize, int aFd) {
  const int lSavedErrno = errno;
  char lLink[32];
  snprintf(lLink, sizeof lLink, "/proc/self/fd/%d", aFd);
  char lPath[512];
  // The person reading the log knows files by name, not by number. Without /proc, or for a
  // descriptor already gone, the number alone has to do.
  const ssize_t lLength = readlink(lLink, lPath, sizeof lPath - 1);
  if (lLength > 0) {
    lPath[lLength] = '\0';
    snprintf(apBuffer, aSize, "fd %d '%s'", aFd, lPath);
  } else {
    snprintf(apBuffer, aSize, "fd %d", aFd);
  }
  errno = lSavedErrno;
}

void OsQuotePath(char* apBuffer, unsigned long aSize, const char* apPath) {
  snprintf(apBuffer, aSize, "'%s'", apPath != nullptr ? apPath : "(null)");
}
