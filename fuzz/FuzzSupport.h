#pragma once
// Helpers shared by the fuzz targets.
//
// A target states what must hold for every input with QN_FUZZ_CHECK. A broken property prints
// the condition and where it was checked, then aborts: under libFuzzer the abort is reported as a
// crash and the input is saved; under the standalone corpus driver the test fails. An exception
// outside the QNCException family is the same kind of fault (qnfuzz::foreignException).

#include <cstdio>
#include <cstdlib>

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

}  // namespace qnfuzz
