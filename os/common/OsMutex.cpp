#include <pthread.h>
#include <time.h>

#include <cerrno>

#include "Os.h"
#include "OsError.h"
#include "QNException.h"

void OsInitMutex(pthread_mutex_t& arMutex) {
  const int lResult = pthread_mutex_init(&arMutex, nullptr);
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_mutex_init");
}

void OsLockMutex(pthread_mutex_t& arMutex) {
  const int lResult = pthread_mutex_lock(&arMutex);
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_mutex_lock");
}

void OsUnlockMutex(pthread_mutex_t& arMutex) {
  const int lResult = pthread_mutex_unlock(&arMutex);
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_mutex_unlock");
}

void OsDestroyMutex(pthread_mutex_t& arMutex) {
  const int lResult = pthread_mutex_destroy(&arMutex);
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_mutex_destroy");
}

void OsInitConditional(pthread_cond_t& arCondition) {
  pthread_condattr_t lAttributes;
  pthread_condattr_init(&lAttributes);
  // Timed waits measure against the monotonic clock: a change of the wall clock must neither end
  // a wait early nor stretch it.
  pthread_condattr_setclock(&lAttributes, CLOCK_MONOTONIC);
  const int lResult = pthread_cond_init(&arCondition, &lAttributes);
  pthread_condattr_destroy(&lAttributes);
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_cond_init");
}

void OsDestroyConditional(pthread_cond_t& arCondition) {
  // Destroying a condition variable nobody waits on cannot fail; the result is not looked at
  // because this runs in destructors.
  pthread_cond_destroy(&arCondition);
}

void OsWait(pthread_cond_t& arCondition, pthread_mutex_t& arMutex) {
  const int lResult = pthread_cond_wait(&arCondition, &arMutex);
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_cond_wait");
}

int OsConditionalTimedWait(pthread_cond_t& arCondition, pthread_mutex_t& arMutex, unsigned int aMilliseconds) {
  struct timespec lDeadline;
  clock_gettime(CLOCK_MONOTONIC, &lDeadline);
  lDeadline.tv_sec += aMilliseconds / 1000;
  lDeadline.tv_nsec += static_cast<long>(aMilliseconds % 1000) * 1000000L;
  if (lDeadline.tv_nsec >= 1000000000L) {
    lDeadline.tv_sec += 1;
    lDeadline.tv_nsec -= 1000000000L;
  }
  const int lResult = pthread_cond_timedwait(&arCondition, &arMutex, &lDeadline);
  if (lResult == ETIMEDOUT) throw QNCTimeOutEx("Timed out waiting on the conditional", ETIMEDOUT);
  if (lResult != 0) OsThrowError<QNCOsException>(lResult, "pthread_cond_timedwait");
  return 0;
}

void OsSignal(pthread_cond_t& arCondition) { pthread_cond_signal(&arCondition); }
void OsBroadcast(pthread_cond_t& arCondition) { pthread_cond_broadcast(&arCondition); }
