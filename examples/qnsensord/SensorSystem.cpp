#include "SensorSystem.h"

#include <cstdio>

#include "ProcessInstanceManager.h"
#include "QNException.h"
#include "SystemGlobals.h"
#include "Version.h"

QNCSensorSystem::QNCSensorSystem() {
  mName = QNCString("qnsensord");
  mVersion = QNCPointer<QNCVersion>(new (std::nothrow) QNCVersion("1.0.0"), QNPST_Individual, QNPAT_New);
  QNCString lPidFilePath;
  getLogDir(lPidFilePath);
  lPidFilePath += "/qnsensord.pid";
  mProcessInstanceManager = QNCPointer<QNCProcessInstanceManager>(
      new (std::nothrow) QNCProcessInstanceManager(lPidFilePath), QNPST_Individual, QNPAT_New);
}

void QNCSensorSystem::setCommandLineArgumentDesc() {}

void QNCSensorSystem::parseConfigFile(QNCString&) {
  throw QNCNotImplementedEx("qnsensord reads no configuration file", 0);
}

void QNCSensorSystem::displayHelp() { printf("usage: qnsensord\n"); }
