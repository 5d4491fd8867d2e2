#pragma once
// Command-line parsing: the descriptors of the accepted options, the parsed arguments and the
// parser that turns one joined command line into arguments.
//
// The command line is one string of words separated by blanks (spaces or tabs); the system
// joins the process's arguments that way, so a word never contains a blank (an argument that
// holds blanks reaches the parser as several words). Every option the process accepts, the
// common ones and the application's own, is described in one descriptor table; an option's
// text is compared exactly ("-d" is not "-D", "-d16" is not "-d").
//
// Parsing rules (run()):
// - A word that equals a described option is that option.
// - An option described as taking a value takes the next word as its value, unless that word is
//   itself a described option. So "-I -5" gives -I the value "-5", but "-d -v" is "-d" without
//   a value.
// - Everything else is an error, reported as QNCInvalidEx (6) whose message names the word:
//     "Unknown option '<word>'"                        a word starting with '-' that is not described
//     "Option '<opt>' needs a value"                   a value option at the end or before an option
//     "Option '<opt>' takes no value, got '<word>'"    a plain word after an option without value
//     "Unexpected argument '<word>'"                   a plain word before any option
//     "Option '<opt>' given more than once"
// So a successful run() delivers every value option as a QNCOptionValueArgument and every other
// option as a plain QNCCommandLineArgument, exactly as the descriptors say.
//
// Threads: one thread at a time (the system uses the parser on its main thread during start-up).

#include "Logger.h"
#include "Pointer.h"
#include "QNString.h"
#include "QNVector.h"

// One accepted option. A plain record of fixed-size, NUL-terminated arrays and single-byte flags,
// copied by value; filled by the application (aggregate initialisation from literals checks the
// lengths at compile time) and read by the parser and the help text.
struct QNSCommandLineArgumentDesc {
  char mOption[16];           // the option text, compared exactly: "-d"
  unsigned char mTakesValue;  // 1 when the option takes one value, else 0
  char mValueName[16];        // the value's name in the help text: "mask"; "" without a value
  char mHelp[96];             // one line of help
};

// A parser: something that turns input into parsed items and can tell how far it got.
class QNCParser {
 public:
  virtual ~QNCParser() = default;
  virtual unsigned char getState() const = 0;
};

// One option found on the command line.
class QNCCommandLineArgument {
 public:
  explicit QNCCommandLineArgument(const char* apOption) : mOption(apOption) {}
  virtual ~QNCCommandLineArgument() = default;
  const QNCString& getOption() const { return mOption; }

 private:
  QNCString mOption;
};

// An option found together with its value.
class QNCOptionValueArgument : public virtual QNCCommandLineArgument {
 public:
  QNCOptionValueArgument(const char* apOption, const char* apValue)
      : QNCCommandLineArgument(apOption), mValue(apValue) {}
  QNCString& getValue() { return mValue; }

 private:
  QNCString mValue;
};

// The states getState() reports.
enum QNECommandLineParserState : unsigned char {
  QNCLPS_NotRun = 0,  // run() has not been called since construction
  QNCLPS_Parsed = 1,  // the last run() succeeded; getArgument() answers from its result
  QNCLPS_Failed = 2,  // the last run() threw; no argument is held
};

class QNCCommandLineParser : public virtual QNCParser {
 public:
  // An empty command line and no descriptors. Allocation failures: QNCNoMemoryEx.
  QNCCommandLineParser() : mArgumentDesc(10), mArguments(10), mState(QNCLPS_NotRun) {
    QN_ENTERED();
    QN_LEFT();
  }
  ~QNCCommandLineParser() override {
    QN_ENTERED();
    QN_LEFT();
  }

  void setCommandLine(const QNCString& aCommandLine) { mCommandLine = aCommandLine; }
  // Copies the table; QNCNoMemoryEx when the copy cannot be allocated.
  void setArgumentDesc(const QNCVector<QNSCommandLineArgumentDesc>& aDesc) { mArgumentDesc = aDesc; }
  unsigned char getState() const override { return mState; }

  // Parses the command line against the descriptors (rules above), replacing the result of any
  // earlier run. An empty command line is valid with or without descriptors and yields no
  // argument. Throws QNCInvalidEx naming the offending word; nothing is kept from a failed run.
  void run();

  // Sets aArgument to the parsed option whose text equals aOption. Throws QNCNotFoundEx
  // "Option '<opt>' is not on the command line" (8) when it was not given; aArgument is then
  // unchanged.
  void getArgument(const QNCString& aOption, QNCPointer<QNCCommandLineArgument>& aArgument);

 private:
  // The descriptor whose option text equals apWord, or null.
  const QNSCommandLineArgumentDesc* _findDesc(const char* apWord) const;
  // The index in mArguments of the parsed option, or mArguments.numberOfElements() when absent.
  unsigned int _indexOfArgument(const char* apOption) const;

  QNCString mCommandLine;
  QNCVector<QNSCommandLineArgumentDesc> mArgumentDesc;
  QNCVector<QNCPointer<QNCCommandLineArgument>> mArguments;
  unsigned char mState;
};
