#pragma once

// Converts parsed TOML to values. Include it only in sources, because the parser is large.

#define TOML_HEADER_ONLY 0  // the configuration's source compiles the parser
#define TOML_EXCEPTIONS 0
#include <toml++/toml.h>

#include "platform/value.h"

namespace halvox::platform::linux_ {

// Returns the property-list value of a node. A date-time without an offset is in the machine's time
// zone, and a date without a time is its first moment. A time without a date becomes a text,
// because property lists have no such type.
Value toValue(const toml::node& node);
Dictionary toDictionary(const toml::table& table);

}  // namespace halvox::platform::linux_
