#include "ProcessInstanceManager.h"
#include "System.h"

bool QNCSystem::isAnInstanceRunning() { return false; }
void QNCSystem::markAsRunning() {}
void QNCSystem::killRunningInstance() {}
void QNCSystem::exitInstanceManagement() {}
void QNCSystem::getProcStatus(QNCString) {}
