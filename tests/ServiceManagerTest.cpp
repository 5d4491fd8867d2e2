// qnsensord as a service manager sees it: the exit status of a daemon start, and the systemd
// notification protocol, heard on a datagram socket of the test's own standing in for systemd.

#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <cstring>
#include <string>
#include <vector>

#include "TestSupport.h"

namespace {
using std::chrono::milliseconds;
using Clock = std::chrono::steady_clock;

std::string qnsensord() { return qntest::builtProgram("examples/qnsensord"); }

// The process id in a 4-byte PID file; 0 when there is none.
int pidIn(const std::string& acrPidFile) {
  const std::string lBytes = qntest::readFile(acrPidFile);
  int lPid = 0;
  if (lBytes.size() == sizeof lPid) memcpy(&lPid, lBytes.data(), sizeof lPid);
  return lPid;
}

// A bound AF_UNIX datagram socket: a path, or "@name" in the abstract namespace.
class NotifySocket {
 public:
  explicit NotifySocket(const std::string& acrAddress) : mFd(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
    struct sockaddr_un lAddress = {};
    lAddress.sun_family = AF_UNIX;
    memcpy(lAddress.sun_path, acrAddress.data(), acrAddress.size());
    if (acrAddress[0] == '@') lAddress.sun_path[0] = '\0';
    const socklen_t lLength =
        static_cast<socklen_t>(offsetof(struct sockaddr_un, sun_path) + acrAddress.size());
    EXPECT_EQ(0, bind(mFd, reinterpret_cast<struct sockaddr*>(&lAddress), lLength)) << strerror(errno);
  }
  ~NotifySocket() { close(mFd); }

  // The datagrams that arrive until one equals acrLast (kept) or aTimeout has passed; with no
  // time-out, those already waiting.
  std::vector<std::string> until(const std::string& acrLast, milliseconds aTimeout) {
    std::vector<std::string> lReceived;
    const auto lDeadline = Clock::now() + aTimeout;
    for (;;) {
      const auto lLeft = std::chrono::duration_cast<milliseconds>(lDeadline - Clock::now()).count();
      struct pollfd lPoll = {mFd, POLLIN, 0};
      if (poll(&lPoll, 1, lLeft > 0 ? static_cast<int>(lLeft) : 0) <= 0) break;
      char lData[4096];
      const ssize_t lSize = recv(mFd, lData, sizeof lData, 0);
      if (lSize <= 0) continue;
      lReceived.emplace_back(lData, static_cast<size_t>(lSize));
      if (lReceived.back() == acrLast) break;
    }
    return lReceived;
  }

 private:
  int mFd;
};

// Daemon starts one after the other, each judged when its starting command has ended: the exit
// status, its standard error, and the daemon then in the PID file. The first start must not end
// before the daemon has finished start-up: its READY=1 must already be waiting on the socket.
TEST(DaemonStartTest, StartingCommandTellsHowTheDaemonStarted) {
  qntest::TempDir lDir;
  NotifySocket lNotify(lDir.file("notify"));
  const std::string lMissing = lDir.file("missing");
  struct QNSCase {
    const char* mName;
    std::string mLogDir;
    int mStatus;
    std::string mError;  // "" : standard error stays empty
  };
  const QNSCase lCases[] = {
      {"first start", lDir.path(), 0, ""},
      {"second instance", lDir.path(), 1, "Cannot mark running.. found another instance"},
      {"missing log directory", lMissing, 1, lMissing + "/qnsensord.pid"},
  };
  int lDaemon = 0;
  for (const QNSCase& acrCase : lCases) {
    const std::string lErr = lDir.file(std::string(acrCase.mName) + ".err");
    const auto lStart = Clock::now();
    const pid_t lStarter =
        qntest::spawn({qnsensord(), "-d", "127"},
                      {"QN_LOG_DIR=" + acrCase.mLogDir, "NOTIFY_SOCKET=" + lDir.file("notify")}, "", lErr);
    EXPECT_EQ(acrCase.mStatus, qntest::waitExit(lStarter, std::chrono::seconds(10))) << acrCase.mName;
    EXPECT_LT(Clock::now() - lStart, std::chrono::seconds(10)) << acrCase.mName;
    const std::string lErrText = qntest::readFile(lErr);
    if (acrCase.mError.empty()) {
      EXPECT_EQ("", lErrText) << acrCase.mName;
      lDaemon = pidIn(lDir.file("qnsensord.pid"));
      ASSERT_GT(lDaemon, 0);
      EXPECT_EQ(0, kill(lDaemon, 0));
      const std::vector<std::string> lHeard = lNotify.until("READY=1\nSTATUS=Running", milliseconds(0));
      EXPECT_EQ("READY=1\nSTATUS=Running", lHeard.empty() ? "(nothing)" : lHeard.back());
    } else {
      EXPECT_NE(std::string::npos, lErrText.find(acrCase.mError)) << acrCase.mName << ": " << lErrText;
    }
  }
  EXPECT_EQ(lDaemon, pidIn(lDir.file("qnsensord.pid"))) << "a failed start touched the running daemon's mark";
  const pid_t lStopper =
      qntest::spawn({qnsensord(), "-s"}, {"QN_LOG_DIR=" + lDir.path()}, lDir.file("stop.out"));
  EXPECT_EQ(0, qntest::waitExit(lStopper));
  for (int lTry = 0; lTry < 100 && kill(lDaemon, 0) == 0; ++lTry) usleep(100 * 1000);
  EXPECT_NE(0, kill(lDaemon, 0)) << "the daemon did not end";
}

// In the foreground, as Type=notify runs it, for both forms of address: STATUS at the start,
// READY=1 once start-up is complete (the PID file is then held), WATCHDOG=1 every half
// WATCHDOG_USEC (150 ms here), STOPPING=1 on SIGTERM, and an orderly exit.
TEST(ServiceNotifyTest, ReadyWatchdogAndStoppingReachTheNotifySocket) {
  qntest::TempDir lDir;
  for (const std::string& acrAddress : {lDir.file("notify"), "@qn-notify-test-" + std::to_string(getpid())}) {
    NotifySocket lNotify(acrAddress);
    const pid_t lService =
        qntest::spawn({qnsensord(), "-D", "false", "-d", "127"},
                      {"QN_LOG_DIR=" + lDir.path(), "NOTIFY_SOCKET=" + acrAddress, "WATCHDOG_USEC=300000"},
                      "", lDir.file("err"));
    const std::vector<std::string> lStart = lNotify.until("READY=1\nSTATUS=Running", milliseconds(10000));
    ASSERT_FALSE(lStart.empty()) << acrAddress;
    EXPECT_EQ("STATUS=Starting", lStart.front()) << acrAddress;
    ASSERT_EQ("READY=1\nSTATUS=Running", lStart.back()) << acrAddress;
    EXPECT_EQ(lService, pidIn(lDir.file("qnsensord.pid"))) << acrAddress;

    const std::vector<std::string> lPings = lNotify.until("(none)", milliseconds(1500));
    EXPECT_GE(lPings.size(), 7u) << acrAddress;  // 10 at the nominal pace
    EXPECT_LE(lPings.size(), 12u) << acrAddress;
    for (const std::string& acrPing : lPings) EXPECT_EQ("WATCHDOG=1", acrPing) << acrAddress;

    kill(lService, SIGTERM);
    const std::vector<std::string> lStop = lNotify.until("STATUS=Stopped", milliseconds(10000));
    EXPECT_NE(lStop.end(), std::find(lStop.begin(), lStop.end(), "STOPPING=1\nSTATUS=Stopping"))
        << acrAddress;
    EXPECT_EQ("STATUS=Stopped", lStop.empty() ? "(nothing)" : lStop.back()) << acrAddress;
    EXPECT_EQ(0, qntest::waitExit(lService)) << qntest::readFile(lDir.file("err"));
  }
}
}  // namespace
