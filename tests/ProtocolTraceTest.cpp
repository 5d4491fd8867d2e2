// The framing helper looks at the trace level once per call and then runs a path with all of its
// trace lines or with none: a line lost from the traced path, or written by the other, shows here.

#include "FdReader.h"
#include "FdWriter.h"
#include "LogSupport.h"
#include "OsStream.h"
#include "ProtocolHelper.h"

using ProtocolTraceTest = qntest::LoggedTest;

TEST_F(ProtocolTraceTest, FramingWritesEveryTraceLineWhenTracedAndNoneWhenMaskedOff) {
  int lReadFd = -1, lWriteFd = -1;
  OsOpenWakePipe(lReadFd, lWriteFd);
  QNCPointer<QNCWriter> lWriter(new QNCFdWriter(lWriteFd), QNPST_Individual, QNPAT_New);
  QNCPointer<QNCReader> lReader(new QNCFdReader(lReadFd), QNPST_Individual, QNPAT_New);
  QNCPointer<QNCBuffer> lReceived;
  for (const unsigned int lMask : {255u, 255u & ~static_cast<unsigned int>(QNLL_Trace)}) {
    setLogCode(lMask);
    QNCProtocolHelper(0).write(lWriter, qntest::bufferOf({7, 8, 9}), false);
    QNCProtocolHelper(0).read(lReader, lReceived, 0);
  }
  const std::string lLog = log();
  // Each operation's own lines, and the public operation named on the lines of its helpers.
  qntest::expectInOrder(
      lLog, {"] write (", "] __writeSize", "Wrote '4' bytes of Protocol Message Size of required '4'",
             "Wrote '3' bytes of Protocol Message of required '3'", "] write (", "] read (", "] __read ",
             "Protocol Message to read is of '3' bytes", "] read (", "Creating a buffer of '3' size",
             "Read 3 bytes into localbuffer total read = 3", "] read ("});
  EXPECT_EQ(lLog.find("Protocol Message to read"), lLog.rfind("Protocol Message to read")) << lLog;
}
