// Fuzz target: the framing helper's read path against a peer that sends arbitrary bytes in
// arbitrary pieces.
//
// Input layout:
//   byte 0   options: bit 0 reads bodies of a fixed size (bytes 1-2, little-endian, 0 meaning
//            "with a prefix after all") instead of length-prefixed messages; bit 1 sets the
//            maximum message size to 64 bytes instead of 1 MiB;
//   the rest a script for the reader, one step per reader call, each step a control byte:
//     0x00-0xFA  deliver up to (control + 1) bytes of the stream, taken from the script right
//                after the control byte, never more than the helper offered;
//     0xFB       deliver as above into a buffer of the reader's own, half the size offered;
//     0xFC       claim one byte more than offered (a misbehaving reader; nothing extra is written);
//     0xFD       throw QNCReadFailedEx, as a descriptor that failed would;
//     0xFE, 0xFF throw QNCTryAgainEx (nothing to deliver yet);
//   a script that has run out delivers 0 bytes: the peer closed the stream.
// The helper retries at once (retry time 0), so 301 steps of "try again" in a row are cheap.
//
// Properties, for every input: messages are read until one read fails; every read returns a
// message or throws a QNCException, never crashes (ASan, UBSan) and never loops forever. A
// message is exactly the bytes the reader delivered for it: the 4-byte prefix, when there is
// one, equals the body's length and the body follows it unchanged, so no read went past the end
// of a message. A failed read leaves the caller's buffer as it was; a refusal for size names a
// length above the maximum.

#include <cstdint>
#include <cstring>
#include <new>
#include <vector>

#include "AllocatedBuffer.h"
#include "FuzzSupport.h"
#include "ProtocolHelper.h"
#include "QNException.h"
#include "Reader.h"

namespace {

constexpr unsigned int kLargeMaximum = 1024 * 1024;
constexpr unsigned int kSmallMaximum = 64;
constexpr unsigned int kMaxMessagesPerInput = 64;

QNCPointer<QNCBuffer> newBuffer(unsigned int aLength) {
  return QNCPointer<QNCBuffer>(new (std::nothrow) QNCAllocatedBuffer(aLength, 0));
}

class ScriptedReader : public QNCReader {
 public:
  ScriptedReader(const uint8_t* apScript, size_t aSize) : mpScript(apScript), mSize(aSize), mNext(0) {}

  void read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) override {
    const unsigned int lOffered = arBuffer->getLength();
    QN_FUZZ_CHECK(lOffered != 0);  // the helper only reads when bytes are missing
    QN_FUZZ_CHECK(lOffered <= arBuffer->getCapacity());
    if (mNext == mSize) {
      arCount = 0;
      return;
    }
    const uint8_t lControl = mpScript[mNext++];
    if (lControl >= 0xFE) throw QNCTryAgainEx("Resource temporarily unavailable", 11);
    if (lControl == 0xFD) throw QNCReadFailedEx("Peer failed", 5);
    if (lControl == 0xFC) {
      arCount = lOffered + 1;
      return;
    }
    unsigned int lRoom = lOffered;
    if (lControl == 0xFB) {
      lRoom = lOffered / 2 == 0 ? 1 : lOffered / 2;
      arBuffer = newBuffer(lRoom);
    }
    const size_t lLeft = mSize - mNext;
    size_t lCount = lControl == 0xFB ? lRoom : static_cast<size_t>(lControl) + 1;
    if (lCount > lRoom) lCount = lRoom;
    if (lCount > lLeft) lCount = lLeft;
    unsigned char* lpTarget = *arBuffer;
    memcpy(lpTarget, mpScript + mNext, lCount);
    mDelivered.insert(mDelivered.end(), mpScript + mNext, mpScript + mNext + lCount);
    mNext += lCount;
    arCount = static_cast<unsigned int>(lCount);
  }

  bool waitForActivity(unsigned int) override { return mNext < mSize; }

  // The bytes delivered since the last call, in order.
  std::vector<uint8_t> takeDelivered() {
    std::vector<uint8_t> lDelivered;
    lDelivered.swap(mDelivered);
    return lDelivered;
  }

 private:
  const uint8_t* mpScript;
  size_t mSize;
  size_t mNext;
  std::vector<uint8_t> mDelivered;
};

// One read; false when it failed (with a family exception, checked here).
bool readOne(QNCProtocolHelper& arHelper, QNCPointer<QNCReader>& arReader, ScriptedReader& arScript,
             unsigned int aFixedSize, unsigned int aMaximum) {
  const QNCPointer<QNCBuffer> lBefore = newBuffer(1);
  QNCPointer<QNCBuffer> lMessage = lBefore;
  bool lRead = false, lTooLarge = false;
  try {
    arHelper.read(arReader, lMessage, aFixedSize);
    lRead = true;
  } catch (const QNCException& acrException) {
    // Any member of the family (a bad frame, no memory, the reader's own failure) is a clear error.
    lTooLarge = strcmp(acrException.what(), "Message exceeds the maximum size") == 0;
  } catch (...) {
    qnfuzz::foreignException("QNCProtocolHelper::read");
  }
  QN_FUZZ_CHECK(lRead == (lMessage.get() != lBefore.get()));  // a failed read leaves the buffer
  // The length the message declared: its prefix, or the fixed size.
  const std::vector<uint8_t> lDelivered = arScript.takeDelivered();
  const size_t lBodyStart = aFixedSize == 0 ? 4 : 0;
  unsigned int lLength = aFixedSize;
  if (aFixedSize == 0 && lDelivered.size() >= 4) memcpy(&lLength, lDelivered.data(), 4);
  if (lTooLarge) QN_FUZZ_CHECK(lLength > aMaximum && lDelivered.size() == lBodyStart);
  if (!lRead) return false;
  QN_FUZZ_CHECK(lDelivered.size() == lBodyStart + lLength && lMessage->getLength() == lLength);
  QN_FUZZ_CHECK(lLength <= aMaximum);
  const QNCBuffer& lrBody = *lMessage;
  QN_FUZZ_CHECK(lLength == 0 || memcmp(static_cast<const unsigned char*>(lrBody),
                                       lDelivered.data() + lBodyStart, lLength) == 0);
  return true;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* apData, size_t aSize) {
  if (aSize == 0) return 0;
  const uint8_t lOptions = apData[0];
  size_t lSkip = 1;
  unsigned int lFixedSize = 0;
  if ((lOptions & 1) != 0 && aSize >= 3) {
    lFixedSize = static_cast<unsigned int>(apData[1]) | static_cast<unsigned int>(apData[2]) << 8;
    lSkip = 3;
  }
  const unsigned int lMaximum = (lOptions & 2) != 0 ? kSmallMaximum : kLargeMaximum;

  ScriptedReader* lpScript = new (std::nothrow) ScriptedReader(apData + lSkip, aSize - lSkip);
  QNCPointer<QNCReader> lReader(lpScript);
  QNCProtocolHelper lHelper(0, lMaximum);
  for (unsigned int lMessages = 0; lMessages < kMaxMessagesPerInput; ++lMessages)
    if (!readOne(lHelper, lReader, *lpScript, lFixedSize, lMaximum)) break;
  return 0;
}
