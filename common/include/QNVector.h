#pragma once
// QNCVector<T>: a vector whose misuse is reported through the exception family. Element counts
// and indices are unsigned int. No standard-library exception leaves it:
//   index at or beyond numberOfElements()  -> QNCInvalidEx "Vector out of bounds access" (6)
//   reserve beyond the possible size         -> QNCInvalidEx "Cannot reserve space for Vector" (6)
//   allocation failure                       -> QNCNoMemoryEx "Out of Memory" (2)
// After an exception from a single-element operation the vector is unchanged.
// Threads: one thread at a time, or many readers while nobody writes.

#include <new>
#include <stdexcept>
#include <vector>

#include "QNException.h"

template <class T>
class QNCVector {
 public:
  explicit QNCVector(unsigned int aReserveCount = 0) {
    try {
      mVector.reserve(aReserveCount);
    } catch (const std::length_error&) {
      throw QNCInvalidEx("Cannot reserve space for Vector", 6);
    } catch (const std::bad_alloc&) {
      throw QNCNoMemoryEx("Out of Memory", 2);
    }
  }

  QNCVector(const QNCVector& acrCopy) { _copyFrom(acrCopy); }

  QNCVector& operator=(const QNCVector& acrCopy) {
    if (this != &acrCopy) _copyFrom(acrCopy);
    return *this;
  }

  unsigned int numberOfElements() const noexcept { return static_cast<unsigned int>(mVector.size()); }
  bool isEmpty() const noexcept { return mVector.empty(); }

  T& operator[](unsigned int aIndex) {
    if (aIndex >= mVector.size()) throw QNCInvalidEx("Vector out of bounds access", 6);
    return mVector[aIndex];
  }

  const T& operator[](unsigned int aIndex) const {
    if (aIndex >= mVector.size()) throw QNCInvalidEx("Vector out of bounds access", 6);
    return mVector[aIndex];
  }

  void append(const T& acrElement) {
    try {
      mVector.push_back(acrElement);
    } catch (const std::bad_alloc&) {
      throw QNCNoMemoryEx("Out of Memory", 2);
    } catch (const std::length_error&) {
      throw QNCNoMemoryEx("Out of Memory", 2);
    }
  }

  void clear() noexcept { mVector.clear(); }

 private:
  void _copyFrom(const QNCVector& acrCopy) {
    QNNoMemoryToException([&] { mVector = acrCopy.mVector; });
  }

  std::vector<T> mVector;
};
