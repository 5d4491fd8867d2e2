// Daemonizing and the exit-aware sleep of QNCSystem.
//
// Unlike the rest of system/, this file makes a few POSIX calls itself (umask, getrlimit, fork,
// setsid, sigemptyset, sigaction, close): they change the calling process in ways the service
// layer has no wrapper for.
//
// When SystemMain runs it, the daemon keeps one descriptor pair open through "close every
// descriptor": the channel on which it tells the starting command how start-up ended
// (DaemonStart.h). While start-up runs its descriptor 2 is that channel; afterwards acStdErr.

#include <fcntl.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <utility>

#include "Assert.h"
#include "Clib.h"
#include "DaemonStart.h"
#include "Logger.h"
#include "QNException.h"
#include "System.h"

namespace {
constexpr unsigned long kErrorTextSize = 512;
constexpr rlim_t kUnlimitedDescriptors = 1024;
constexpr int kRedirectFlags = O_WRONLY | O_CREAT | O_APPEND;
constexpr int kRedirectMode = 0600;
constexpr unsigned int kExitCheckStep = 5;

// Closes aFirst .. aLast, or up to aLimit - 1 when close_range() is refused.
// The hard limit can be a million or more in containers, where a close() per descriptor takes
// noticeable time, so a span goes in one close_range() call; a kernel or sandbox that refuses it
// gets the plain loop. Results are ignored: most of these descriptors are not open.
void closeSpan(unsigned int aFirst, unsigned int aLast, rlim_t aLimit) {
  if (aFirst > aLast) return;
#if defined(__GLIBC__) && (__GLIBC__ > 2 || (__GLIBC__ == 2 && __GLIBC_MINOR__ >= 34))
  if (close_range(aFirst, aLast, 0) == 0) return;
#endif
  for (rlim_t lFd = aFirst; lFd <= aLast && lFd < aLimit; ++lFd) close(static_cast<int>(lFd));
}

// Closes descriptors 0 .. aLimit - 1 (and any above, which can exist when the limit was lowered
// after they were opened), except the daemon's start channel (DaemonStart.h): aKeepLow and
// aKeepHigh, -1 when there is none, else at least 3 and aKeepLow < aKeepHigh.
void closeAllDescriptors(rlim_t aLimit, int aKeepLow, int aKeepHigh) {
  for (int lFd = 0; lFd < 3 && static_cast<rlim_t>(lFd) < aLimit; ++lFd) close(lFd);
  if (aLimit <= 3) return;
  unsigned int lFirst = 3;
  for (const int lKeep : {aKeepLow, aKeepHigh}) {
    if (lKeep < 0) continue;
    closeSpan(lFirst, static_cast<unsigned int>(lKeep) - 1, aLimit);
    lFirst = static_cast<unsigned int>(lKeep) + 1;
  }
  closeSpan(lFirst, ~0U, aLimit);
}

// The parent's side of a fork: it leaves start-up by this exception, the child goes on.
[[noreturn]] void leaveAsParent(bool aStarting) {
  QNCDaemonStart::enterParent(aStarting);  // before the halt line: a start that succeeds is quiet
  QN_LOG_HALT("Time for parent process to quit");
  QN_LEFT();
  throw QNCParentExitEx("Time for parent process to quit", 19);
}

// fork() with the failure and parent handling both forks share; returns only in the child.
void forkAndLeaveParent(char* apErrorText, bool aStarting) {
  QN_LOG_TRACE("Going to fork ");
  const pid_t lPid = fork();
  if (lPid < 0) {
    ClibStrerror(apErrorText, kErrorTextSize);
    QN_LOG_ERROR("can't fork :%s", apErrorText);
    QN_LEFT();
    throw QNCProcessCreationFailedEx(apErrorText, 345);
  }
  if (lPid > 0) leaveAsParent(aStarting);
}
}  // namespace

void QNCSystem::systemDaemonize(QNCString acDir, QNCString acStdIn, QNCString acStdOut, QNCString acStdErr) {
  QN_ENTERED();
  char lErrorText[kErrorTextSize];
  QN_LOG_INFO("The process will be run as a daemon");
  umask(0);

  struct rlimit lLimit;
  if (getrlimit(RLIMIT_NOFILE, &lLimit) < 0) {
    ClibStrerror(lErrorText, sizeof lErrorText);
    QN_LOG_ERROR("can't get file limit :%s", lErrorText);
    QN_LEFT();
    throw QNCExitConditionEx(lErrorText, 19);
  }

  // Before the first fork, so that the starting command holds its end (SystemMain arms it).
  QNCDaemonStart::openChannel();
  forkAndLeaveParent(lErrorText, true);

  QN_LOG_INFO("Creating a new session for the process and making it session leader");
  setsid();  // cannot fail here: the child of a fork is never a process group leader

  QN_LOG_TRACE("Setting SIGHUP to ignore ");
  struct sigaction lIgnore = {};
  lIgnore.sa_handler = SIG_IGN;
  sigemptyset(&lIgnore.sa_mask);
  lIgnore.sa_flags = 0;
  if (sigaction(SIGHUP, &lIgnore, nullptr) < 0) {
    ClibStrerror(lErrorText, sizeof lErrorText);
    QN_LOG_ERROR("can't set SIGHUP to be  ignored :%s", lErrorText);
    QN_LEFT();
    throw QNCExitConditionEx(lErrorText, 19);
  }

  // The session leader stays behind as the parent, so the daemon can never again acquire a
  // controlling terminal by opening one.
  forkAndLeaveParent(lErrorText, false);

  QN_ASSERT(acDir.isEmpty() == false);
  ClibChdir(acDir.get());

  const rlim_t lDescriptorLimit = lLimit.rlim_max == RLIM_INFINITY ? kUnlimitedDescriptors : lLimit.rlim_max;
  QN_LOG_TRACE("Closing all the file descriptors");
  int lKeepLow = -1;
  int lKeepHigh = -1;
  QNCDaemonStart::getKeptDescriptors(lKeepLow, lKeepHigh);
  if (lKeepLow > lKeepHigh) std::swap(lKeepLow, lKeepHigh);
  closeAllDescriptors(lDescriptorLimit, lKeepLow, lKeepHigh);

  // With every descriptor closed, open() hands out the lowest free numbers: 0, 1 and 2.
  int lStdIn = -1;
  int lStdOut = -1;
  int lStdErr = -1;
  try {
    lStdIn = ClibOpen(acStdIn.get(), O_RDONLY, 0);
    lStdOut = ClibOpen(acStdOut.get(), kRedirectFlags, kRedirectMode);
    lStdErr = ClibOpen(acStdErr.get(), kRedirectFlags, kRedirectMode);
  } catch (QNCOpenFailedEx&) {
    throw QNCExitConditionEx("Cannot redirect stdin/stdout/stderr", 19);
  }
  if (lStdIn != 0 || lStdOut != 1 || lStdErr != 2) {
    ClibStrerror(lErrorText, sizeof lErrorText);
    throw QNCExitConditionEx(lErrorText, 19);
  }
  QNCDaemonStart::enterDaemon();
  QN_LEFT();
}

void QNCSystem::waitAndCheckExit(unsigned int aSeconds) {
  QN_ENTERED();
  unsigned int lStepLength = kExitCheckStep;
  unsigned int lRemainder = 0;
  unsigned int lSteps = 1;
  if (aSeconds > kExitCheckStep) {
    lSteps = aSeconds / kExitCheckStep;
    lRemainder = aSeconds % kExitCheckStep;
  } else {
    lStepLength = aSeconds;
  }
  for (unsigned int lStep = 0; lStep < lSteps; ++lStep) {
    ClibSleep(lStepLength);
    if (isSetForExit()) {
      QN_LOG_NOTICE("Process is marked for exit.");
      throw QNCHaltEx("Process is marked for exit.", 1);
    }
  }
  if (lRemainder != 0) ClibSleep(lRemainder);
  if (isSetForExit()) {
    QN_LOG_NOTICE("Process is marked for exit.");
    throw QNCHaltEx("Process is marked for exit.", 1);
  }
  QN_LEFT();
}
