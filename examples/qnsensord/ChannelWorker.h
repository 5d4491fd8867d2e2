#pragma once
// QNCChannelWorker: the thread that serves one channel of qnsensord. It waits for activity on
// its reader, reads one framed reading with the system's protocol helper, gives an accepted
// reading a numeric identifier, wraps it in a QNCSensorReadingItem, enlists it on the list of
// readings and signals the consumer. A malformed reading is enlisted too, refused, so its answer
// keeps its place in the connection's order. A client that leaves, between messages or in the
// middle of one, ends only its own connection.
// It looks at the exit request at least every 200 ms.

#include "ThreadComponent.h"

class QNCSensorChannel;
class QNCSensorSystem;

class QNCChannelWorker : public QNCThreadComponent {
 public:
  QNCChannelWorker(QNCSensorSystem& arSystem, QNCSensorChannel& arChannel, unsigned int aChannelNo);

 protected:
  void run() override;

 private:
  void _handleMessage();

  QNCSensorSystem& mSystem;
  QNCSensorChannel& mChannel;
  const unsigned int mChannelNo;
};
