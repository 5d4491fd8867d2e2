// qn_daemon_probe: daemonizes through QNCSystem::systemDaemonize and reports what the daemon
// sees, for the daemonizing tests.
//
//   qn_daemon_probe <report-file> <go-file>
//
// Before daemonizing it leaves two descriptors open that the daemon must not inherit: an
// ordinary one and one at the top of the allowed range. The starting process and the first
// child leave with QNCParentExitEx (exit status 0). The daemon waits until <go-file> exists (so
// the test can see the starting process end first), then writes lines "key=value" and a last
// line "done" to <report-file>, and exits 0.

#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <string>
#include <thread>

#include "QNException.h"
#include "programs/TestSystem.h"

namespace {
std::string linkTarget(const std::string& acrPath) {
  char lTarget[4096];
  const ssize_t lLength = readlink(acrPath.c_str(), lTarget, sizeof lTarget - 1);
  return lLength < 0 ? std::string("(closed)") : std::string(lTarget, static_cast<size_t>(lLength));
}

// Descriptors open besides 0, 1 and 2, as a comma-separated list ("" when none).
std::string otherDescriptors() {
  std::string lList;
  DIR* lpDir = opendir("/proc/self/fd");
  if (lpDir == nullptr) return "(unreadable)";
  const int lOwnFd = dirfd(lpDir);
  while (const dirent* lpEntry = readdir(lpDir)) {
    if (lpEntry->d_name[0] == '.') continue;
    const int lFd = std::stoi(lpEntry->d_name);
    if (lFd <= 2 || lFd == lOwnFd) continue;
    lList += (lList.empty() ? "" : ",") + std::to_string(lFd);
  }
  closedir(lpDir);
  return lList;
}

void report(const char* apReportPath) {
  char lCwd[4096] = "(unknown)";
  if (getcwd(lCwd, sizeof lCwd) == nullptr) snprintf(lCwd, sizeof lCwd, "(unknown)");
  const mode_t lMask = umask(0);
  struct sigaction lHup = {};
  sigaction(SIGHUP, nullptr, &lHup);
  const std::string lOthers = otherDescriptors();

  const std::string lTemporary = std::string(apReportPath) + ".tmp";
  FILE* lpOut = fopen(lTemporary.c_str(), "w");
  if (lpOut == nullptr) return;
  fprintf(lpOut, "pid=%d\nppid=%d\nsid=%d\ncwd=%s\numask=%o\nsighup=%s\n", static_cast<int>(getpid()),
          static_cast<int>(getppid()), static_cast<int>(getsid(0)), lCwd, static_cast<unsigned int>(lMask),
          lHup.sa_handler == SIG_IGN ? "ignored" : "other");
  for (int lFd = 0; lFd <= 2; ++lFd) {
    fprintf(lpOut, "fd%d=%s\n", lFd, linkTarget("/proc/self/fd/" + std::to_string(lFd)).c_str());
  }
  fprintf(lpOut, "others=%s\ndone\n", lOthers.c_str());
  fclose(lpOut);
  rename(lTemporary.c_str(), apReportPath);  // the test never sees half a report
}
}  // namespace

int main(int argc, char** argv) {
  if (argc != 3) {
    fprintf(stderr, "usage: qn_daemon_probe <report-file> <go-file>\n");
    return 2;
  }
  const int lInherited = open("/dev/null", O_RDONLY);
  struct rlimit lLimit;
  getrlimit(RLIMIT_NOFILE, &lLimit);
  if (lInherited >= 0) dup2(lInherited, static_cast<int>(lLimit.rlim_cur - 1));

  try {
    QNCTestSystem lSystem;
    lSystem.systemDaemonize("/", "/dev/null", "/dev/null", "/dev/null");
    // Bounded, so a test that fails before creating the file leaves no daemon behind for long.
    for (int lTry = 0; lTry < 3000 && access(argv[2], F_OK) != 0; ++lTry) {
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    report(argv[1]);
  } catch (const QNCParentExitEx&) {
    return 0;
  } catch (const QNCException& acrException) {
    fprintf(stderr, "error: %s (code %u)\n", acrException.what(), acrException.getCode());
    return 1;
  }
  return 0;
}
