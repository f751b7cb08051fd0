#pragma once

// Private to the settings: what the nodes of a parsed file mean.

#define TOML_HEADER_ONLY 0  // the parser is compiled once, for the configuration
#define TOML_EXCEPTIONS 0
#include <toml++/toml.h>

#include "platform/value.h"

namespace halvox::platform::linux_ {

// The property-list value of a node. A date without an offset is in the machine's time zone, one
// without a time its first moment. A time without a date is its text: no property list has these.
Value toValue(const toml::node& node);
Dictionary toDictionary(const toml::table& table);

}  // namespace halvox::platform::linux_
