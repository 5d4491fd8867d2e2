#pragma once
// The log lines of qnsensord whose rate its peers decide. Each kind has its own
// QNCWarningLimiter with the defaults, so a flood of bad input adds at most 11 lines per second
// per kind to the log (see WarningLimiter.h): five kinds here and the protocol helper's
// oversized-message line, at most 66 lines per second in all.
//
// Threads: any thread. The limiters live until the process exits; QNFlushPeerWarnings() writes
// their pending counts before the logger is destroyed.

#include "WarningLimiter.h"

enum QNEPeerWarning : unsigned int {
  QNPW_RefusedReading,  // a malformed reading ("reading ... refused")
  QNPW_LostMessage,     // a message cut short or announced over the size limit ("message lost")
  QNPW_UnreadAnswer,    // a client that does not read its answers
  QNPW_DroppedAnswer,   // an answer for a client that has left
  QNPW_Connection,      // a connection accepted or ended
  QNPW_Count
};

// The limiter of one kind.
QNCWarningLimiter& QNPeerWarning(QNEPeerWarning aKind);

// Writes every pending count of suppressed lines; called at shut-down while the log is open.
void QNFlushPeerWarnings();
