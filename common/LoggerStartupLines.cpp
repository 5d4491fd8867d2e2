#include "LoggerStartupLines.h"

#include <cstdlib>
#include <cstring>

#include "Logger.h"

namespace {
// A kept line is stored as its length (2 bytes), its level (1 byte), then its text.
constexpr size_t kRecordHeader = 3;
static_assert(kQNLogMaxLine <= 0xffff, "a line's length must fit in its 2-byte record header");
}  // namespace

QNCLogStartupLines::~QNCLogStartupLines() { release(); }

void QNCLogStartupLines::keep(unsigned int aLevel, const char* apLine, size_t aLength) {
  if (mpStore == nullptr) {
    // malloc, not new: a failed allocation loses the start-up lines, never the caller's call.
    mpStore = static_cast<char*>(malloc(kCapacity));
    if (mpStore == nullptr) {
      ++mDropped;
      return;
    }
  }
  if (aLength > kQNLogMaxLine || kCapacity - mUsed < kRecordHeader + aLength) {
    ++mDropped;
    return;
  }
  char* lpRecord = mpStore + mUsed;
  lpRecord[0] = static_cast<char>(aLength & 0xff);
  lpRecord[1] = static_cast<char>(aLength >> 8);
  lpRecord[2] = static_cast<char>(aLevel);
  memcpy(lpRecord + kRecordHeader, apLine, aLength);
  mUsed += kRecordHeader + aLength;
}

size_t QNCLogStartupLines::takeSelected(unsigned int aMask, const char** appText) {
  size_t lOut = 0;
  for (size_t lIn = 0; lIn < mUsed;) {
    const unsigned char* lpRecord = reinterpret_cast<const unsigned char*>(mpStore + lIn);
    const size_t lLength = lpRecord[0] | (static_cast<size_t>(lpRecord[1]) << 8);
    const unsigned int lLevel = lpRecord[2];
    // The text only ever moves towards the front, never past a record still to be read.
    if ((lLevel & aMask) != 0) {
      memmove(mpStore + lOut, mpStore + lIn + kRecordHeader, lLength);
      lOut += lLength;
    }
    lIn += kRecordHeader + lLength;
  }
  mUsed = 0;
  *appText = mpStore;
  return lOut;
}

void QNCLogStartupLines::release() {
  free(mpStore);
  mpStore = nullptr;
  mUsed = 0;
  mDropped = 0;
}
