#pragma once

#include "reporters/pipewire/StreamProperties.h"

struct spa_dict;

namespace halvox::pipewire_reporter {

// Returns the keys and values of a dictionary of PipeWire; none when it is null. Skips entries
// without a key or a value. Any thread may call.
[[nodiscard]] Properties makeProperties(const spa_dict* dict);

}  // namespace halvox::pipewire_reporter
