// qn_test_helper: the one program the process-level tests start. The first argument picks a mode:
//
//   hold <pid-file> <log> [go-file]   mark this process as the running instance (after go-file
//                                     exists), probe its own PID file (which opens and closes it),
//                                     print "running <pid>", wait for SIGTERM, release, exit 0
//   hold-stubborn <pid-file> <log>    as hold, but SIGTERM is ignored: only SIGKILL ends it
//   kill <pid-file> <log>             stop the running instance recorded in the file
//   log-exit <log>, log-crash <log> <signal>
//                                     one logger scenario that needs a process of its own
//   run|linger [<requests>]
//                                     a service on the start-up and shut-down driver (see Driver)
//
// A QNCException is printed to standard error as "error: <message> (code <n>)", exit status 1.

#include <signal.h>
#include <sys/mman.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <string>
#include <thread>

#include "Logger.h"
#include "SystemGlobals.h"
#include "TableSystem.h"

namespace {

void say(const std::string& acrText) {
  const std::string lLine = acrText + "\n";
  (void)!write(STDOUT_FILENO, lLine.data(), lLine.size());
}

int instance(const std::string& acrMode, int argc, char** argv) {
  // SIGTERM is blocked before any thread exists, so only sigwait() below ever takes it.
  sigset_t lTerm;
  sigemptyset(&lTerm);
  sigaddset(&lTerm, SIGTERM);
  if (acrMode == "hold-stubborn") {
    signal(SIGTERM, SIG_IGN);
  } else {
    sigprocmask(SIG_BLOCK, &lTerm, nullptr);
  }
  CreateLogger(QNCString(argv[3]));
  qntest::TableSystem lSystem(0, 0, 0);
  lSystem.usePidFile(argv[2]);
  // Bounded, so a test that fails before creating the go-file leaves nothing behind for long.
  for (int lTry = 0; argc > 4 && lTry < 3000 && access(argv[4], F_OK) != 0; ++lTry)
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  if (acrMode == "kill") {
    lSystem.killRunningInstance();
  } else {
    lSystem.markAsRunning();
    lSystem.getProcStatus(QNCString(argv[2]));
    say("running " + std::to_string(getpid()));
    if (acrMode == "hold-stubborn")
      for (;;) pause();
    int lSignal = 0;
    sigwait(&lTerm, &lSignal);
    lSystem.exitInstanceManagement();
    say("stopped");
  }
  destroyLogger();
  return 0;
}

int logger(const std::string& acrMode, int argc, char** argv) {
  const char* lpLog = argv[2];
  if (acrMode == "log-exit") {
    // exit(1) with lines buffered while another thread keeps logging.
    CreateLogger(lpLog);
    std::atomic<bool> lStarted{false};
    std::thread([&lStarted] {
      for (unsigned long lCount = 0;; ++lCount) {
        QN_LOG_INFO("noise %lu", lCount);
        lStarted.store(true);
      }
    }).detach();
    while (!lStarted.load()) std::this_thread::yield();
    for (int lIndex = 0; lIndex < 1000; ++lIndex) QN_LOG_TRACE("line %d", lIndex);
    exit(1);
  }
  if (acrMode == "log-crash" && argc > 3) {
    CreateLogger(lpLog);
    for (int lIndex = 0; lIndex < 100; ++lIndex) QN_LOG_TRACE("line %d", lIndex);
    QN_LOG_INFO("last line before the crash");
    const int lSignal = atoi(argv[3]);
    if (lSignal == SIGSEGV) {
      // A real fault on a page without access (not a null pointer, which UBSan would catch first).
      void* lpPage = mmap(nullptr, 4096, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
      if (lpPage != MAP_FAILED) *static_cast<volatile int*>(lpPage) = 1;
    }
    if (lSignal == SIGABRT) abort();
    raise(lSignal);
    return 4;  // the signal did not end the process
  }
  return 2;
}

// A service built on the start-up and shut-down driver. Every lifecycle operation is overridden
// without calling the base, so the tests see the driver's sequence alone. Each logs "step <name>"
// ($QN_LOG_DIR/driver_app.log) and prints "<name>" at once. "run": parseConfigFile throws
// QNCNotImplementedEx as a service without a configuration file does; "linger": it succeeds and
// the process lives a second past SystemMain.
// waitForThreads blocks until makeThreadsToExit has been called <requests> times.
class Driver : public qntest::TableSystem {
 public:
  Driver(std::string aMode, unsigned int aRequests)
      : TableSystem(0, 0, 0), mMode(std::move(aMode)), mExpected(aRequests) {}
  ~Driver() override { step("destructor"); }

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
    say("running");
  }
  void waitForThreads() override {
    step("waitForThreads");
    std::unique_lock<std::mutex> lLock(mLock);
    mChanged.wait(lLock, [this] { return mRequests >= mExpected; });
  }
  void exitInstanceManagement() override { step("exitInstanceManagement"); }
  void destroy() override { step("destroy"); }
  void postDestroy() override { step("postDestroy"); }
  // Runs on whichever thread handles the signal; looks itself up as a service's threads do.
  void makeThreadsToExit() override {
    QNCSystem* lpRegistered = nullptr;
    getSystemObject(lpRegistered);
    QN_LOG_NOTICE("step makeThreadsToExit");
    unsigned int lRequests = 0;
    {
      std::lock_guard<std::mutex> lGuard(mLock);
      lRequests = ++mRequests;
    }
    mChanged.notify_all();
    say("exit request " + std::to_string(lRequests) + (lpRegistered == this ? " self" : " other"));
  }

 private:
  void step(const char* apName) {
    QN_LOG_NOTICE("step %s", apName);
    say(apName);
  }

  const std::string mMode;
  const unsigned int mExpected;
  std::mutex mLock;  // guards mRequests
  std::condition_variable mChanged;
  unsigned int mRequests = 0;
};

int driver(const std::string& acrMode, int argc, char** argv) {
  setSystemObject(new Driver(acrMode, argc > 2 ? static_cast<unsigned int>(atoi(argv[2])) : 1));
  setLogFilePath("driver_app.log");
  SystemMain(argc, argv);
  say("SystemMain returned");
  QN_LOG_TRACE("dropped: the log is closed");
  QN_LOG_ERROR("urgent after the log was closed");  // still reaches standard error
  if (acrMode == "linger") {
    // The tests send signals now; with their default effect any of them would end the process.
    std::this_thread::sleep_for(std::chrono::seconds(1));
    say("lingered");
  }
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  const std::string lMode = argc > 1 ? argv[1] : "";
  try {
    if ((lMode == "hold" || lMode == "hold-stubborn" || lMode == "kill") && argc > 3)
      return instance(lMode, argc, argv);
    if (lMode.compare(0, 4, "log-") == 0 && argc > 2) return logger(lMode, argc, argv);
    if (lMode == "run" || lMode == "linger") return driver(lMode, argc, argv);
  } catch (const QNCException& acrException) {
    fprintf(stderr, "error: %s (code %u)\n", acrException.what(), acrException.getCode());
    return 1;
  }
  fprintf(stderr, "usage: see tests/programs/TestHelper.cpp\n");
  return 2;
}
