#include "SensorSystem.h"

#include <cstddef>
#include <cstdio>
#include <cstring>

#include "Assert.h"
#include "BufferManager.h"
#include "KeyValueFormatParser.h"
#include "Logger.h"
#include "MultiType.h"
#include "ProcessInstanceManager.h"
#include "SystemGlobals.h"
#include "Version.h"

QNCUsageEx::~QNCUsageEx() = default;

namespace {

constexpr unsigned int kDefaultChannelCount = 2;
constexpr unsigned int kMaxChannelCount = 64;

// Every option qnsensord accepts: the library's common ones and its own. The help text and the
// usage line are printed from this table, so they cannot drift from what the parser accepts.
const QNSCommandLineArgumentDesc kOptions[] = {
    {"-v", 0, "", "print the name and version, then exit"},
    {"-h", 0, "", "print this help, then exit"},
    {"-s", 0, "", "stop the running qnsensord, then exit"},
    {"-c", 1, "file", "take DebugLevel, HbTimeout, Daemonize from a key = value file; -d -b -D -I unused"},
    {"-d", 1, "mask",
     "log levels: sum of 1 halt 8 error 16 warning 32 notice 64 info 128 trace (default 255)"},
    {"-b", 1, "seconds", "heartbeat time-out for the watchdog (default 30)"},
    {"-D", 1, "true|false", "true runs in the background as a daemon, anything else in front (default true)"},
    {"-I", 1, "minutes", "database reopen interval; 0 or less never reopens (default 15)"},
    {"-n", 1, "count", "number of sensor channels, 1 to 64 (default 2); not with -c"},
    {"-t", 1, "seconds", "drop a connection that completes no message for this long, 1 to 3600 (default 60)"},
};

// Decodes acrText as the kind aValue holds, or throws QNCInvalidEx "<file>:<line>: <key>: ...".
void decodeSetting(const QNCKeyValueFormatParser& acrParser, const char* apKey, QNCMultiType& arValue) {
  try {
    arValue.decode(acrParser.getValue(apKey));
  } catch (const QNCInvalidEx& acrException) {
    char lMessage[QNCException::kMaxMessage];
    snprintf(lMessage, sizeof lMessage, "%s:%u: %s: %s", acrParser.getFilePath().get(),
             acrParser.getLine(apKey), apKey, acrException.what());
    throw QNCInvalidEx(lMessage, 6);
  }
}

[[noreturn]] void throwBadValue(const QNCKeyValueFormatParser& acrParser, const char* apKey,
                                const char* apExpected) {
  char lMessage[QNCException::kMaxMessage];
  snprintf(lMessage, sizeof lMessage, "%s:%u: %s expects %s, got '%s'", acrParser.getFilePath().get(),
           acrParser.getLine(apKey), apKey, apExpected, acrParser.getValue(apKey).get());
  throw QNCInvalidEx(lMessage, 6);
}

bool isChannelCount(unsigned int aCount) { return aCount >= 1 && aCount <= kMaxChannelCount; }

}  // namespace

QNCSensorSystem::QNCSensorSystem() {
  mName = QNCString("qnsensord");
  mVersion = QNCPointer<QNCVersion>(new (std::nothrow) QNCVersion("1.0.0"), QNPST_Individual, QNPAT_New);
  QNCString lPidFilePath;
  getLogDir(lPidFilePath);
  lPidFilePath += "/qnsensord.pid";
  mProcessInstanceManager = QNCPointer<QNCProcessInstanceManager>(
      new (std::nothrow) QNCProcessInstanceManager(lPidFilePath), QNPST_Individual, QNPAT_New);
  // Replies are small status frames up to one page; ascending lengths make first fit best fit.
  for (const unsigned int lLength : {64u, 256u, 1024u, 4096u}) mMemoryBufferList.pushBack(lLength);
  mBufferManager =
      QNCPointer<QNCBufferManager>(new (std::nothrow) QNCBufferManager(this), QNPST_Individual, QNPAT_New);
}

void QNCSensorSystem::processCommandLine(int argc, char** argv) {
  QN_ENTERED();
  try {
    QNCSystem::processCommandLine(argc, argv);
    // With -c the file sets the channel count (parseConfigFile); -n beside it is refused.
    const bool lFromFile = mSettings.contains("ConfigFile");
    unsigned int lCount = kDefaultChannelCount;
    const char* lpRefusal =
        lFromFile ? "Option '-n' cannot be combined with -c: set ChannelCount in the file" : nullptr;
    const bool lGiven = _optionInRange("-n", "a channel count", kMaxChannelCount, lCount, lpRefusal);
    if (lGiven || !lFromFile) _addChannelCount(lCount);
    (void)_optionInRange("-t", "seconds", 3600, mIdleLimit);  // absent: the default stays
  } catch (const QNCUsageEx&) {
    throw;
  } catch (const QNCInvalidEx& acrException) {
    throw QNCUsageEx(acrException.what(), acrException.getCode());
  }
  QN_LEFT();
}

bool QNCSensorSystem::_optionInRange(const char* apOption, const char* apWhat, unsigned int aMax,
                                     unsigned int& arValue, const char* apRefusal) {
  QNCPointer<QNCCommandLineArgument> lArgument;
  try {
    mCommandLineParser->getArgument(apOption, lArgument);
  } catch (QNCNotFoundEx&) {
    return false;
  }
  if (apRefusal != nullptr) throw QNCInvalidEx(apRefusal, 6);
  QNCOptionValueArgument* lpArg = dynamic_cast<QNCOptionValueArgument*>(lArgument.get());
  QN_ASSERT(NULL != lpArg);
  QNCMultiType lValue(0u);
  try {
    lValue.decode(lpArg->getValue());
  } catch (const QNCInvalidEx&) {
    lValue.set(0u);  // not a number: reported below like any value out of range
  }
  if (static_cast<unsigned int>(lValue) < 1 || static_cast<unsigned int>(lValue) > aMax) {
    char lMessage[QNCException::kMaxMessage];
    snprintf(lMessage, sizeof lMessage, "Option '%s' expects %s from 1 to %u, got '%s'", apOption, apWhat,
             aMax, lpArg->getValue().get());
    throw QNCInvalidEx(lMessage, 6);
  }
  arValue = lValue;
  return true;
}

void QNCSensorSystem::setCommandLineArgumentDesc() {
  for (const QNSCommandLineArgumentDesc& lrDesc : kOptions) mCommandLineArgumentDesc.append(lrDesc);
}

void QNCSensorSystem::parseConfigFile(QNCString&) {
  QN_ENTERED();
  QNCPointer<QNCMultiType> lPath;
  if (!mSettings.contains("ConfigFile"))
    throw QNCNotImplementedEx("qnsensord reads a configuration file only with -c", 0);
  getSetting("ConfigFile", lPath);
  QN_LOG_NOTICE("Reading configuration file %s", lPath->getText().get());
  mConfigFileParser->parse(lPath->getText());

  // Check every key before adding any setting, so a bad file leaves the store as it was.
  QNCVector<QNCString> lKeys;
  mConfigFileParser->getKeys(lKeys);
  for (unsigned int lIndex = 0; lIndex < lKeys.numberOfElements(); ++lIndex) {
    const char* lpKey = lKeys[lIndex].get();
    if (strcmp(lpKey, "DebugLevel") != 0 && strcmp(lpKey, "HbTimeout") != 0 &&
        strcmp(lpKey, "Daemonize") != 0 && strcmp(lpKey, "ChannelCount") != 0) {
      char lMessage[QNCException::kMaxMessage];
      snprintf(lMessage, sizeof lMessage,
               "%s:%u: unknown key '%s' (qnsensord knows DebugLevel, HbTimeout, Daemonize, ChannelCount)",
               mConfigFileParser->getFilePath().get(), mConfigFileParser->getLine(lKeys[lIndex]), lpKey);
      throw QNCInvalidEx(lMessage, 6);
    }
  }
  for (const char* lpRequired : {"DebugLevel", "HbTimeout", "Daemonize"}) {
    if (!mConfigFileParser->hasKey(lpRequired)) {
      char lMessage[QNCException::kMaxMessage];
      snprintf(lMessage, sizeof lMessage,
               "%s: '%s' is not set (qnsensord needs DebugLevel, HbTimeout and Daemonize)",
               mConfigFileParser->getFilePath().get(), lpRequired);
      throw QNCNotFoundEx(lMessage, 8);
    }
  }
  QNCMultiType lDebugLevel(0u);
  decodeSetting(*mConfigFileParser, "DebugLevel", lDebugLevel);
  QNCMultiType lHbTimeout(0u);
  decodeSetting(*mConfigFileParser, "HbTimeout", lHbTimeout);
  QNCMultiType lDaemonize(static_cast<signed char>(0));
  decodeSetting(*mConfigFileParser, "Daemonize", lDaemonize);
  if (static_cast<signed char>(lDaemonize) != 0 && static_cast<signed char>(lDaemonize) != 1)
    throwBadValue(*mConfigFileParser, "Daemonize", "0 or 1");
  QNCMultiType lChannelCount(kDefaultChannelCount);
  if (mConfigFileParser->hasKey("ChannelCount")) {
    decodeSetting(*mConfigFileParser, "ChannelCount", lChannelCount);
    if (!isChannelCount(lChannelCount))
      throwBadValue(*mConfigFileParser, "ChannelCount", "a count from 1 to 64");
  }

  addSetting("DebugLevel", QNCPointer<QNCMultiType>(new (std::nothrow) QNCMultiType(lDebugLevel),
                                                    QNPST_Individual, QNPAT_New));
  addSetting("HbTimeout", QNCPointer<QNCMultiType>(new (std::nothrow) QNCMultiType(lHbTimeout),
                                                   QNPST_Individual, QNPAT_New));
  addSetting("Daemonize", QNCPointer<QNCMultiType>(new (std::nothrow) QNCMultiType(lDaemonize),
                                                   QNPST_Individual, QNPAT_New));
  _addChannelCount(lChannelCount);
  QN_LEFT();
}

void QNCSensorSystem::printUsage(FILE* apStream) {
  fprintf(apStream, "usage: qnsensord");
  for (const QNSCommandLineArgumentDesc& lrDesc : kOptions) {
    if (lrDesc.mTakesValue != 0) {
      fprintf(apStream, " [%s %s]", lrDesc.mOption, lrDesc.mValueName);
    } else {
      fprintf(apStream, " [%s]", lrDesc.mOption);
    }
  }
  fprintf(apStream, "\n");
}

void QNCSensorSystem::displayHelp() {
  printUsage(stdout);
  printf("qnsensord, the example sensor service. Options:\n");
  for (const QNSCommandLineArgumentDesc& lrDesc : kOptions) {
    // Option and value name padded together to one column.
    const int lWidth = 14 - static_cast<int>(strlen(lrDesc.mOption));
    printf("  %s %-*s %s\n", lrDesc.mOption, lWidth > 0 ? lWidth : 0, lrDesc.mValueName, lrDesc.mHelp);
  }
  printf("The log is written to $QN_LOG_DIR/qnsensord.log (/tmp when QN_LOG_DIR is unset).\n");
}

unsigned int QNCSensorSystem::getChannelCount() {
  QNCPointer<QNCMultiType> lCount;
  getSetting("ChannelCount", lCount);
  return *lCount;
}

void QNCSensorSystem::_addChannelCount(unsigned int aCount) {
  QN_LOG_NOTICE("Using %u sensor channels", aCount);
  addSetting("ChannelCount",
             QNCPointer<QNCMultiType>(new (std::nothrow) QNCMultiType(aCount), QNPST_Individual, QNPAT_New));
}
