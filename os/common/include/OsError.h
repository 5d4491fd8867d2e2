#pragma once
// The one place that turns an error number into an exception of the family. The message names
// the call, the path or descriptor where there is one, and the system's error text:
//   "open '/run/x.pid': Permission denied"      (path)
//   "read fd 7: Bad file descriptor"            (descriptor)
//   "pthread_mutex_destroy: Device or resource busy"
// The code of the exception is the error number, so a catcher can tell ENOENT from EACCES.

#include "QNException.h"

// Formats "<call>[ <object>]: <strerror(aErrno)>" into arBuffer (NUL-terminated, cut to aSize).
void OsFormatError(char* apBuffer, unsigned long aSize, int aErrno, const char* apCall, const char* apObject);

template <class E>
[[noreturn]] void OsThrowError(int aErrno, const char* apCall, const char* apObject = nullptr) {
  char lMessage[QNCException::kMaxMessage];
  OsFormatError(lMessage, sizeof lMessage, aErrno, apCall, apObject);
  throw E(lMessage, static_cast<unsigned int>(aErrno));
}
