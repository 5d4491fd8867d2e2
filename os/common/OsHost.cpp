#include <arpa/inet.h>
#include <ifaddrs.h>
#include <net/if.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/utsname.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "Os.h"
#include "QNString.h"

bool OsNamesOneProcess(int aPid) { return aPid > 0; }

int OsKill(int aPid, int aSignal) {
  if (!OsNamesOneProcess(aPid)) {
    errno = EINVAL;
    return -1;
  }
  return kill(aPid, aSignal);
}

void OsGetOsName(QNEOperatingSystem& arOs, QNCString& arVariant) {
  struct utsname lName;
  if (uname(&lName) != 0) {
    arOs = QNOS_Unknown;
    arVariant = QNCString("unknown");
    return;
  }
  arOs = strcmp(lName.sysname, "Linux") == 0 ? QNOS_Linux : QNOS_OtherUnix;
  char lVariant[sizeof lName.sysname + sizeof lName.release + sizeof lName.machine + 3];
  snprintf(lVariant, sizeof lVariant, "%s %s %s", lName.sysname, lName.release, lName.machine);
  arVariant = QNCString(lVariant);
}

void OsGetIpAddress(unsigned int& arAddress) {
  arAddress = INADDR_LOOPBACK;
  struct ifaddrs* lpList = nullptr;
  if (getifaddrs(&lpList) != 0) return;  // no interface list: the loopback address will do
  for (struct ifaddrs* lpEntry = lpList; lpEntry != nullptr; lpEntry = lpEntry->ifa_next) {
    if (lpEntry->ifa_addr == nullptr || lpEntry->ifa_addr->sa_family != AF_INET) continue;
    if ((lpEntry->ifa_flags & IFF_LOOPBACK) != 0 || (lpEntry->ifa_flags & IFF_UP) == 0) continue;
    sockaddr_in lAddress;
    // Copied, not cast: the list holds a sockaddr, whose alignment need not suit sockaddr_in.
    memcpy(&lAddress, lpEntry->ifa_addr, sizeof lAddress);
    arAddress = ntohl(lAddress.sin_addr.s_addr);
    break;
  }
  freeifaddrs(lpList);
}
