#include <arpa/inet.h>
#include <ifaddrs.h>
#include <net/if.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/utsname.h>

#include <cstdio>
#include <cstring>

#include "Os.h"
#include "QNString.h"

int OsKill(int aPid, int aSignal) { return kill(aPid, aSignal); }

void OsGetOsName(QNEOperatingSystem& arOs, QNCString& arVariant) {
  struct utsname lName;
  if (uname(&lName) != 0) {
    arOs = QNOS_Unknown;
    arVariant = QNCString("unknown");
    return;
  }
  arOs = strcmp(lName.sysname, "Linux") == 0 ? QNOS_Linux : QNOS_OtherUnix;
  char lVariant[sizeof lName.sysname + sizeof lName.release + 2];
  snprintf(lVariant, sizeof lVariant, "%s %s", lName.sysname, lName.release);
  arVariant = QNCString(lVariant);
}

void OsGetIpAddress(unsigned int& arAddress) {
  arAddress = INADDR_LOOPBACK;
  struct ifaddrs* lpList = nullptr;
  if (getifaddrs(&lpList) != 0) return;  // no interface list: the loopback address will do
  for (struct ifaddrs* lpEntry = lpList; lpEntry != nullptr; lpEntry = lpEntry->ifa_next) {
    if (lpEntry->ifa_addr == nullptr || lpEntry->ifa_addr->sa_family != AF_INET) continue;
    if ((lpEntry->ifa_flags & IFF_LOOPBACK) != 0 || (lpEntry->ifa_flags & IFF_UP) == 0) continue;
    const auto* lpAddress = reinterpret_cast<const struct sockaddr_in*>(lpEntry->ifa_addr);
    arAddress = ntohl(lpAddress->sin_addr.s_addr);
    break;
  }
  freeifaddrs(lpList);
}
