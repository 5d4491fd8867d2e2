// qnsensord: the example sensor service built on libQNSystem.

#include <cstdio>

#include "QNException.h"
#include "SensorSystem.h"
#include "SystemGlobals.h"

int main(int argc, char** argv) {
  try {
    setSystemObject(new QNCSensorSystem);
    setLogFilePath("qnsensord.log");
    SystemMain(argc, argv);
  } catch (const QNCParentExitEx&) {
    // The parent side of daemonizing (0 only once the daemon runs; its reason on standard error
    // otherwise), or "-s" after stopping the running instance.
    return waitForDaemonStart();
  } catch (const QNCUsageEx& acrException) {
    // Refused during the command-line step: no log file, no PID file, no thread exists yet.
    fprintf(stderr, "qnsensord: %s\n", acrException.what());
    QNCSensorSystem::printUsage(stderr);
    return 2;
  } catch (const QNCException& acrException) {
    fprintf(stderr, "qnsensord: %s\n", acrException.what());
    return 1;
  }
  // 1 when a thread died: the service then ended in order by itself, and says so to its supervisor.
  return getRunExitStatus();
}
