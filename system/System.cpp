#include "System.h"

#include "BufferManager.h"
#include "Conditional.h"
#include "IpAddress.h"
#include "KeyValueFormatParser.h"
#include "Logger.h"
#include "MultiType.h"
#include "Mutex.h"
#include "NumericIdManager.h"
#include "ProcessInstanceManager.h"
#include "ProtocolHelper.h"
#include "Reader.h"
#include "SynchList.h"
#include "SynchQueue.h"
#include "ThreadComponent.h"
#include "ThreadPool.h"
#include "Version.h"
#include "Writer.h"

QNCSystem::QNCSystem()
    : mExitFlag(false),
      mOs(QNOS_Unknown),
      mExitLock(new (std::nothrow) QNCMutex, QNPST_Individual, QNPAT_New) {}

QNCSystem::~QNCSystem() {
  QN_ENTERED();
  QN_LEFT();
}

QNCPointer<QNCIpAddress>& QNCSystem::getAddress() { return mAddress; }

bool QNCSystem::isSetForExit() const {
  mExitLock->lock();
  const bool lExitFlag = mExitFlag;
  mExitLock->unlock();
  return lExitFlag;
}

void QNCSystem::setAddress(const QNCPointer<QNCIpAddress>& acrAddress) { mAddress = acrAddress; }
QNCString& QNCSystem::getHostName() { return mHostName; }

void QNCSystem::setForExit() {
  mExitLock->lock();
  mExitFlag = true;
  mExitLock->unlock();
}

QNEOperatingSystem QNCSystem::getOs() { return mOs; }
QNCString& QNCSystem::getOsVariant() { return mOsVariant; }
QNCPointer<QNCVersion>& QNCSystem::getVersion() { return mVersion; }
QNCPointer<QNCProtocolHelper>& QNCSystem::getProtocolHelper() { return mProtocolHelper; }

void QNCSystem::preInit() {
  QN_ENTERED();
  QN_LEFT();
}

void QNCSystem::init() {
  QN_ENTERED();
  QN_LOG_TRACE("Creating Numeric Id Manager...");
  mNumericIdManager = QNCPointer<QNCNumericIdManager>(new (std::nothrow) QNCNumericIdManager, QNPST_Individual, QNPAT_New);
  QN_LOG_TRACE("Creating NID creation lock...");
  mNidCreationLock = QNCPointer<QNCMutex>(new (std::nothrow) QNCMutex, QNPST_Individual, QNPAT_New);
  QN_LEFT();
}

void QNCSystem::postDestroy() {
  QN_ENTERED();
  QN_LEFT();
}

void QNCSystem::destroy() {
  QN_ENTERED();
  QN_LEFT();
}

void QNCSystem::createThreads() {
  QN_ENTERED();
  QN_LEFT();
}

void QNCSystem::startThreads() {
  QN_ENTERED();
  QN_LEFT();
}

void QNCSystem::startThread(unsigned int) {
  QN_ENTERED();
  QN_LEFT();
}

void QNCSystem::postThreadsInit() {}

void QNCSystem::waitForThreads() {
  QN_ENTERED();
  QN_LEFT();
}

void QNCSystem::makeThreadsToExit() {
  createShutDownEvent();
  setForExit();
}

bool QNCSystem::isInited(unsigned int) const { return false; }

void QNCSystem::createStartUpEvent() {}
void QNCSystem::createShutDownEvent() {}

void QNCSystem::destroyThreads() {
  QN_ENTERED();
  QN_LEFT();
}
