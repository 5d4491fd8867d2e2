#include "SystemInterface.h"

QNCSystemInterface::~QNCSystemInterface() = default;
