// The threads of qnsensord: one sampler thread feeding a pool of two sample processors.

#include "SensorSampler.h"
#include "SensorSystem.h"
#include "ThreadPool.h"

void QNCSensorSystem::createThreads() {
  QNCSystem::createThreads();
  QNCPointer<QNCThreadPool> lPool(new (std::nothrow) QNCThreadPool("SampleProcessors", 2), QNPST_Individual,
                                  QNPAT_New);
  mThreadComponents.append(QNCPointer<QNCThreadComponent>(new (std::nothrow) QNCSensorSampler("SensorSampler", lPool),
                                                          QNPST_Individual, QNPAT_New));
  mThreadPools.append(lPool);
}
