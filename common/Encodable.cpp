#include "Encodable.h"

QNCEncodable::~QNCEncodable() = default;
