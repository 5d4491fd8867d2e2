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
QNCString workerName(unsigned int aChannelNo) {
  const std::string lName = "ChannelWorker-" + std::to_string(aChannelNo);
  return QNCString(lName.c_str());
}
}  // namespace

QNCChannelWorker::QNCChannelWorker(QNCSensorSystem& arSystem, QNCSensorChannel& arChannel, unsigned int aChannelNo)
    : QNCThreadComponent(workerName(aChannelNo)), mSystem(arSystem), mChannel(arChannel), mChannelNo(aChannelNo) {}

void QNCChannelWorker::run() {
  while (!isExitRequested()) {
    if (!mSystem.getReader(mChannelNo)->waitForActivity(200)) continue;
    if (mChannel.atEndOfStream()) {
      mChannel.dropConnection();  // the client left between messages
      continue;
    }
    _handleMessage();
  }
}

void QNCChannelWorker::_handleMessage() {
  QNCPointer<QNCBuffer> lMessage;
  try {
    mSystem.getProtocolHelper()->read(mSystem.getReader(mChannelNo), lMessage, 0);
  } catch (const QNCReadFailedEx& acrFailure) {
    if (QNPeerWarning(QNPW_LostMessage).admit())
      QN_LOG_WARNING("Channel %u: message lost, connection dropped: %s", mChannelNo, acrFailure.what());
    mChannel.dropConnection();
    return;
  }
  QNCPointer<QNCSensorReadingItem> lItem(new (std::nothrow) QNCSensorReadingItem, QNPST_Individual, QNPAT_New);
  lItem->mChannel = mChannelNo;
  lItem->mGeneration = mChannel.getGeneration();
  const QNCBuffer& lBytes = *lMessage;
  lItem->mAccepted = QNParseReading(lBytes, lBytes.getLength(), lItem->mReading, lItem->mSequenceText, lItem->mReason);
  if (lItem->mAccepted) {
    mSystem.generateNumericId(lItem->mId);
  } else if (QNPeerWarning(QNPW_RefusedReading).admit()) {
    QN_LOG_WARNING("Channel %u: reading %s refused: %s", mChannelNo, lItem->mSequenceText.c_str(),
                   lItem->mReason.c_str());
  }
  mSystem.enlist(QNCSensorSystem::kReadingList, lItem);
  mSystem.signal(QNCSensorSystem::kReadingsReady);
}
