#include "Assert.h"
#include "ConditionalWait.h"
#include "Logger.h"
#include "Queueable.h"
#include "SynchList.h"
#include "SynchQueue.h"
#include "System.h"

namespace {
const auto kNever = [] { return false; };

// The exit-aware waits take 0 for "no time limit"; the scaffold takes a negative limit.
long long noLimitIfZero(unsigned int aMaxWaitMs) { return aMaxWaitMs == 0 ? -1 : aMaxWaitMs; }

// The exit-aware takes' wait, out of line: a take that finds an element at once then sets up
// neither the wait's frame nor its exception handling.
template <class Take>
__attribute__((noinline)) QNEWaitStatus waitToTake(QNCSystem& arSystem, QNCConditional& arConditional,
                                                   const Take& acrTake, unsigned int aMaxWaitMs,
                                                   const char* apWaitTrace, const char* apFunction,
                                                   bool aTrace) {
  return QNWaitOnConditional(
      arConditional, acrTake, [&arSystem] { return arSystem.isSetForExit(); }, noLimitIfZero(aMaxWaitMs),
      false, apWaitTrace, apFunction, aTrace);
}

// The exit-aware take: one pass through the container's lock when it holds an element, else the
// wait, whose test is the take itself, made under the conditional's lock so that no other consumer
// comes between the test and the take. Conditional aConditionNo (asserted by the caller) is
// reached only when the take waits.
template <class Take>
QNEWaitStatus takeOrWait(QNCSystem& arSystem, QNCVector<QNCPointer<QNCConditional>>& arConditionals,
                         unsigned int aConditionNo, const Take& acrTake, unsigned int aMaxWaitMs,
                         const char* apWaitTrace, const char* apFunction, bool aTrace) {
  if (acrTake()) return QNWS_Ready;
  return waitToTake(arSystem, *arConditionals[aConditionNo], acrTake, aMaxWaitMs, apWaitTrace, apFunction,
                    aTrace);
}
}  // namespace

// The shape of every numbered list and queue service: the trace level is read once, "Entered" is
// traced, the number asserted (the assertion names the argument and the table, e.g.
// "acListNo < this->mLists.numberOfElements()"), then lrElement is list or queue n. The service
// traces "Left" with QN_LEFT_IF(lTrace) on return; an exception leaves without it, as it always
// did. Macros, so that the trace lines and the assertion name the service itself. The waits
// assert their conditional's number first and reach the conditional only when they wait.
#define QN_NUMBERED(acNo, mTable)                 \
  const bool lTrace = QNIsLogLevelOn(QNLL_Trace); \
  QN_TRACE_IF(lTrace, "Entered");                 \
  QN_NUMBERED_AFTER_ENTRY(acNo, mTable)
#define QN_NUMBERED_AFTER_ENTRY(acNo, mTable)                                                       \
  auto& lrElement = QNNumbered(this->mTable, acNo, #acNo " < this->" #mTable ".numberOfElements()", \
                               __LINE__, __func__, __FILE__)
#define QN_WAIT_NUMBERED(acConditionNo, acNo, mTable)                    \
  const bool lTrace = QNIsLogLevelOn(QNLL_Trace);                        \
  QN_TRACE_IF(lTrace, "Entered");                                        \
  QN_ASSERT(acConditionNo < this->mWaitConditionals.numberOfElements()); \
  QN_NUMBERED_AFTER_ENTRY(acNo, mTable)

// --- Queues. The queue's own operations keep the element order and report its failures.

void QNCSystem::waitOnEmptyQueue(unsigned int acConditionNo, unsigned int acQueueNo) {
  QN_WAIT_NUMBERED(acConditionNo, acQueueNo, mQueues);
  QNWaitOnConditional(
      *mWaitConditionals[acConditionNo], [&lrElement] { return !lrElement.isEmpty(); }, kNever, -1, false,
      "Queue empty... Going to wait on conditional", __func__, lTrace);
  QN_LEFT_IF(lTrace);
}

void QNCSystem::enqueue(unsigned int acQueueNo, const QNCPointer<QNCQueueable>& acrElement) {
  QN_NUMBERED(acQueueNo, mQueues);
  lrElement.enqueue(acrElement);
  QN_LEFT_IF(lTrace);
}

QNCPointer<QNCQueueable> QNCSystem::dequeue(unsigned int acQueueNo) {
  QN_NUMBERED(acQueueNo, mQueues);
  QNCPointer<QNCQueueable> lHead = lrElement.dequeue();
  QN_LEFT_IF(lTrace);
  return lHead;
}

QNCPointer<QNCQueueable> QNCSystem::queueFront(unsigned int acQueueNo) {
  QN_NUMBERED(acQueueNo, mQueues);
  QNCPointer<QNCQueueable> lHead = lrElement.front();
  QN_LEFT_IF(lTrace);
  return lHead;
}

void QNCSystem::queueClear(unsigned int acQueueNo) {
  QN_NUMBERED(acQueueNo, mQueues);
  lrElement.clear();
  QN_LEFT_IF(lTrace);
}

bool QNCSystem::isQueueEmpty(unsigned int acQueueNo) {
  QN_NUMBERED(acQueueNo, mQueues);
  const bool lEmpty = lrElement.isEmpty();
  QN_LEFT_IF(lTrace);
  return lEmpty;
}

// --- Lists. Each operation locks list n's mMutex inside QNCSynchList for its own duration.

void QNCSystem::waitOnEmptyList(unsigned int acConditionNo, unsigned int acListNo) {
  QN_WAIT_NUMBERED(acConditionNo, acListNo, mLists);
  QNWaitOnConditional(
      *mWaitConditionals[acConditionNo], [&lrElement] { return !lrElement.isEmpty(); }, kNever, -1, false,
      "List empty... Going to wait on conditional", __func__, lTrace);
  QN_LEFT_IF(lTrace);
}

void QNCSystem::enlist(unsigned int acListNo, const QNCPointer<QNCQueueable>& acrElement) {
  QN_NUMBERED(acListNo, mLists);
  lrElement.enlist(acrElement);
  QN_LEFT_IF(lTrace);
}

void QNCSystem::enlistFront(unsigned int acListNo, const QNCPointer<QNCQueueable>& acrElement) {
  QN_NUMBERED(acListNo, mLists);
  lrElement.enlistFront(acrElement);
  QN_LEFT_IF(lTrace);
}

QNCPointer<QNCQueueable> QNCSystem::delist(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  QNCPointer<QNCQueueable> lHead = lrElement.delist();
  QN_LEFT_IF(lTrace);
  return lHead;
}

QNCPointer<QNCQueueable> QNCSystem::delistBack(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  QNCPointer<QNCQueueable> lTail = lrElement.delistBack();
  QN_LEFT_IF(lTrace);
  return lTail;
}

QNCPointer<QNCQueueable> QNCSystem::listFront(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  QNCPointer<QNCQueueable> lHead = lrElement.front();
  QN_LEFT_IF(lTrace);
  return lHead;
}

void QNCSystem::listClear(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  lrElement.clear();
  QN_LEFT_IF(lTrace);
}

unsigned int QNCSystem::listSize(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  const unsigned int lSize = lrElement.numberOfElements();
  QN_LEFT_IF(lTrace);
  return lSize;
}

bool QNCSystem::isListEmpty(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  const bool lEmpty = lrElement.isEmpty();
  QN_LEFT_IF(lTrace);
  return lEmpty;
}

void QNCSystem::listErase(unsigned int acListNo, QNCQueueableList::iterator& arIterator) {
  QN_NUMBERED(acListNo, mLists);
  lrElement.erase(arIterator);
  QN_LEFT_IF(lTrace);
}

QNCQueueableList::const_iterator QNCSystem::listBegin(unsigned int acListNo) const {
  QN_NUMBERED(acListNo, mLists);
  QN_LEFT_IF(lTrace);
  return static_cast<const QNCSynchList&>(lrElement).begin();
}

QNCQueueableList::const_iterator QNCSystem::listEnd(unsigned int acListNo) const {
  QN_NUMBERED(acListNo, mLists);
  QN_LEFT_IF(lTrace);
  return static_cast<const QNCSynchList&>(lrElement).end();
}

QNCQueueableList::iterator QNCSystem::listBegin(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  QN_LEFT_IF(lTrace);
  return lrElement.begin();
}

QNCQueueableList::iterator QNCSystem::listEnd(unsigned int acListNo) {
  QN_NUMBERED(acListNo, mLists);
  QN_LEFT_IF(lTrace);
  return lrElement.end();
}

// --- Exit-aware waits: the scaffold of ConditionalWait.h with the exit flag as the second test.

QNEWaitStatus QNCSystem::waitOnEmptyListOrExit(unsigned int acConditionNo, unsigned int acListNo,
                                               unsigned int aMaxWaitMs) {
  QN_WAIT_NUMBERED(acConditionNo, acListNo, mLists);
  const QNEWaitStatus lStatus = QNWaitOnConditional(
      *mWaitConditionals[acConditionNo], [&lrElement] { return !lrElement.isEmpty(); },
      [this] { return isSetForExit(); }, noLimitIfZero(aMaxWaitMs), false,
      "List empty... Going to wait on conditional", __func__, lTrace);
  QN_LEFT_IF(lTrace);
  return lStatus;
}

QNEWaitStatus QNCSystem::waitOnEmptyQueueOrExit(unsigned int acConditionNo, unsigned int acQueueNo,
                                                unsigned int aMaxWaitMs) {
  QN_WAIT_NUMBERED(acConditionNo, acQueueNo, mQueues);
  const QNEWaitStatus lStatus = QNWaitOnConditional(
      *mWaitConditionals[acConditionNo], [&lrElement] { return !lrElement.isEmpty(); },
      [this] { return isSetForExit(); }, noLimitIfZero(aMaxWaitMs), false,
      "Queue empty... Going to wait on conditional", __func__, lTrace);
  QN_LEFT_IF(lTrace);
  return lStatus;
}

QNEWaitStatus QNCSystem::delistOrExit(unsigned int acConditionNo, unsigned int acListNo,
                                      unsigned int aMaxWaitMs, QNCPointer<QNCQueueable>& arElement) {
  QN_WAIT_NUMBERED(acConditionNo, acListNo, mLists);
  // tryDelist releases arElement's former object before it locks.
  const QNEWaitStatus lStatus = takeOrWait(
      *this, mWaitConditionals, acConditionNo, [&] { return lrElement.tryDelist(arElement); }, aMaxWaitMs,
      "List empty... Going to wait on conditional", __func__, lTrace);
  QN_LEFT_IF(lTrace);
  return lStatus;
}

QNEWaitStatus QNCSystem::dequeueOrExit(unsigned int acConditionNo, unsigned int acQueueNo,
                                       unsigned int aMaxWaitMs, QNCPointer<QNCQueueable>& arElement) {
  QN_WAIT_NUMBERED(acConditionNo, acQueueNo, mQueues);
  arElement.reset();  // tryDequeue does it too, but a derived queue may override it
  const QNEWaitStatus lStatus = takeOrWait(
      *this, mWaitConditionals, acConditionNo, [&] { return lrElement.tryDequeue(arElement); }, aMaxWaitMs,
      "Queue empty... Going to wait on conditional", __func__, lTrace);
  QN_LEFT_IF(lTrace);
  return lStatus;
}
