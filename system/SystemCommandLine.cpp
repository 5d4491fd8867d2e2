// The command-line operations of QNCSystem: joining the arguments, running the parser, and one
// handler per common option that turns it into a setting or ends the process.

#include <cstddef>
#include <cstdio>
#include <cstdlib>

#include "Assert.h"
#include "Clib.h"
#include "Logger.h"
#include "MultiType.h"
#include "QNException.h"
#include "System.h"
#include "SystemMember.h"
#include "Version.h"

namespace {

// The value of a value option. The parser delivers every option that its descriptor declares
// as taking a value as a QNCOptionValueArgument; anything else means the application's
// descriptor table contradicts the common options, a bug of the program, not of its input.
QNCString& valueOf(QNCPointer<QNCCommandLineArgument>& arArgument) {
  QNCOptionValueArgument* lpArg = dynamic_cast<QNCOptionValueArgument*>(arArgument.get());
  QN_ASSERT(NULL != lpArg);
  return lpArg->getValue();
}

// True and arArgument set when the option is on the command line; false when the parser reports
// it absent (QNCNotFoundEx). Only the lookup is guarded, so the same exception thrown later by
// whatever the handler does for a found option is never mistaken for "absent".
bool isGiven(QNCCommandLineParser& arParser, const char* apOption,
             QNCPointer<QNCCommandLineArgument>& arArgument) {
  try {
    arParser.getArgument(apOption, arArgument);
    return true;
  } catch (QNCNotFoundEx&) {
    return false;
  }
}

QNCPointer<QNCMultiType> newUnsigned(unsigned int aValue) {
  return QNCPointer<QNCMultiType>(new (std::nothrow) QNCMultiType(aValue), QNPST_Individual, QNPAT_New);
}

QNCPointer<QNCMultiType> newSignedByte(signed char aValue) {
  return QNCPointer<QNCMultiType>(new (std::nothrow) QNCMultiType(aValue), QNPST_Individual, QNPAT_New);
}

}  // namespace

void QNCSystem::processCommandLine(int argc, char** argv) {
  QN_ENTERED();
  QNCString lCommandLine("");
  QN_LOG_TRACE("Going to check command line");
  try {
    checkCommandLine(argc, argv, lCommandLine);
    QN_LOG_TRACE("Going to set command line and argument descriptors");
    mCommandLineParser->setCommandLine(lCommandLine);
    mCommandLineParser->setArgumentDesc(mCommandLineArgumentDesc);
  } catch (QNCNoArgsEx&) {
    // Not a failure: the parser keeps its empty line and table, every option reads as absent
    // and the defaults apply.
    QN_LOG_INFO("No command line argument passed");
  }
  QN_LOG_TRACE("Running command line parser");
  mCommandLineParser->run();
  QN_LOG_TRACE("Processing common command line arguments");
  processCommandLineArguments();
  QN_LOG_INFO("Processed the command line successfully : %s", lCommandLine.get());
  QN_LEFT();
}

void QNCSystem::checkCommandLine(int argc, char** argv, QNCString& aCommandLine) {
  QN_ENTERED();
  if (argc > 1) {
    for (int lIndex = 1; lIndex < argc - 1; ++lIndex) {
      aCommandLine += argv[lIndex];
      aCommandLine += " ";
    }
    aCommandLine += argv[argc - 1];
    QN_LOG_INFO("Command line : '%s'", aCommandLine.get());
  } else {
    QN_LOG_INFO("No arguments in command line");
    aCommandLine = "";
    throw QNCNoArgsEx("No Arguments Provided", 5);
  }
  QN_LEFT();
}

void QNCSystem::processCommandLineArguments() {
  QN_ENTERED();
  QN_LOG_TRACE("Processing version command line argument");
  processVersionCommandLineArgument();
  QN_LOG_TRACE("Processing help command line argument");
  processHelpCommandLineArgument();
  QN_LOG_TRACE("Processing shutdown  command line argument");
  processShutdownCommandLineArgument();
  QN_LOG_TRACE("Processing config line command line argument");
  try {
    processConfigFileCommandLineArgument();
    // With a configuration file, the file supplies the other settings.
    QN_LOG_TRACE("Found and handled -c option, not processing others");
    QN_LEFT();
    return;
  } catch (QNCNotFoundEx&) {
    QN_LOG_TRACE("Failed to find -c option, processing others");
  }
  QN_LOG_TRACE("Processing debug level  command line argument");
  processDebugLevelCommandLineArgument();
  QN_LOG_TRACE("Processing Heartbeat Timeout  command line argument");
  processHbTimeoutCommandLineArgument();
  QN_LOG_TRACE("Processing daemonize command line argument");
  processDaemonizeCommandLineArgument();
  QN_LOG_TRACE("Processing DB Reopen interval command line argument");
  processDBReopenIntervalCommandLineArgument();
  QN_LEFT();
}

void QNCSystem::processVersionCommandLineArgument() {
  QN_ENTERED();
  QN_LOG_TRACE("Checking for -v option");
  QNCPointer<QNCCommandLineArgument> lArgument;
  if (isGiven(*mCommandLineParser, "-v", lArgument)) {
    QN_LOG_INFO("Found -v option in command line");
    displayVersionAndExit();
  } else {
    QN_LOG_INFO("-v option not specified in command line");
  }
  QN_LEFT();
}

void QNCSystem::processHelpCommandLineArgument() {
  QN_ENTERED();
  QN_LOG_TRACE("Checking for -h option");
  QNCPointer<QNCCommandLineArgument> lArgument;
  if (isGiven(*mCommandLineParser, "-h", lArgument)) {
    QN_LOG_INFO("Found -h option in command line");
    displayHelpAndExit();
  } else {
    QN_LOG_INFO("-h option not specified in command line");
  }
  QN_LEFT();
}

void QNCSystem::processShutdownCommandLineArgument() {
  QN_ENTERED();
  QN_LOG_TRACE("Checking for -s option");
  QNCPointer<QNCCommandLineArgument> lArgument;
  if (!isGiven(*mCommandLineParser, "-s", lArgument)) {
    QN_LOG_INFO("-s option not specified in command line");
    QN_LEFT();
    return;
  }
  QN_LOG_INFO("Found -s option in command line");
  QN_LOG_TRACE("Checking for a running instance");
  if (isAnInstanceRunning()) {
    QN_LOG_NOTICE("Killing the running instance");
    killRunningInstance();
    printf("%s shutdown successfully.\n", mName.get());
    fflush(stdout);
    throw QNCParentExitEx("Done.. time to exit", 19);
  }
  QN_LOG_INFO("No instance running.. cannot kill");
  throw QNCParentExitEx("Done (nothing).. time to exit", 19);
}

void QNCSystem::processConfigFileCommandLineArgument() {
  QN_ENTERED();
  QN_LOG_TRACE("Checking for -c option");
  QNCPointer<QNCCommandLineArgument> lArgument;
  // No handler for QNCNotFoundEx here: processCommandLineArguments decides what "no -c" means.
  mCommandLineParser->getArgument("-c", lArgument);
  QN_LOG_INFO("Found -c option in command line");
  QNCOptionValueArgument* lpArg = dynamic_cast<QNCOptionValueArgument*>(lArgument.get());
  QN_ASSERT(NULL != lpArg);
  QN_LOG_TRACE("Adding 'ConfigFile' system setting");
  addSetting("ConfigFile", QNCPointer<QNCMultiType>(new (std::nothrow) QNCMultiType(lpArg->getValue().get()),
                                                    QNPST_Individual, QNPAT_New));
  QN_LEFT();
}

void QNCSystem::processDebugLevelCommandLineArgument() {
  QN_ENTERED();
  QN_LOG_TRACE("Checking for -d option");
  QNCPointer<QNCCommandLineArgument> lArgument;
  unsigned int lDebugLevel = 0;
  if (isGiven(*mCommandLineParser, "-d", lArgument)) {
    QN_LOG_INFO("Found -d option in command line");
    // atoi: text without leading digits reads as 0; the signed result is kept as unsigned.
    lDebugLevel = static_cast<unsigned int>(atoi(valueOf(lArgument).get()));
  } else {
    QN_LOG_INFO("The -d option is defaulted, using default debug level");
    getLogCode(lDebugLevel);
  }
  QN_LOG_TRACE("Adding 'DebugLevel' system setting");
  addSetting("DebugLevel", newUnsigned(lDebugLevel));
  QN_LEFT();
}

void QNCSystem::processHbTimeoutCommandLineArgument() {
  QN_ENTERED();
  QN_LOG_TRACE("Checking for -b option");
  QNCPointer<QNCCommandLineArgument> lArgument;
  unsigned int lHbTimeout = 0;
  if (isGiven(*mCommandLineParser, "-b", lArgument)) {
    QN_LOG_INFO("Found -b option in command line");
    lHbTimeout = static_cast<unsigned int>(atoi(valueOf(lArgument).get()));
  } else {
    getHbTimeout(lHbTimeout);
  }
  QN_LOG_TRACE("Adding 'HbTimeout' system setting");
  addSetting("HbTimeout", newUnsigned(lHbTimeout));
  QN_LEFT();
}

void QNCSystem::processDaemonizeCommandLineArgument() {
  QN_ENTERED();
  QN_LOG_TRACE("Checking for -D option");
  QNCPointer<QNCCommandLineArgument> lArgument;
  signed char lDaemonize = 1;
  if (isGiven(*mCommandLineParser, "-D", lArgument)) {
    QN_LOG_INFO("Found -D option in command line");
    // Exactly "true": "TRUE", "1" or "yes" keep the process in the foreground.
    lDaemonize = ClibStrcmp(valueOf(lArgument).get(), "true") == 0 ? 1 : 0;
  } else {
    QN_LOG_INFO("The -D option is defaulted. Using default value");
  }
  QN_LOG_TRACE("Adding 'Daemonize' system setting");
  addSetting("Daemonize", newSignedByte(lDaemonize));
  QN_LEFT();
}

void QNCSystem::processDBReopenIntervalCommandLineArgument() {
  QN_ENTERED();
  QN_LOG_NOTICE("Checking for -I option");
  QNCPointer<QNCCommandLineArgument> lArgument;
  unsigned int lInterval = 15;
  if (isGiven(*mCommandLineParser, "-I", lArgument)) {
    QN_LOG_NOTICE("Found -I option in command line");
    const int lMinutes = atoi(valueOf(lArgument).get());
    if (lMinutes <= 0) {
      QN_LOG_WARNING("Zero/Invalid value specified for -I option. DB won't be reopened at fixed intervals");
      lInterval = 0;
    } else {
      lInterval = static_cast<unsigned int>(lMinutes);
    }
  } else {
    QN_LOG_NOTICE("The -I option is not specified, using default interval %u min", lInterval);
  }
  addSetting("DBReopenInterval", newUnsigned(lInterval));
  QN_LEFT();
}

void QNCSystem::displayVersionAndExit() {
  QN_REQUIRE_MEMBER(mVersion, QN_WHERE_VERSION);
  printf("%s v%s", mName.get(), mVersion->getVersion());
  exit(0);
}

void QNCSystem::displayHelpAndExit() {
  displayHelp();
  exit(0);
}
