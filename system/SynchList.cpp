#include "SynchList.h"

#include <iterator>
#include <new>
#include <utility>

QNCSynchList::QNCSynchList() : mMutex(new (std::nothrow) QNCMutex, QNPST_Individual, QNPAT_New) {}

QNCSynchList::~QNCSynchList() {
  mList.clear();
  mMutex.reset();
}

// The element's counter is taken and a node allocated (when no spare node is at hand) before the
// lock: a failed allocation leaves the list untouched, and other threads do not wait behind the
// allocator. Declared before the guard, lElement and lNode are released after the unlock.
void QNCSynchList::enlist(const QNCPointer<QNCQueueable>& acrElement) {
  QNCPointer<QNCQueueable> lElement(acrElement);
  QNCSpareNodes::Node lNode;
  mSpares.prepare(lElement, lNode);
  QNCMutexLocker lGuard(*mMutex);
  mSpares.insert(mList, mList.end(), lNode, lElement);
}

void QNCSynchList::enlistFront(const QNCPointer<QNCQueueable>& acrElement) {
  QNCPointer<QNCQueueable> lElement(acrElement);
  QNCSpareNodes::Node lNode;
  mSpares.prepare(lElement, lNode);
  QNCMutexLocker lGuard(*mMutex);
  mSpares.insert(mList, mList.begin(), lNode, lElement);
}

QNCPointer<QNCQueueable> QNCSynchList::delist() {
  QNCPointer<QNCQueueable> lHead;
  if (!tryDelist(lHead)) throw QNCNotFoundEx("Not Found", 8);
  return lHead;
}

// arElement's former object is released before the lock; the head is moved into it under the
// lock (no counter traffic) and its node kept as a spare (one beyond the spares' bound is freed
// after the lock).
bool QNCSynchList::tryDelist(QNCPointer<QNCQueueable>& arElement) {
  arElement.reset();
  QNCSpareNodes::Node lFreed;
  QNCMutexLocker lGuard(*mMutex);
  if (mList.isEmpty()) return false;
  mSpares.take(mList, mList.begin(), arElement, lFreed);
  return true;
}

QNCPointer<QNCQueueable> QNCSynchList::delistBack() {
  QNCPointer<QNCQueueable> lTail;
  QNCSpareNodes::Node lFreed;
  {
    QNCMutexLocker lGuard(*mMutex);
    if (mList.isEmpty()) throw QNCNotFoundEx("Not Found", 8);
    mSpares.take(mList, std::prev(mList.end()), lTail, lFreed);
  }
  return lTail;
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
  QNCPointer<QNCQueueable> lErased;
  QNCSpareNodes::Node lFreed;
  QNCMutexLocker lGuard(*mMutex);
  const Elements::iterator lNext = std::next(arPosition);
  mSpares.take(mList, arPosition, lErased, lFreed);
  arPosition = lNext;
  // lGuard is released before lErased, so the erased element is destroyed outside the lock.
}
