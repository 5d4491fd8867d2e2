#pragma once
// QNCLogStartupLines: the lines logged before the log is open, kept in memory with their levels so
// that the log can begin with those the mask then in force selects.
//
// Bounded: at most kCapacity bytes; lines beyond are counted, not kept. The storage is taken at the
// first line and given back by release(). Plain memory, so a fork (daemonizing) hands it to the
// child. One thread at a time: the owner serialises the calls.

#include <cstddef>

class QNCLogStartupLines {
 public:
  static constexpr size_t kCapacity = 1024 * 1024;

  QNCLogStartupLines() = default;
  ~QNCLogStartupLines();
  QNCLogStartupLines(const QNCLogStartupLines&) = delete;
  QNCLogStartupLines& operator=(const QNCLogStartupLines&) = delete;

  // Keeps one line (newline included), or counts it as dropped when it does not fit.
  void keep(unsigned int aLevel, const char* apLine, size_t aLength);

  // Gathers, in the order they came, the kept lines whose level is in aMask into one text at the
  // front of the storage; *appText points to it (valid until the next call) and its length is
  // returned. The lines are consumed: call release() afterwards.
  size_t takeSelected(unsigned int aMask, const char** appText);

  // The number of lines dropped for want of room.
  unsigned long dropped() const { return mDropped; }

  // Forgets every line and gives the storage back.
  void release();

 private:
  char* mpStore = nullptr;
  size_t mUsed = 0;
  unsigned long mDropped = 0;
};
