// qnsensord against hostile peers over real sockets: whatever one client does costs that client's
// connection only, never a channel, the other clients' answers, memory or the shut-down.

#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "LogSupport.h"

namespace {

using Clock = std::chrono::steady_clock;

// One client connection, written with raw socket calls so it can misbehave.
class Peer {
 public:
  explicit Peer(const std::string& acrPath) : mFd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    sockaddr_un lAddress = {};
    lAddress.sun_family = AF_UNIX;
    snprintf(lAddress.sun_path, sizeof lAddress.sun_path, "%s", acrPath.c_str());
    EXPECT_EQ(0, connect(mFd, reinterpret_cast<sockaddr*>(&lAddress), sizeof lAddress)) << strerror(errno);
  }
  ~Peer() { close(mFd); }
  void sendRaw(const std::string& acrBytes) {
    (void)!::send(mFd, acrBytes.data(), acrBytes.size(), MSG_NOSIGNAL);
  }
  void sendReading(const std::string& acrBody) {
    const unsigned int lLength = static_cast<unsigned int>(acrBody.size());
    sendRaw(std::string(reinterpret_cast<const char*>(&lLength), 4) + acrBody);
  }
  // The body of the next answer; "" when none arrives within aTimeoutMs.
  std::string answer(int aTimeoutMs = 4000) {
    const auto lDeadline = Clock::now() + std::chrono::milliseconds(aTimeoutMs);
    unsigned int lLength = 0;
    if (!readExact(reinterpret_cast<char*>(&lLength), 4, lDeadline) || lLength > 4096) return "";
    std::string lBody(lLength, '\0');
    return readExact(&lBody[0], lLength, lDeadline) ? lBody : "";
  }
  bool readable(int aTimeoutMs) {
    pollfd lPoll = {mFd, POLLIN, 0};
    return poll(&lPoll, 1, aTimeoutMs) == 1;
  }

 private:
  bool readExact(char* apTarget, unsigned int aCount, Clock::time_point aDeadline) {
    for (unsigned int lDone = 0; lDone < aCount;) {
      const auto lLeft =
          std::chrono::duration_cast<std::chrono::milliseconds>(aDeadline - Clock::now()).count();
      if (lLeft <= 0 || !readable(static_cast<int>(lLeft))) return false;
      const long lRead = recv(mFd, apTarget + lDone, aCount - lDone, 0);
      if (lRead <= 0) return false;
      lDone += static_cast<unsigned int>(lRead);
    }
    return true;
  }
  int mFd;
};

class SensorRobustnessTest : public ::testing::Test {
 protected:
  void start(const std::vector<std::string>& acrExtra) {
    std::vector<std::string> lArgv = {qntest::builtProgram("examples/qnsensord"), "-D", "false", "-d", "127"};
    lArgv.insert(lArgv.end(), acrExtra.begin(), acrExtra.end());
    mService = qntest::spawn(lArgv, {"QN_LOG_DIR=" + mDir.path()}, mDir.file("out"), mDir.file("err"));
    ASSERT_TRUE(qntest::waitForText(mLog, "qnsensord running")) << qntest::readFile(mLog);
  }
  // SIGTERM; the service must end with status 0 within aLimitMs.
  void stop(int aLimitMs = 5000) {
    kill(mService, SIGTERM);
    EXPECT_EQ(0, qntest::waitExit(mService, std::chrono::milliseconds(aLimitMs))) << qntest::readFile(mLog);
    mService = -1;
  }
  void TearDown() override {
    if (mService > 0) stop();
  }
  std::string channel(unsigned int aNo) const {
    return mDir.file("qnsensord." + std::to_string(aNo) + ".sock");
  }

  qntest::TempDir mDir;
  std::string mLog = mDir.file("qnsensord.log");
  pid_t mService = -1;
};

// A hostile peer takes channel 0 first; a good client queued behind it on the same channel
// must then be served (within the idle limit plus slack when the peer holds the connection).
// With aReset the peer closes once its answer has arrived, leaving it unread in the socket.
void servedAfter(const std::string& acrChannel, const std::string& acrHostile, bool aReset,
                 const std::string& acrSequence) {
  std::unique_ptr<Peer> lpHostile(new Peer(acrChannel));
  lpHostile->sendRaw(acrHostile);
  if (aReset) {
    ASSERT_TRUE(lpHostile->readable(4000));
    lpHostile.reset();  // the server's next read fails with ECONNRESET
  }
  Peer lGood(acrChannel);
  lGood.sendReading("good " + acrSequence + " 1.5");
  EXPECT_EQ(0u, lGood.answer().find("OK " + acrSequence + " "));
}

// Regression, run with the default options as the service was then: a client sends a reading
// and closes with its answer unread; the server's next read failed with ECONNRESET, and
// "Thread 'ChannelWorker-0' ended by an exception: read fd N: Connection reset by peer" ended
// the channel for good. Now the reset costs that connection only.
TEST_F(SensorRobustnessTest, ResetPeerCostsOnlyItsConnection) {
  start({});
  servedAfter(channel(0), std::string("\x0a\0\0\0temp-1 1 2", 14), true, "1");
  stop();
  EXPECT_EQ(std::string::npos, qntest::readFile(mLog).find("ended by an exception"));
}

// A silent client held the channel forever; a prefix followed by silence held it about 45 s.
// Either is dropped at the idle limit (1 s here) and the next client is served.
TEST_F(SensorRobustnessTest, SilentOrStalledPeerIsDroppedAtTheIdleLimit) {
  start({"-t", "1"});
  servedAfter(channel(0), "", false, "1");
  servedAfter(channel(0), std::string("\x0a\0\0\0temp", 8), false, "2");
}

// Channel 0's client sends 3000 readings and reads no answer, so its socket fills. Channel 1's
// client must still get 20 answers in 3 s. Before: the one consumer waited 5 s on every answer
// for channel 0, and 20 readings on channel 1 took about 28 s.
TEST_F(SensorRobustnessTest, PeerThatDoesNotReadStallsNobody) {
  start({});
  Peer lDeaf(channel(0));
  for (unsigned int lSequence = 0; lSequence < 3000; ++lSequence)
    lDeaf.sendReading("deaf " + std::to_string(lSequence) + " 1");
  Peer lGood(channel(1));
  const auto lStart = Clock::now();
  for (unsigned int lSequence = 0; lSequence < 20; ++lSequence) {
    lGood.sendReading("good " + std::to_string(lSequence) + " 2");
    ASSERT_EQ(0u, lGood.answer(3000).find("OK " + std::to_string(lSequence) + " ")) << lSequence;
  }
  EXPECT_LT(Clock::now() - lStart, std::chrono::seconds(3));
}

// Invented sensor names: the 1025th new name is refused, known names are still counted. Before:
// every name was kept (about 310 bytes each, never freed) and logged at shut-down.
TEST_F(SensorRobustnessTest, TrackedSensorsAreBounded) {
  start({});
  Peer lPeer(channel(0));
  for (unsigned int lSequence = 0; lSequence <= 1024; ++lSequence) {
    lPeer.sendReading("s" + std::to_string(lSequence) + " " + std::to_string(lSequence) + " 1");
    const std::string lAnswer = lPeer.answer();
    ASSERT_EQ(lSequence < 1024 ? "OK" : "ERR 1024 too many sensors",
              lAnswer.substr(0, lSequence < 1024 ? 2 : 99));
  }
  lPeer.sendReading("s7 2000 1");
  EXPECT_EQ(0u, lPeer.answer().find("OK 2000 "));
  stop();
  EXPECT_NE(std::string::npos, qntest::readFile(mLog).find("Statistics: 1025 readings from 1024 sensors"));
}

// Regression (found by fault injection): accept4 failing for want of descriptors was taken for
// an idle channel, and the worker spun, serving nobody and saying nothing. Here the service's
// descriptor limit is lowered to its lowest free descriptor and a client connects: every accept
// fails with EMFILE, and after 5 s of failures the worker ends by the exception, which ends the
// run in order with status 1.
TEST_F(SensorRobustnessTest, ChannelThatCannotAcceptEndsTheRunInOrder) {
  start({"-n", "1"});
  const std::string lFds = "/proc/" + std::to_string(mService) + "/fd/";
  int lFree = 0;
  while (access((lFds + std::to_string(lFree)).c_str(), F_OK) == 0) ++lFree;
  const rlimit lLimit = {static_cast<rlim_t>(lFree), static_cast<rlim_t>(lFree)};
  ASSERT_EQ(0, prlimit(mService, RLIMIT_NOFILE, &lLimit, nullptr)) << strerror(errno);
  Peer lClient(channel(0));
  EXPECT_EQ(1, qntest::waitExit(mService, std::chrono::seconds(15))) << "spinning?";
  mService = -1;
  qntest::expectInOrder(qntest::readFile(mLog),
                        {"Thread 'ChannelWorker-0' ended by an exception: accept ", "Too many open files",
                         "All threads have gracefully exited", "Destroying the Logger"});
}

// SIGTERM while a client stalls in the middle of a message: the worker gives the message up on
// the exit request, and the service ends within its 200 ms plus the heartbeat's 1 s step (2.5 s
// leaves room for the sanitizer builds).
// Before: the worker retried the stalled read for about 45 s.
TEST_F(SensorRobustnessTest, StalledPeerDoesNotDelayShutDown) {
  start({});
  Peer lStalled(channel(0));
  lStalled.sendRaw(std::string("\x0a\0\0\0temp", 8));
  usleep(300 * 1000);
  stop(2500);
}

}  // namespace
