#include "MultiType.h"
#include "NumericIdManager.h"
#include "QNException.h"
#include "System.h"

void QNCSystem::applySettings() {}
void QNCSystem::getSetting(const QNCString&, QNCPointer<QNCMultiType>&) {
  throw QNCNotFoundEx("No element for the key exists in map", 8);
}
void QNCSystem::addSetting(const QNCString&, const QNCPointer<QNCMultiType>&) {}
void QNCSystem::generateNumericId(unsigned int&) { throw QNCNotImplementedEx("generateNumericId", 0); }
void QNCSystem::returnNumericId(const unsigned int&) {}
