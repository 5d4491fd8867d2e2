#pragma once
// QNCChannelWorker: the thread that serves one channel of qnsensord. It waits for activity on
// its reader, reads one framed reading with the system's protocol helper, gives an accepted
// reading a numeric identifier, wraps it in a QNCSensorReadingItem, enlists it on the list of
// readings and signals the consumer. A malformed reading is enlisted too, refused, so its answer
// keeps its place in the connection's order.
//
// What a client can do to a channel costs that client's connection only, never the channel:
// - leaving between messages or in the middle of one, or resetting the connection (ECONNRESET):
//   the connection is dropped and the next client is taken;
// - sending nothing, or stalling in the middle of a message: a connection that completes no
//   message within the idle limit (the IdleLimit setting, seconds) is dropped.
// A failure that persists with no progress between for 5 s (poll or accept on the listening
// socket, no descriptor left, ...) is the channel's own: the thread then ends by that exception,
// and the library's policy ends the run in order with exit status 1.
// It looks at the exit request at least every 200 ms, also while it waits for the rest of a
// message: a body read gives up at once when exit is requested.

#include <chrono>

#include "ThreadComponent.h"

class QNCSensorChannel;
class QNCSensorSystem;

class QNCChannelWorker : public QNCThreadComponent {
 public:
  QNCChannelWorker(QNCSensorSystem& arSystem, QNCSensorChannel& arChannel, unsigned int aChannelNo,
                   unsigned int aIdleLimitSeconds);

  // True once the current connection has completed no message for longer than the idle limit,
  // or exit has been requested: a read of that connection should give up.
  bool mustGiveUp() const;

 protected:
  void run() override;

 private:
  // One wait and what it brought; true when it made progress (a connection accepted, a message
  // read or a client's end seen).
  bool _serveOnce();
  void _handleMessage();

  QNCSensorSystem& mSystem;
  QNCSensorChannel& mChannel;
  const unsigned int mChannelNo;
  const std::chrono::seconds mIdleLimit;
  unsigned long mGeneration;                            // the connection mLastProgress belongs to
  std::chrono::steady_clock::time_point mLastProgress;  // its accept or its last whole message
};
