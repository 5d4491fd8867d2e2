#pragma once
// QNCSensorChannel: one numbered channel of qnsensord, a Unix-domain stream socket that serves
// one connection at a time and takes the next when it ends, so channel numbers stay fixed while
// clients come and go. Reader n and writer n of the system object are the two ends of channel n's
// current connection (QNCSensorChannelReader, QNCSensorChannelWriter), built on the library's
// descriptor-based channel ends.
//
// Each connection has a generation number. A reading remembers the generation it arrived on, and
// its answer is written only while that connection is still the current one: an answer never
// reaches a later client of the same channel.
//
// Threads: the channel's worker thread accepts, reads and drops connections; the consumer thread
// writes answers. mLock guards the current connection and its generation; a writer holds it for
// the whole check-and-write of one answer, and a connection is only replaced under it.

#include <string>

#include "FdReader.h"
#include "FdWriter.h"
#include "Mutex.h"
#include "Pointer.h"
#include "Reader.h"
#include "Writer.h"

class QNCSensorChannel {
 public:
  // How long an answer may wait for its client to drain the socket (whose buffer holds a few
  // hundred answers) before the connection is ended.
  static constexpr unsigned int kAnswerDrainMs = 100;

  // Owner read and write, group read and write: the service's group may feed readings, others
  // may not even connect. Set explicitly, so the umask (0 in a daemon) plays no part.
  static constexpr unsigned int kSocketMode = 0660;

  // Binds a socket of mode kSocketMode at acrPath and listens. The caller must hold the instance
  // lock (markAsRunning has run): a socket at acrPath owned by this user that nobody accepts on
  // is then a leftover of an earlier run and is replaced. Throws QNCExistsEx, logged at error
  // level, when anything else is at acrPath (a file, a directory, a link, another user's socket, a
  // served socket): it is left untouched. Throws QNCOpenFailedEx naming the path and the call when
  // the socket cannot be set up.
  explicit QNCSensorChannel(const std::string& acrPath);
  ~QNCSensorChannel();
  QNCSensorChannel(const QNCSensorChannel&) = delete;
  QNCSensorChannel& operator=(const QNCSensorChannel&) = delete;

  // Waits at most aMilliseconds. Without a connection, accepts one that is waiting. Returns true
  // when the current connection has bytes to read or has ended.
  // Throws QNCOpenFailedEx naming the path when poll or accept on the listening socket fails for
  // a reason other than a client that gave up (no descriptor or memory left, ...).
  bool waitForActivity(unsigned int aMilliseconds);

  // True when the current connection's client has closed it and every byte has been read.
  bool atEndOfStream();

  // Reads from the current connection; QNCTryAgainEx when there is none.
  void read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount);

  // Writes to the current connection if it is still generation acGeneration; returns false (and
  // writes nothing) when that connection has ended. A client whose socket stays full for
  // kAnswerDrainMs loses its connection: QNCTimeOutEx, and the connection is ended.
  bool writeIfCurrent(unsigned long acGeneration, const QNCPointer<QNCBuffer>& acrBuffer,
                      unsigned int& arCount);

  // Ends the current connection (after the end of its stream, or a message that failed).
  void dropConnection();

  // The generation of the current connection (0 when there is none).
  unsigned long getGeneration() const;
  const std::string& getPath() const { return mPath; }

 private:
  std::string mPath;
  int mListenFd;
  mutable QNCMutex mLock;  // guards the four members below
  QNCPointer<QNCFdReader> mReader;
  QNCPointer<QNCFdWriter> mWriter;
  unsigned long mGeneration;
  unsigned long mNextGeneration;
};

// Reader n of the system object: the receiving end of channel n's current connection.
class QNCSensorChannelReader : public QNCReader {
 public:
  explicit QNCSensorChannelReader(QNCSensorChannel& arChannel) : mChannel(arChannel) {}
  void read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) override {
    mChannel.read(arBuffer, arCount);
  }
  bool waitForActivity(unsigned int acWaitTime) override { return mChannel.waitForActivity(acWaitTime); }

 private:
  QNCSensorChannel& mChannel;
};

// Writer n of the system object: the sending end of channel n's current connection. The
// generation to write to is set per thread with setGeneration() before the helper's write, so
// the framing helper can be used unchanged.
class QNCSensorChannelWriter : public QNCWriter {
 public:
  explicit QNCSensorChannelWriter(QNCSensorChannel& arChannel) : mChannel(arChannel) {}

  // The connection the calling thread's next writes are meant for.
  static void setGeneration(unsigned long aGeneration);

  // Throws QNCWriteFailedEx "connection ended" when the intended connection is gone.
  void write(const QNCPointer<QNCBuffer>& acrBuffer, unsigned int& arCount) override;

 private:
  QNCSensorChannel& mChannel;
};
