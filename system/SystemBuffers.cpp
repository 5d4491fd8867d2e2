#include "BufferManager.h"
#include "Logger.h"
#include "System.h"
#include "SystemMember.h"

void QNCSystem::getBuffer(unsigned int aLength, QNCPointer<QNCBuffer>& arBuffer) {
  QN_ENTERED();
  QN_REQUIRE_MEMBER(mBufferManager, QN_WHERE_BUFFER_MANAGER);
  mBufferManager->get(aLength, arBuffer);
  QN_LEFT();
}

void QNCSystem::reuseBuffer(QNCPointer<QNCBuffer>& arBuffer) {
  QN_ENTERED();
  QN_REQUIRE_MEMBER(mBufferManager, QN_WHERE_BUFFER_MANAGER);
  mBufferManager->reuse(arBuffer);
  QN_LEFT();
}

void QNCSystem::clearBuffer(QNCPointer<QNCBuffer>& arBuffer) {
  QN_ENTERED();
  QN_REQUIRE_MEMBER(mBufferManager, QN_WHERE_BUFFER_MANAGER);
  mBufferManager->reuse(arBuffer);
  QN_LEFT();
}
