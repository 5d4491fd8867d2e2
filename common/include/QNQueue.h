#pragma once
// QNCQueue<T>: a first-in first-out queue over a list.
//   dequeue on an empty queue -> QNCNotFoundEx "Not Found" (8)
//   allocation failure        -> QNCNoMemoryEx "Out of Memory" (2)
// After an exception the queue is unchanged.
//
// Node recycling: when T can be default-constructed and moved without throwing, a dequeued
// element's list node is kept on a spare list, emptied (the element is moved out and the node
// holds a default T, so the queue never keeps a dequeued element alive), and the next enqueue
// fills that node instead of allocating one. A queue that cycles at a steady depth therefore
// allocates nothing; the spare list holds at most as many nodes as the queue once held at the
// same time, and all of them are freed with the queue. Other T use a plain list node per element.
//
// Threads: one thread at a time (callers lock).

#include <new>
#include <type_traits>
#include <utility>

#include "QNList.h"

template <class T>
class QNCQueue {
 public:
  void enqueue(const T& acrElement) {
    if constexpr (kRecycles) {
      if (!mSpare.isEmpty()) {
        // Copy first: should the copy throw, both lists are unchanged. A copy that runs out of
        // memory fails as a fresh node would.
        QNNoMemoryToException([&] { *mSpare.begin() = acrElement; });
        mList.spliceBack(mSpare, mSpare.begin());
        return;
      }
    }
    mList.pushBack(acrElement);
  }

  // The same, moving the element in: a caller that made its copy before taking its lock keeps
  // the copy's cost out of the locked section.
  void enqueue(T&& arElement) {
    if constexpr (kRecycles) {
      if (!mSpare.isEmpty()) {
        *mSpare.begin() = std::move(arElement);
        mList.spliceBack(mSpare, mSpare.begin());
        return;
      }
    }
    mList.pushBack(arElement);
  }

  T dequeue() {
    if constexpr (kRecycles) {
      T lHead(std::move(mList.front()));  // front() throws on an empty queue
      *mList.begin() = T();
      mSpare.spliceBack(mList, mList.begin());
      return lHead;
    } else {
      return QNNoMemoryToException([&] {
        T lHead = mList.front();
        mList.popFront();
        return lHead;
      });
    }
  }

  bool isEmpty() const noexcept { return mList.isEmpty(); }
  unsigned int numberOfElements() const noexcept { return mList.numberOfElements(); }

 private:
  static constexpr bool kRecycles = std::is_nothrow_default_constructible<T>::value &&
                                    std::is_nothrow_move_constructible<T>::value &&
                                    std::is_nothrow_move_assignable<T>::value;

  QNCList<T> mList;
  QNCList<T> mSpare;  // emptied nodes waiting for the next enqueue; only used when kRecycles
};
