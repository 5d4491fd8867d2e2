#pragma once
// QNCKeyValueFormatParser: reads a configuration file of "key = value" lines.
//
// File format:
//   - one setting per line: a key, '=', a value; blanks around key and value are ignored;
//   - blank lines are skipped, and so are lines whose first non-blank character is a comment
//     marker ('#' or ';' unless the constructor names others);
//   - a value may be empty ("key =") and may itself contain '=' (only the first one separates);
//   - a line without '=', or with an empty key, is malformed.
//
// Failures (nothing is kept from a file that fails):
//   - the file cannot be opened or read: QNCOpenFailedEx / QNCReadFailedEx naming the path;
//   - a malformed line: QNCInvalidEx "<path>:<line>: expected 'key = value'";
//   - a key given twice (when duplicates are not allowed): QNCExistsEx
//     "<path>:<line>: key '<key>' already set on line <n>";
//   - a lookup of a key that is not there: QNCNotFoundEx naming the key;
//   - getUnsigned() of a value that is not a decimal number in range: QNCInvalidEx
//     "<path>:<line>: key '<key>' expects a number, got '<value>'".
//
// Threads: one thread parses; afterwards any number of threads may read.

#include "Pointer.h"
#include "QNString.h"
#include "QNVector.h"

class QNCKeyValueFormatParser {
 public:
  // acrFilePath: the file parse() reads; empty when the path is given to parse(path) later.
  // acrCommentMarkers: characters that start a comment line; empty means "#;".
  // aCaseInsensitiveKeys: true compares keys without regard to case; false compares them exactly.
  // aAllowDuplicateKeys: true lets a later line replace an earlier one; false refuses it.
  QNCKeyValueFormatParser(const QNCString& acrFilePath, const QNCString& acrCommentMarkers,
                          bool aCaseInsensitiveKeys, bool aAllowDuplicateKeys);
  virtual ~QNCKeyValueFormatParser();

  // Reads the file given to the constructor, or acrFilePath, replacing what was read before.
  void parse();
  void parse(const QNCString& acrFilePath);

  bool hasKey(const QNCString& acrKey) const;
  const QNCString& getValue(const QNCString& acrKey) const;
  unsigned int getUnsigned(const QNCString& acrKey) const;
  // The keys in the order of the file.
  void getKeys(QNCVector<QNCString>& arKeys) const;
  // The line of the file that set the key (for the application's own messages).
  unsigned int getLine(const QNCString& acrKey) const;
  const QNCString& getFilePath() const { return mFilePath; }

 private:
  struct QNSEntry;

  bool _sameKey(const QNCString& acrStored, const QNCString& acrKey) const;
  // The entry of the key; throws QNCNotFoundEx.
  const QNSEntry& _find(const QNCString& acrKey) const;

  QNCString mFilePath;
  QNCString mCommentMarkers;
  bool mCaseInsensitiveKeys;
  bool mAllowDuplicateKeys;
  QNCVector<QNCPointer<QNSEntry>> mEntries;
};
