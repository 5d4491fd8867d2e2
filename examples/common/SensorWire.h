#pragma once
// The messages qnsensord and qnsensor-feed exchange, each the body of one framed message.
//
//   reading  "<sensor> <sequence> <value>"     e.g. "temp-1 17 21.5"
//            sensor: 1 to 31 characters of [A-Za-z0-9_.-]; sequence: decimal, 0 to 2^32-1;
//            value: a finite decimal number
//   answer   "OK <sequence> <id>"              the reading was accepted and given identifier <id>
//            "ERR <sequence> <reason>"         the reading was refused; <sequence> is "-" when
//                                              the reading did not carry a readable one
//
// Parsing never trusts the peer: any body that does not match is refused with a reason, never a
// crash. Used by both programs; no state, any thread.

#include <string>

struct QNSSensorReading {
  std::string mSensor;
  unsigned int mSequence = 0;
  double mValue = 0.0;
};

// Parses a reading. Returns true on success; otherwise false with arReason set, and
// arSequenceText set to the sequence field when one could be read ("-" when not).
bool QNParseReading(const unsigned char* apBytes, unsigned int aLength, QNSSensorReading& arReading,
                    std::string& arSequenceText, std::string& arReason);

std::string QNFormatReading(const QNSSensorReading& acrReading);

struct QNSSensorAnswer {
  bool mAccepted = false;
  std::string mSequence;  // the text of the sequence field
  unsigned int mId = 0;   // when accepted
  std::string mReason;    // when refused
};

bool QNParseAnswer(const unsigned char* apBytes, unsigned int aLength, QNSSensorAnswer& arAnswer);
