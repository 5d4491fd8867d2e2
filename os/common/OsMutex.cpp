#include <pthread.h>
#include <time.h>

#include <cerrno>
#include <cstdio>

#include "Os.h"
#include "OsError.h"
#include "QNException.h"

// The pthread functions return the error number instead of setting errno.

void OsInitMutex(pthread_mutex_t& arMutex) {
  // Default attributes: an ordinary mutex, as the callers expect (no recursion, no owner checks).
  const int lResult = pthread_mutex_init(&arMutex, nullptr);
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_mutex_init");
}

void OsThrowMutexError(int aResult, const char* apCall) { OsThrowError<QNCOsException>(aResult, apCall); }

void OsDestroyMutex(pthread_mutex_t& arMutex) {
  const int lResult = pthread_mutex_destroy(&arMutex);
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_mutex_destroy");
}

void OsInitConditional(pthread_cond_t& arCondition) {
  pthread_condattr_t lAttributes;
  int lResult = pthread_condattr_init(&lAttributes);
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_condattr_init");
  // The deadline of OsConditionalTimedWait is computed on the monotonic clock; a condition
  // variable on the wall clock would read it as long past and time out at once.
  lResult = pthread_condattr_setclock(&lAttributes, CLOCK_MONOTONIC);
  if (lResult == 0) lResult = pthread_cond_init(&arCondition, &lAttributes);
  pthread_condattr_destroy(&lAttributes);  // cannot fail on an initialised attribute object
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_cond_init(CLOCK_MONOTONIC)");
}

void OsDestroyConditional(pthread_cond_t& arCondition) noexcept {
  // The result is not looked at: this runs in destructors, and destroying a condition variable
  // nobody waits on cannot fail.
  pthread_cond_destroy(&arCondition);
}

void OsWait(pthread_cond_t& arCondition, pthread_mutex_t& arMutex) {
  // pthread_cond_wait never reports EINTR: a signal handler runs and the wait goes on.
  const int lResult = pthread_cond_wait(&arCondition, &arMutex);
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_cond_wait");
}

int OsConditionalTimedWait(pthread_cond_t& arCondition, pthread_mutex_t& arMutex,
                           unsigned int aMilliseconds) {
  struct timespec lDeadline;
  clock_gettime(CLOCK_MONOTONIC, &lDeadline);  // cannot fail: the clock exists and the pointer is valid
  lDeadline.tv_sec += static_cast<time_t>(aMilliseconds / 1000);
  lDeadline.tv_nsec += static_cast<long>(aMilliseconds % 1000) * 1000000L;
  if (lDeadline.tv_nsec >= 1000000000L) {
    lDeadline.tv_sec += 1;
    lDeadline.tv_nsec -= 1000000000L;
  }
  // Like pthread_cond_wait, the timed wait never reports EINTR.
  const int lResult = pthread_cond_timedwait(&arCondition, &arMutex, &lDeadline);
  if (lResult == ETIMEDOUT) {
    // pthread_cond_timedwait holds the mutex again when it reports the time-out.
    char lMessage[64];
    snprintf(lMessage, sizeof lMessage, "pthread_cond_timedwait: timed out after %u ms", aMilliseconds);
    throw QNCTimeOutEx(lMessage, ETIMEDOUT);
  }
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_cond_timedwait");
  return 0;
}

void OsSignal(pthread_cond_t& arCondition) noexcept {
  // Cannot fail on an initialised condition variable.
  pthread_cond_signal(&arCondition);
}

void OsBroadcast(pthread_cond_t& arCondition) noexcept {
  // Cannot fail on an initialised condition variable.
  pthread_cond_broadcast(&arCondition);
}
