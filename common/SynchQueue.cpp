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
  QNCList<QNCPointer<QNCQueueable>> lTaken;
  {
    QNCMutexLocker lGuard(mMutex);
    if (mElements.isEmpty()) return false;
    // Unlinking the node costs neither an allocation nor counter traffic under the lock; the
    // node is freed when lTaken goes, after the lock.
    lTaken.spliceBack(mElements, mElements.begin());
  }
  arElement = std::move(lTaken.front());
  return true;
}

void QNCSynchQueue::enqueue(const QNCPointer<QNCQueueable>& acrElement) {
  // The node is allocated before the lock: a failed allocation leaves the queue untouched, and
  // other threads do not wait behind the allocator.
  QNCList<QNCPointer<QNCQueueable>> lNode;
  lNode.pushBack(acrElement);
  QNCMutexLocker lGuard(mMutex);
  mElements.spliceBack(lNode, lNode.begin());
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
