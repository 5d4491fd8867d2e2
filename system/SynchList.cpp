#include "SynchList.h"

#include <iterator>
#include <new>
#include <utility>

QNCSynchList::QNCSynchList() : mMutex(new (std::nothrow) QNCMutex, QNPST_Individual, QNPAT_New) {}

QNCSynchList::~QNCSynchList() {
  mList.clear();
  mMutex.reset();
}

// As enlist (SynchList.h): the counter and the node are made ready before the lock.
void QNCSynchList::enlistFront(const QNCPointer<QNCQueueable>& acrElement) {
  QNCPointer<QNCQueueable> lElement(acrElement);
  QNCSpareNodes::Node lNode;
  mSpares.prepare(lElement, lNode);
  QNCMutexLocker lGuard(_mutex());
  mSpares.insert(mList, mList.begin(), lNode, lElement);
}

QNCPointer<QNCQueueable> QNCSynchList::delist() {
  QNCPointer<QNCQueueable> lHead;
  if (!tryDelist(lHead)) throw QNCNotFoundEx("Not Found", 8);
  return lHead;
}

QNCPointer<QNCQueueable> QNCSynchList::delistBack() {
  QNCPointer<QNCQueueable> lTail;
  QNCSpareNodes::Node lFreed;
  {
    QNCMutexLocker lGuard(_mutex());
    if (mList.isEmpty()) throw QNCNotFoundEx("Not Found", 8);
    mSpares.take(mList, std::prev(mList.end()), lTail, lFreed);
  }
  return lTail;
}

QNCPointer<QNCQueueable> QNCSynchList::front() {
  // The copy is made under the lock so that a concurrent delist cannot release the object first.
  QNCMutexLocker lGuard(_mutex());
  return mList.front();
}

void QNCSynchList::clear() {
  Elements lTaken;
  {
    QNCMutexLocker lGuard(_mutex());
    while (!mList.isEmpty()) lTaken.spliceBack(mList, mList.begin());
  }
  // lTaken releases the elements here, outside the lock: a destructor may use this list.
}

unsigned int QNCSynchList::numberOfElements() {
  QNCMutexLocker lGuard(_mutex());
  return mList.numberOfElements();
}

bool QNCSynchList::isEmpty() {
  QNCMutexLocker lGuard(_mutex());
  return mList.isEmpty();
}

void QNCSynchList::erase(Elements::iterator& arPosition) {
  QNCPointer<QNCQueueable> lErased;
  QNCSpareNodes::Node lFreed;
  QNCMutexLocker lGuard(_mutex());
  const Elements::iterator lNext = std::next(arPosition);
  mSpares.take(mList, arPosition, lErased, lFreed);
  arPosition = lNext;
  // lGuard is released before lErased, so the erased element is destroyed outside the lock.
}
