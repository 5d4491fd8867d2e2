#include "PeerWarnings.h"

#include "Assert.h"

namespace {
// Made on first use, so after the logger's own statics, and destroyed before them.
QNCWarningLimiter* limiters() {
  static QNCWarningLimiter sLimiters[QNPW_Count] = {
      QNCWarningLimiter{"refused readings"}, QNCWarningLimiter{"lost messages"},
      QNCWarningLimiter{"unread answers"}, QNCWarningLimiter{"dropped answers"},
      QNCWarningLimiter{"connection lines"}};
  return sLimiters;
}
}  // namespace

QNCWarningLimiter& QNPeerWarning(QNEPeerWarning aKind) {
  QN_ASSERT(aKind < QNPW_Count);
  return limiters()[aKind];
}

void QNFlushPeerWarnings() {
  for (unsigned int lKind = 0; lKind < QNPW_Count; ++lKind) limiters()[lKind].flush();
}
