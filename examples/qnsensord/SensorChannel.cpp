#include "SensorChannel.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <utility>

#include "Logger.h"
#include "PeerWarnings.h"
#include "QNException.h"

namespace {
thread_local unsigned long tlGeneration = 0;

[[noreturn]] void throwSocketError(const char* apCall, const std::string& acrPath) {
  char lMessage[600];
  snprintf(lMessage, sizeof lMessage, "%s '%s': %s", apCall, acrPath.c_str(), strerror(errno));
  throw QNCOpenFailedEx(lMessage, static_cast<unsigned int>(errno));
}

[[noreturn]] void refusePath(const std::string& acrPath, const char* apWhy) {
  char lMessage[600];
  snprintf(lMessage, sizeof lMessage,
           "socket path '%s' %s; qnsensord will not replace it (remove it, or give the service a private "
           "QN_LOG_DIR)",
           acrPath.c_str(), apWhy);
  QN_LOG_ERROR("%s", lMessage);
  throw QNCExistsEx(lMessage, EEXIST);
}

// Leaves acrPath free for bind. Nothing is there, or a stale socket of our own is: a socket owned
// by this user that nobody accepts on (connect is refused). Since the caller holds the instance
// lock, no other qnsensord can be about to serve it: it is what an instance that did not end in
// order left behind, and it is removed. Anything else -- a file, a directory, a link, another
// user's socket, a socket some process serves -- is refused with QNCExistsEx, and left alone.
void claimSocketPath(const std::string& acrPath, const sockaddr_un& acrAddress) {
  struct stat lStatus;
  if (lstat(acrPath.c_str(), &lStatus) != 0) {
    if (errno == ENOENT) return;
    throwSocketError("lstat", acrPath);
  }
  if (!S_ISSOCK(lStatus.st_mode)) refusePath(acrPath, "exists and is not a socket");
  if (lStatus.st_uid != geteuid()) refusePath(acrPath, "is a socket of another user");
  const int lProbe = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (lProbe < 0) throwSocketError("socket", acrPath);
  const int lResult = connect(lProbe, reinterpret_cast<const sockaddr*>(&acrAddress), sizeof acrAddress);
  const int lErrno = errno;
  close(lProbe);
  if (lResult == 0) refusePath(acrPath, "is a socket that another process serves");
  if (lErrno != ECONNREFUSED) {
    errno = lErrno;
    throwSocketError("connect", acrPath);
  }
  if (unlink(acrPath.c_str()) != 0 && errno != ENOENT) throwSocketError("unlink", acrPath);
  QN_LOG_NOTICE("Removed the stale socket %s of an earlier run", acrPath.c_str());
}
}  // namespace

QNCSensorChannel::QNCSensorChannel(const std::string& acrPath)
    : mPath(acrPath), mListenFd(-1), mGeneration(0), mNextGeneration(1) {
  sockaddr_un lAddress = {};
  lAddress.sun_family = AF_UNIX;
  if (acrPath.size() >= sizeof lAddress.sun_path) {
    errno = ENAMETOOLONG;
    throwSocketError("bind", acrPath);
  }
  memcpy(lAddress.sun_path, acrPath.c_str(), acrPath.size() + 1);
  mListenFd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (mListenFd < 0) throwSocketError("socket", acrPath);
  try {
    claimSocketPath(acrPath, lAddress);
  } catch (const QNCException&) {
    close(mListenFd);
    throw;
  }
  // The mode is set before listen(): until then every connect is refused, so no client can get in
  // through the mode bind gave (0777 less the umask, which is 0 in a daemon).
  const char* lpFailed = nullptr;
  if (bind(mListenFd, reinterpret_cast<sockaddr*>(&lAddress), sizeof lAddress) != 0) {
    lpFailed = "bind";
  } else if (chmod(acrPath.c_str(), kSocketMode) != 0) {
    lpFailed = "chmod";
  } else if (listen(mListenFd, 16) != 0) {
    lpFailed = "listen";
  }
  if (lpFailed != nullptr) {
    const int lErrno = errno;
    close(mListenFd);
    if (strcmp(lpFailed, "bind") != 0) unlink(acrPath.c_str());
    errno = lErrno;
    throwSocketError(lpFailed, acrPath);
  }
}

QNCSensorChannel::~QNCSensorChannel() {
  dropConnection();
  close(mListenFd);
  unlink(mPath.c_str());
}

bool QNCSensorChannel::waitForActivity(unsigned int aMilliseconds) {
  QNCPointer<QNCFdReader> lReader;
  {
    QNCMutexLocker lGuard(mLock);
    if (!mReader.isNull()) lReader = mReader;
  }
  if (!lReader.isNull()) return lReader->waitForActivity(aMilliseconds);

  struct pollfd lPoll = {mListenFd, POLLIN, 0};
  const int lReady = poll(&lPoll, 1, static_cast<int>(aMilliseconds));
  if (lReady < 0 && errno != EINTR) throwSocketError("poll", mPath);  // else the caller would spin
  if (lReady <= 0) return false;
  const int lFd = accept4(mListenFd, nullptr, nullptr, SOCK_CLOEXEC);
  if (lFd < 0) {
    // The client gave up before it was accepted: nothing lost. Anything else (no descriptor or
    // memory left) is the service's own trouble and must not pass as an idle channel.
    if (errno == EAGAIN || errno == EWOULDBLOCK || errno == ECONNABORTED || errno == EINTR || errno == EPROTO)
      return false;
    throwSocketError("accept", mPath);
  }
  const int lWriteFd = dup(lFd);
  if (lWriteFd < 0) {
    close(lFd);
    return false;
  }
  // A read wait: the body of a reading may trail its prefix by a moment.
  QNCPointer<QNCFdReader> lNewReader(new (std::nothrow)
                                         QNCFdReader(lFd, true, QNCFdReader::kDefaultStagingSize, 50),
                                     QNPST_Individual, QNPAT_New);
  QNCPointer<QNCFdWriter> lNewWriter(new (std::nothrow) QNCFdWriter(lWriteFd, true, kAnswerDrainMs),
                                     QNPST_Individual, QNPAT_New);
  QNCMutexLocker lGuard(mLock);
  mReader = lNewReader;
  mWriter = lNewWriter;
  mGeneration = mNextGeneration++;
  if (QNPeerWarning(QNPW_Connection).admit())
    QN_LOG_INFO("Channel %s: connection %lu accepted", mPath.c_str(), mGeneration);
  return false;
}

bool QNCSensorChannel::atEndOfStream() {
  QNCPointer<QNCFdReader> lReader;
  {
    QNCMutexLocker lGuard(mLock);
    if (mReader.isNull()) return false;
    lReader = mReader;
  }
  return lReader->atEndOfStream();
}

void QNCSensorChannel::read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) {
  QNCPointer<QNCFdReader> lReader;
  {
    QNCMutexLocker lGuard(mLock);
    if (mReader.isNull()) throw QNCTryAgainEx("no connection", EAGAIN);
    lReader = mReader;
  }
  lReader->read(arBuffer, arCount);
}

bool QNCSensorChannel::writeIfCurrent(unsigned long acGeneration, const QNCPointer<QNCBuffer>& acrBuffer,
                                      unsigned int& arCount) {
  QNCPointer<QNCFdReader> lReader;  // declared before the guard: released after the lock
  QNCPointer<QNCFdWriter> lWriter;
  QNCMutexLocker lGuard(mLock);
  if (mWriter.isNull() || mGeneration != acGeneration) return false;
  try {
    mWriter->write(acrBuffer, arCount);
  } catch (const QNCTimeOutEx&) {
    // A client that leaves its answers unread: its connection ends here, so no later answer,
    // for this client or any other, waits on it again.
    QN_LOG_INFO("Channel %s: connection %lu ended", mPath.c_str(), mGeneration);
    lReader = std::move(mReader);
    lWriter = std::move(mWriter);
    mGeneration = 0;
    throw;
  }
  return true;
}

void QNCSensorChannel::dropConnection() {
  QNCPointer<QNCFdReader> lReader;
  QNCPointer<QNCFdWriter> lWriter;
  {
    QNCMutexLocker lGuard(mLock);
    if (mReader.isNull()) return;
    if (QNPeerWarning(QNPW_Connection).admit())
      QN_LOG_INFO("Channel %s: connection %lu ended", mPath.c_str(), mGeneration);
    // Moved out so the descriptors are closed after the lock is released.
    lReader = std::move(mReader);
    lWriter = std::move(mWriter);
    mGeneration = 0;
  }
}

unsigned long QNCSensorChannel::getGeneration() const {
  QNCMutexLocker lGuard(mLock);
  return mGeneration;
}

void QNCSensorChannelWriter::setGeneration(unsigned long aGeneration) { tlGeneration = aGeneration; }

void QNCSensorChannelWriter::write(const QNCPointer<QNCBuffer>& acrBuffer, unsigned int& arCount) {
  if (!mChannel.writeIfCurrent(tlGeneration, acrBuffer, arCount))
    throw QNCWriteFailedEx("connection ended", EPIPE);
}
