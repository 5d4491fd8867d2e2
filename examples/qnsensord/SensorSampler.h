#pragma once
// QNCSensorSampler: the thread of qnsensord that takes a sensor reading every second and hands
// it to the sample pool for processing. Every third sample it logs a heartbeat at notice level,
// so a running service is visible in its log.
//
// It ends when the system asks it to (SIGINT, SIGTERM, SIGHUP) or when the pool refuses a sample
// because the pool has been finished first; either way within one sampling period.

#include "Pointer.h"
#include "ThreadComponent.h"

class QNCThreadPool;

class QNCSensorSampler : public QNCThreadComponent {
 public:
  QNCSensorSampler(const QNCString& acrName, const QNCPointer<QNCThreadPool>& acrPool);

 protected:
  void run() override;

 private:
  QNCPointer<QNCThreadPool> mPool;
};
