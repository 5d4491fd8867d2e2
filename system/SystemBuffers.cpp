#include "BufferManager.h"
#include "Logger.h"
#include "System.h"

void QNCSystem::getBuffer(unsigned int aLength, QNCPointer<QNCBuffer>& arBuffer) {
  QN_ENTERED();
  mBufferManager->get(aLength, arBuffer);
  QN_LEFT();
}

void QNCSystem::reuseBuffer(QNCPointer<QNCBuffer>& arBuffer) {
  QN_ENTERED();
  mBufferManager->reuse(arBuffer);
  QN_LEFT();
}

void QNCSystem::clearBuffer(QNCPointer<QNCBuffer>& arBuffer) {
  QN_ENTERED();
  mBufferManager->reuse(arBuffer);
  QN_LEFT();
}
