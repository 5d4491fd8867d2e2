#pragma once
// QNCReadingConsumer: the thread of qnsensord that answers readings. It waits until the list of
// readings holds one (or the process is marked for exit), delists it, adds an accepted reading
// to the per-sensor statistics, takes a pooled buffer, writes the framed answer to the writer of
// the reading's channel, gives the buffer back and returns the reading's identifier. Every 5000
// readings it hands a progress report to the reporting pool. A reading of a new sensor while the
// statistics track their maximum of sensors is refused ("too many sensors").
// An answer for a connection that has ended is dropped; nothing else stops the thread.

#include "Pointer.h"
#include "ThreadComponent.h"

class QNCSensorReadingItem;
class QNCSensorStatistics;
class QNCSensorSystem;
class QNCThreadPool;

class QNCReadingConsumer : public QNCThreadComponent {
 public:
  QNCReadingConsumer(QNCSensorSystem& arSystem, QNCSensorStatistics& arStatistics,
                     const QNCPointer<QNCThreadPool>& acrReporters);

 protected:
  void run() override;

 private:
  void _answer(QNCSensorReadingItem& arItem);
  void _report();

  QNCSensorSystem& mSystem;
  QNCSensorStatistics& mStatistics;
  QNCPointer<QNCThreadPool> mReporters;
};
