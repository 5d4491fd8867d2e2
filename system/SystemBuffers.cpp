#include "BufferManager.h"
#include "QNException.h"
#include "System.h"

void QNCSystem::getBuffer(unsigned int, QNCPointer<QNCBuffer>&) {
  throw QNCNotImplementedEx("getBuffer: no buffer manager", 0);
}
void QNCSystem::reuseBuffer(QNCPointer<QNCBuffer>&) {}
void QNCSystem::clearBuffer(QNCPointer<QNCBuffer>&) {}
