#pragma once

#include <string>

#include "platform/value.h"

namespace halvox::platform {

// Appends the text that describe() returns. For callers that describe millions of values.
void appendDescription(std::string& text, const Value& value);

}  // namespace halvox::platform
