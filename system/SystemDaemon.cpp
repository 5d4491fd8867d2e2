#include "System.h"

void QNCSystem::systemDaemonize(QNCString, QNCString, QNCString, QNCString) {}
void QNCSystem::waitAndCheckExit(unsigned int) {}
