#include "OsSignal.h"

#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>

#include "OsError.h"

int OsSetSignalHandler(int aSignal, void (*apHandler)(int)) noexcept {
  struct sigaction lAction = {};
  lAction.sa_handler = apHandler;
  sigemptyset(&lAction.sa_mask);
  lAction.sa_flags = SA_RESTART | SA_ONSTACK;
  return sigaction(aSignal, &lAction, nullptr) == 0 ? 0 : errno;
}

void OsRaiseWithDefaultAction(int aSignal) noexcept {
  const int lSavedErrno = errno;
  struct sigaction lDefault = {};
  lDefault.sa_handler = SIG_DFL;
  sigemptyset(&lDefault.sa_mask);
  sigaction(aSignal, &lDefault, nullptr);
  raise(aSignal);
  errno = lSavedErrno;  // when the signal's default is to be ignored, the interrupted code goes on
}

void OsCreateSignalPipe(int& arReadFd, int& arWriteFd) {
  int lPipe[2];
  if (pipe2(lPipe, O_CLOEXEC) != 0) OsThrowError<QNCOsException>(errno, "pipe2");
  if (fcntl(lPipe[1], F_SETFL, O_NONBLOCK) != 0) {
    const int lErrno = errno;
    close(lPipe[0]);
    close(lPipe[1]);
    OsThrowError<QNCOsException>(lErrno, "fcntl O_NONBLOCK");
  }
  arReadFd = lPipe[0];
  arWriteFd = lPipe[1];
}
