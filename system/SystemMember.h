#pragma once
// QN_REQUIRE_MEMBER: the newcomer's word before an assertion. The members an application's system
// class must set are reached through QNCPointer, whose access asserts "0 != mPointer" when one is
// missing; that line alone names neither the member nor where to set it. Before such an access,
// this logs one "-E-" line that does (the "-H-" level stays the assertion's own), at the caller's
// file and line. It changes nothing else: the access that follows still asserts and ends the
// process with status 1. Costs one pointer test when the member is set.

#include "Logger.h"

#define QN_REQUIRE_MEMBER(member, where)                                                 \
  do {                                                                                   \
    if ((member).isNull()) QN_LOG_ERROR("QNCSystem::%s is not set: %s", #member, where); \
  } while (0)

// Where each member comes from, in the words of the log line.
#define QN_WHERE_INSTANCE_MANAGER                                                                 \
  "create a QNCProcessInstanceManager with the PID file path in your system class's constructor " \
  "(see docs/GUIDE.md)"
#define QN_WHERE_VERSION "create a QNCVersion in your system class's constructor (see docs/GUIDE.md)"
#define QN_WHERE_EXIT_LOCK \
  "the QNCSystem constructor creates it; your system class must not replace it with an empty pointer"
#define QN_WHERE_BUFFER_MANAGER                                                                        \
  "fill mMemoryBufferList and create a QNCBufferManager in your system class's constructor or init() " \
  "before any buffer operation (see docs/GUIDE.md)"
