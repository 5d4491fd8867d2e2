#include "ProcessInstanceManager.h"
#include "System.h"

// Thin wrappers over the instance manager the application installed at construction; they log
// nothing themselves. Reaching through mProcessInstanceManager asserts that it is set.

bool QNCSystem::isAnInstanceRunning() { return mProcessInstanceManager->isAnInstanceRunning(); }

void QNCSystem::markAsRunning() { mProcessInstanceManager->markAsRunning(); }

void QNCSystem::killRunningInstance() { mProcessInstanceManager->killRunningInstance(); }

void QNCSystem::exitInstanceManagement() { mProcessInstanceManager->exitCleanup(); }

void QNCSystem::getProcStatus(QNCString aPidFilePath) { mProcessInstanceManager->getProcStatusFromPidFile(aPidFilePath); }
