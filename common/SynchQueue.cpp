#include "SynchQueue.h"

#include <utility>

QNCPointer<QNCQueueable> QNCSynchQueue::front() {
  QNCMutexLocker lGuard(mMutex);
  // The copy is made under the lock so that a concurrent dequeue cannot release the object first.
  return mElements.front();
}

QNCPointer<QNCQueueable> QNCSynchQueue::dequeue() {
  QNCPointer<QNCQueueable> lHead;
  if (!QNCSynchQueue::tryDequeue(lHead)) throw QNCNotFoundEx("Not Found", 8);
  return lHead;
}

bool QNCSynchQueue::tryDequeue(QNCPointer<QNCQueueable>& arElement) {
  arElement.reset();
  QNCSpareNodes::Node lFreed;
  QNCMutexLocker lGuard(mMutex);
  if (mElements.isEmpty()) return false;
  // Moving the element out costs no counter traffic under the lock; its node stays as a spare
  // (or, beyond the spares' bound, is freed with lFreed after the lock).
  mSpares.take(mElements, mElements.begin(), arElement, lFreed);
  return true;
}

void QNCSynchQueue::enqueue(const QNCPointer<QNCQueueable>& acrElement) {
  // The counter is taken, and a node allocated when no spare is at hand, before the lock: a
  // failed allocation leaves the queue untouched, and other threads do not wait behind the
  // allocator.
  QNCPointer<QNCQueueable> lElement(acrElement);
  QNCSpareNodes::Node lNode;
  mSpares.prepare(lElement, lNode);
  QNCMutexLocker lGuard(mMutex);
  mSpares.insert(mElements, mElements.end(), lNode, lElement);
}

bool QNCSynchQueue::isEmpty() {
  QNCMutexLocker lGuard(mMutex);
  return mElements.isEmpty();
}

void QNCSynchQueue::clear() {
  QNCList<QNCPointer<QNCQueueable>> lTaken;
  {
    QNCMutexLocker lGuard(mMutex);
    while (!mElements.isEmpty()) lTaken.spliceBack(mElements, mElements.begin());
  }
  // lTaken releases the elements here, outside the lock: a destructor may use this queue.
}
