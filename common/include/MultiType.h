#pragma once
// QNCMultiType: one setting value, holding exactly one of three kinds: a text, a signed byte
// (flags: 1 is true) or an unsigned 32-bit integer.
//
// - Each constructor stores its argument with the matching set(); set() may later change both the
//   value and the kind.
// - Reading is strict: a conversion or getText() of a kind other than the one held throws
//   QNCInvalidEx "Setting value holds <kind>, not <asked kind>" (6). There is no silent
//   narrowing or reinterpretation: a caller never gets a value that was not stored.
// - Text encoding (QNCEncodable): a text as it is; numbers in decimal ("-1", "4294967295").
//   decode() accepts exactly that form for the kind held: no blanks, no '+', nothing after the
//   digits, and a number within the kind's range.
//
// Values live behind QNCPointer<QNCMultiType> and are shared by everyone who got the pointer:
// a set() is seen by every holder. One thread at a time may change a value; many may read it
// while nobody changes it.

#include "Encodable.h"
#include "QNString.h"

enum QNEMultiTypeKind : unsigned char {
  QNMTK_Text = 1,
  QNMTK_SignedByte = 2,
  QNMTK_Unsigned = 3,
};

class QNCMultiType : public QNCEncodable {
 public:
  explicit QNCMultiType(signed char aValue);
  explicit QNCMultiType(unsigned int aValue);
  // apValue must not be null (asserted): a missing text is a caller's bug, "" is the empty text.
  explicit QNCMultiType(char const* apValue);
  ~QNCMultiType() override;

  void set(signed char aValue);
  void set(unsigned int aValue);
  void set(char const* apValue);

  QNEMultiTypeKind getKind() const { return mKind; }

  // The stored value; QNCInvalidEx when another kind is held.
  operator signed char() const;
  operator unsigned int() const;
  const QNCString& getText() const;

  const char* getKindName() const override;
  void encode(QNCString& arText) const override;
  void decode(const QNCString& acrText) override;

 private:
  void _requireKind(QNEMultiTypeKind aKind) const;

  QNEMultiTypeKind mKind;
  signed char mSignedByte;  // meaningful when mKind is QNMTK_SignedByte
  unsigned int mUnsigned;   // meaningful when mKind is QNMTK_Unsigned
  QNCString mText;          // meaningful when mKind is QNMTK_Text
};
