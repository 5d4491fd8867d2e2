// The framing helper reuses one prefix buffer per thread. A writer that keeps the buffers it is
// given (one that queues them for later sending, say) must find each prefix as it was written:
// reusing a buffer that a writer still holds would rewrite an earlier message's length.

#include <gtest/gtest.h>

#include <vector>

#include "ProtocolHelper.h"
#include "TestSupport.h"
#include "Writer.h"

namespace {

class KeepingWriter : public QNCWriter {
 public:
  void write(const QNCPointer<QNCBuffer>& acrBuffer, unsigned int& arCount) override {
    mKept.push_back(acrBuffer);
    arCount = acrBuffer->getLength();
  }
  std::vector<QNCPointer<QNCBuffer>> mKept;
};

TEST(ProtocolPrefixTest, PrefixesAWriterKeptStayAsTheyWereWritten) {
  auto* lpWriter = new KeepingWriter;
  QNCPointer<QNCWriter> lWriter(lpWriter, QNPST_Individual, QNPAT_New);
  for (const unsigned int lLength : {3u, 5u})
    QNCProtocolHelper(0).write(lWriter, qntest::bufferOf(qntest::Bytes(lLength, 1)), false);
  ASSERT_EQ(4u, lpWriter->mKept.size());
  EXPECT_EQ((qntest::Bytes{3, 0, 0, 0}), qntest::bytesOf(lpWriter->mKept[0]));
  EXPECT_EQ((qntest::Bytes{5, 0, 0, 0}), qntest::bytesOf(lpWriter->mKept[2]));
}

}  // namespace
