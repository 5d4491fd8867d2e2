// The service side of qnsensord: its channels, numbered tables and threads.
//
//   channel n  --reader n-->  ChannelWorker-n  --enlist + signal-->  list 0 / conditional 0
//   list 0     --delist-->    ReadingConsumer  --framed answer-->    writer n
//
// One ChannelWorker per channel, one ReadingConsumer, a Heartbeat, and the "Reporters" pool that
// logs progress.

#include <unistd.h>

#include <string>

#include "ChannelWorker.h"
#include "Conditional.h"
#include "HeartbeatThread.h"
#include "Logger.h"
#include "MultiType.h"
#include "PeerWarnings.h"
#include "ProtocolHelper.h"
#include "ReadingConsumer.h"
#include "SensorChannel.h"
#include "SensorSystem.h"
#include "SynchList.h"
#include "SystemGlobals.h"
#include "ThreadPool.h"

QNCSensorSystem::~QNCSensorSystem() = default;

void QNCSensorSystem::init() {
  QNCSystem::init();
  QN_ENTERED();
  // Readings and answers are short: a peer that announces more than 4 KiB is refused before
  // anything is allocated.
  mProtocolHelper = QNCPointer<QNCProtocolHelper>(new (std::nothrow) QNCProtocolHelper(100, 4096),
                                                  QNPST_Individual, QNPAT_New);
  QNCString lDir;
  getLogDir(lDir);
  const unsigned int lChannelCount = getChannelCount();
  for (unsigned int lChannelNo = 0; lChannelNo < lChannelCount; ++lChannelNo) {
    const std::string lPath = std::string(lDir.get()) + "/qnsensord." + std::to_string(lChannelNo) + ".sock";
    QNCPointer<QNCSensorChannel> lChannel(new (std::nothrow) QNCSensorChannel(lPath), QNPST_Individual,
                                          QNPAT_New);
    mChannels.append(lChannel);
    mReaders.append(QNCPointer<QNCReader>(new (std::nothrow) QNCSensorChannelReader(*lChannel),
                                          QNPST_Individual, QNPAT_New));
    mWriters.append(QNCPointer<QNCWriter>(new (std::nothrow) QNCSensorChannelWriter(*lChannel),
                                          QNPST_Individual, QNPAT_New));
    QN_LOG_NOTICE("Channel %u listening on %s", lChannelNo, lPath.c_str());
  }
  mWaitConditionals.append(
      QNCPointer<QNCConditional>(new (std::nothrow) QNCConditional, QNPST_Individual, QNPAT_New));
  mLists.append(QNCPointer<QNCSynchList>(new (std::nothrow) QNCSynchList, QNPST_Individual, QNPAT_New));
  QN_LEFT();
}

void QNCSensorSystem::createThreads() {
  QNCSystem::createThreads();
  QNCPointer<QNCThreadPool> lReporters(new (std::nothrow) QNCThreadPool("Reporters", 1), QNPST_Individual,
                                       QNPAT_New);
  for (unsigned int lChannelNo = 0; lChannelNo < mChannels.numberOfElements(); ++lChannelNo) {
    mThreadComponents.append(QNCPointer<QNCThreadComponent>(
        new (std::nothrow) QNCChannelWorker(*this, *mChannels[lChannelNo], lChannelNo, mIdleLimit),
        QNPST_Individual, QNPAT_New));
  }
  mThreadComponents.append(QNCPointer<QNCThreadComponent>(
      new (std::nothrow) QNCReadingConsumer(*this, mStatistics, lReporters), QNPST_Individual, QNPAT_New));
  QNCPointer<QNCMultiType> lHbTimeout;
  getSetting("HbTimeout", lHbTimeout);
  mThreadComponents.append(QNCPointer<QNCThreadComponent>(
      new (std::nothrow) QNCHeartbeatThread(*this, mStatistics, *lHbTimeout), QNPST_Individual, QNPAT_New));
  mThreadPools.append(lReporters);
}

void QNCSensorSystem::createStartUpEvent() {
  QNCSystem::createStartUpEvent();
  QN_LOG_NOTICE("qnsensord running: %u channels, pid %d", mChannels.numberOfElements(),
                static_cast<int>(getpid()));
}

void QNCSensorSystem::destroy() {
  QNCSystem::destroy();
  QNFlushPeerWarnings();
  const auto lSnapshot = mStatistics.snapshot();
  QN_LOG_NOTICE("Statistics: %lu readings from %u sensors", mStatistics.total(),
                static_cast<unsigned int>(lSnapshot.size()));
  for (const auto& lrEntry : lSnapshot) {
    QN_LOG_NOTICE("Sensor %s: count %lu, min %.2f, max %.2f, mean %.2f", lrEntry.first.c_str(),
                  lrEntry.second.mCount, lrEntry.second.mMin, lrEntry.second.mMax, lrEntry.second.mean());
  }
}
