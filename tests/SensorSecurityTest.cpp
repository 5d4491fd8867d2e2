// qnsensord as a local user meets it (the modes of what a daemon creates: DaemonStartTest): the
// socket paths it refuses to take over, how much a flood of bad readings adds to its log, and a
// run without root.

#include <gtest/gtest.h>
#include <pwd.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "TestSupport.h"

namespace {

using Clock = std::chrono::steady_clock;

long lineCount(const std::string& acrText) { return std::count(acrText.begin(), acrText.end(), '\n'); }

class SensorSecurityTest : public ::testing::Test {
 protected:
  // Starts qnsensord with the given arguments, its QN_LOG_DIR being mDir; aPrefix runs it (setpriv).
  pid_t start(const std::vector<std::string>& acrArguments, const std::vector<std::string>& acrPrefix = {}) {
    std::vector<std::string> lArgv = acrPrefix;
    lArgv.push_back(qntest::builtProgram("examples/qnsensord"));
    lArgv.insert(lArgv.end(), acrArguments.begin(), acrArguments.end());
    return qntest::spawn(lArgv, {"QN_LOG_DIR=" + mDir.path()}, mOut.file("stdout"), mOut.file("stderr"));
  }

  // A socket connected to channel 0 (aConnect) or bound at its path; reads time out after 10 s.
  int socketAtChannel0(bool aConnect) {
    const int lFd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un lAddress = {};
    lAddress.sun_family = AF_UNIX;
    snprintf(lAddress.sun_path, sizeof lAddress.sun_path, "%s", mSocket.c_str());
    auto lpCall = aConnect ? &connect : &bind;
    EXPECT_EQ(0, lpCall(lFd, reinterpret_cast<sockaddr*>(&lAddress), sizeof lAddress)) << strerror(errno);
    const timeval lTimeout = {10, 0};  // a stalled service fails the test instead of hanging it
    setsockopt(lFd, SOL_SOCKET, SO_RCVTIMEO, &lTimeout, sizeof lTimeout);
    return lFd;
  }

  qntest::TempDir mDir;  // the service's directory: only what it creates is in there
  qntest::TempDir mOut;
  std::string mLog = mDir.file("qnsensord.log");
  std::string mSocket = mDir.file("qnsensord.0.sock");
};

// 200,000 malformed readings, pipelined over one connection: each is answered, yet the log grows
// by at most 11 "refused" lines per second begun (10 lines and one count), and the counts account
// for every reading left out.
TEST_F(SensorSecurityTest, FloodOfMalformedReadingsAddsFewLogLines) {
  constexpr unsigned int kFlood = 200000;
  const pid_t lService = start({"-D", "false", "-d", "127", "-n", "1", "-b", "3600"});
  ASSERT_TRUE(qntest::waitForText(mLog, "qnsensord running")) << qntest::readFile(mLog);
  const long lLinesBefore = lineCount(qntest::readFile(mLog));
  std::string lFrames;
  for (unsigned int lSequence = 0; lSequence < kFlood; ++lSequence) {
    const std::string lBody = "s " + std::to_string(lSequence) + " x";
    const uint32_t lLength = lBody.size();
    lFrames.append(reinterpret_cast<const char*>(&lLength), 4).append(lBody);
  }
  const int lFd = socketAtChannel0(true);
  const Clock::time_point lStart = Clock::now();
  // A blocking send writes it all, or fails once the reader below gives up and shuts the socket.
  std::thread lSender([&] { send(lFd, lFrames.data(), lFrames.size(), MSG_NOSIGNAL); });
  // Answers come in order: the flood is served once the last one is in.
  std::string lTail;
  char lChunk[65536];
  for (ssize_t lCount;
       lTail.find("ERR 199999 ") == std::string::npos && (lCount = read(lFd, lChunk, sizeof lChunk)) > 0;)
    lTail = lTail.substr(lTail.size() > 64 ? lTail.size() - 64 : 0) + std::string(lChunk, lCount);
  const long lSeconds = std::chrono::duration_cast<std::chrono::seconds>(Clock::now() - lStart).count() + 1;
  shutdown(lFd, SHUT_RDWR);
  lSender.join();
  close(lFd);
  ASSERT_NE(std::string::npos, lTail.find("ERR 199999 bad value"));
  EXPECT_LE(lineCount(qntest::readFile(mLog)) - lLinesBefore, 11 * (lSeconds + 1) + 2)
      << "flood of " << lSeconds << " s";

  ASSERT_EQ(0, kill(lService, SIGTERM));
  ASSERT_EQ(0, qntest::waitExit(lService));
  const std::string lLog = qntest::readFile(mLog);
  unsigned long lAccounted = 0;
  for (size_t lAt = lLog.find(" refused"); lAt != std::string::npos; lAt = lLog.find(" refused", lAt + 1))
    lAccounted += lLog.compare(lAt, 19, " refused readings: ") == 0 ? std::stoul(lLog.substr(lAt + 19)) : 1;
  EXPECT_EQ(kFlood, lAccounted) << lLog;
}

// A regular file or a directory at the socket path (a local user squatting it) stops start-up
// with a message and status 1, and stays as it was. A socket of its own that nobody serves (an
// earlier run that did not end in order) is replaced.
TEST_F(SensorSecurityTest, RefusesASquattedSocketPathAndReplacesItsOwnStaleSocket) {
  for (const bool lDirectory : {false, true}) {
    if (lDirectory) {
      ASSERT_EQ(0, unlink(mSocket.c_str()));
      ASSERT_EQ(0, mkdir(mSocket.c_str(), 0755));
    } else {
      qntest::writeFile(mSocket, "squatted");
    }
    EXPECT_EQ(1, qntest::waitExit(start({"-D", "false", "-n", "1"})));
    EXPECT_NE(std::string::npos, qntest::readFile(mOut.file("stderr")).find("exists and is not a socket"))
        << qntest::readFile(mOut.file("stderr"));
    struct stat lStatus;
    ASSERT_EQ(0, lstat(mSocket.c_str(), &lStatus));
    EXPECT_EQ(lDirectory, S_ISDIR(lStatus.st_mode));
  }
  ASSERT_EQ(0, rmdir(mSocket.c_str()));
  close(socketAtChannel0(false));  // the socket file stays, and nobody accepts on it

  const pid_t lService = start({"-D", "false", "-d", "127", "-n", "1"});
  ASSERT_TRUE(qntest::waitForText(mLog, "qnsensord running")) << qntest::readFile(mOut.file("stderr"));
  EXPECT_NE(std::string::npos, qntest::readFile(mLog).find("Removed the stale socket"));
  close(socketAtChannel0(true));
  ASSERT_EQ(0, kill(lService, SIGTERM));
  EXPECT_EQ(0, qntest::waitExit(lService));
}

// Without root, in a directory of its own: started as "nobody" when the test runs as root (and
// as the test's own user otherwise), qnsensord serves readings on sockets that user owns.
TEST_F(SensorSecurityTest, ServesReadingsWithoutRoot) {
  std::vector<std::string> lPrefix;
  struct passwd* lpNobody = getpwnam("nobody");
  if (geteuid() == 0) {
    if (lpNobody == nullptr || access("/usr/bin/setpriv", X_OK) != 0)
      GTEST_SKIP() << "no user nobody or no setpriv";
    ASSERT_EQ(0, chown(mDir.path().c_str(), lpNobody->pw_uid, lpNobody->pw_gid));
    lPrefix = {"/usr/bin/setpriv", "--reuid=nobody", "--regid=nogroup", "--clear-groups"};
    if (qntest::waitExit(start({"-v"}, lPrefix)) != 0)
      GTEST_SKIP() << "nobody cannot run the built qnsensord: " << qntest::readFile(mOut.file("stderr"));
  }
  const pid_t lService = start({"-D", "false", "-d", "127", "-n", "1"}, lPrefix);
  ASSERT_TRUE(qntest::waitForText(mLog, "qnsensord running")) << qntest::readFile(mOut.file("stderr"));
  struct stat lStatus;
  ASSERT_EQ(0, stat(mSocket.c_str(), &lStatus));
  EXPECT_EQ(geteuid() == 0 ? lpNobody->pw_uid : geteuid(), lStatus.st_uid);
  const pid_t lFeed = qntest::spawn(
      {qntest::builtProgram("examples/qnsensor-feed"), "-d", mDir.path(), "-n", "10", "-m", "1", "-c", "1"},
      {}, mOut.file("feed.out"), mOut.file("feed.err"));
  EXPECT_EQ(0, qntest::waitExit(lFeed)) << qntest::readFile(mOut.file("feed.out"));
  ASSERT_EQ(0, kill(lService, SIGTERM));
  EXPECT_EQ(0, qntest::waitExit(lService));
}

}  // namespace
