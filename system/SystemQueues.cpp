#include "Queueable.h"
#include "SynchList.h"
#include "SynchQueue.h"
#include "System.h"

void QNCSystem::waitOnEmptyQueue(unsigned int, unsigned int) {}
void QNCSystem::enqueue(unsigned int, const QNCPointer<QNCQueueable>&) {}
QNCPointer<QNCQueueable> QNCSystem::dequeue(unsigned int) { return QNCPointer<QNCQueueable>(); }
QNCPointer<QNCQueueable> QNCSystem::queueFront(unsigned int) { return QNCPointer<QNCQueueable>(); }
void QNCSystem::queueClear(unsigned int) {}
bool QNCSystem::isQueueEmpty(unsigned int) { return true; }
void QNCSystem::waitOnEmptyList(unsigned int, unsigned int) {}
void QNCSystem::enlist(unsigned int, const QNCPointer<QNCQueueable>&) {}
void QNCSystem::enlistFront(unsigned int, const QNCPointer<QNCQueueable>&) {}
QNCPointer<QNCQueueable> QNCSystem::delist(unsigned int) { return QNCPointer<QNCQueueable>(); }
QNCPointer<QNCQueueable> QNCSystem::delistBack(unsigned int) { return QNCPointer<QNCQueueable>(); }
QNCPointer<QNCQueueable> QNCSystem::listFront(unsigned int) { return QNCPointer<QNCQueueable>(); }
void QNCSystem::listClear(unsigned int) {}
unsigned int QNCSystem::listSize(unsigned int) { return 0; }
bool QNCSystem::isListEmpty(unsigned int) { return true; }
void QNCSystem::listErase(unsigned int, QNCQueueableList::iterator&) {}
namespace {
QNCQueueableList gsNoList;
}
QNCQueueableList::const_iterator QNCSystem::listBegin(unsigned int) const { return gsNoList.begin(); }
QNCQueueableList::const_iterator QNCSystem::listEnd(unsigned int) const { return gsNoList.end(); }
QNCQueueableList::iterator QNCSystem::listBegin(unsigned int) { return gsNoList.begin(); }
QNCQueueableList::iterator QNCSystem::listEnd(unsigned int) { return gsNoList.end(); }
