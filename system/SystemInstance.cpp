#include "ProcessInstanceManager.h"
#include "System.h"
#include "SystemMember.h"

// Thin wrappers over the instance manager the application installed at construction; they log
// nothing themselves but the newcomer's line when mProcessInstanceManager is missing; reaching
// through it then asserts.

bool QNCSystem::isAnInstanceRunning() {
  QN_REQUIRE_MEMBER(mProcessInstanceManager, QN_WHERE_INSTANCE_MANAGER);
  return mProcessInstanceManager->isAnInstanceRunning();
}

void QNCSystem::markAsRunning() {
  QN_REQUIRE_MEMBER(mProcessInstanceManager, QN_WHERE_INSTANCE_MANAGER);
  mProcessInstanceManager->markAsRunning();
}

void QNCSystem::killRunningInstance() {
  QN_REQUIRE_MEMBER(mProcessInstanceManager, QN_WHERE_INSTANCE_MANAGER);
  mProcessInstanceManager->killRunningInstance();
}

void QNCSystem::exitInstanceManagement() {
  QN_REQUIRE_MEMBER(mProcessInstanceManager, QN_WHERE_INSTANCE_MANAGER);
  mProcessInstanceManager->exitCleanup();
}

void QNCSystem::getProcStatus(QNCString aPidFilePath) {
  QN_REQUIRE_MEMBER(mProcessInstanceManager, QN_WHERE_INSTANCE_MANAGER);
  mProcessInstanceManager->getProcStatusFromPidFile(aPidFilePath);
}
