#include "OsService.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstring>

#include "OsError.h"
#include "OsStream.h"

namespace {
constexpr int kFirstFreeDescriptor = 3;

// Moves a fresh descriptor to 3 or above, close-on-exec; the original is closed either way.
int moveAboveStandard(int aFd) {
  if (aFd >= kFirstFreeDescriptor) return aFd;
  const int lMoved = fcntl(aFd, F_DUPFD_CLOEXEC, kFirstFreeDescriptor);
  const int lErrno = errno;
  close(aFd);
  errno = lErrno;
  return lMoved;
}
}  // namespace

void OsOpenStartChannel(int& arReadFd, int& arWriteFd) {
  int lEnds[2];
  OsOpenWakePipe(lEnds[0], lEnds[1]);
  lEnds[0] = moveAboveStandard(lEnds[0]);
  // The copies keep O_NONBLOCK: it belongs to the open pipe, not to the descriptor number.
  lEnds[1] = moveAboveStandard(lEnds[1]);
  if (lEnds[0] < 0 || lEnds[1] < 0) {
    const int lErrno = errno;
    OsCloseDescriptor(lEnds[0]);
    OsCloseDescriptor(lEnds[1]);
    OsThrowError<QNCOsException>(lErrno, "start channel");
  }
  arReadFd = lEnds[0];
  arWriteFd = lEnds[1];
}

int OsCopyDescriptor(int aFd) noexcept { return fcntl(aFd, F_DUPFD_CLOEXEC, kFirstFreeDescriptor); }

bool OsReplaceDescriptor(int aSource, int aTarget) noexcept { return dup2(aSource, aTarget) >= 0; }

bool OsNullDescriptor(int aTarget) noexcept {
  const int lNull = open("/dev/null", O_RDWR | O_CLOEXEC);
  if (lNull < 0) return false;
  const bool lDone = lNull == aTarget || OsReplaceDescriptor(lNull, aTarget);
  // open() may have returned aTarget itself (it was closed): then it must stay open, and
  // inheritable like any standard descriptor.
  if (lNull != aTarget) {
    close(lNull);
  } else {
    fcntl(aTarget, F_SETFD, 0);
  }
  return lDone;
}

void OsCloseDescriptor(int aFd) noexcept {
  if (aFd >= 0) close(aFd);
}

int OsSendDatagram(const char* apAddress, const char* apData, unsigned long aLength) noexcept {
  struct sockaddr_un lAddress = {};
  lAddress.sun_family = AF_UNIX;
  const size_t lNameLength = strlen(apAddress);
  if (lNameLength == 0 || lNameLength >= sizeof lAddress.sun_path) return ENAMETOOLONG;
  memcpy(lAddress.sun_path, apAddress, lNameLength);
  // An abstract name starts with a NUL byte in place of the '@' and is exactly as long as given.
  if (apAddress[0] == '@') lAddress.sun_path[0] = '\0';
  const socklen_t lAddressLength =
      static_cast<socklen_t>(offsetof(struct sockaddr_un, sun_path) + lNameLength);
  const int lSocket = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  if (lSocket < 0) return errno;
  int lResult = 0;
  while (sendto(lSocket, apData, aLength, MSG_NOSIGNAL | MSG_DONTWAIT,
                reinterpret_cast<const struct sockaddr*>(&lAddress), lAddressLength) < 0) {
    if (errno != EINTR) {
      lResult = errno;
      break;
    }
  }
  close(lSocket);
  return lResult;
}

int OsGetPid() noexcept { return static_cast<int>(getpid()); }
