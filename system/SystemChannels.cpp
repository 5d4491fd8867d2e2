#include "Assert.h"
#include "ConditionalWait.h"
#include "Logger.h"
#include "QNException.h"
#include "Reader.h"
#include "System.h"
#include "Writer.h"

namespace {
const auto kNever = [] { return false; };
}  // namespace

QNCPointer<QNCReader>& QNCSystem::getReader(unsigned int acReaderNo) {
  QN_ASSERT(acReaderNo < this->mReaders.numberOfElements());
  return mReaders[acReaderNo];
}

QNCPointer<QNCWriter>& QNCSystem::getWriter(unsigned int acWriterNo) {
  QN_ASSERT(acWriterNo < this->mWriters.numberOfElements());
  return mWriters[acWriterNo];
}

void QNCSystem::signal(unsigned int acConditionNo) {
  const bool lTrace = QNIsLogLevelOn(QNLL_Trace);
  QN_TRACE_IF(lTrace, "Entered");
  QNCConditional& lConditional =
      QNNumbered(mWaitConditionals, acConditionNo,
                 "acConditionNo < this->mWaitConditionals.numberOfElements()", __LINE__, __func__, __FILE__);
  // Nobody between lock() and unlock() of the conditional: no thread waits, and none has tested
  // its list or queue before the caller's enlist/enqueue (a waiter counts itself before its
  // test, and that change was made before this read; Conditional.h gives the ordering), so a
  // later waiter will find the element and the wake-up can be skipped. With the trace level on,
  // the signal passes the lock every time, as it always did.
  if (lConditional.hasWaiters() || lTrace) {
    // A waiter that has found its queue or list empty holds this lock until it is inside the
    // wait. Passing through the lock therefore orders this signal after that waiter's wait has
    // begun, so it cannot fall between the waiter's test and its wait and be lost. The signal
    // itself is given after the unlock: a thread woken while the lock is still held would only
    // block again on it, which costs a second sleep and wake-up per hand-off.
    // The signaller does not count itself as a waiter, so other producers do not take the lock
    // on its account.
    lConditional.passLock();
    lConditional.signal();
  }
  QN_LEFT_IF(lTrace);
}

// wait and timedWait: one wait whatever the state, through the scaffold of ConditionalWait.h,
// which gives the lock up before a time-out (QNCTimeOutEx) or any other failure leaves.
void QNCSystem::wait(unsigned int acConditionNo) {
  QN_ENTERED();
  QN_ASSERT(acConditionNo < this->mWaitConditionals.numberOfElements());
  QNWaitOnConditional(*mWaitConditionals[acConditionNo], kNever, kNever, -1, true,
                      "Going to wait on conditional", __func__, QNIsLogLevelOn(QNLL_Trace));
  QN_LEFT();
}

void QNCSystem::timedWait(unsigned int acConditionNo, unsigned int aWaitTime) {
  QN_ENTERED();
  QN_ASSERT(acConditionNo < this->mWaitConditionals.numberOfElements());
  QNWaitOnConditional(*mWaitConditionals[acConditionNo], kNever, kNever, aWaitTime, true,
                      "Going to wait on conditional", __func__, QNIsLogLevelOn(QNLL_Trace));
  QN_LEFT();
}

void QNCSystem::send(unsigned int acWriterNo, const QNCPointer<QNCBuffer>& acrBuffer, unsigned int& arCount) {
  QN_ENTERED();
  QN_ASSERT(acWriterNo < this->mWriters.numberOfElements());
  mWriters[acWriterNo]->write(acrBuffer, arCount);
  QN_LEFT();
}

void QNCSystem::receive(unsigned int acReaderNo, QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) {
  QN_ENTERED();
  QN_ASSERT(acReaderNo < this->mReaders.numberOfElements());
  mReaders[acReaderNo]->read(arBuffer, arCount);
  QN_LEFT();
}

void QNCSystem::waitForActivity(unsigned int acReaderNo, unsigned int acWaitTime) {
  QN_ENTERED();
  QN_ASSERT(acReaderNo < this->mReaders.numberOfElements());
  QN_ASSERT(acWaitTime > 0);
  // Whether data arrived or the time passed is the reader's answer; callers find out by reading.
  (void)mReaders[acReaderNo]->waitForActivity(acWaitTime);
  QN_LEFT();
}
