#pragma once
// QNCEncodable: a value that can say what kind it holds and travel as text.
//
// Settings come from text (the command line, a configuration file) and are shown as text (the
// log), so every setting value implements this pair of conversions. encode() and decode() are
// inverse: decoding what encode() produced restores the same value of the same kind.

class QNCString;

class QNCEncodable {
 public:
  virtual ~QNCEncodable();

  // A short name of the kind held now ("text", "signed byte", "unsigned integer"), for messages.
  virtual const char* getKindName() const = 0;

  // Writes the value as text into arText (replacing its contents). Never fails but for memory
  // (QNCNoMemoryEx).
  virtual void encode(QNCString& arText) const = 0;

  // Reads acrText as a value of the kind held now and stores it. Throws QNCInvalidEx naming the
  // text and the kind when the text is not such a value; the held value is then unchanged.
  virtual void decode(const QNCString& acrText) = 0;

 protected:
  QNCEncodable() = default;
  QNCEncodable(const QNCEncodable&) = default;
  QNCEncodable& operator=(const QNCEncodable&) = default;
};
