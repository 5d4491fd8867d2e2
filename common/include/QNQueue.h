#pragma once
// QNCQueue<T>: a first-in first-out queue over a list.
//   dequeue on an empty queue -> QNCNotFoundEx "Not Found" (8)
//   allocation failure        -> QNCNoMemoryEx "Out of Memory" (2)
// dequeue copies the head before removing it, so a failed copy leaves the queue unchanged.
// Threads: one thread at a time (callers lock).

#include "QNList.h"

template <class T>
class QNCQueue {
 public:
  void enqueue(const T& acrElement) { mList.pushBack(acrElement); }

  T dequeue() {
    T lHead = mList.front();
    mList.popFront();
    return lHead;
  }

  bool isEmpty() const noexcept { return mList.isEmpty(); }
  unsigned int numberOfElements() const noexcept { return mList.numberOfElements(); }

 private:
  QNCList<T> mList;
};
