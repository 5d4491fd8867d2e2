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

// A line of the operation acpFunction (get or reuse, whose work runs in a helper), written as
// the mask decides at that moment. Trace lines exist only in the instantiation with acTrace.
#define QN_POOL_LOG(level, tag, acpFunction, ...)                                             \
  do {                                                                                        \
    if (QNIsLogLevelOn(level))                                                                \
      PrintLogMessageWithTimeStamp(level, tag, __LINE__, acpFunction, __FILE__, __VA_ARGS__); \
  } while (0)
#define QN_POOL_TRACE(acpFunction, ...)                                    \
  do {                                                                     \
    if (acTrace) QN_POOL_LOG(QNLL_Trace, "-T-", acpFunction, __VA_ARGS__); \
  } while (0)

namespace {
// Element aIndex of one of the bucket vectors, for an index the caller has already bounded (the
// bucket scan or an assertion): the vectors all hold one element per bucket and never change
// after construction, so a second check per access would only cost time.
template <class T>
[[gnu::always_inline]] inline T& bucketElement(QNCVector<T>& arVector, unsigned int aIndex) {
  return (&arVector[0])[aIndex];
}
}  // namespace

template <bool acTrace>
[[gnu::always_inline]] inline void QNCBufferManager::_determineBucketNo(unsigned int aLength,
                                                                        unsigned int& arBucketNo) const {
  if (acTrace) QN_ENTERED();
  // The lengths never change after construction and there is at least one (asserted then).
  const unsigned int* const lpLengths = &mBufferLengths[0];
  const unsigned int lCount = mBufferLengths.numberOfElements();
  for (unsigned int lIndex = 0; lIndex < lCount; ++lIndex) {
    if (lpLengths[lIndex] >= aLength) {
      arBucketNo = lIndex;
      if (acTrace) QN_LOG_TRACE("Determined bucket number is %u", lIndex);
      if (acTrace) QN_LEFT();
      return;
    }
  }
  QN_LOG_ERROR("Failed to find a bucket for %u buffer size", aLength);
  throw QNCNotFoundEx("Cannot find a buffer bucket", 8);
}

template <bool acTrace>
[[gnu::always_inline]] inline void QNCBufferManager::_get(unsigned int aLength,
                                                          QNCPointer<QNCBuffer>& arBuffer) {
  QN_POOL_TRACE("get", "%s", "Entered");
  QNCMutex* lHeldMutex = nullptr;  // the bucket's mutex while this call holds it
  try {
    QN_POOL_TRACE("get", "Determining bucket number for %u length", aLength);
    unsigned int lIndex = 0;
    _determineBucketNo<acTrace>(aLength, lIndex);
    QN_ASSERT(lIndex < this->mBufferQueues.numberOfElements());
    // Made non-null at construction and never changed.
    QNCMutex& lMutex = *bucketElement(mBufferQueueMutexes, lIndex).get();
    QNCBufferQueue& lQueue = *bucketElement(mBufferQueues, lIndex).get();
    // Read before the lock (the lengths never change), so that its assertion repeats the one
    // above and costs nothing; the trace line keeps its place after the lock.
    const unsigned int lBufferSize = _bucketBufferLength(lIndex);

    QN_POOL_TRACE("get", "Locking bucket # %u", lIndex);
    lMutex.lock();
    lHeldMutex = &lMutex;
    QN_POOL_TRACE("get", "Getting buffer length of bucket # %u", lIndex);
    QN_ASSERT(0 != lBufferSize);
    QNCPointer<QNCBuffer> lBuffer;
    if (lQueue.isEmpty()) {
      QN_POOL_TRACE("get", "No existing buffers.. creating new of %u size", lBufferSize);
      lBuffer = QNCPointer<QNCBuffer>(new (std::nothrow) QNCAllocatedBuffer(aLength, lBufferSize),
                                      QNPST_Individual, QNPAT_New);
    } else {
      QN_POOL_TRACE("get", "Got buffer of %u length from bucket # %u", lBufferSize, lIndex);
      lBuffer = lQueue.dequeue();
      // Cannot fail: reuse() pools only buffers whose capacity reaches their bucket's length.
      lBuffer.get()->setLength(aLength);
    }
    QN_POOL_TRACE("get", "Unlocking bucket # %u", lIndex);
    lHeldMutex = nullptr;
    lMutex.unlock();
    // Assigned after the unlock: the caller's previous buffer may be destroyed here, and that
    // need not hold up the bucket.
    arBuffer = std::move(lBuffer);
  } catch (QNCException& arException) {
    if (lHeldMutex != nullptr) lHeldMutex->unlock();
    QN_POOL_LOG(QNLL_Error, "-E-", "get", "Cannot allocate a buffer");
    throw QNCNoMemoryEx(arException.what(), 2);
  }
  QN_POOL_TRACE("get", "%s", "Left");
}

template <bool acTrace>
[[gnu::always_inline]] inline void QNCBufferManager::_reuse(QNCPointer<QNCBuffer>& arBuffer) {
  QN_POOL_TRACE("reuse", "%s", "Entered");
  QNCBuffer& lBuffer = *arBuffer;
  const unsigned int lLength = lBuffer.getLength();
  if (lLength > kMaxPooledLength) {
    QN_POOL_TRACE("reuse", "Buffer too big... Need not be reused");
    QN_POOL_TRACE("reuse", "%s", "Left");
    return;
  }
  QN_POOL_TRACE("reuse", "Determining bucket number for %u buffer length", lLength);
  unsigned int lIndex = 0;
  try {
    _determineBucketNo<acTrace>(lLength, lIndex);
  } catch (QNCNotFoundEx& arException) {
    QN_POOL_LOG(QNLL_Error, "-E-", "reuse", "Failed to determine bucket no, error: %s", arException.what());
    QN_POOL_TRACE("reuse", "%s", "Left");
    return;
  }
  // A buffer the manager made always passes; one made elsewhere with a smaller capacity would
  // later be asked for a length it cannot hold, so it is dropped here instead.
  const unsigned int lBucketLength = _bucketBufferLength(lIndex);
  if (lBuffer.getCapacity() < lBucketLength) {
    QN_POOL_TRACE("reuse", "Buffer capacity %u below bucket # %u length %u... Need not be reused",
                  lBuffer.getCapacity(), lIndex, lBucketLength);
    QN_POOL_TRACE("reuse", "%s", "Left");
    return;
  }
  // Made non-null at construction and never changed.
  QNCMutex& lMutex = *bucketElement(mBufferQueueMutexes, lIndex).get();
  QNCBufferQueue& lQueue = *bucketElement(mBufferQueues, lIndex).get();
  // The queue's own reference, taken before the lock so that its counter update does not
  // lengthen the locked section; should the enqueue fail it is dropped after the unlock.
  QNCPointer<QNCBuffer> lQueued(arBuffer);
  QN_POOL_TRACE("reuse", "Locking bucket # %u", lIndex);
  lMutex.lock();
  QN_POOL_TRACE("reuse", "Queuing buffer to be reused in bucket # %u", lIndex);
  try {
    lQueue.enqueue(std::move(lQueued));
  } catch (QNCException&) {
    lMutex.unlock();
    throw;
  }
  QN_POOL_TRACE("reuse", "Unlocking bucket # %u", lIndex);
  lMutex.unlock();
  QN_POOL_TRACE("reuse", "%s", "Left");
}

void QNCBufferManager::get(unsigned int aLength, QNCPointer<QNCBuffer>& arBuffer) {
  if (QNIsLogLevelOn(QNLL_Trace)) {
    _get<true>(aLength, arBuffer);
  } else {
    _get<false>(aLength, arBuffer);
  }
}

void QNCBufferManager::reuse(QNCPointer<QNCBuffer>& arBuffer) {
  if (QNIsLogLevelOn(QNLL_Trace)) {
    _reuse<true>(arBuffer);
  } else {
    _reuse<false>(arBuffer);
  }
}
