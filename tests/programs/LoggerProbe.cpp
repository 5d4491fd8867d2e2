// Runs one logger scenario that needs a process of its own: the start-up state before
// CreateLogger, fork, exit and crash. The tests read the log and the exit status afterwards.
//
//   LoggerProbe startup <log>        lines before CreateLogger, with the mask changed before it opens
//   LoggerProbe daemon <log>         lines before a fork; only the child opens the log
//   LoggerProbe exit <log>           exit(1) by a failed assertion while another thread logs
//   LoggerProbe crash <log> <signal> buffered lines, then a crash by that signal
//   LoggerProbe badpath <log>        CreateLogger on a path that cannot be opened

#include <signal.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <thread>

#include "Assert.h"
#include "Logger.h"
#include "QNString.h"

namespace {

int runStartup(const char* apLog) {
  QN_LOG_TRACE("early trace %d", 1);
  QN_LOG_INFO("early info %d", 2);
  QN_LOG_ERROR("early error %d", 3);
  QN_LOG_WARNING("early warning %d", 4);
  setLogCode(255 & ~static_cast<unsigned int>(QNLL_Info));  // as -d would, before the log opens
  CreateLogger(apLog);
  QN_LOG_NOTICE("after open %d", 5);
  destroyLogger();
  QN_LOG_TRACE("after destroy %d", 6);
  QN_LOG_ERROR("after destroy %d", 7);
  return 0;
}

int runDaemon(const char* apLog) {
  QN_LOG_TRACE("before fork in %d", static_cast<int>(getpid()));
  const pid_t lChild = fork();
  if (lChild < 0) return 2;
  if (lChild > 0) {
    int lStatus = 0;
    waitpid(lChild, &lStatus, 0);
    return WIFEXITED(lStatus) ? WEXITSTATUS(lStatus) : 3;
  }
  CreateLogger(apLog);
  QN_LOG_NOTICE("child opened the log");
  destroyLogger();
  return 0;
}

int runExit(const char* apLog) {
  CreateLogger(apLog);
  std::atomic<bool> lStarted{false};
  std::thread([&lStarted] {
    for (unsigned long lCount = 0;; ++lCount) {
      QN_LOG_INFO("noise %lu", lCount);
      lStarted.store(true);
    }
  }).detach();
  while (!lStarted.load()) std::this_thread::yield();
  for (int lIndex = 0; lIndex < 1000; ++lIndex) QN_LOG_TRACE("line %d", lIndex);
  QN_ASSERT(lStarted.load() == false);
  return 0;
}

[[noreturn]] void crashBy(int aSignal) {
  switch (aSignal) {
    case SIGSEGV: {
      // A real fault on a page without access (not a null pointer, which UBSan would catch first).
      void* lpPage = mmap(nullptr, 4096, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
      if (lpPage == MAP_FAILED) break;
      *static_cast<volatile int*>(lpPage) = 1;
      break;
    }
    case SIGABRT:
      abort();
    default:
      raise(aSignal);
  }
  _exit(4);  // the signal did not end the process
}

int runCrash(const char* apLog, int aSignal) {
  CreateLogger(apLog);
  for (int lIndex = 0; lIndex < 100; ++lIndex) QN_LOG_TRACE("line %d", lIndex);
  QN_LOG_INFO("last line before the crash");
  crashBy(aSignal);
}

int runBadPath(const char* apLog) {
  CreateLogger(apLog);
  QN_LOG_INFO("still here");
  printf("went on\n");
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 3) return 2;
  const char* lpMode = argv[1];
  if (strcmp(lpMode, "startup") == 0) return runStartup(argv[2]);
  if (strcmp(lpMode, "daemon") == 0) return runDaemon(argv[2]);
  if (strcmp(lpMode, "exit") == 0) return runExit(argv[2]);
  if (strcmp(lpMode, "crash") == 0 && argc > 3) return runCrash(argv[2], atoi(argv[3]));
  if (strcmp(lpMode, "badpath") == 0) return runBadPath(argv[2]);
  return 2;
}
