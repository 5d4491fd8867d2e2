#include "Mutex.h"

#include "Logger.h"
#include "Os.h"
#include "QNException.h"

QNCMutex::QNCMutex() { OsInitMutex(mMutex); }

QNCMutex::~QNCMutex() {
  QN_ENTERED();
  try {
    OsDestroyMutex(mMutex);
  } catch (QNCException&) {
    QN_LOG_TRACE("Ignoring exception in Mutex destruction ...");
  }
  QN_LEFT();
}
