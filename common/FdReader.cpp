#include "FdReader.h"

#include <new>

#include "Buffer.h"
#include "Clib.h"
#include "OsStream.h"

QNCFdReader::QNCFdReader(int aFd, bool aOwnsFd, unsigned int aStagingSize, unsigned int aReadWaitMs)
    : mFd(aFd),
      mOwnsFd(aOwnsFd),
      mpStaging(nullptr),
      mStagingSize(aStagingSize == 0 ? 1 : aStagingSize),
      mStagedBegin(0),
      mStagedEnd(0),
      mEnded(false),
      mReadWaitMs(aReadWaitMs) {
  mpStaging = new (std::nothrow) unsigned char[mStagingSize];
  if (mpStaging == nullptr) throw QNCNoMemoryEx("Out of Memory", 2);
  try {
    OsSetNonBlocking(mFd);
  } catch (QNCException&) {
    delete[] mpStaging;
    throw;
  }
}

QNCFdReader::~QNCFdReader() {
  delete[] mpStaging;
  if (mOwnsFd) ClibCloseQuietly(mFd);
}

void QNCFdReader::read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) {
  QNCMutexLocker lGuard(mLock);
  unsigned char* lpTarget = *arBuffer;
  const unsigned int lWanted = arBuffer->getLength();
  arCount = 0;
  if (lWanted == 0) return;
  if (mStagedBegin == mStagedEnd) {
    if (mEnded) return;  // end of the stream, seen before
    // Waiting here, under the lock, is what a read wait asks for: this thread wants these bytes.
    if (mReadWaitMs != 0) (void)OsWaitReadable(mFd, mReadWaitMs);
    if (lWanted >= mStagingSize) {
      // A large read gains nothing from staging: read straight into the caller's buffer.
      const long lRead = OsReadSome(mFd, lpTarget, lWanted);
      if (lRead < 0) throw QNCTryAgainEx("Resource temporarily unavailable", 11);
      mEnded = lRead == 0;
      arCount = static_cast<unsigned int>(lRead);
      return;
    }
    const long lRead = OsReadSome(mFd, mpStaging, mStagingSize);
    if (lRead < 0) throw QNCTryAgainEx("Resource temporarily unavailable", 11);
    if (lRead == 0) {
      mEnded = true;
      return;
    }
    mStagedBegin = 0;
    mStagedEnd = static_cast<unsigned int>(lRead);
  }
  const unsigned int lStaged = mStagedEnd - mStagedBegin;
  const unsigned int lDelivered = lStaged < lWanted ? lStaged : lWanted;
  ClibMemcpy(lpTarget, mpStaging + mStagedBegin, lDelivered);
  mStagedBegin += lDelivered;
  arCount = lDelivered;
  // The staging buffer is empty and much is still wanted: take what is already there straight
  // into the caller's buffer rather than through another round of staging.
  const unsigned int lRest = lWanted - lDelivered;
  if (lRest >= mStagingSize && !mEnded) {
    const long lRead = OsReadSome(mFd, lpTarget + lDelivered, lRest);
    if (lRead > 0) arCount += static_cast<unsigned int>(lRead);
    mEnded = lRead == 0;
  }
}

bool QNCFdReader::atEndOfStream() {
  QNCMutexLocker lGuard(mLock);
  if (mStagedBegin != mStagedEnd) return false;
  if (mEnded) return true;
  const long lRead = OsReadSome(mFd, mpStaging, mStagingSize);
  if (lRead <= 0) {
    mEnded = lRead == 0;
    return mEnded;
  }
  mStagedBegin = 0;
  mStagedEnd = static_cast<unsigned int>(lRead);
  return false;
}

bool QNCFdReader::waitForActivity(unsigned int acWaitTime) {
  {
    QNCMutexLocker lGuard(mLock);
    if (mStagedBegin != mStagedEnd) return true;
  }
  // Not under the lock: a reader thread must be able to read while another thread waits here.
  return OsWaitReadable(mFd, acWaitTime);
}
