#include "BufferManager.h"

#include <new>
#include <utility>

#include "Logger.h"
#include "QNException.h"
#include "QNList.h"
#include "System.h"

using QNCBufferQueue = QNCQueue<QNCPointer<QNCBuffer>>;

QNCBufferManager::QNCBufferManager(QNCSystem* apSystem)
    : mBufferQueues(8), mBufferQueueMutexes(8), mBufferLengths(8) {
  QN_ENTERED();
  QN_LOG_TRACE("Getting Buffer List");
  QNCList<unsigned int> lBufferList;
  apSystem->getMemoryBufferList(lBufferList);
  QN_ASSERT(lBufferList.size() > 0);
  QN_LOG_TRACE("Got a memory buffer list of size : %u", lBufferList.size());
  for (const unsigned int lLength : lBufferList) {
    mBufferLengths.append(lLength);
    QN_LOG_TRACE("Creating buffer Queue mutexes for length = %u", lLength);
    mBufferQueueMutexes.append(
        QNCPointer<QNCMutex>(new (std::nothrow) QNCMutex, QNPST_Individual, QNPAT_New));
    QN_LOG_TRACE("Creating Buffer Queues for length = %u", lLength);
    mBufferQueues.append(
        QNCPointer<QNCBufferQueue>(new (std::nothrow) QNCBufferQueue, QNPST_Individual, QNPAT_New));
  }
  QN_LEFT();
}

QNCBufferManager::~QNCBufferManager() {
  QN_ENTERED();
  unsigned int lTotal = 0;
  for (unsigned int lIndex = 0; lIndex < mBufferQueues.numberOfElements(); ++lIndex) {
    QNCBufferQueue& lQueue = *mBufferQueues[lIndex];
    unsigned int lBucketSum = 0;
    while (!lQueue.isEmpty()) lBucketSum += lQueue.dequeue()->getLength();
    QN_LOG_TRACE("Memory Used by the memory slab %u : %u", mBufferLengths[lIndex], lBucketSum);
    lTotal += lBucketSum;
  }
  QN_LOG_TRACE("TOTAL Memory Used : %u", lTotal);
  QN_LEFT();
}

void QNCBufferManager::_determineBucketNo(unsigned int aLength, unsigned int& arBucketNo) const {
  QN_ENTERED();
  const unsigned int lCount = mBufferLengths.numberOfElements();
  for (unsigned int lIndex = 0; lIndex < lCount; ++lIndex) {
    if (mBufferLengths[lIndex] >= aLength) {
      arBucketNo = lIndex;
      QN_LOG_TRACE("Determined bucket number is %u", lIndex);
      QN_LEFT();
      return;
    }
  }
  QN_LOG_ERROR("Failed to find a bucket for %u buffer size", aLength);
  throw QNCNotFoundEx("Cannot find a buffer bucket", 8);
}

void QNCBufferManager::get(unsigned int aLength, QNCPointer<QNCBuffer>& arBuffer) {
  QN_ENTERED();
  QNCMutex* lHeldMutex = nullptr;  // the bucket's mutex while this call holds it
  try {
    QN_LOG_TRACE("Determining bucket number for %u length", aLength);
    unsigned int lIndex = 0;
    _determineBucketNo(aLength, lIndex);
    QN_ASSERT(lIndex < this->mBufferQueues.numberOfElements());
    QNCMutex& lMutex = *mBufferQueueMutexes[lIndex];
    QNCBufferQueue& lQueue = *mBufferQueues[lIndex];

    QN_LOG_TRACE("Locking bucket # %u", lIndex);
    lMutex.lock();
    lHeldMutex = &lMutex;
    QN_LOG_TRACE("Getting buffer length of bucket # %u", lIndex);
    const unsigned int lBufferSize = _bucketBufferLength(lIndex);
    QN_ASSERT(0 != lBufferSize);
    QNCPointer<QNCBuffer> lBuffer;
    if (lQueue.isEmpty()) {
      QN_LOG_TRACE("No existing buffers.. creating new of %u size", lBufferSize);
      lBuffer = QNCPointer<QNCBuffer>(new (std::nothrow) QNCAllocatedBuffer(aLength, lBufferSize),
                                      QNPST_Individual, QNPAT_New);
    } else {
      QN_LOG_TRACE("Got buffer of %u length from bucket # %u", lBufferSize, lIndex);
      lBuffer = lQueue.dequeue();
      // Cannot fail: reuse() pools only buffers whose capacity reaches their bucket's length.
      lBuffer->setLength(aLength);
    }
    QN_LOG_TRACE("Unlocking bucket # %u", lIndex);
    lHeldMutex = nullptr;
    lMutex.unlock();
    // Assigned after the unlock: the caller's previous buffer may be destroyed here, and that
    // need not hold up the bucket.
    arBuffer = std::move(lBuffer);
  } catch (QNCException& arException) {
    if (lHeldMutex != nullptr) lHeldMutex->unlock();
    QN_LOG_ERROR("Cannot allocate a buffer");
    throw QNCNoMemoryEx(arException.what(), 2);
  }
  QN_LEFT();
}

void QNCBufferManager::reuse(QNCPointer<QNCBuffer>& arBuffer) {
  QN_ENTERED();
  const unsigned int lLength = arBuffer->getLength();
  if (lLength > kMaxPooledLength) {
    QN_LOG_TRACE("Buffer too big... Need not be reused");
    QN_LEFT();
    return;
  }
  QN_LOG_TRACE("Determining bucket number for %u buffer length", lLength);
  unsigned int lIndex = 0;
  try {
    _determineBucketNo(lLength, lIndex);
  } catch (QNCNotFoundEx& arException) {
    QN_LOG_ERROR("Failed to determine bucket no, error: %s", arException.what());
    QN_LEFT();
    return;
  }
  // A buffer the manager made always passes; one made elsewhere with a smaller capacity would
  // later be asked for a length it cannot hold, so it is dropped here instead.
  const unsigned int lBucketLength = _bucketBufferLength(lIndex);
  if (arBuffer->getCapacity() < lBucketLength) {
    QN_LOG_TRACE("Buffer capacity %u below bucket # %u length %u... Need not be reused",
                 arBuffer->getCapacity(), lIndex, lBucketLength);
    QN_LEFT();
    return;
  }
  QNCMutex& lMutex = *mBufferQueueMutexes[lIndex];
  QNCBufferQueue& lQueue = *mBufferQueues[lIndex];
  // The queue's own reference, taken before the lock so that its counter update does not
  // lengthen the locked section; should the enqueue fail it is dropped after the unlock.
  QNCPointer<QNCBuffer> lQueued(arBuffer);
  QN_LOG_TRACE("Locking bucket # %u", lIndex);
  lMutex.lock();
  QN_LOG_TRACE("Queuing buffer to be reused in bucket # %u", lIndex);
  try {
    lQueue.enqueue(std::move(lQueued));
  } catch (QNCException&) {
    lMutex.unlock();
    throw;
  }
  QN_LOG_TRACE("Unlocking bucket # %u", lIndex);
  lMutex.unlock();
  QN_LEFT();
}
