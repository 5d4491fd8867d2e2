#pragma once
// QNCFdWriter: the sending end of a buffer channel over a file descriptor (a connected stream
// socket or the write end of a pipe).
//
// - write() sends every used byte of the buffer before it returns, looping over partial writes
//   and EINTR; when the descriptor is non-blocking and full it waits for the peer to drain, at
//   most the time-out given to the constructor (QNCTimeOutEx).
// - A peer that has gone is QNCWriteFailedEx ("... Broken pipe"); the process never receives
//   SIGPIPE from it.
// - On a TCP socket the constructor sets TCP_NODELAY: a framed message is written as a prefix and
//   a body, and with Nagle's algorithm the body would wait for the peer's delayed acknowledgement.
// - The descriptor is closed by the destructor when the writer owns it. A reader and a writer
//   over the same socket: let one of them own it.
//
// Threads: any thread; one lock serialises write(), so the bytes of one call are never interleaved
// with another's. Keeping a prefix and its body together is the caller's business.

#include "Mutex.h"
#include "Writer.h"

class QNCFdWriter : public QNCWriter {
 public:
  static constexpr unsigned int kDefaultTimeoutMs = 30000;

  explicit QNCFdWriter(int aFd, bool aOwnsFd = true, unsigned int aTimeoutMs = kDefaultTimeoutMs);
  ~QNCFdWriter() override;
  QNCFdWriter(const QNCFdWriter&) = delete;
  QNCFdWriter& operator=(const QNCFdWriter&) = delete;

  void write(const QNCPointer<QNCBuffer>& acrBuffer, unsigned int& arCount) override;

 private:
  QNCMutex mLock;  // serialises write()
  int mFd;
  bool mOwnsFd;
  bool mIsSocket;
  unsigned int mTimeoutMs;
};
