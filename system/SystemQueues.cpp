#include <exception>

#include "Assert.h"
#include "ConditionalWait.h"
#include "Logger.h"
#include "Queueable.h"
#include "SynchList.h"
#include "SynchQueue.h"
#include "System.h"

namespace {
// Traces "Left" for the service it was made in when that service returns, and not when an
// exception leaves it (as the services always did). With the trace level off at entry it does
// nothing at all: asking for the exceptions in flight costs two calls into the runtime per
// service, a good part of a hand-off's cost.
class QNCLeftTrace {
 public:
  QNCLeftTrace(int aLine, const char* apFunction)
      : mUncaught(QNIsLogLevelOn(QNLL_Trace) ? std::uncaught_exceptions() : -1),
        mLine(aLine),
        mpFunction(apFunction) {}
  ~QNCLeftTrace() {
    if (mUncaught >= 0 && std::uncaught_exceptions() == mUncaught && QNIsLogLevelOn(QNLL_Trace))
      PrintLogMessageWithTimeStamp(QNLL_Trace, "-T-", mLine, mpFunction, __FILE__, "%s", "Left");
  }

 private:
  const int mUncaught;  // exceptions in flight at entry; -1: the trace level was off
  const int mLine;
  const char* mpFunction;
};

const auto kNever = [] { return false; };

// The exit-aware waits take 0 for "no time limit"; the scaffold takes a negative limit.
long long noLimitIfZero(unsigned int aMaxWaitMs) { return aMaxWaitMs == 0 ? -1 : aMaxWaitMs; }
}  // namespace

// The shape of every numbered list and queue service: trace "Entered", assert the number (the
// assertion names the argument and the table, e.g. "acListNo < this->mLists.numberOfElements()"),
// then lrElement is list or queue n and "Left" is traced on return. A macro, so that the trace
// lines and the assertion keep naming the service itself.
#define QN_NUMBERED(acNo, mTable) \
  QN_ENTERED();                   \
  QN_NUMBERED_AFTER_ENTRY(acNo, mTable)
// The waits trace "Entered" and assert their conditional's number first.
#define QN_NUMBERED_AFTER_ENTRY(acNo, mTable)        \
  QN_ASSERT(acNo < this->mTable.numberOfElements()); \
  auto& lrElement = *mTable[acNo];                   \
  const QNCLeftTrace lLeftTrace(__LINE__, __func__)

// --- Queues. The queue's own operations keep the element order and report its failures.

void QNCSystem::waitOnEmptyQueue(unsigned int acConditionNo, unsigned int acQueueNo) {
  QN_ENTERED();
  QN_ASSERT(acConditionNo < this->mWaitConditionals.numberOfElements());
  QN_NUMBERED_AFTER_ENTRY(acQueueNo, mQueues);
  QNWaitOnConditional(
      *mWaitConditionals[acConditionNo], [&lrElement] { return !lrElement.isEmpty(); }, kNever, -1, false,
      "Queue empty... Going to wait on conditional", __func__);
}

void QNCSystem::enqueue(unsigned int acQueueNo, const QNCPointer<QNCQueueable>& acrElement) {
  QN_NUMBERED(acQueueNo, mQueues);
  lrElement.enqueue(acrElement);
}

QNCPointer<QNCQueueable> QNCSystem::dequeue(unsigned int acQueueNo) {
  QN_NUMBERED(acQueueNo, mQueues);
  return lrElement.dequeue();
}

QNCPointer<QNCQueueable> QNCSystem::queueFront(unsigned int acQueueNo) {
  QN_NUMBERED(acQueueNo, mQueues);
  return lrElement.front();
}

void QNCSystem::queueClear(unsigned int acQueueNo) {
  QN_NUMBERED(acQueueNo, mQueues);
  lrElement.clear();
}

bool QNCSystem::isQueueEmpty(unsigned int acQueueNo) {
  QN_NUMBERED(acQueueNo, mQueues);
  return lrElement.isEmpty();
}

// --- Lists. Each operation locks list n's mMutex inside QNCSynchList for its own duration.

void QNCSystem::waitOnEmptyList(unsigned int acConditionNo, unsigned int acListNo) {
  QN_ENTERED();
  QN_ASSERT(acConditionNo < this->mWaitConditionals.numberOfElements());
  QN_NUMBERED_AFTER_ENTRY(acListNo, mLists);
  QNWaitOnConditional(
      *mWaitConditionals[acConditionNo], [&lrElement] { return !lrElement.isEmpty(); }, kNever, -1, false,
      "List empty... Going to wait on conditional", __func__);
}

void QNCSystem::enlist(unsigned int acListNo, const QNCPointer<QNCQueueable>& acrElement) {
  QN_NUMBERED(acListNo, mLists);
  lrElement.enlist(acrElement);
}

void QNCSystem::enlistFront(unsigned int acListNo, const QNCPointer<QNCQueueable>& acrElement) {
  QN_NUMBERED(acListNo, mLists);
  lrElement.enlistFront(acrElement);
}

QNCPointer<QNCQueueable> QNCSystem::delist(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  return lrElement.delist();
}

QNCPointer<QNCQueueable> QNCSystem::delistBack(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  return lrElement.delistBack();
}

QNCPointer<QNCQueueable> QNCSystem::listFront(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  return lrElement.front();
}

void QNCSystem::listClear(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  lrElement.clear();
}

unsigned int QNCSystem::listSize(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  return lrElement.numberOfElements();
}

bool QNCSystem::isListEmpty(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  return lrElement.isEmpty();
}

void QNCSystem::listErase(unsigned int acListNo, QNCQueueableList::iterator& arIterator) {
  QN_NUMBERED(acListNo, mLists);
  lrElement.erase(arIterator);
}

QNCQueueableList::const_iterator QNCSystem::listBegin(unsigned int acListNo) const {
  QN_NUMBERED(acListNo, mLists);
  return static_cast<const QNCSynchList&>(lrElement).begin();
}

QNCQueueableList::const_iterator QNCSystem::listEnd(unsigned int acListNo) const {
  QN_NUMBERED(acListNo, mLists);
  return static_cast<const QNCSynchList&>(lrElement).end();
}

QNCQueueableList::iterator QNCSystem::listBegin(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  return lrElement.begin();
}

QNCQueueableList::iterator QNCSystem::listEnd(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  return lrElement.end();
}

// --- Exit-aware waits: the scaffold of ConditionalWait.h with the exit flag as the second test.

QNEWaitStatus QNCSystem::waitOnEmptyListOrExit(unsigned int acConditionNo, unsigned int acListNo,
                                               unsigned int aMaxWaitMs) {
  QN_ENTERED();
  QN_ASSERT(acConditionNo < this->mWaitConditionals.numberOfElements());
  QN_NUMBERED_AFTER_ENTRY(acListNo, mLists);
  return QNWaitOnConditional(
      *mWaitConditionals[acConditionNo], [&lrElement] { return !lrElement.isEmpty(); },
      [this] { return isSetForExit(); }, noLimitIfZero(aMaxWaitMs), false,
      "List empty... Going to wait on conditional", __func__);
}

QNEWaitStatus QNCSystem::waitOnEmptyQueueOrExit(unsigned int acConditionNo, unsigned int acQueueNo,
                                                unsigned int aMaxWaitMs) {
  QN_ENTERED();
  QN_ASSERT(acConditionNo < this->mWaitConditionals.numberOfElements());
  QN_NUMBERED_AFTER_ENTRY(acQueueNo, mQueues);
  return QNWaitOnConditional(
      *mWaitConditionals[acConditionNo], [&lrElement] { return !lrElement.isEmpty(); },
      [this] { return isSetForExit(); }, noLimitIfZero(aMaxWaitMs), false,
      "Queue empty... Going to wait on conditional", __func__);
}

QNEWaitStatus QNCSystem::delistOrExit(unsigned int acConditionNo, unsigned int acListNo,
                                      unsigned int aMaxWaitMs, QNCPointer<QNCQueueable>& arElement) {
  QN_ENTERED();
  QN_ASSERT(acConditionNo < this->mWaitConditionals.numberOfElements());
  QN_NUMBERED_AFTER_ENTRY(acListNo, mLists);
  // tryDelist releases arElement's former object before it locks. The busy case first: one pass
  // through the list's lock. Otherwise the take is the test itself, made under the conditional's
  // lock, so no other consumer comes between the test and the take.
  if (lrElement.tryDelist(arElement)) return QNWS_Ready;
  return QNWaitOnConditional(
      *mWaitConditionals[acConditionNo], [&] { return lrElement.tryDelist(arElement); },
      [this] { return isSetForExit(); }, noLimitIfZero(aMaxWaitMs), false,
      "List empty... Going to wait on conditional", __func__);
}

QNEWaitStatus QNCSystem::dequeueOrExit(unsigned int acConditionNo, unsigned int acQueueNo,
                                       unsigned int aMaxWaitMs, QNCPointer<QNCQueueable>& arElement) {
  QN_ENTERED();
  QN_ASSERT(acConditionNo < this->mWaitConditionals.numberOfElements());
  QN_NUMBERED_AFTER_ENTRY(acQueueNo, mQueues);
  arElement.reset();  // tryDequeue does it too, but a derived queue may override it
  if (lrElement.tryDequeue(arElement)) return QNWS_Ready;
  return QNWaitOnConditional(
      *mWaitConditionals[acConditionNo], [&] { return lrElement.tryDequeue(arElement); },
      [this] { return isSetForExit(); }, noLimitIfZero(aMaxWaitMs), false,
      "Queue empty... Going to wait on conditional", __func__);
}
