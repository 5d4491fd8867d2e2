// qnsensord as a service manager sees it: the exit status of a daemon start, the daemon it
// leaves behind, and the systemd notification protocol, heard on a datagram socket of the test's own standing
// in for systemd.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <cstring>
#include <map>
#include <sstream>
#include <string>
#include <vector>

#include "LogSupport.h"

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

// The daemon process as /proc shows it: "key=value" for its parent, session, working
// directory, umask, descriptors 0-2, and "others" listing its other descriptors' targets.
std::map<std::string, std::string> daemonState(int aPid) {
  const std::string lProc = "/proc/" + std::to_string(aPid) + "/";
  std::map<std::string, std::string> lState;
  const std::string lStatLine = qntest::readFile(lProc + "stat");
  std::istringstream lStat(lStatLine.substr(lStatLine.rfind(')') + 2));
  std::string lField;
  lStat >> lField >> lState["ppid"] >> lField >> lState["sid"];
  const std::string lStatus = qntest::readFile(lProc + "status");
  lState["umask"] = lStatus.substr(lStatus.find("Umask:\t") + 7, 4);
  for (const std::string& lrName :
       {std::string("cwd"), std::string("fd/0"), std::string("fd/1"), std::string("fd/2")}) {
    char lTarget[4096] = "";
    lState[lrName] = std::string(
        lTarget, std::max<ssize_t>(0, readlink((lProc + lrName).c_str(), lTarget, sizeof lTarget)));
  }
  for (int lFd = 3; lFd < 4096; ++lFd) {
    char lTarget[4096] = "";
    const ssize_t lLength = readlink((lProc + "fd/" + std::to_string(lFd)).c_str(), lTarget, sizeof lTarget);
    if (lLength > 0) lState["others"] += std::string(lTarget, lLength) + " ";
  }
  return lState;
}

// Daemon starts one after the other, each judged when its starting command has ended: the exit
// status, its standard error, and the daemon then in the PID file. The first start must not end
// before the daemon has finished start-up: its READY=1 must already be waiting on the socket.
// The daemon is detached (a session of its own that it does not lead, so it can never regain a
// controlling terminal; "/" and /dev/null; no descriptor of its starter, even a high one) and
// creates nothing others can use although its umask is 0. "-s" stops it, and finds nothing to
// stop once it is gone.
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
  struct rlimit lLimit;
  ASSERT_EQ(0, getrlimit(RLIMIT_NOFILE, &lLimit));
  const int lLeftOpen = open(lDir.file("left-open").c_str(), O_WRONLY | O_CREAT, 0600);
  ASSERT_LE(0, dup2(lLeftOpen, static_cast<int>(std::min<rlim_t>(lLimit.rlim_cur, 4096) - 1)));
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
      std::map<std::string, std::string> lState = daemonState(lDaemon);
      EXPECT_NE(std::to_string(lStarter), lState["ppid"]);
      EXPECT_NE(std::to_string(getpid()), lState["ppid"]);
      EXPECT_NE(std::to_string(lDaemon), lState["sid"]);
      EXPECT_NE(std::to_string(getsid(0)), lState["sid"]);
      const std::map<std::string, std::string> lExpected = {{"cwd", "/"},
                                                            {"umask", "0000"},
                                                            {"fd/0", "/dev/null"},
                                                            {"fd/1", "/dev/null"},
                                                            {"fd/2", "/dev/null"}};
      for (const auto& acrEntry : lExpected)
        EXPECT_EQ(acrEntry.second, lState[acrEntry.first]) << acrEntry.first;
      EXPECT_EQ(std::string::npos, lState["others"].find("left-open")) << lState["others"];
    } else {
      EXPECT_NE(std::string::npos, lErrText.find(acrCase.mError)) << acrCase.mName << ": " << lErrText;
    }
  }
  close(lLeftOpen);
  close(static_cast<int>(std::min<rlim_t>(lLimit.rlim_cur, 4096) - 1));
  EXPECT_EQ(lDaemon, pidIn(lDir.file("qnsensord.pid"))) << "a failed start touched the running daemon's mark";
  const std::map<std::string, unsigned int> lModes = {{"qnsensord.0.sock", 0660},
                                                      {"qnsensord.1.sock", 0660},
                                                      {"qnsensord.log", 0640},
                                                      {"qnsensord.pid", 0640}};
  for (const auto& acrEntry : lModes) {
    struct stat lStatus;
    ASSERT_EQ(0, lstat(lDir.file(acrEntry.first).c_str(), &lStatus)) << acrEntry.first;
    EXPECT_EQ(acrEntry.second, lStatus.st_mode & 07777) << acrEntry.first;
  }
  // The daemon's own lines follow those its starter logged before the fork.
  qntest::expectInOrder(
      qntest::readFile(lDir.file("qnsensord.log")),
      {"Running the current process in the background as daemon", "[" + std::to_string(lDaemon) + "] init"});
  for (const char* apExpected : {"qnsensord shutdown successfully.\n", ""}) {
    const pid_t lStopper =
        qntest::spawn({qnsensord(), "-s"}, {"QN_LOG_DIR=" + lDir.path()}, lDir.file("stop.out"));
    EXPECT_EQ(0, qntest::waitExit(lStopper));
    EXPECT_EQ(apExpected, qntest::readFile(lDir.file("stop.out")));
    for (int lTry = 0; lTry < 100 && kill(lDaemon, 0) == 0; ++lTry) usleep(100 * 1000);
    EXPECT_NE(0, kill(lDaemon, 0)) << "the daemon did not end";
  }
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
