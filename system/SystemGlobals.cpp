#include "SystemGlobals.h"

#include <atomic>
#include <cstdlib>
#include <mutex>

#include "Assert.h"
#include "Clib.h"
#include "DaemonStart.h"
#include "Logger.h"
#include "OsService.h"
#include "QNException.h"
#include "QNString.h"
#include "RunStatus.h"
#include "ServiceNotifier.h"
#include "SignalHandler.h"
#include "System.h"

namespace {
// The registered object. Any thread may read it (getSystemObject, the handlers on the signal
// dispatcher thread); the main thread writes it before the handlers exist and in SysExit. Atomic,
// so that reading it needs no lock.
std::atomic<QNCSystem*> gspSystem{nullptr};
// Keeps SysExit from destroying the object while a handler is inside makeThreadsToExit: SysExit
// clears gspSystem under it before the destruction begins, so a later handler finds no object.
// It is never taken by getSystemObject: the application's threads, and its own makeThreadsToExit,
// look the object up while an exit request is being handled, and would deadlock on it.
std::mutex gsExitRequestLock;
char gsLogFilePath[512] = {0};

void requestExit() {
  std::lock_guard<std::mutex> lGuard(gsExitRequestLock);
  QNCSystem* lpSystem = gspSystem.load();
  if (lpSystem == nullptr) return;
  QNCServiceNotifier::instance().notifyStopping();
  lpSystem->makeThreadsToExit();
}

// Logs the tolerated "no configuration file" line at its error level, to the log only: it is not
// a failure, and on the terminal of a start that succeeds it would read as one. Descriptor 2 is
// moved aside for the one call (start-up runs on the main thread alone at this point).
void logConfigFileNotImplemented() {
  const int lStderr = OsCopyDescriptor(2);
  const bool lMoved = lStderr >= 0 && OsNullDescriptor(2);
  QN_LOG_ERROR("Config file parsing not implemented.");
  if (lMoved) OsReplaceDescriptor(lStderr, 2);
  OsCloseDescriptor(lStderr);
}

void handleSigInt(int) { requestExit(); }
void handleSigTerm(int) { requestExit(); }
void handleSigHup(int) { requestExit(); }
}  // namespace

void setSystemObject(QNCSystem* apSystem) {
  QN_ASSERT(0UL != apSystem);
  gspSystem.store(apSystem);
  // A thread that dies starts the orderly exit the way a signal does (RunStatus.h).
  QNSetExitRequest(requestExit);
}

void getSystemObject(QNCSystem*& arpSystem) { arpSystem = gspSystem.load(); }

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
  QNCSystem* const lpSystem = gspSystem.load();
  QNCString lLogFilePath("");
  lpSystem->preInit();
  lpSystem->processCommandLine(argc, argv);
  QNCString lConfFilePath(lpSystem->getConfFilePathStr());
  try {
    lpSystem->parseConfigFile(lConfFilePath);
  } catch (QNCNotImplementedEx&) {
    logConfigFileNotImplemented();
  }
  lpSystem->applySettings();
  getLogFilePath(lLogFilePath);
  QN_LOG_TRACE("Creating the logger");
  CreateLogger(lLogFilePath);
  lpSystem->markAsRunning();
  QN_LOG_TRACE("Initializing the system data");
  lpSystem->init();
  QN_LOG_TRACE("Creating the threads");
  lpSystem->createThreads();
  lpSystem->startThreads();
  // A thread that died while later ones were still being started asked for an exit that those
  // could not receive yet; asked again now, it reaches every thread.
  if (QNHasRunFailed()) requestExit();
  lpSystem->postThreadsInit();
  RegisterSignalHandler(2, handleSigInt);
  RegisterSignalHandler(15, handleSigTerm);
  RegisterSignalHandler(1, handleSigHup);
  lpSystem->createStartUpEvent();
  QN_LEFT();
}

void SysExit() {
  QN_ENTERED();
  QN_ASSERT(0 != gspSystem);
  QNCSystem* const lpSystem = gspSystem.load();
  QN_LOG_TRACE("Waiting for threads to exit...");
  lpSystem->waitForThreads();
  QNCServiceNotifier& lrNotifier = QNCServiceNotifier::instance();
  lrNotifier.stopWatchdog();
  lrNotifier.notifyStopping();  // once only: the signal that asked for the exit may have sent it
  QN_LOG_INFO("All threads have gracefully exited");
  QN_LOG_TRACE("Going to unmark itself as singleton running process");
  lpSystem->exitInstanceManagement();
  QN_LOG_INFO("Destroying System");
  lpSystem->destroy();
  lpSystem->postDestroy();
  {
    std::lock_guard<std::mutex> lGuard(gsExitRequestLock);
    gspSystem.store(nullptr);
  }
  delete lpSystem;
  lrNotifier.send("STATUS=Stopped");
  QN_LOG_INFO("Destroying the Logger. You won't see any more logs!");
  destroyLogger();
  QN_LEFT();
}

int getRunExitStatus() { return QNHasRunFailed() ? 1 : 0; }

bool hasRunFailed() { return QNHasRunFailed(); }

void SystemMain(int argc, char** argv) {
  QN_ENTERED();
  setLogCode(255);
  QNCServiceNotifier& lrNotifier = QNCServiceNotifier::instance();
  lrNotifier.send("STATUS=Starting");
  QNCDaemonStart::arm();
  try {
    SysInit(argc, argv);
  } catch (...) {
    // The daemon tells its starting command why (nothing happens in any other process), and the
    // exception goes on unchanged.
    QNCDaemonStart::reportFailure(QNCurrentExceptionText());
    throw;
  }
  // READY=1 first: whoever hears that the starting command ended can count on it being sent.
  lrNotifier.send("READY=1\nSTATUS=Running");
  QNCDaemonStart::reportReady();
  QNCSystem* lpSystem = nullptr;
  getSystemObject(lpSystem);
  lrNotifier.startWatchdog(lpSystem);
  SysExit();
  QN_LEFT();
}
