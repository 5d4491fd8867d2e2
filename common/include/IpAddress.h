#pragma once
// QNCIpAddress: an IPv4 address held as one 32-bit number in host byte order (192.168.1.2 is
// 0xC0A80102, the form OsGetIpAddress writes) with its dotted text form.
// Immutable after construction.

class QNCIpAddress {
 public:
  explicit QNCIpAddress(unsigned int aAddress);
  virtual ~QNCIpAddress() = default;

  unsigned int getNumericForm() const { return mAddress; }
  // "a.b.c.d"; valid as long as this object.
  const char* getStringForm() const { return mText; }

 private:
  unsigned int mAddress;
  char mText[16];
};
