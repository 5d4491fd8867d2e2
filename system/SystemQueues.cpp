#include "Assert.h"
#include "Conditional.h"
#include "Logger.h"
#include "Queueable.h"
#include "SynchList.h"
#include "SynchQueue.h"
#include "System.h"

// --- Queues. The queue's own operations keep the element order and report its failures.

void QNCSystem::waitOnEmptyQueue(unsigned int acConditionNo, unsigned int acQueueNo) {
  QN_ENTERED();
  QN_ASSERT(acConditionNo < this->mWaitConditionals.numberOfElements());
  QN_ASSERT(acQueueNo < this->mQueues.numberOfElements());
  QNCConditional& lConditional = *mWaitConditionals[acConditionNo];
  QNCSynchQueue& lQueue = *mQueues[acQueueNo];
  QN_LOG_TRACE("Locking the wait conditional");
  lConditional.lock();
  try {
    // The test runs under the conditional's lock, and signal() takes that lock, so an element
    // enqueued and signalled after the test wakes this wait.
    while (lQueue.isEmpty()) {
      QN_LOG_TRACE("Queue empty... Going to wait on conditional");
      lConditional.wait();
    }
  } catch (...) {
    QN_LOG_TRACE("Unlocking the wait conditional");
    lConditional.unlock();
    throw;
  }
  QN_LOG_TRACE("Unlocking the wait conditional");
  lConditional.unlock();
  QN_LEFT();
}

void QNCSystem::enqueue(unsigned int acQueueNo, const QNCPointer<QNCQueueable>& acrElement) {
  QN_ENTERED();
  QN_ASSERT(acQueueNo < this->mQueues.numberOfElements());
  mQueues[acQueueNo]->enqueue(acrElement);
  QN_LEFT();
}

QNCPointer<QNCQueueable> QNCSystem::dequeue(unsigned int acQueueNo) {
  QN_ENTERED();
  QN_ASSERT(acQueueNo < this->mQueues.numberOfElements());
  QNCPointer<QNCQueueable> lHead = mQueues[acQueueNo]->dequeue();
  QN_LEFT();
  return lHead;
}

QNCPointer<QNCQueueable> QNCSystem::queueFront(unsigned int acQueueNo) {
  QN_ENTERED();
  QN_ASSERT(acQueueNo < this->mQueues.numberOfElements());
  QNCPointer<QNCQueueable> lHead = mQueues[acQueueNo]->front();
  QN_LEFT();
  return lHead;
}

void QNCSystem::queueClear(unsigned int acQueueNo) {
  QN_ENTERED();
  QN_ASSERT(acQueueNo < this->mQueues.numberOfElements());
  mQueues[acQueueNo]->clear();
  QN_LEFT();
}

bool QNCSystem::isQueueEmpty(unsigned int acQueueNo) {
  QN_ENTERED();
  QN_ASSERT(acQueueNo < this->mQueues.numberOfElements());
  const bool lEmpty = mQueues[acQueueNo]->isEmpty();
  QN_LEFT();
  return lEmpty;
}

// --- Lists. Each operation locks list n's mMutex inside QNCSynchList for its own duration.

void QNCSystem::waitOnEmptyList(unsigned int acConditionNo, unsigned int acListNo) {
  QN_ENTERED();
  QN_ASSERT(acConditionNo < this->mWaitConditionals.numberOfElements());
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  QNCConditional& lConditional = *mWaitConditionals[acConditionNo];
  QNCSynchList& lList = *mLists[acListNo];
  QN_LOG_TRACE("Locking the wait conditional");
  lConditional.lock();
  try {
    // See waitOnEmptyQueue: the test and the wait are under the lock that signal() takes.
    while (lList.isEmpty()) {
      QN_LOG_TRACE("List empty... Going to wait on conditional");
      lConditional.wait();
    }
  } catch (...) {
    QN_LOG_TRACE("Unlocking the wait conditional");
    lConditional.unlock();
    throw;
  }
  QN_LOG_TRACE("Unlocking the wait conditional");
  lConditional.unlock();
  QN_LEFT();
}

void QNCSystem::enlist(unsigned int acListNo, const QNCPointer<QNCQueueable>& acrElement) {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  mLists[acListNo]->enlist(acrElement);
  QN_LEFT();
}

void QNCSystem::enlistFront(unsigned int acListNo, const QNCPointer<QNCQueueable>& acrElement) {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  mLists[acListNo]->enlistFront(acrElement);
  QN_LEFT();
}

QNCPointer<QNCQueueable> QNCSystem::delist(unsigned int acListNo) {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  QNCPointer<QNCQueueable> lHead = mLists[acListNo]->delist();
  QN_LEFT();
  return lHead;
}

QNCPointer<QNCQueueable> QNCSystem::delistBack(unsigned int acListNo) {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  QNCPointer<QNCQueueable> lTail = mLists[acListNo]->delistBack();
  QN_LEFT();
  return lTail;
}

QNCPointer<QNCQueueable> QNCSystem::listFront(unsigned int acListNo) {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  QNCPointer<QNCQueueable> lHead = mLists[acListNo]->front();
  QN_LEFT();
  return lHead;
}

void QNCSystem::listClear(unsigned int acListNo) {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  mLists[acListNo]->clear();
  QN_LEFT();
}

unsigned int QNCSystem::listSize(unsigned int acListNo) {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  const unsigned int lSize = mLists[acListNo]->numberOfElements();
  QN_LEFT();
  return lSize;
}

bool QNCSystem::isListEmpty(unsigned int acListNo) {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  const bool lEmpty = mLists[acListNo]->isEmpty();
  QN_LEFT();
  return lEmpty;
}

void QNCSystem::listErase(unsigned int acListNo, QNCQueueableList::iterator& arIterator) {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  mLists[acListNo]->erase(arIterator);
  QN_LEFT();
}

QNCQueueableList::const_iterator QNCSystem::listBegin(unsigned int acListNo) const {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  const QNCSynchList& lList = *mLists[acListNo];
  QN_LEFT();
  return lList.begin();
}

QNCQueueableList::const_iterator QNCSystem::listEnd(unsigned int acListNo) const {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  const QNCSynchList& lList = *mLists[acListNo];
  QN_LEFT();
  return lList.end();
}

QNCQueueableList::iterator QNCSystem::listBegin(unsigned int acListNo) {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  QNCQueueableList::iterator lBegin = mLists[acListNo]->begin();
  QN_LEFT();
  return lBegin;
}

QNCQueueableList::iterator QNCSystem::listEnd(unsigned int acListNo) {
  QN_ENTERED();
  QN_ASSERT(acListNo < this->mLists.numberOfElements());
  QNCQueueableList::iterator lEnd = mLists[acListNo]->end();
  QN_LEFT();
  return lEnd;
}
