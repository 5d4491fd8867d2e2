#pragma once
// QNCSynchQueue: a first-in first-out queue of shared objects that any number of threads may use
// at the same time. Every operation holds the queue's own mutex for its own duration only and
// never calls out while holding it: elements that leave the queue are released after it is given
// up, so an element's destructor may use this queue again. The node of a dequeued element is
// kept as a spare (QNCSpareNodes, bounded) and reused by the next enqueue, so a queue in steady
// use allocates nothing; a node is allocated only when no spare is at hand, before the lock (under
// it only when another thread took the last spare meanwhile).
//
// The system object reaches a queue only through these virtual operations, in this slot order:
// front, dequeue, enqueue, isEmpty, clear. A derived queue may override them (for instance to
// observe the emptiness test of QNCSystem::waitOnEmptyQueue); it must keep their contracts.
//
// The queue has no conditional of its own. QNCSystem::waitOnEmptyQueue calls isEmpty() while
// holding a conditional's lock, so isEmpty() must never wait for that conditional.

#include "Mutex.h"
#include "Pointer.h"
#include "QNList.h"
#include "Queueable.h"
#include "SpareNodes.h"

class QNCSynchQueue {
 public:
  QNCSynchQueue() = default;
  QNCSynchQueue(const QNCSynchQueue&) = delete;
  QNCSynchQueue& operator=(const QNCSynchQueue&) = delete;
  // Releases every element still held.
  virtual ~QNCSynchQueue() = default;

  // A copy of the head element, made under the lock; the queue is unchanged.
  // Throws QNCNotFoundEx "Not Found" (8) when the queue is empty. Does not block.
  virtual QNCPointer<QNCQueueable> front();

  // Removes the head element and hands it to the caller.
  // Throws QNCNotFoundEx "Not Found" (8) when the queue is empty; the queue is then unchanged.
  virtual QNCPointer<QNCQueueable> dequeue();

  // Adds acrElement at the tail; the queue shares the object with the caller.
  // Throws QNCNoMemoryEx "Out of Memory" (2) when no node can be allocated; the queue is then
  // unchanged. Signals nothing: the producer wakes consumers itself (QNCSystem::signal).
  virtual void enqueue(const QNCPointer<QNCQueueable>& acrElement);

  // True when the queue holds no element at the moment of the test.
  virtual bool isEmpty();

  // Removes every element; the objects no other holder shares are destroyed after the lock is
  // given up.
  virtual void clear();

  // dequeue() without the exception: false (arElement then empty) when the queue is empty. One
  // pass through the lock, no allocation; arElement's former object is released before the lock
  // is taken.
  virtual bool tryDequeue(QNCPointer<QNCQueueable>& arElement);

 private:
  QNCMutex mMutex;  // guards mElements and mSpares
  QNCList<QNCPointer<QNCQueueable>> mElements;
  QNCSpareNodes mSpares;
};
