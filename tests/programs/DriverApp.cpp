// driver_app: a service built on the start-up and shut-down driver, for the process-level tests.
//
//   driver_app run [<requests>]     runs until <requests> exit requests (default 1) have arrived;
//                                   its parseConfigFile throws QNCNotImplementedEx, as a service
//                                   without a configuration file does
//   driver_app linger [<requests>]  as run, but parseConfigFile succeeds, and the process stays
//                                   alive for a second after SystemMain has returned
//   driver_app throw <step>         the named lifecycle step throws QNCExistsEx
//
// Every lifecycle operation is overridden and does not call the base operation, so what the
// tests see is the driver's sequence alone. Each operation logs "step <name>" (the log goes to
// $QN_LOG_DIR/driver_app.log) and writes "<name>" on its own line to standard output at once,
// so a test can follow the run while the log is still buffered. waitForThreads blocks until
// makeThreadsToExit has been called <requests> times, as a real service waits for its threads.
// main returns 0 after SystemMain, and 3 when SystemMain throws.

#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <cstdlib>
#include <mutex>
#include <string>
#include <thread>

#include "Logger.h"
#include "QNException.h"
#include "QNString.h"
#include "System.h"
#include "SystemGlobals.h"

namespace {

void mark(const std::string& acrText) {
  const std::string lLine = acrText + "\n";
  (void)!write(STDOUT_FILENO, lLine.data(), lLine.size());
}

class QNCDriverApp : public QNCSystem {
 public:
  QNCDriverApp(std::string aMode, std::string aFailingStep, unsigned int aExpectedRequests)
      : mMode(std::move(aMode)),
        mFailingStep(std::move(aFailingStep)),
        mExpectedRequests(aExpectedRequests) {}
  ~QNCDriverApp() override { step("destructor"); }

  void preInit() override { step("preInit"); }
  void processCommandLine(int, char**) override { step("processCommandLine"); }
  void parseConfigFile(QNCString&) override {
    step("parseConfigFile");
    if (mMode == "run") throw QNCNotImplementedEx("no configuration file", 0);
  }
  void applySettings() override { step("applySettings"); }
  void markAsRunning() override { step("markAsRunning"); }
  void init() override { step("init"); }
  void createThreads() override { step("createThreads"); }
  void startThreads() override { step("startThreads"); }
  void postThreadsInit() override { step("postThreadsInit"); }
  void createStartUpEvent() override {
    step("createStartUpEvent");
    mark("running");
  }
  void waitForThreads() override {
    step("waitForThreads");
    std::unique_lock<std::mutex> lLock(mRequestsLock);
    mRequestsChanged.wait(lLock, [this] { return mRequests >= mExpectedRequests; });
  }
  void exitInstanceManagement() override { step("exitInstanceManagement"); }
  void destroy() override { step("destroy"); }
  void postDestroy() override { step("postDestroy"); }

  // Runs on whichever thread handles the signal. It looks itself up as the service's own
  // threads do while they are being stopped.
  void makeThreadsToExit() override {
    QNCSystem* lpRegistered = nullptr;
    getSystemObject(lpRegistered);
    QN_LOG_NOTICE("step makeThreadsToExit");
    unsigned int lRequests = 0;
    {
      std::lock_guard<std::mutex> lGuard(mRequestsLock);
      lRequests = ++mRequests;
    }
    mRequestsChanged.notify_all();
    mark("exit request " + std::to_string(lRequests) + (lpRegistered == this ? " self" : " other"));
  }

  void setCommandLineArgumentDesc() override {}
  void displayHelp() override {}

 private:
  void step(const char* apName) {
    QN_LOG_NOTICE("step %s", apName);
    mark(apName);
    if (mFailingStep == apName) throw QNCExistsEx((std::string("injected failure in ") + apName).c_str(), 10);
  }

  const std::string mMode;
  const std::string mFailingStep;
  const unsigned int mExpectedRequests;
  std::mutex mRequestsLock;  // guards mRequests
  std::condition_variable mRequestsChanged;
  unsigned int mRequests = 0;
};

}  // namespace

int main(int argc, char** argv) {
  const std::string lMode = argc > 1 ? argv[1] : "run";
  const std::string lFailingStep = lMode == "throw" && argc > 2 ? argv[2] : "";
  const unsigned int lRequests = lMode != "throw" && argc > 2 ? static_cast<unsigned int>(atoi(argv[2])) : 1;
  try {
    setSystemObject(new QNCDriverApp(lMode, lFailingStep, lRequests));
    setLogFilePath("driver_app.log");
    SystemMain(argc, argv);
  } catch (const QNCException& acrException) {
    mark(std::string("SystemMain threw: ") + acrException.what());
    return 3;
  }
  mark("SystemMain returned");
  if (lMode == "linger") {
    // The tests send signals now; with their default effect any of them would end the process.
    std::this_thread::sleep_for(std::chrono::seconds(1));
    mark("lingered");
  }
  return 0;
}
