#include "LoggerLine.h"

#include <cstdio>
#include <cstring>
#include <ctime>

#include "OsThread.h"

namespace {

// Date and time of one second, "YYYY-MM-DD HH:MM:SS".
constexpr size_t kSecondText = 19;

struct QNSLineCache {
  time_t mSecond = -1;
  char mSecondText[kSecondText];
  size_t mSecondLength = 0;
  char mTid[24];  // "[tid]"; empty until first use in this thread
  size_t mTidLength = 0;
};

thread_local QNSLineCache gsLineCache;

// In a shared library each look-up of a thread_local is a call, and the compiler repeats it at
// every use rather than keep the address: taken once per line through a function that is not inlined.
__attribute__((noinline)) QNSLineCache& lineCache() { return gsLineCache; }

// A child of fork runs on in the forking thread under a new thread id: forget the cached one.
void forgetThreadId() { gsLineCache.mTidLength = 0; }
const int gsForkHook = OsAtFork(nullptr, nullptr, forgetThreadId);

// Appends up to the room left; returns the new write position.
char* put(char* apOut, const char* apEnd, const char* apText, size_t aLength) {
  const size_t lRoom = static_cast<size_t>(apEnd - apOut);
  if (aLength > lRoom) aLength = lRoom;
  memcpy(apOut, apText, aLength);
  return apOut + aLength;
}

char* putText(char* apOut, const char* apEnd, const char* apText) {
  return put(apOut, apEnd, apText != nullptr ? apText : "(null)",
             strlen(apText != nullptr ? apText : "(null)"));
}

char* putUnsigned(char* apOut, const char* apEnd, unsigned long aValue, int aMinDigits) {
  int lWidth = 1;
  for (unsigned long lRest = aValue / 10; lRest != 0; lRest /= 10) ++lWidth;
  if (lWidth < aMinDigits) lWidth = aMinDigits;
  if (lWidth <= apEnd - apOut) {
    // Straight into the line: digits stored bytewise and then read back in wider words would stall
    // the processor on every line.
    for (char* lpDigit = apOut + lWidth; lpDigit != apOut; aValue /= 10)
      *--lpDigit = static_cast<char>('0' + aValue % 10);
    return apOut + lWidth;
  }
  char lDigits[24];  // the line is being cut: its leading digits, as many as fit
  int lCount = 0;
  do {
    lDigits[sizeof lDigits - 1 - lCount++] = static_cast<char>('0' + aValue % 10);
    aValue /= 10;
  } while (aValue != 0 || lCount < aMinDigits);
  return put(apOut, apEnd, lDigits + sizeof lDigits - lCount, static_cast<size_t>(lCount));
}

char* putTimeStamp(char* apOut, const char* apEnd, QNSLineCache& arCache) {
  struct timespec lNow;
  clock_gettime(CLOCK_REALTIME, &lNow);
  if (lNow.tv_sec != arCache.mSecond) {
    // Time-zone and summer-time changes happen at whole seconds, so one conversion per second is exact.
    struct tm lTm;
    localtime_r(&lNow.tv_sec, &lTm);
    char* lpText = arCache.mSecondText;
    const char* const lpTextEnd = lpText + kSecondText;
    lpText = putUnsigned(lpText, lpTextEnd, static_cast<unsigned long>(lTm.tm_year + 1900), 4);
    lpText = put(lpText, lpTextEnd, "-", 1);
    lpText = putUnsigned(lpText, lpTextEnd, static_cast<unsigned long>(lTm.tm_mon + 1), 2);
    lpText = put(lpText, lpTextEnd, "-", 1);
    lpText = putUnsigned(lpText, lpTextEnd, static_cast<unsigned long>(lTm.tm_mday), 2);
    lpText = put(lpText, lpTextEnd, " ", 1);
    lpText = putUnsigned(lpText, lpTextEnd, static_cast<unsigned long>(lTm.tm_hour), 2);
    lpText = put(lpText, lpTextEnd, ":", 1);
    lpText = putUnsigned(lpText, lpTextEnd, static_cast<unsigned long>(lTm.tm_min), 2);
    lpText = put(lpText, lpTextEnd, ":", 1);
    lpText = putUnsigned(lpText, lpTextEnd, static_cast<unsigned long>(lTm.tm_sec), 2);
    arCache.mSecondLength = static_cast<size_t>(lpText - arCache.mSecondText);
    arCache.mSecond = lNow.tv_sec;
  }
  apOut = put(apOut, apEnd, arCache.mSecondText, arCache.mSecondLength);
  apOut = put(apOut, apEnd, ".", 1);
  return putUnsigned(apOut, apEnd, static_cast<unsigned long>(lNow.tv_nsec / 1000), 6);
}

char* putThreadId(char* apOut, const char* apEnd, QNSLineCache& arCache) {
  if (arCache.mTidLength == 0) {
    const int lLength = snprintf(arCache.mTid, sizeof arCache.mTid, "[%ld]", OsThreadId());
    arCache.mTidLength = static_cast<size_t>(lLength);
  }
  return put(apOut, apEnd, arCache.mTid, arCache.mTidLength);
}

}  // namespace

size_t QNFormatLogLine(char* apBuffer, size_t aCapacity, const char* apTag, unsigned int aLine,
                       const char* apFunction, const char* apFile, const char* apFormat, va_list aArgs) {
  (void)gsForkHook;
  const char* const lpEnd = apBuffer + aCapacity - 1;  // the last byte is kept for the newline
  QNSLineCache& lrCache = lineCache();
  char* lpOut = putTimeStamp(apBuffer, lpEnd, lrCache);
  lpOut = put(lpOut, lpEnd, " ", 1);
  lpOut = putText(lpOut, lpEnd, apTag);
  lpOut = put(lpOut, lpEnd, " ", 1);
  lpOut = putThreadId(lpOut, lpEnd, lrCache);
  lpOut = put(lpOut, lpEnd, " ", 1);
  lpOut = putText(lpOut, lpEnd, apFunction);
  lpOut = put(lpOut, lpEnd, " (", 2);
  lpOut = putText(lpOut, lpEnd, apFile);
  lpOut = put(lpOut, lpEnd, ":", 1);
  lpOut = putUnsigned(lpOut, lpEnd, aLine, 1);
  lpOut = put(lpOut, lpEnd, ") ", 2);

  char* const lpMessage = lpOut;
  if (strcmp(apFormat, "%s") == 0) {
    // "Entered" and "Left" of every operation take this path: no printf machinery on the hot path.
    lpOut = putText(lpOut, lpEnd, va_arg(aArgs, const char*));
  } else if (lpOut < lpEnd) {
    // vsnprintf NUL-terminates inside the room it is given; the NUL lands on the newline's byte at most.
    const size_t lRoom = static_cast<size_t>(lpEnd - lpOut) + 1;
    const int lWanted = vsnprintf(lpOut, lRoom, apFormat, aArgs);
    if (lWanted > 0) lpOut += static_cast<size_t>(lWanted) < lRoom ? static_cast<size_t>(lWanted) : lRoom - 1;
  }
  while (lpOut > lpMessage && lpOut[-1] == '\n') --lpOut;
  for (char* lpScan = lpMessage;
       (lpScan = static_cast<char*>(memchr(lpScan, '\n', lpOut - lpScan))) != nullptr;)
    *lpScan = ' ';
  *lpOut++ = '\n';
  return static_cast<size_t>(lpOut - apBuffer);
}

size_t QNFormatLogLineV(char* apBuffer, size_t aCapacity, const char* apTag, unsigned int aLine,
                        const char* apFunction, const char* apFile, const char* apFormat, ...) {
  va_list lArgs;
  va_start(lArgs, apFormat);
  const size_t lLength =
      QNFormatLogLine(apBuffer, aCapacity, apTag, aLine, apFunction, apFile, apFormat, lArgs);
  va_end(lArgs);
  return lLength;
}
