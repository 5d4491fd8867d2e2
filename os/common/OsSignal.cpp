#include "OsSignal.h"

#include <signal.h>
#include <unistd.h>

#include <cerrno>

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
