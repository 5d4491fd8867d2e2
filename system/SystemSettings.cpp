// The settings store, applySettings, and the numeric identifiers of QNCSystem.

#include "Logger.h"
#include "MultiType.h"
#include "Mutex.h"
#include "NumericIdManager.h"
#include "QNException.h"
#include "System.h"

void QNCSystem::addSetting(const QNCString& acrKey, const QNCPointer<QNCMultiType>& acrValue) {
  QN_ENTERED();
  mSettings.insert(acrKey, acrValue);
  QN_LEFT();
}

void QNCSystem::getSetting(const QNCString& acrKey, QNCPointer<QNCMultiType>& arValue) {
  QN_ENTERED();
  arValue = mSettings.get(acrKey);
  QN_LEFT();
}

void QNCSystem::applySettings() {
  QN_ENTERED();
  QNCPointer<QNCMultiType> lValue;

  QN_LOG_TRACE("Searching for 'DebugLevel' setting");
  getSetting("DebugLevel", lValue);
  const unsigned int lDebugLevel = *lValue;
  QN_LOG_INFO("Applying 'DebugLevel' setting to %u", lDebugLevel);
  setLogCode(lDebugLevel);

  QN_LOG_TRACE("Searching for 'HbTimeout' setting");
  getSetting("HbTimeout", lValue);
  const unsigned int lHbTimeout = *lValue;
  QN_LOG_INFO("Applying 'HbTimeout' setting to %u", lHbTimeout);
  setHbTimeout(lHbTimeout);

  getSetting("Daemonize", lValue);
  QN_LOG_INFO("Applying 'Daemonize' setting");
  const signed char lDaemonize = *lValue;
  if (lDaemonize == 1) {
    QN_LOG_INFO("Running the current process in the background as daemon");
    systemDaemonize("/", "/dev/null", "/dev/null", "/dev/null");
  }
  QN_LEFT();
}

void QNCSystem::generateNumericId(unsigned int& arId) {
  QN_ENTERED();
  {
    // The locker releases the lock also when the manager throws (no identifier left).
    QNCMutexLocker lLocker(*mNidCreationLock);
    mNumericIdManager->getNextId(arId);
  }
  QN_LEFT();
}

void QNCSystem::returnNumericId(const unsigned int& acrId) {
  QN_ENTERED();
  {
    // Also released when the manager refuses an identifier that is not in use.
    QNCMutexLocker lLocker(*mNidCreationLock);
    mNumericIdManager->markForReuse(acrId);
  }
  QN_LEFT();
}
