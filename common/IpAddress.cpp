#include "IpAddress.h"

#include "Clib.h"

QNCIpAddress::QNCIpAddress(unsigned int aAddress) : mAddress(aAddress) {
  ClibSnprintf(mText, sizeof mText, "%u.%u.%u.%u", (aAddress >> 24) & 0xFFu, (aAddress >> 16) & 0xFFu,
               (aAddress >> 8) & 0xFFu, aAddress & 0xFFu);
}
