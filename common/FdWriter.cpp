#include "FdWriter.h"

#include "Buffer.h"
#include "Clib.h"
#include "OsStream.h"

QNCFdWriter::QNCFdWriter(int aFd, bool aOwnsFd, unsigned int aTimeoutMs)
    : mFd(aFd), mOwnsFd(aOwnsFd), mIsSocket(OsIsSocket(aFd)), mTimeoutMs(aTimeoutMs) {
  OsDisableNagleIfTcp(mFd);
}

QNCFdWriter::~QNCFdWriter() {
  if (mOwnsFd) ClibCloseQuietly(mFd);
}

void QNCFdWriter::write(const QNCPointer<QNCBuffer>& acrBuffer, unsigned int& arCount) {
  QNCMutexLocker lGuard(mLock);
  const QNCBuffer& lBuffer = *acrBuffer;
  const unsigned char* lpBytes = lBuffer;
  const unsigned int lLength = lBuffer.getLength();
  arCount = 0;
  OsWriteAll(mFd, mIsSocket, lpBytes, lLength, mTimeoutMs);
  arCount = lLength;
}
