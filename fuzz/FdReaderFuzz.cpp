// Fuzz target: a byte stream from a peer, arriving through a pipe at QNCFdReader and framed by
// the helper: the whole path that bytes from another process take into the library.
//
// Input layout: byte 0 chooses the reader's staging size (byte + 1, so 1 to 256 bytes, small
// enough that prefixes and bodies straddle staged blocks); the rest is the stream, written into
// the pipe before reading starts, after which the writing end is closed.
//
// Properties, for every input: messages are read until one read fails, and the outcome is exactly
// what the stream spells: each message is the next length prefix and the body that follows it;
// the first read that fails is the one whose prefix is cut short, whose length is above the
// maximum, or whose body is cut short by the end of the stream, and it fails with
// QNCReadFailedEx. A stream that ended between messages leaves the reader at its end.

#include <fcntl.h>
#include <unistd.h>

#include <cstdint>
#include <cstring>
#include <new>

#include "Buffer.h"
#include "FdReader.h"
#include "FuzzSupport.h"
#include "ProtocolHelper.h"
#include "QNException.h"

namespace {

constexpr unsigned int kMaximum = 1024 * 1024;
// Stays below the pipe's capacity (64 KiB on Linux), so writing never waits for a reader.
constexpr size_t kMaxStream = 60000;

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* apData, size_t aSize) {
  if (aSize == 0) return 0;
  const unsigned int lStagingSize = static_cast<unsigned int>(apData[0]) + 1;
  const uint8_t* lpStream = apData + 1;
  const size_t lStreamSize = aSize - 1 < kMaxStream ? aSize - 1 : kMaxStream;

  int lPipe[2];
  QN_FUZZ_CHECK(pipe2(lPipe, O_CLOEXEC) == 0);
  qnfuzz::writeAll(lPipe[1], lpStream, lStreamSize);
  QN_FUZZ_CHECK(close(lPipe[1]) == 0);

  QNCFdReader* lpFdReader = new (std::nothrow) QNCFdReader(lPipe[0], true, lStagingSize);
  QNCPointer<QNCReader> lReader(lpFdReader);
  QNCProtocolHelper lHelper(0, kMaximum);
  size_t lAt = 0;  // the start of the next message in the stream
  for (;;) {
    // What the stream says the next read must give.
    const size_t lLeft = lStreamSize - lAt;
    unsigned int lLength = 0;
    if (lLeft >= 4) memcpy(&lLength, lpStream + lAt, 4);
    const bool lWhole = lLeft >= 4 && lLength <= kMaximum && lLeft - 4 >= lLength;

    QNCPointer<QNCBuffer> lMessage;
    try {
      lHelper.read(lReader, lMessage, 0);
    } catch (const QNCReadFailedEx&) {
      QN_FUZZ_CHECK(!lWhole);
      if (lLeft == 0) QN_FUZZ_CHECK(lpFdReader->atEndOfStream());
      return 0;
    } catch (const QNCException&) {
      // Another member of the family (no memory): a clear error, but not one this stream calls for.
      QN_FUZZ_CHECK(false);
    } catch (...) {
      qnfuzz::foreignException("QNCProtocolHelper::read over QNCFdReader");
    }
    QN_FUZZ_CHECK(lWhole);
    QN_FUZZ_CHECK(lMessage->getLength() == lLength);
    const QNCBuffer& lrBody = *lMessage;
    QN_FUZZ_CHECK(lLength == 0 ||
                  memcmp(static_cast<const unsigned char*>(lrBody), lpStream + lAt + 4, lLength) == 0);
    lAt += 4 + lLength;
  }
}
