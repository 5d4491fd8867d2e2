#include <cstdlib>

#include "QNException.h"
#include "System.h"

void QNCSystem::processCommandLine(int, char**) {}
void QNCSystem::displayVersionAndExit() { exit(0); }
void QNCSystem::displayHelpAndExit() {
  displayHelp();
  exit(0);
}
void QNCSystem::processCommandLineArguments() {}
void QNCSystem::checkCommandLine(int, char**, QNCString&) {}
void QNCSystem::processVersionCommandLineArgument() {}
void QNCSystem::processHelpCommandLineArgument() {}
void QNCSystem::processShutdownCommandLineArgument() {}
void QNCSystem::processConfigFileCommandLineArgument() {}
void QNCSystem::processDebugLevelCommandLineArgument() {}
void QNCSystem::processHbTimeoutCommandLineArgument() {}
void QNCSystem::processDaemonizeCommandLineArgument() {}
void QNCSystem::processDBReopenIntervalCommandLineArgument() {}
