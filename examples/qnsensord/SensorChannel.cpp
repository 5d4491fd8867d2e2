#include "SensorChannel.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <utility>

#include "Logger.h"
#include "QNException.h"

namespace {
thread_local unsigned long tlGeneration = 0;

[[noreturn]] void throwSocketError(const char* apCall, const std::string& acrPath) {
  char lMessage[600];
  snprintf(lMessage, sizeof lMessage, "%s '%s': %s", apCall, acrPath.c_str(), strerror(errno));
  throw QNCOpenFailedEx(lMessage, static_cast<unsigned int>(errno));
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
  unlink(acrPath.c_str());  // a socket file left by an earlier run; the instance lock says none runs
  if (bind(mListenFd, reinterpret_cast<sockaddr*>(&lAddress), sizeof lAddress) != 0 || listen(mListenFd, 16) != 0) {
    const int lErrno = errno;
    close(mListenFd);
    errno = lErrno;
    throwSocketError("bind", acrPath);
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
  QNCPointer<QNCFdReader> lNewReader(new (std::nothrow) QNCFdReader(lFd, true, QNCFdReader::kDefaultStagingSize, 50),
                                     QNPST_Individual, QNPAT_New);
  QNCPointer<QNCFdWriter> lNewWriter(new (std::nothrow) QNCFdWriter(lWriteFd, true, kAnswerDrainMs), QNPST_Individual,
                                     QNPAT_New);
  QNCMutexLocker lGuard(mLock);
  mReader = lNewReader;
  mWriter = lNewWriter;
  mGeneration = mNextGeneration++;
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
  if (!mChannel.writeIfCurrent(tlGeneration, acrBuffer, arCount)) throw QNCWriteFailedEx("connection ended", EPIPE);
}
