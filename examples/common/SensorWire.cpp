#include "SensorWire.h"

#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <sstream>
#include <vector>

namespace {
constexpr unsigned int kMaxReading = 256;

std::vector<std::string> split(const unsigned char* apBytes, unsigned int aLength) {
  std::vector<std::string> lFields;
  std::string lField;
  for (unsigned int i = 0; i < aLength; ++i) {
    const char lChar = static_cast<char>(apBytes[i]);
    if (lChar == ' ') {
      if (!lField.empty()) lFields.push_back(lField);
      lField.clear();
    } else {
      lField.push_back(lChar);
    }
  }
  if (!lField.empty()) lFields.push_back(lField);
  return lFields;
}

bool parseUnsigned(const std::string& acrText, unsigned int& arValue) {
  if (acrText.empty() || acrText.size() > 10) return false;
  unsigned long long lValue = 0;
  for (char lChar : acrText) {
    if (lChar < '0' || lChar > '9') return false;
    lValue = lValue * 10 + static_cast<unsigned long long>(lChar - '0');
  }
  if (lValue > 0xFFFFFFFFull) return false;
  arValue = static_cast<unsigned int>(lValue);
  return true;
}

bool validSensorName(const std::string& acrName) {
  if (acrName.empty() || acrName.size() > 31) return false;
  for (char lChar : acrName) {
    const bool lOk = (lChar >= 'a' && lChar <= 'z') || (lChar >= 'A' && lChar <= 'Z') ||
                     (lChar >= '0' && lChar <= '9') || lChar == '_' || lChar == '.' || lChar == '-';
    if (!lOk) return false;
  }
  return true;
}
}  // namespace

bool QNParseReading(const unsigned char* apBytes, unsigned int aLength, QNSSensorReading& arReading,
                    std::string& arSequenceText, std::string& arReason) {
  arSequenceText = "-";
  if (aLength == 0 || aLength > kMaxReading) {
    arReason = aLength == 0 ? "empty reading" : "reading too long";
    return false;
  }
  const std::vector<std::string> lFields = split(apBytes, aLength);
  if (lFields.size() >= 2 && parseUnsigned(lFields[1], arReading.mSequence)) arSequenceText = lFields[1];
  if (lFields.size() != 3) {
    arReason = "expected '<sensor> <sequence> <value>'";
    return false;
  }
  if (!validSensorName(lFields[0])) {
    arReason = "bad sensor name";
    return false;
  }
  if (arSequenceText == "-") {
    arReason = "bad sequence number";
    return false;
  }
  errno = 0;
  char* lpEnd = nullptr;
  const double lValue = strtod(lFields[2].c_str(), &lpEnd);
  if (lpEnd == lFields[2].c_str() || *lpEnd != '\0' || errno == ERANGE || !std::isfinite(lValue)) {
    arReason = "bad value";
    return false;
  }
  arReading.mSensor = lFields[0];
  arReading.mValue = lValue;
  return true;
}

std::string QNFormatReading(const QNSSensorReading& acrReading) {
  std::ostringstream lOut;
  lOut << acrReading.mSensor << ' ' << acrReading.mSequence << ' ' << acrReading.mValue;
  return lOut.str();
}

bool QNParseAnswer(const unsigned char* apBytes, unsigned int aLength, QNSSensorAnswer& arAnswer) {
  const std::vector<std::string> lFields = split(apBytes, aLength);
  if (lFields.size() < 3) return false;
  arAnswer.mSequence = lFields[1];
  if (lFields[0] == "OK") {
    arAnswer.mAccepted = true;
    return lFields.size() == 3 && parseUnsigned(lFields[2], arAnswer.mId);
  }
  if (lFields[0] != "ERR") return false;
  arAnswer.mAccepted = false;
  arAnswer.mReason.clear();
  for (size_t i = 2; i < lFields.size(); ++i) arAnswer.mReason += (i > 2 ? " " : "") + lFields[i];
  return true;
}
