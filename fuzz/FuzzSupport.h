#pragma once
// Helpers shared by the fuzz targets.
//
// A target states what must hold for every input with QN_FUZZ_CHECK. A broken property prints
// the condition and where it was checked, then aborts: under libFuzzer the abort is reported as a
// crash and the input is saved; under the standalone corpus driver the test fails. An exception
// outside the QNCException family is the same kind of fault (qnfuzz::foreignException).

#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "Logger.h"

#define QN_FUZZ_CHECK(condition)                                                             \
  do {                                                                                       \
    if (!(condition)) {                                                                      \
      fprintf(stderr, "Fuzz property broken: %s (%s:%d)\n", #condition, __FILE__, __LINE__); \
      abort();                                                                               \
    }                                                                                        \
  } while (0)

namespace qnfuzz {

// Call from a catch (...) after the family has been caught: anything that reaches it escaped
// the library's error reporting.
[[noreturn]] inline void foreignException(const char* apWhere) {
  fprintf(stderr, "Fuzz property broken: %s threw an exception outside the QNCException family\n", apWhere);
  abort();
}

// Writes every byte in one call: the descriptor never holds back part of it (a memory file, or a
// pipe below its capacity), and no signal arrives in a fuzz run.
inline void writeAll(int aFd, const uint8_t* apData, size_t aSize) {
  QN_FUZZ_CHECK(write(aFd, apData, aSize) == static_cast<ssize_t>(aSize));
}

// An independent reading of apText as an optional '-' (when aSigned) and decimal digits, judged
// by strtoll/strtoull: true with the value when it is one, within [aMin, aMax].
inline bool decimal(const char* apText, bool aSigned, long long aMin, unsigned long long aMax,
                    long long& arValue) {
  const char* lpDigits = aSigned && apText[0] == '-' ? apText + 1 : apText;
  if (*lpDigits == '\0' || strspn(lpDigits, "0123456789") != strlen(lpDigits)) return false;
  errno = 0;
  if (aSigned) {
    arValue = strtoll(apText, nullptr, 10);
    return errno != ERANGE && arValue >= aMin && arValue <= static_cast<long long>(aMax);
  }
  const unsigned long long lValue = strtoull(apText, nullptr, 10);
  arValue = static_cast<long long>(lValue);
  return errno != ERANGE && lValue <= aMax;
}

}  // namespace qnfuzz

// Every target logs nothing: its properties, not its log, are what is checked.
extern "C" int LLVMFuzzerInitialize(int*, char***) {
  setLogCode(0);
  return 0;
}
