#pragma once
// Minimal system classes for tests and their helper programs: the three operations every
// application must provide, and one with an instance manager on the PID file it is given.

#include <new>

#include "ProcessInstanceManager.h"
#include "QNException.h"
#include "System.h"

// No options, no configuration file, no help text.
class QNCBareTestSystem : public QNCSystem {
 public:
  void setCommandLineArgumentDesc() override {}
  void parseConfigFile(QNCString&) override { throw QNCNotImplementedEx("no configuration file", 0); }
  void displayHelp() override {}
};

class QNCTestSystem : public QNCBareTestSystem {
 public:
  explicit QNCTestSystem(const char* apPidFilePath = "/nonexistent/qntest.pid") {
    mName = "qntest";
    mProcessInstanceManager = QNCPointer<QNCProcessInstanceManager>(
        new (std::nothrow) QNCProcessInstanceManager(apPidFilePath), QNPST_Individual, QNPAT_New);
  }
};
