#pragma once
// QNCNumericIdManager: hands out numeric identifiers that are unique among those in use.
//
// Policy:
// - New identifiers are 1, 2, 3, ... up to the upper bound given at construction (by default the
//   largest unsigned int). 0 is never handed out, so callers may use it as "no identifier".
// - An identifier given back with markForReuse() is handed out again before any new one, the
//   earliest returned first.
// - Nothing wraps around: when every identifier from 1 to the bound is in use, getNextId() throws
//   instead of repeating one that is in use.
//
// Threads: no lock of its own; the owner serialises every call (QNCSystem holds mNidCreationLock
// around each one). After an exception the manager is unchanged.

#include <unordered_set>

#include "Pointer.h"
#include "QNList.h"

class QNCNumericIdManager {
 public:
  explicit QNCNumericIdManager(unsigned int aUpperBound = 0xFFFFFFFFu);
  virtual ~QNCNumericIdManager();
  QNCNumericIdManager(const QNCNumericIdManager&) = delete;
  QNCNumericIdManager& operator=(const QNCNumericIdManager&) = delete;

  // Writes an identifier not in use into arId. Throws QNCNotFoundEx "No numeric identifier is free:
  // all of 1..<bound> are in use" (8) when none is left; arId is then unchanged.
  void getNextId(unsigned int& arId);

  // Makes aId, which must be in use (handed out and not returned since), available again.
  // Throws QNCInvalidEx "Numeric identifier <id> is not in use, cannot return it" (6) otherwise:
  // returning twice would let two users hold the same identifier. QNCNoMemoryEx when the
  // bookkeeping cannot grow.
  void markForReuse(unsigned int aId);

 private:
  bool _isReturned(unsigned int aId) const;

  // Returned identifiers in the order they came back: handed out again from the front.
  QNCList<unsigned int> mReusable;
  // The same identifiers as mReusable, for a constant-time "was it returned?" when one comes
  // back. Created at the first return, since many users never return one.
  QNCPointer<std::unordered_set<unsigned int>> mReusableSet;
  unsigned int mUpperBound;
  unsigned int mHighestIssued;  // 0 before the first new identifier; never above mUpperBound
};
