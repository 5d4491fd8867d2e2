#include "SystemGlobals.h"

#include <cstdlib>
#include <mutex>

#include "Assert.h"
#include "Clib.h"
#include "Logger.h"
#include "QNException.h"
#include "QNString.h"
#include "SignalHandler.h"
#include "System.h"

namespace {
// Guards gspSystem against the signal handlers, which run on the dispatcher thread: SysExit
// clears the pointer under it before destroying the object, so no handler reaches an object
// being destroyed. The main thread writes gspSystem only before handlers exist and in SysExit.
std::mutex gsSystemLock;
QNCSystem* gspSystem = nullptr;
char gsLogFilePath[512] = {0};

void requestExit() {
  std::lock_guard<std::mutex> lGuard(gsSystemLock);
  if (gspSystem != nullptr) gspSystem->makeThreadsToExit();
}

void handleSigInt(int) { requestExit(); }
void handleSigTerm(int) { requestExit(); }
void handleSigHup(int) { requestExit(); }
}  // namespace

void setSystemObject(QNCSystem* apSystem) {
  QN_ASSERT(0UL != apSystem);
  std::lock_guard<std::mutex> lGuard(gsSystemLock);
  gspSystem = apSystem;
}

void getSystemObject(QNCSystem*& arpSystem) {
  std::lock_guard<std::mutex> lGuard(gsSystemLock);
  arpSystem = gspSystem;
}

void setLogFilePath(char const* apFileName) {
  QN_ENTERED();
  QN_LOG_INFO("Log file name %s", apFileName);
  const char* lpDir = getenv("QN_LOG_DIR");
  if (lpDir != nullptr) {
    ClibSnprintf(gsLogFilePath, sizeof gsLogFilePath, "%s/%s", lpDir, apFileName);
  } else {
    ClibSnprintf(gsLogFilePath, sizeof gsLogFilePath, "/tmp/%s", apFileName);
  }
  QN_LOG_INFO("Set the log file path: %s", gsLogFilePath);
  QN_LEFT();
}

void getLogFilePath(QNCString& arPath) { arPath = QNCString(gsLogFilePath); }

void getLogDir(QNCString& arDir) {
  const char* lpDir = getenv("QN_LOG_DIR");
  arDir = QNCString(lpDir != nullptr ? lpDir : "/tmp");
}

void SysInit(int argc, char** argv) {
  QN_ENTERED();
  QN_ASSERT(0 != gspSystem);
  QNCString lLogFilePath("");
  gspSystem->preInit();
  gspSystem->processCommandLine(argc, argv);
  QNCString lConfFilePath(gspSystem->getConfFilePathStr());
  try {
    gspSystem->parseConfigFile(lConfFilePath);
  } catch (QNCNotImplementedEx&) {
    QN_LOG_ERROR("Config file parsing not implemented.");
  }
  gspSystem->applySettings();
  getLogFilePath(lLogFilePath);
  QN_LOG_TRACE("Creating the logger");
  CreateLogger(lLogFilePath);
  gspSystem->markAsRunning();
  QN_LOG_TRACE("Initializing the system data");
  gspSystem->init();
  QN_LOG_TRACE("Creating the threads");
  gspSystem->createThreads();
  gspSystem->startThreads();
  gspSystem->postThreadsInit();
  RegisterSignalHandler(2, handleSigInt);
  RegisterSignalHandler(15, handleSigTerm);
  RegisterSignalHandler(1, handleSigHup);
  gspSystem->createStartUpEvent();
  QN_LEFT();
}

void SysExit() {
  QN_ENTERED();
  QN_ASSERT(0 != gspSystem);
  QN_LOG_TRACE("Waiting for threads to exit...");
  gspSystem->waitForThreads();
  QN_LOG_INFO("All threads have gracefully exited");
  QN_LOG_TRACE("Going to unmark itself as singleton running process");
  gspSystem->exitInstanceManagement();
  QN_LOG_INFO("Destroying System");
  gspSystem->destroy();
  gspSystem->postDestroy();
  QNCSystem* lpSystem = nullptr;
  {
    std::lock_guard<std::mutex> lGuard(gsSystemLock);
    lpSystem = gspSystem;
    gspSystem = nullptr;
  }
  delete lpSystem;
  QN_LOG_INFO("Destroying the Logger. You won't see any more logs!");
  destroyLogger();
  QN_LEFT();
}

void SystemMain(int argc, char** argv) {
  QN_ENTERED();
  setLogCode(255);
  SysInit(argc, argv);
  SysExit();
  QN_LEFT();
}
