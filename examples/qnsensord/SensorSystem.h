#pragma once
// The system object of qnsensord, the example sensor service.
//
// Configuration comes from one of two places, never both:
// - the command line: the library's eight common options plus "-n <count>", the number of
//   sensor channels (1 to 64, default 2), and "-t <seconds>", the idle limit of a connection
//   (1 to 3600, default 60; also with -c);
// - with "-c <file>", a key = value file (see examples/qnsensord.conf) that must set DebugLevel,
//   HbTimeout and Daemonize and may set ChannelCount; the other command-line options are then
//   ignored by the library, and "-n" is refused.
// Either way the channel count ends up in the setting "ChannelCount" (unsigned integer).

#include <cstdio>

#include "QNException.h"
#include "SensorChannel.h"
#include "SensorStatistics.h"
#include "System.h"

// A command line that qnsensord cannot run with (unknown option, missing or bad value). main
// answers it with the message, the usage line and exit status 2, before anything has started.
QN_DECLARE_EXCEPTION(QNCUsageEx, public virtual QNCInvalidEx);

class QNCSensorSystem : public QNCSystem {
 public:
  QNCSensorSystem();
  ~QNCSensorSystem() override;

  // The base processing, then "-n". Every QNCInvalidEx of the command line (the parser's, a
  // bad -n) leaves as QNCUsageEx with the same message.
  void processCommandLine(int argc, char** argv) override;
  void setCommandLineArgumentDesc() override;
  // Reads the file named by the ConfigFile setting; QNCNotImplementedEx when -c was not given.
  // Errors name the file and the line: QNCInvalidEx for a bad line, value or unknown key,
  // QNCNotFoundEx for a required key that is missing, QNCOpenFailedEx for a missing file.
  void parseConfigFile(QNCString& arConfFilePath) override;
  void displayHelp() override;
  // The base, then one channel per ChannelCount (a Unix-domain socket qnsensord.<n>.sock in the
  // log directory) as reader and writer n, conditional 0 and list 0 (SensorThreads.cpp).
  void init() override;
  // One ChannelWorker per channel, the ReadingConsumer, the Heartbeat, and the Reporters pool.
  void createThreads() override;
  // The base, then the per-sensor statistics at notice level.
  void destroy() override;
  // Logs "qnsensord running" at notice level: start-up is complete and SIGINT, SIGTERM and SIGHUP
  // now end the service in order (before this line they have their default effect).
  void createStartUpEvent() override;

  static constexpr unsigned int kReadingsReady = 0;  // the conditional the consumer waits on
  static constexpr unsigned int kReadingList = 0;    // the list of readings to answer

  // The one-line synopsis of the options, followed by a line end.
  static void printUsage(FILE* apStream);

  // The "ChannelCount" setting; available once processCommandLine and parseConfigFile have run.
  unsigned int getChannelCount();

 private:
  void _addChannelCount(unsigned int aCount);
  // The value of option apOption (1 to aMax) in arValue; false, arValue untouched, when the option
  // was not given. Throws QNCInvalidEx "Option '<o>' expects <apWhat> from 1 to <aMax>, got '<v>'",
  // or with the text apRefusal (when not null) as soon as the option was given at all.
  bool _optionInRange(const char* apOption, const char* apWhat, unsigned int aMax, unsigned int& arValue,
                      const char* apRefusal = nullptr);

  QNCVector<QNCPointer<QNCSensorChannel>> mChannels;
  QNCSensorStatistics mStatistics;
  unsigned int mIdleLimit = 60;  // seconds a connection may complete no message (-t)
};
