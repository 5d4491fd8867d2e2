#include "NumericIdManager.h"

#include <cstdio>
#include <new>

#include "Logger.h"
#include "QNException.h"

QNCNumericIdManager::QNCNumericIdManager(unsigned int aUpperBound)
    : mUpperBound(aUpperBound), mHighestIssued(0) {
  QN_ENTERED();
  QN_LEFT();
}

QNCNumericIdManager::~QNCNumericIdManager() {
  QN_ENTERED();
  QN_LEFT();
}

void QNCNumericIdManager::getNextId(unsigned int& arId) {
  if (!mReusable.isEmpty()) {
    const unsigned int lId = mReusable.front();
    mReusableSet->erase(lId);
    mReusable.popFront();
    arId = lId;
    return;
  }
  if (mHighestIssued == mUpperBound) {
    char lMessage[96];
    snprintf(lMessage, sizeof lMessage, "No numeric identifier is free: all of 1..%u are in use",
             mUpperBound);
    throw QNCNotFoundEx(lMessage, 8);
  }
  arId = ++mHighestIssued;
}

void QNCNumericIdManager::markForReuse(unsigned int aId) {
  if (aId == 0 || aId > mHighestIssued || _isReturned(aId)) {
    char lMessage[96];
    snprintf(lMessage, sizeof lMessage, "Numeric identifier %u is not in use, cannot return it", aId);
    throw QNCInvalidEx(lMessage, 6);
  }
  if (mReusableSet.isNull()) {
    mReusableSet = QNCPointer<std::unordered_set<unsigned int>>(
        new (std::nothrow) std::unordered_set<unsigned int>, QNPST_Individual, QNPAT_New);
  }
  QNNoMemoryToException([&] { mReusableSet->insert(aId); });
  try {
    mReusable.pushBack(aId);
  } catch (...) {
    // Keep the two in step: an identifier in the set but not in the list would never come back.
    mReusableSet->erase(aId);
    throw;
  }
}

bool QNCNumericIdManager::_isReturned(unsigned int aId) const {
  return !mReusableSet.isNull() && mReusableSet->count(aId) != 0;
}
