#pragma once
// The one place that turns an error number into an exception of the family. The message names
// the call, the path or descriptor where there is one, and the system's error text:
//   "open '/run/x.pid': Permission denied"                        (path)
//   "read fd 7 '/run/x.pid': Bad file descriptor"                 (descriptor and its path)
//   "pthread_mutex_destroy: Device or resource busy"              (neither)
// The code of the exception is the error number, so a catcher can tell ENOENT from EACCES.
// Callers save errno at once after the failing call and pass the saved value.

#include "QNException.h"

// Formats "<call>[ <object>]: <strerror(aErrno)>" into apBuffer (NUL-terminated, cut to aSize).
void OsFormatError(char* apBuffer, unsigned long aSize, int aErrno, const char* apCall, const char* apObject);

// Formats "fd <n>", followed by " '<path>'" when the system still names a file for the descriptor.
// Keeps errno unchanged.
void OsDescribeFd(char* apBuffer, unsigned long aSize, int aFd);

// Formats "'<path>'" (a null path as "(null)").
void OsQuotePath(char* apBuffer, unsigned long aSize, const char* apPath);

template <class E>
[[noreturn]] void OsThrowError(int aErrno, const char* apCall, const char* apObject = nullptr) {
  char lMessage[QNCException::kMaxMessage];
  OsFormatError(lMessage, sizeof lMessage, aErrno, apCall, apObject);
  throw E(lMessage, static_cast<unsigned int>(aErrno));
}

// OsThrowError with the descriptor (and its path) as the object.
template <class E>
[[noreturn]] void OsThrowFdError(int aErrno, const char* apCall, int aFd) {
  char lObject[QNCException::kMaxMessage / 2];
  OsDescribeFd(lObject, sizeof lObject, aFd);
  OsThrowError<E>(aErrno, apCall, lObject);
}

// OsThrowError with the quoted path as the object.
template <class E>
[[noreturn]] void OsThrowPathError(int aErrno, const char* apCall, const char* apPath) {
  char lObject[QNCException::kMaxMessage / 2];
  OsQuotePath(lObject, sizeof lObject, apPath);
  OsThrowError<E>(aErrno, apCall, lObject);
}
