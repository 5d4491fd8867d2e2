#include "Assert.h"
#include "Conditional.h"
#include "Reader.h"
#include "System.h"
#include "Writer.h"

QNCPointer<QNCReader>& QNCSystem::getReader(unsigned int acReaderNo) {
  QN_ASSERT(acReaderNo < this->mReaders.numberOfElements());
  return mReaders[acReaderNo];
}

QNCPointer<QNCWriter>& QNCSystem::getWriter(unsigned int acWriterNo) {
  QN_ASSERT(acWriterNo < this->mWriters.numberOfElements());
  return mWriters[acWriterNo];
}

void QNCSystem::signal(unsigned int) {}
void QNCSystem::wait(unsigned int) {}
void QNCSystem::timedWait(unsigned int, unsigned int) {}
void QNCSystem::send(unsigned int, const QNCPointer<QNCBuffer>&, unsigned int&) {}
void QNCSystem::receive(unsigned int, QNCPointer<QNCBuffer>&, unsigned int&) {}
void QNCSystem::waitForActivity(unsigned int, unsigned int) {}
