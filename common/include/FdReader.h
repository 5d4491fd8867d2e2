#pragma once
// QNCFdReader: the receiving end of a buffer channel over a file descriptor (a connected
// stream socket or the read end of a pipe).
//
// - The descriptor is put into non-blocking mode. With nothing to deliver, read() throws
//   QNCTryAgainEx at once -- or, when the reader was made with a read wait, after waiting at most
//   that long for bytes (a body that trails its prefix by a moment then costs no retry sleep of
//   the caller). At the end of the stream it delivers 0 bytes; other failures are
//   QNCReadFailedEx naming the descriptor and the system's error text.
// - Received bytes are staged: one read(2) fills a staging buffer, and small reads (a size prefix,
//   short bodies) are served from memory. A read that wants at least the staging size and finds
//   nothing staged goes straight into the caller's buffer, so a large body is copied once.
// - waitForActivity(ms) returns true at once when bytes are staged, else waits with poll(2).
// - The descriptor is closed by the destructor when the reader owns it.
//
// Threads: any thread; one lock serialises read() and waitForActivity(). A message spread over
// several reads is kept whole only when one thread at a time reads it.

#include "Mutex.h"
#include "Reader.h"

class QNCFdReader : public QNCReader {
 public:
  static constexpr unsigned int kDefaultStagingSize = 4096;

  // aReadWaitMs: how long read() may wait for bytes before it throws QNCTryAgainEx (0: never).
  // Throws QNCNoMemoryEx when the staging buffer cannot be allocated, QNCOsException when the
  // descriptor cannot be made non-blocking.
  explicit QNCFdReader(int aFd, bool aOwnsFd = true, unsigned int aStagingSize = kDefaultStagingSize,
                       unsigned int aReadWaitMs = 0);
  // Never throws: a failing close(2) of an owned descriptor is ignored (the descriptor is gone).
  ~QNCFdReader() override;
  QNCFdReader(const QNCFdReader&) = delete;
  QNCFdReader& operator=(const QNCFdReader&) = delete;

  // Delivers up to arBuffer->getLength() bytes into the buffer, from its first byte on; 0 bytes
  // (no exception) at the end of the stream. Throws:
  // - QNCTryAgainEx "Resource temporarily unavailable" (11) when nothing has arrived (after the
  //   read wait, if any);
  // - QNCReadFailedEx "read fd <n>: <system text>" (errno) when read(2) fails otherwise, e.g.
  //   ECONNRESET when the peer closed a socket with bytes of ours still unread;
  // - QNCOsException "poll fd <n>: <system text>" when the read wait's poll(2) fails.
  // Never throws for EINTR (retried).
  void read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) override;
  // Throws QNCOsException "poll fd <n>: <system text>" when poll(2) fails (EINTR is retried for the
  // time that is left).
  bool waitForActivity(unsigned int acWaitTime) override;

  // True when the peer has closed the stream and every byte has been delivered; never blocks.
  // Lets a server tell a client that left between messages (not an error) from one that left in
  // the middle of a message. It reads ahead to find out, so it throws what read(2) reports:
  // QNCReadFailedEx "read fd <n>: <system text>" (ECONNRESET after a peer closed with our bytes
  // unread, among others). Never QNCTryAgainEx: nothing to read yet is false.
  bool atEndOfStream();

 private:
  QNCMutex mLock;  // guards everything below
  int mFd;
  bool mOwnsFd;
  unsigned char* mpStaging;
  unsigned int mStagingSize;
  unsigned int mStagedBegin;  // first staged byte not yet delivered
  unsigned int mStagedEnd;    // one past the last staged byte
  bool mEnded;                // read(2) has reported the end of the stream
  unsigned int mReadWaitMs;
};
