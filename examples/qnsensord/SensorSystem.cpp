#include "SensorSystem.h"

#include <cstdio>

#include "BufferManager.h"
#include "QNException.h"
#include "Version.h"

QNCSensorSystem::QNCSensorSystem() {
  mName = QNCString("qnsensord");
  mVersion = QNCPointer<QNCVersion>(new (std::nothrow) QNCVersion("1.0.0"), QNPST_Individual, QNPAT_New);
  // Replies are small status frames up to one page; ascending lengths make first fit best fit.
  for (const unsigned int lLength : {64u, 256u, 1024u, 4096u}) mMemoryBufferList.pushBack(lLength);
  mBufferManager =
      QNCPointer<QNCBufferManager>(new (std::nothrow) QNCBufferManager(this), QNPST_Individual, QNPAT_New);
}

void QNCSensorSystem::setCommandLineArgumentDesc() {}

void QNCSensorSystem::parseConfigFile(QNCString&) {
  throw QNCNotImplementedEx("qnsensord reads no configuration file", 0);
}

void QNCSensorSystem::displayHelp() { printf("usage: qnsensord\n"); }
