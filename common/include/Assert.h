#pragma once
// Assertions test invariants that no input can legitimately break; a failure means the bug is in
// this process's code. A failed assertion logs one "-H-" line "Assertion [ <condition> ] failed"
// with the call site, then ends the process with exit(1): a normal exit, so buffered log lines are
// written, but objects on the threads' stacks are not destroyed and locks are not released.
// Assertions never throw and are part of every build.
//
// The condition's text is taken after macro expansion (NULL reads "__null").

[[noreturn]] void QNAssertionFailed(const char* apCondition, unsigned int aLine, const char* apFunction,
                                    const char* apFile);

#define QN_ASSERT(condition) QN_ASSERT_EXPANDED(condition)
#define QN_ASSERT_EXPANDED(condition)                                                                   \
  do {                                                                                                  \
    if (__builtin_expect(!(condition), 0)) QNAssertionFailed(#condition, __LINE__, __func__, __FILE__); \
  } while (0)
