#pragma once
// Command-line parsing: descriptors of the accepted options, the parsed arguments, the parser.
// (The parsing operations are completed together with the common options.)

#include "Pointer.h"
#include "QNString.h"
#include "QNVector.h"

// One accepted option. A plain record of fixed-size arrays and single-byte flags, copied by value.
struct QNSCommandLineArgumentDesc {
  char mOption[16];           // the option text, compared exactly: "-d"
  unsigned char mTakesValue;  // 1 when the option takes one value, else 0
  char mValueName[16];        // the value's name in the help text: "level"
  char mHelp[96];             // one line of help
};

class QNCParser {
 public:
  virtual ~QNCParser() = default;
  virtual unsigned char getState() const = 0;
};

class QNCCommandLineArgument {
 public:
  explicit QNCCommandLineArgument(const char* apOption) : mOption(apOption) {}
  virtual ~QNCCommandLineArgument() = default;
  const QNCString& getOption() const { return mOption; }

 private:
  QNCString mOption;
};

class QNCOptionValueArgument : public virtual QNCCommandLineArgument {
 public:
  QNCOptionValueArgument(const char* apOption, const char* apValue)
      : QNCCommandLineArgument(apOption), mValue(apValue) {}
  QNCString& getValue() { return mValue; }

 private:
  QNCString mValue;
};

class QNCCommandLineParser : public virtual QNCParser {
 public:
  QNCCommandLineParser() : mArgumentDesc(10), mArguments(10), mState(0) {}
  ~QNCCommandLineParser() override = default;

  void setCommandLine(const QNCString& aCommandLine) { mCommandLine = aCommandLine; }
  void setArgumentDesc(const QNCVector<QNSCommandLineArgumentDesc>& aDesc) { mArgumentDesc = aDesc; }
  unsigned char getState() const override { return mState; }

  void run();
  void getArgument(const QNCString& aOption, QNCPointer<QNCCommandLineArgument>& aArgument);

 private:
  QNCString mCommandLine;
  QNCVector<QNSCommandLineArgumentDesc> mArgumentDesc;
  QNCVector<QNCPointer<QNCCommandLineArgument>> mArguments;
  unsigned char mState;
};
