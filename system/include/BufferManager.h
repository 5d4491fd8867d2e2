#pragma once
// QNCBufferManager: a pool of idle byte buffers sorted into size buckets, so that steady message
// traffic takes and returns buffers instead of allocating and freeing storage for each message.
//
// Buckets. They are fixed at construction from the system object's list of buffer lengths
// (QNCSystem::getMemoryBufferList), one bucket per entry, in list order; the lengths are taken
// as they are (neither sorted nor checked). A length is served by the FIRST bucket whose length
// is at least that length, not the best-fitting one: best fit follows only from an ascending
// list; of two equal lengths the later bucket is never chosen; a length of 0 selects bucket 0.
// Every buffer the manager creates for bucket i is a QNCAllocatedBuffer of capacity
// mBufferLengths[i]. Idle buffers wait in their bucket's queue, oldest first.
//
// Invariant: every idle buffer in bucket i has a capacity of at least mBufferLengths[i], so get()
// never hands out a buffer that cannot hold the requested length. Buffers the manager created
// always meet it; a returned buffer of another origin that does not (a message buffer whose
// capacity equals its used length, say) is refused by reuse() and simply dropped.
//
// Threads: get() and reuse() may be called from any thread between construction and
// destruction. Each call holds at most one lock, the mutex of the bucket it works on, so there
// is no lock order; threads using different buckets never contend. The bucket vectors never
// change after construction and are read without a lock. Construction and destruction take no
// lock: no other thread may use the manager while they run.
//
// Cost after warm-up: get() and reuse() each scan the bucket lengths, take one lock and move one
// queue node; neither allocates (the queues recycle their nodes). Each call looks at the trace
// level once: with trace masked off it runs a path that contains no trace line, so a masked-off
// pool does not pay a test per line; with trace on every line is written, in the same order.

#include "AllocatedBuffer.h"
#include "Assert.h"
#include "Buffer.h"
#include "Mutex.h"
#include "Pointer.h"
#include "QNQueue.h"
#include "QNVector.h"

class QNCSystem;

class QNCBufferManager {
 public:
  // The largest used length that reuse() pools; larger buffers are always dropped, whatever the
  // bucket lengths, so that large one-off buffers never pile up in the pool.
  static constexpr unsigned int kMaxPooledLength = 4096;

  // Builds one empty bucket per entry of apSystem's buffer list; no buffer is made in advance.
  // Asserts that the list is not empty ("lBufferList.size() > 0", exit status 1). Throws
  // QNCNoMemoryEx "Out of Memory" (2) when a bucket cannot be allocated.
  explicit QNCBufferManager(QNCSystem* apSystem);

  // Drops every idle buffer, then traces per bucket "Memory Used by the memory slab %u : %u"
  // (bucket length, sum of the idle buffers' used lengths) and "TOTAL Memory Used : %u".
  virtual ~QNCBufferManager();

  QNCBufferManager(const QNCBufferManager&) = delete;
  QNCBufferManager& operator=(const QNCBufferManager&) = delete;

  // Hands out a buffer whose used length is aLength: the oldest idle buffer of the chosen bucket
  // (its bytes are whatever its previous user left), or a new one of the bucket's capacity when
  // the bucket is empty. The result is assigned to arBuffer, releasing what it referred to.
  // Every failure becomes QNCNoMemoryEx (2) carrying the caught message, after the error line
  // "Cannot allocate a buffer"; arBuffer then keeps what it referred to. In particular a length
  // larger than every bucket throws with the message "Cannot find a buffer bucket". Blocks only
  // on the bucket's lock, held for one dequeue or one buffer creation.
  void get(unsigned int aLength, QNCPointer<QNCBuffer>& arBuffer);

  // Returns a buffer to the pool: it joins the queue of the first bucket whose length is at
  // least its used length (not the bucket it came from). Not pooled, with no exception:
  //   - a used length above kMaxPooledLength (trace "Buffer too big... Need not be reused");
  //   - a used length larger than every bucket (two error lines, the search's failure absorbed);
  //   - a capacity below the chosen bucket's length (trace line).
  // The buffer is not changed and arBuffer still refers to it; the caller must not touch it
  // again. An empty arBuffer is a caller's bug (the pointer's assertion). Throws QNCNoMemoryEx
  // "Out of Memory" (2) when the queue cannot grow; the bucket's lock is released on every way
  // out. Blocks only on the bucket's lock, held for one enqueue.
  void reuse(QNCPointer<QNCBuffer>& arBuffer);

 private:
  // get() and reuse() with their trace lines (acTrace) or without any.
  template <bool acTrace>
  void _get(unsigned int aLength, QNCPointer<QNCBuffer>& arBuffer);
  template <bool acTrace>
  void _reuse(QNCPointer<QNCBuffer>& arBuffer);

  // First bucket whose length is at least aLength. Throws QNCNotFoundEx "Cannot find a buffer
  // bucket" (8) after an error line when none is; arBucketNo is then unchanged.
  template <bool acTrace>
  void _determineBucketNo(unsigned int aLength, unsigned int& arBucketNo) const;

  unsigned int _bucketBufferLength(unsigned int acIndex) const {
    QN_ASSERT(acIndex < this->mBufferQueues.numberOfElements());
    return (&mBufferLengths[0])[acIndex];  // bounded by the assertion: the vectors match
  }

  // Element i of each vector describes bucket i; none of them changes after construction.
  // mBufferQueueMutexes[i] guards the contents of *mBufferQueues[i].
  QNCVector<QNCPointer<QNCQueue<QNCPointer<QNCBuffer>>>> mBufferQueues;
  QNCVector<QNCPointer<QNCMutex>> mBufferQueueMutexes;
  QNCVector<unsigned int> mBufferLengths;
};
