#include "OsError.h"

#include <cstdio>
#include <cstring>

void OsFormatError(char* apBuffer, unsigned long aSize, int aErrno, const char* apCall, const char* apObject) {
  char lText[256];
  // The GNU strerror_r returns the text, which may or may not be lText.
  const char* lpText = strerror_r(aErrno, lText, sizeof lText);
  if (apObject != nullptr) {
    snprintf(apBuffer, aSize, "%s %s: %s", apCall, apObject, lpText);
  } else {
    snprintf(apBuffer, aSize, "%s: %s", apCall, lpText);
  }
}
