#include "ChannelWorker.h"

#include <string>

#include "Buffer.h"
#include "Logger.h"
#include "PeerWarnings.h"
#include "ProtocolHelper.h"
#include "Reader.h"
#include "SensorChannel.h"
#include "SensorReading.h"
#include "SensorSystem.h"

namespace {
constexpr unsigned int kFailuresInRowToGiveUp = 25;  // with a 200 ms pause after each: 5 s

QNCString workerName(unsigned int aChannelNo) {
  const std::string lName = "ChannelWorker-" + std::to_string(aChannelNo);
  return QNCString(lName.c_str());
}

// Reader n as one message read sees it: it gives up with QNCReadFailedEx once the worker must
// (idle limit passed, exit requested). The framing helper retries a reader that has nothing yet
// every 150 ms (its 100 ms sleep and the reader's 50 ms read wait) and passes any other exception
// on, so a peer that stalls in the middle of a message no longer holds the worker for the
// helper's 301 retries.
class QNCWatchedReader : public QNCReader {
 public:
  QNCWatchedReader(QNCPointer<QNCReader>& arReader, const QNCChannelWorker& acrWorker)
      : mReader(arReader), mWorker(acrWorker) {}
  void read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) override {
    if (mWorker.mustGiveUp()) throw QNCReadFailedEx("peer stalled in the middle of a message", 0);
    mReader->read(arBuffer, arCount);
  }
  bool waitForActivity(unsigned int acWaitTime) override { return mReader->waitForActivity(acWaitTime); }

 private:
  QNCPointer<QNCReader>& mReader;
  const QNCChannelWorker& mWorker;
};
}  // namespace

QNCChannelWorker::QNCChannelWorker(QNCSensorSystem& arSystem, QNCSensorChannel& arChannel,
                                   unsigned int aChannelNo, unsigned int aIdleLimitSeconds)
    : QNCThreadComponent(workerName(aChannelNo)),
      mSystem(arSystem),
      mChannel(arChannel),
      mChannelNo(aChannelNo),
      mIdleLimit(aIdleLimitSeconds),
      mGeneration(0) {}

bool QNCChannelWorker::mustGiveUp() const {
  return isExitRequested() || std::chrono::steady_clock::now() - mLastProgress > mIdleLimit;
}

void QNCChannelWorker::run() {
  unsigned int lFailuresInRow = 0;
  while (!isExitRequested()) {
    try {
      if (_serveOnce()) lFailuresInRow = 0;
    } catch (const QNCException& acrFailure) {
      // A failure of one connection's socket (a reset reported at the end of the stream, ...)
      // ends that connection, never the channel.
      QN_LOG_WARNING("Channel %u: connection dropped: %s", mChannelNo, acrFailure.what());
      mChannel.dropConnection();
      // Failures with no progress between them for 5 s are the channel's own (its listening
      // socket, the process's descriptors or memory), not a client's: the thread gives up, which
      // ends the run in order with exit status 1 for a supervisor to restart it. The pause keeps
      // a failing call from spinning meanwhile.
      if (++lFailuresInRow >= kFailuresInRowToGiveUp) throw;
      waitForExitRequest(200);
    }
  }
}

bool QNCChannelWorker::_serveOnce() {
  const bool lActive = mSystem.getReader(mChannelNo)->waitForActivity(200);
  const unsigned long lGeneration = mChannel.getGeneration();
  const bool lAccepted = lGeneration != mGeneration && lGeneration != 0;
  if (lGeneration != mGeneration) {  // a new connection (or none): its idle time starts now
    mGeneration = lGeneration;
    mLastProgress = std::chrono::steady_clock::now();
  }
  if (lGeneration == 0) return false;
  if (!lActive) {
    if (mustGiveUp() && !isExitRequested()) {
      QN_LOG_WARNING("Channel %u: no message for %u s, connection dropped", mChannelNo,
                     static_cast<unsigned int>(mIdleLimit.count()));
      mChannel.dropConnection();
    }
    return lAccepted;
  }
  if (mChannel.atEndOfStream()) {
    mChannel.dropConnection();  // the client left between messages
    return true;
  }
  _handleMessage();
  return true;
}

void QNCChannelWorker::_handleMessage() {
  QNCPointer<QNCBuffer> lMessage;
  try {
    QNCPointer<QNCReader> lReader(new (std::nothrow) QNCWatchedReader(mSystem.getReader(mChannelNo), *this),
                                  QNPST_Individual, QNPAT_New);
    mSystem.getProtocolHelper()->read(lReader, lMessage, 0);
  } catch (const QNCReadFailedEx& acrFailure) {
    if (QNPeerWarning(QNPW_LostMessage).admit())
      QN_LOG_WARNING("Channel %u: message lost, connection dropped: %s", mChannelNo, acrFailure.what());
    mChannel.dropConnection();
    return;
  }
  mLastProgress = std::chrono::steady_clock::now();
  QNCPointer<QNCSensorReadingItem> lItem(new (std::nothrow) QNCSensorReadingItem, QNPST_Individual,
                                         QNPAT_New);
  lItem->mChannel = mChannelNo;
  lItem->mGeneration = mGeneration;
  const QNCBuffer& lBytes = *lMessage;
  lItem->mAccepted =
      QNParseReading(lBytes, lBytes.getLength(), lItem->mReading, lItem->mSequenceText, lItem->mReason);
  if (lItem->mAccepted) {
    mSystem.generateNumericId(lItem->mId);
  } else if (QNPeerWarning(QNPW_RefusedReading).admit()) {
    QN_LOG_WARNING("Channel %u: reading %s refused: %s", mChannelNo, lItem->mSequenceText.c_str(),
                   lItem->mReason.c_str());
  }
  mSystem.enlist(QNCSensorSystem::kReadingList, lItem);
  mSystem.signal(QNCSensorSystem::kReadingsReady);
}
