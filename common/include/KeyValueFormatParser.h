#pragma once
// QNCKeyValueFormatParser (declared here; its contract is completed with its implementation).

class QNCKeyValueFormatParser {
 public:
  virtual ~QNCKeyValueFormatParser() = default;
};
