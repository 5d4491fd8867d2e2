#include "Clib.h"

#include <cstdarg>
#include <cstdio>
#include <cstring>

int ClibStrcmp(const char* apFirst, const char* apSecond) { return strcmp(apFirst, apSecond); }

int ClibSnprintf(char* apBuffer, unsigned long aSize, const char* apFormat, ...) {
  va_list lArgs;
  va_start(lArgs, apFormat);
  const int lResult = vsnprintf(apBuffer, aSize, apFormat, lArgs);
  va_end(lArgs);
  return lResult;
}
