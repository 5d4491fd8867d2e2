#include "System.h"

#include "BufferManager.h"
#include "Clib.h"
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
#include "SystemMember.h"
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
  QN_REQUIRE_MEMBER(mExitLock, QN_WHERE_EXIT_LOCK);
  mExitLock->lock();
  const bool lExitFlag = mExitFlag;
  mExitLock->unlock();
  return lExitFlag;
}

void QNCSystem::setAddress(const QNCPointer<QNCIpAddress>& acrAddress) { mAddress = acrAddress; }
QNCString& QNCSystem::getHostName() { return mHostName; }

void QNCSystem::setForExit() {
  QN_REQUIRE_MEMBER(mExitLock, QN_WHERE_EXIT_LOCK);
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
  OsGetOsName(mOs, mOsVariant);
  QN_LOG_TRACE("Creating Command Line Parser...");
  mCommandLineParser =
      QNCPointer<QNCCommandLineParser>(new (std::nothrow) QNCCommandLineParser, QNPST_Individual, QNPAT_New);
  QN_LOG_TRACE("Creating Config File Parser...");
  mConfigFileParser = QNCPointer<QNCKeyValueFormatParser>(
      new (std::nothrow) QNCKeyValueFormatParser(QNCString(""), QNCString(""), false, false),
      QNPST_Individual, QNPAT_New);
  QN_LOG_TRACE("Setting the command line argument descriptor");
  setCommandLineArgumentDesc();
  QN_LEFT();
}

void QNCSystem::init() {
  QN_ENTERED();
  char lHostName[256];
  ClibGethostname(lHostName, 256);
  mHostName = QNCString(lHostName);
  QN_LOG_NOTICE("HostName: %s", mHostName.get());
  QN_LOG_TRACE("Setting IP Address...");
  unsigned int lAddress = 0;
  OsGetIpAddress(lAddress);
  QN_LOG_INFO("The IP Address of the host in number form: %u ", lAddress);
  QN_LOG_TRACE("Setting the IP Address");
  mAddress = QNCPointer<QNCIpAddress>(new (std::nothrow) QNCIpAddress(lAddress), QNPST_Individual, QNPAT_New);
  QN_LOG_NOTICE("IpAddress: %s", mAddress->getStringForm());
  QN_LOG_TRACE("Creating Numeric Id Manager...");
  mNumericIdManager =
      QNCPointer<QNCNumericIdManager>(new (std::nothrow) QNCNumericIdManager, QNPST_Individual, QNPAT_New);
  QN_LOG_TRACE("Creating NID creation lock...");
  mNidCreationLock = QNCPointer<QNCMutex>(new (std::nothrow) QNCMutex, QNPST_Individual, QNPAT_New);
  mProtocolHelper =
      QNCPointer<QNCProtocolHelper>(new (std::nothrow) QNCProtocolHelper(100), QNPST_Individual, QNPAT_New);
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
  // Single threads first, then pools, each in index order. Nothing is caught: a thread that
  // cannot start ends start-up, and the ones after it are not started.
  for (unsigned int lIndex = 0; lIndex < mThreadComponents.numberOfElements(); ++lIndex) {
    mThreadComponents[lIndex]->init();
    QN_LOG_NOTICE("Started Thread: %s", mThreadComponents[lIndex]->getName().get());
  }
  for (unsigned int lIndex = 0; lIndex < mThreadPools.numberOfElements(); ++lIndex) {
    mThreadPools[lIndex]->init();
    QN_LOG_NOTICE("Started Threads in Thread Pool: %s", mThreadPools[lIndex]->getName().get());
  }
  QN_LEFT();
}

void QNCSystem::startThread(unsigned int aIndex) {
  QN_ENTERED();
  mThreadComponents[aIndex]->init();
  QN_LOG_NOTICE("Started Thread: %s", mThreadComponents[aIndex]->getName().get());
  QN_LEFT();
}

void QNCSystem::postThreadsInit() {}

void QNCSystem::waitForThreads() {
  QN_ENTERED();
  // Sequential: a component that ended early is reaped only after every one before it.
  for (unsigned int lIndex = 0; lIndex < mThreadComponents.numberOfElements(); ++lIndex) {
    QN_LOG_NOTICE("Waiting for '%s' thread to exit", mThreadComponents[lIndex]->getName().get());
    mThreadComponents[lIndex]->waitForExit();
  }
  for (unsigned int lIndex = 0; lIndex < mThreadPools.numberOfElements(); ++lIndex) {
    QN_LOG_NOTICE("Waiting for threads in '%s' ThreadPool to exit", mThreadPools[lIndex]->getName().get());
    mThreadPools[lIndex]->waitForThreads();
  }
  QN_LEFT();
}

void QNCSystem::makeThreadsToExit() {
  createShutDownEvent();
  setForExit();
  for (unsigned int lIndex = 0; lIndex < mThreadComponents.numberOfElements(); ++lIndex) {
    // One component that cannot take the request (never started) must not keep the others,
    // or the pools, from being told: the shut-down would then hang in waitForThreads.
    try {
      mThreadComponents[lIndex]->requestExit();
    } catch (const QNCInvalidEx&) {
    }
  }
  for (unsigned int lIndex = 0; lIndex < mThreadPools.numberOfElements(); ++lIndex) {
    mThreadPools[lIndex]->finish();
  }
  // Wakes the exit-aware waits at once. Passing through each conditional's lock orders the wake-up
  // after any waiter that tested the exit flag under it before the flag was set.
  for (unsigned int lIndex = 0; lIndex < mWaitConditionals.numberOfElements(); ++lIndex) {
    mWaitConditionals[lIndex]->lock();
    mWaitConditionals[lIndex]->unlock();
    mWaitConditionals[lIndex]->broadcast();
  }
}

bool QNCSystem::isInited(unsigned int aIndex) const {
  if (aIndex >= mThreadComponents.numberOfElements()) return false;
  return mThreadComponents[aIndex]->isInited();
}

void QNCSystem::createStartUpEvent() {}
void QNCSystem::createShutDownEvent() {}

void QNCSystem::destroyThreads() {
  QN_ENTERED();
  QN_LEFT();
}
