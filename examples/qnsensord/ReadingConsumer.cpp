#include "ReadingConsumer.h"

#include <cstdio>
#include <string>

#include "Buffer.h"
#include "Clib.h"
#include "Logger.h"
#include "PeerWarnings.h"
#include "ProtocolHelper.h"
#include "SensorChannel.h"
#include "SensorReading.h"
#include "SensorStatistics.h"
#include "SensorSystem.h"
#include "ThreadPool.h"

QNCReadingConsumer::QNCReadingConsumer(QNCSensorSystem& arSystem, QNCSensorStatistics& arStatistics,
                                       const QNCPointer<QNCThreadPool>& acrReporters)
    : QNCThreadComponent("ReadingConsumer"),
      mSystem(arSystem),
      mStatistics(arStatistics),
      mReporters(acrReporters) {}

void QNCReadingConsumer::run() {
  QNCPointer<QNCQueueable> lElement;
  // Ends once the process is marked for exit and every reading handed over has been answered;
  // the exit request wakes the wait at once.
  while (mSystem.delistOrExit(QNCSensorSystem::kReadingsReady, QNCSensorSystem::kReadingList, 0, lElement) ==
         QNWS_Ready) {
    QNCSensorReadingItem& lItem = static_cast<QNCSensorReadingItem&>(*lElement);
    const bool lHadId = lItem.mAccepted;
    _answer(lItem);
    if (lHadId) mSystem.returnNumericId(lItem.mId);
    if (lItem.mAccepted && mStatistics.total() % 5000 == 0) _report();
  }
}

void QNCReadingConsumer::_answer(QNCSensorReadingItem& arItem) {
  if (arItem.mAccepted && !mStatistics.add(arItem.mReading.mSensor, arItem.mReading.mValue)) {
    arItem.mAccepted = false;
    arItem.mReason = "too many sensors";
  }
  char lText[128];
  const int lLength = arItem.mAccepted ? ClibSnprintf(lText, sizeof lText, "OK %s %u",
                                                      arItem.mSequenceText.c_str(), arItem.mId)
                                       : ClibSnprintf(lText, sizeof lText, "ERR %s %s",
                                                      arItem.mSequenceText.c_str(), arItem.mReason.c_str());
  const unsigned int lSize = lLength < static_cast<int>(sizeof lText)
                                 ? static_cast<unsigned int>(lLength)
                                 : static_cast<unsigned int>(sizeof lText - 1);
  QNCPointer<QNCBuffer> lAnswer;
  mSystem.getBuffer(lSize, lAnswer);
  ClibMemcpy(static_cast<unsigned char*>(*lAnswer), lText, lSize);
  QNCSensorChannelWriter::setGeneration(arItem.mGeneration);
  try {
    mSystem.getProtocolHelper()->write(mSystem.getWriter(arItem.mChannel), lAnswer, false);
  } catch (const QNCWriteFailedEx& acrFailure) {
    if (QNPeerWarning(QNPW_DroppedAnswer).admit())
      QN_LOG_INFO("Channel %u: answer to reading %s dropped: %s", arItem.mChannel,
                  arItem.mSequenceText.c_str(), acrFailure.what());
  } catch (const QNCTimeOutEx& acrFailure) {
    if (QNPeerWarning(QNPW_UnreadAnswer).admit())
      QN_LOG_WARNING("Channel %u: client does not read its answers: %s", arItem.mChannel, acrFailure.what());
  }
  mSystem.reuseBuffer(lAnswer);
}

void QNCReadingConsumer::_report() {
  QNCSensorStatistics* lpStatistics = &mStatistics;
  try {
    mReporters->submit([lpStatistics] {
      const auto lSnapshot = lpStatistics->snapshot();
      QN_LOG_NOTICE("Progress: %lu readings from %u sensors", lpStatistics->total(),
                    static_cast<unsigned int>(lSnapshot.size()));
    });
  } catch (const QNCExitConditionEx&) {
    // The pool is finished: the service is shutting down and the final statistics follow.
  }
}
