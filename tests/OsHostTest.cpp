#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <net/if.h>
#include <netinet/in.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <set>
#include <string>

#include "Os.h"
#include "QNString.h"
#include "TestSupport.h"

namespace {

// The IPv4 addresses (host byte order) of interfaces that are up and not loopback, as the older
// SIOCGIFCONF interface lists them: a second source beside the one the layer uses.
std::set<unsigned int> upNonLoopbackAddresses() {
  std::set<unsigned int> lAddresses;
  const int lSocket = socket(AF_INET, SOCK_DGRAM, 0);
  if (lSocket < 0) return lAddresses;
  struct ifreq lRequests[64];
  struct ifconf lConfig = {};
  lConfig.ifc_len = sizeof lRequests;
  lConfig.ifc_req = lRequests;
  if (ioctl(lSocket, SIOCGIFCONF, &lConfig) == 0) {
    for (size_t lIndex = 0; lIndex < lConfig.ifc_len / sizeof(struct ifreq); ++lIndex) {
      struct ifreq lFlags = lRequests[lIndex];
      if (ioctl(lSocket, SIOCGIFFLAGS, &lFlags) != 0) continue;
      if ((lFlags.ifr_flags & IFF_UP) == 0 || (lFlags.ifr_flags & IFF_LOOPBACK) != 0) continue;
      sockaddr_in lAddress;
      memcpy(&lAddress, &lRequests[lIndex].ifr_addr, sizeof lAddress);
      lAddresses.insert(ntohl(lAddress.sin_addr.s_addr));
    }
  }
  close(lSocket);
  return lAddresses;
}

// A swapped byte order gives a number that is no address of this host, nor the loopback one.
TEST(OsHostTest, IpAddressIsOneOfThisHostsInHostByteOrder) {
  unsigned int lAddress = 0;
  OsGetIpAddress(lAddress);
  const std::set<unsigned int> lCandidates = upNonLoopbackAddresses();
  if (lCandidates.empty()) {
    EXPECT_EQ(0x7F000001u, lAddress);
  } else {
    EXPECT_EQ(1u, lCandidates.count(lAddress))
        << std::hex << lAddress << " is no non-loopback address of this host";
  }
}

TEST(OsHostTest, OsNameIsLinuxWithTheRunningRelease) {
  QNEOperatingSystem lOs = QNOS_Unknown;
  QNCString lVariant;
  OsGetOsName(lOs, lVariant);
  EXPECT_EQ(QNOS_Linux, lOs);
  std::string lRelease = qntest::readFile("/proc/sys/kernel/osrelease");
  while (!lRelease.empty() && lRelease.back() == '\n') lRelease.pop_back();
  ASSERT_FALSE(lRelease.empty());
  EXPECT_EQ(0u, std::string(lVariant.get()).rfind("Linux " + lRelease + " ", 0)) << lVariant.get();
}

// That a real pid is signalled shows in the instance tests, which stop a running instance.
TEST(OsHostTest, KillRefusesProcessGroups) {
  EXPECT_EQ(0, OsKill(getpid(), 0));
  // Signal 0 to 0 or -1 would succeed for a process group or everyone: refusal proves no call.
  for (int lPid : {0, -1}) {
    errno = 0;
    EXPECT_GT(0, OsKill(lPid, 0)) << "pid " << lPid;
    EXPECT_EQ(EINVAL, errno);
  }
}

}  // namespace
