#pragma once
// QNCSynchList: a doubly linked list of shared objects that any number of threads may change at
// the same time. A plain class: the system object's list services (QNCSystem::enlist, delist,
// ...) delegate to the operations below.
//
// Locking: mMutex guards mList and mSpares. Every element operation holds it for its own
// duration only and never calls out while holding it: an element that leaves the list is
// released after the lock is given up, so an element's destructor may use this list again.
// Elements are handed out as new pointers that share the object, so a caller may keep using a
// delisted object while others change the list.
//
// Nodes: a node that leaves the list by delist, delistBack, tryDelist or erase is kept as a spare
// (up to QNCSpareNodes::kMaxNodes of them, holding no element) and reused by the next enlist or
// enlistFront, so a list in steady use allocates nothing. A node is allocated only when no spare
// is at hand, before the lock is taken (under it only when another thread took the last spare
// meanwhile).
//
// begin(), end() and erase() are for a walk of the list. begin() and end() take no lock; the
// walker must make sure that no other thread changes the list until the walk is over (erase()
// itself locks, so it is safe against isEmpty() and numberOfElements() of other threads).
//
// Destruction clears mList (releasing every element's pointer), then releases mMutex.

#include "Mutex.h"
#include "Pointer.h"
#include "QNList.h"
#include "Queueable.h"
#include "SpareNodes.h"

class QNCSynchList {
 public:
  using Elements = QNCList<QNCPointer<QNCQueueable>>;

  // Throws QNCNoMemoryEx "Out of Memory" (2) when the mutex cannot be allocated.
  QNCSynchList();
  QNCSynchList(const QNCSynchList&) = delete;
  QNCSynchList& operator=(const QNCSynchList&) = delete;
  ~QNCSynchList();

  // Add acrElement at the tail / at the head. Throw QNCNoMemoryEx "Out of Memory" (2) when no
  // node can be allocated; the list is then unchanged.
  void enlist(const QNCPointer<QNCQueueable>& acrElement) {
    // The element's counter is taken and a node allocated (when no spare node is at hand) before
    // the lock: a failed allocation leaves the list untouched, and other threads do not wait
    // behind the allocator. Declared before the guard, lElement and lNode are released after the
    // unlock. Inline, as tryDelist: these two are the hand-off's hot path.
    QNCPointer<QNCQueueable> lElement(acrElement);
    QNCSpareNodes::Node lNode;
    mSpares.prepare(lElement, lNode);
    QNCMutexLocker lGuard(_mutex());
    mSpares.insert(mList, mList.end(), lNode, lElement);
  }
  void enlistFront(const QNCPointer<QNCQueueable>& acrElement);

  // Remove the head / the tail element and hand it to the caller. Throw QNCNotFoundEx
  // "Not Found" (8) when the list is empty; the list is then unchanged and its lock released.
  QNCPointer<QNCQueueable> delist();
  QNCPointer<QNCQueueable> delistBack();
  // delist() without the exception: false (arElement then empty) when the list is empty. One
  // pass through the lock and no allocation; arElement's former object is released before the
  // lock is taken.
  bool tryDelist(QNCPointer<QNCQueueable>& arElement) {
    // The head is moved into arElement under the lock (no counter traffic) and its node kept as
    // a spare (one beyond the spares' bound is freed with lFreed after the lock).
    arElement.reset();
    QNCSpareNodes::Node lFreed;
    QNCMutexLocker lGuard(_mutex());
    if (mList.isEmpty()) return false;
    mSpares.take(mList, mList.begin(), arElement, lFreed);
    return true;
  }

  // A copy of the head element, made under the lock. Throws QNCNotFoundEx "Not Found" (8) when
  // the list is empty.
  QNCPointer<QNCQueueable> front();

  // Removes every element.
  void clear();
  unsigned int numberOfElements();
  bool isEmpty();

  // Removes the element at arPosition, which must designate an element of this list, and moves
  // arPosition to the element after it (end() after the last one).
  void erase(Elements::iterator& arPosition);

  Elements::iterator begin() { return mList.begin(); }
  Elements::iterator end() { return mList.end(); }
  Elements::const_iterator begin() const { return mList.begin(); }
  Elements::const_iterator end() const { return mList.end(); }

 private:
  // Never empty: the constructor throws when it cannot make the mutex.
  QNCMutex& _mutex() { return *mMutex.get(); }

  Elements mList;
  QNCPointer<QNCMutex> mMutex;  // guards mList and mSpares
  QNCSpareNodes mSpares;
};
