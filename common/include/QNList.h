#pragma once
// QNCList<T>: a doubly linked list whose misuse is reported through the exception family.
//   front/back/popFront/popBack on an empty list -> QNCNotFoundEx "Not Found" (8)
//   allocation failure                           -> QNCNoMemoryEx "Out of Memory" (2)
// After an exception the list is unchanged. clear() and erase() never throw. Iterators are the
// standard list iterators and stay valid until their element is erased.
// Threads: one thread at a time (QNCSynchList adds a lock).

#include <list>
#include <new>
#include <utility>

#include "QNException.h"

template <class T>
class QNCList {
 public:
  using iterator = typename std::list<T>::iterator;
  using const_iterator = typename std::list<T>::const_iterator;

  QNCList() = default;
  QNCList(const QNCList& acrCopy) { _copyFrom(acrCopy); }

  QNCList& operator=(const QNCList& acrCopy) {
    if (this != &acrCopy) _copyFrom(acrCopy);
    return *this;
  }

  void pushBack(const T& acrElement) {
    QNNoMemoryToException([&] { mList.push_back(acrElement); });
  }
  // pushBack that moves arElement in instead of copying it (only the node is allocated).
  void moveToBack(T&& arElement) {
    QNNoMemoryToException([&] { mList.push_back(std::move(arElement)); });
  }
  void pushFront(const T& acrElement) {
    QNNoMemoryToException([&] { mList.push_front(acrElement); });
  }

  T& front() {
    if (mList.empty()) throw QNCNotFoundEx("Not Found", 8);
    return mList.front();
  }
  const T& front() const {
    if (mList.empty()) throw QNCNotFoundEx("Not Found", 8);
    return mList.front();
  }
  T& back() {
    if (mList.empty()) throw QNCNotFoundEx("Not Found", 8);
    return mList.back();
  }
  const T& back() const {
    if (mList.empty()) throw QNCNotFoundEx("Not Found", 8);
    return mList.back();
  }

  void popFront() {
    if (mList.empty()) throw QNCNotFoundEx("Not Found", 8);
    mList.pop_front();
  }

  void popBack() {
    if (mList.empty()) throw QNCNotFoundEx("Not Found", 8);
    mList.pop_back();
  }

  bool isEmpty() const noexcept { return mList.empty(); }
  unsigned int numberOfElements() const noexcept { return static_cast<unsigned int>(mList.size()); }
  unsigned int size() const noexcept { return numberOfElements(); }
  void clear() noexcept { mList.clear(); }

  iterator begin() noexcept { return mList.begin(); }
  iterator end() noexcept { return mList.end(); }
  const_iterator begin() const noexcept { return mList.begin(); }
  const_iterator end() const noexcept { return mList.end(); }

  // Removes the element and returns the iterator to the element after it.
  iterator erase(iterator aPosition) noexcept { return mList.erase(aPosition); }

  // Moves the element at aPosition of arOther to the end of this list without allocating.
  void spliceBack(QNCList& arOther, iterator aPosition) noexcept {
    mList.splice(mList.end(), arOther.mList, aPosition);
  }
  // The same, to the place before aBefore. Iterators to the moved element stay valid and now
  // designate it in this list.
  void splice(iterator aBefore, QNCList& arOther, iterator aPosition) noexcept {
    mList.splice(aBefore, arOther.mList, aPosition);
  }

 private:
  void _copyFrom(const QNCList& acrCopy) {
    QNNoMemoryToException([&] { mList = acrCopy.mList; });
  }

  std::list<T> mList;
};
