#include "SynchList.h"

#include <iterator>
#include <new>
#include <utility>

QNCSynchList::QNCSynchList() : mMutex(new (std::nothrow) QNCMutex, QNPST_Individual, QNPAT_New) {}

QNCSynchList::~QNCSynchList() {
  mList.clear();
  mMutex.reset();
}

// The node is allocated before the lock: a failed allocation leaves the list untouched, and
// other threads do not wait behind the allocator.
void QNCSynchList::enlist(const QNCPointer<QNCQueueable>& acrElement) {
  Elements lNode;
  lNode.pushBack(acrElement);
  QNCMutexLocker lGuard(*mMutex);
  mList.spliceBack(lNode, lNode.begin());
}

void QNCSynchList::enlistFront(const QNCPointer<QNCQueueable>& acrElement) {
  QNCMutexLocker lGuard(*mMutex);
  mList.pushFront(acrElement);
}

// The removed node is unlinked into a local list under the lock (no allocation, no counter
// traffic) and its element moved out after the lock; the node is freed outside the lock too.
QNCPointer<QNCQueueable> QNCSynchList::delist() {
  QNCPointer<QNCQueueable> lHead;
  if (!tryDelist(lHead)) throw QNCNotFoundEx("Not Found", 8);
  return lHead;
}

bool QNCSynchList::tryDelist(QNCPointer<QNCQueueable>& arElement) {
  Elements lTaken;
  {
    QNCMutexLocker lGuard(*mMutex);
    if (mList.isEmpty()) return false;
    lTaken.spliceBack(mList, mList.begin());
  }
  arElement = std::move(lTaken.front());
  return true;
}

QNCPointer<QNCQueueable> QNCSynchList::delistBack() {
  Elements lTaken;
  {
    QNCMutexLocker lGuard(*mMutex);
    if (mList.isEmpty()) throw QNCNotFoundEx("Not Found", 8);
    lTaken.spliceBack(mList, std::prev(mList.end()));
  }
  return std::move(lTaken.front());
}

QNCPointer<QNCQueueable> QNCSynchList::front() {
  // The copy is made under the lock so that a concurrent delist cannot release the object first.
  QNCMutexLocker lGuard(*mMutex);
  return mList.front();
}

void QNCSynchList::clear() {
  Elements lTaken;
  {
    QNCMutexLocker lGuard(*mMutex);
    while (!mList.isEmpty()) lTaken.spliceBack(mList, mList.begin());
  }
  // lTaken releases the elements here, outside the lock: a destructor may use this list.
}

unsigned int QNCSynchList::numberOfElements() {
  QNCMutexLocker lGuard(*mMutex);
  return mList.numberOfElements();
}

bool QNCSynchList::isEmpty() {
  QNCMutexLocker lGuard(*mMutex);
  return mList.isEmpty();
}

void QNCSynchList::erase(Elements::iterator& arPosition) {
  Elements lTaken;
  QNCMutexLocker lGuard(*mMutex);
  const Elements::iterator lNext = std::next(arPosition);
  lTaken.spliceBack(mList, arPosition);
  arPosition = lNext;
  // lGuard is released before lTaken, so the erased element is destroyed outside the lock.
}
