#include "SynchList.h"

#include <iterator>
#include <new>
#include <utility>

QNCSynchList::QNCSynchList() : mMutex(new (std::nothrow) QNCMutex, QNPST_Individual, QNPAT_New) {}

QNCSynchList::~QNCSynchList() {
  mList.clear();
  mMutex.reset();
}

bool QNCSynchList::_enlistIntoSpare(const QNCPointer<QNCQueueable>& acrElement, bool aAtFront) {
  if (mSpareNodes.isEmpty()) return false;
  // The spare node's pointer is empty: the assignment releases nothing under the lock.
  if (aAtFront) {
    mList.spliceFront(mSpareNodes, mSpareNodes.begin());
    mList.front() = acrElement;
  } else {
    mList.spliceBack(mSpareNodes, mSpareNodes.begin());
    mList.back() = acrElement;
  }
  return true;
}

QNCPointer<QNCQueueable> QNCSynchList::_take(Elements::iterator aPosition, Elements& arFreed) {
  QNCPointer<QNCQueueable> lElement(std::move(*aPosition));  // a move: no counter traffic
  if (mSpareNodes.numberOfElements() < kSpareNodes) {
    mSpareNodes.spliceBack(mList, aPosition);
  } else {
    arFreed.spliceBack(mList, aPosition);
  }
  return lElement;
}

// Without a spare node, the node is allocated outside the lock: a failed allocation leaves the
// list untouched, and other threads do not wait behind the allocator.
void QNCSynchList::enlist(const QNCPointer<QNCQueueable>& acrElement) {
  {
    QNCMutexLocker lGuard(*mMutex);
    if (_enlistIntoSpare(acrElement, false)) return;
  }
  Elements lNode;
  lNode.pushBack(acrElement);
  QNCMutexLocker lGuard(*mMutex);
  mList.spliceBack(lNode, lNode.begin());
}

void QNCSynchList::enlistFront(const QNCPointer<QNCQueueable>& acrElement) {
  {
    QNCMutexLocker lGuard(*mMutex);
    if (_enlistIntoSpare(acrElement, true)) return;
  }
  Elements lNode;
  lNode.pushBack(acrElement);
  QNCMutexLocker lGuard(*mMutex);
  mList.spliceFront(lNode, lNode.begin());
}

// lFreed is declared before the lock, so a node beyond the spares is freed after the lock.
QNCPointer<QNCQueueable> QNCSynchList::delist() {
  Elements lFreed;
  QNCMutexLocker lGuard(*mMutex);
  if (mList.isEmpty()) throw QNCNotFoundEx("Not Found", 8);
  return _take(mList.begin(), lFreed);
}

QNCPointer<QNCQueueable> QNCSynchList::delistBack() {
  Elements lFreed;
  QNCMutexLocker lGuard(*mMutex);
  if (mList.isEmpty()) throw QNCNotFoundEx("Not Found", 8);
  return _take(std::prev(mList.end()), lFreed);
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
  Elements lFreed;
  QNCPointer<QNCQueueable> lErased;
  QNCMutexLocker lGuard(*mMutex);
  const Elements::iterator lNext = std::next(arPosition);
  lErased = _take(arPosition, lFreed);
  arPosition = lNext;
  // lGuard is released before lErased, so the erased element is destroyed outside the lock.
}
