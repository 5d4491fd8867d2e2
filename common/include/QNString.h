#pragma once
// QNCString: a text with deep-copy semantics. Every QNCString owns its own storage (mString is
// always set); copies never share it, so changing a copy never changes the source.
//
// - Construction from a C text copies it; a null text asserts (it is a programming error, not
//   input). Failure to allocate the string object throws QNCNoMemoryEx "Out of Memory" (2).
// - == compares as NUL-terminated texts; < is the standard lexicographic order.
//
// Threads: one thread at a time per object.

#include <string>

#include "Pointer.h"

class QNCString {
 public:
  QNCString(const char* apString = "");  // NOLINT: implicit by design, texts convert freely
  QNCString(const QNCString& acrCopy);
  QNCString& operator=(const QNCString& acrCopy);
  ~QNCString() = default;

  // The text; valid until this string is changed or destroyed.
  const char* get() const;
  bool isEmpty() const;
  unsigned int length() const;

  bool operator==(const QNCString& acrString) const;
  bool operator!=(const QNCString& acrString) const { return !(*this == acrString); }
  bool operator<(const QNCString& acrString) const;

  // Appends in place: this string's storage is changed, not replaced.
  QNCString& operator+=(const QNCString& acrString);

 private:
  QNCPointer<std::string> mString;
};
