// qn_instance_tool: one process acting on a PID file, for the instance-manager tests.
//
//   qn_instance_tool <action> <pid-file> <log-file> [--go <file>] [--probe-own]
//
//   hold         mark this process as the running instance, print "running", wait for SIGTERM,
//                release the instance and exit 0
//   hold-stubborn  as hold, but SIGTERM is ignored: only SIGKILL ends it
//   kill         stop the running instance recorded in the file, exit 0 when that returns
//
//   --go <file>  wait until the file exists before acting (to start many tools at one moment)
//   --probe-own  after marking, ask getProcStatus() about this instance's own PID file
//
// A QNCException is printed to standard error as "error: <message> (code <n>)", exit status 1.

#include <signal.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstring>
#include <string>
#include <thread>

#include "Logger.h"
#include "QNException.h"
#include "QNString.h"
#include "programs/TestSystem.h"

namespace {
void waitForFile(const char* apPath) {
  // Bounded, so a test that fails before creating the file does not leave this process behind.
  for (int lTry = 0; lTry < 30000 && access(apPath, F_OK) != 0; ++lTry) {
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
}

void waitForSigTerm() {
  sigset_t lSet;
  sigemptyset(&lSet);
  sigaddset(&lSet, SIGTERM);
  int lSignal = 0;
  sigwait(&lSet, &lSignal);
}

void say(const char* apText) {
  printf("%s %d\n", apText, static_cast<int>(getpid()));
  fflush(stdout);
}
}  // namespace

int main(int argc, char** argv) {
  if (argc < 4) {
    fprintf(stderr, "usage: qn_instance_tool <action> <pid-file> <log-file> [--go <file>] [--probe-own]\n");
    return 2;
  }
  const std::string lAction = argv[1];
  const char* lpGoFile = nullptr;
  bool lProbeOwn = false;
  for (int lArg = 4; lArg < argc; ++lArg) {
    if (strcmp(argv[lArg], "--go") == 0 && lArg + 1 < argc) lpGoFile = argv[++lArg];
    if (strcmp(argv[lArg], "--probe-own") == 0) lProbeOwn = true;
  }

  // Blocked before any thread exists (the logger may start one), so every thread inherits the
  // mask and SIGTERM is only ever taken by sigwait() below.
  sigset_t lTerm;
  sigemptyset(&lTerm);
  sigaddset(&lTerm, SIGTERM);
  if (lAction == "hold-stubborn") {
    signal(SIGTERM, SIG_IGN);
  } else {
    sigprocmask(SIG_BLOCK, &lTerm, nullptr);
  }

  CreateLogger(QNCString(argv[3]));
  int lStatus = 0;
  try {
    QNCTestSystem lSystem(argv[2]);
    if (lpGoFile != nullptr) waitForFile(lpGoFile);
    if (lAction == "hold" || lAction == "hold-stubborn") {
      lSystem.markAsRunning();
      if (lProbeOwn) lSystem.getProcStatus(QNCString(argv[2]));
      say("running");
      if (lAction == "hold") {
        waitForSigTerm();
        lSystem.exitInstanceManagement();
        say("stopped");
      } else {
        for (;;) pause();
      }
    } else if (lAction == "kill") {
      lSystem.killRunningInstance();
      say("kill returned");
    } else {
      fprintf(stderr, "unknown action '%s'\n", lAction.c_str());
      lStatus = 2;
    }
  } catch (const QNCException& acrException) {
    fprintf(stderr, "error: %s (code %u)\n", acrException.what(), acrException.getCode());
    lStatus = 1;
  }
  destroyLogger();
  return lStatus;
}
