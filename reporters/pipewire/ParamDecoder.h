#pragma once

#include <optional>

#include "reporters/pipewire/StreamValues.h"

struct spa_pod;

namespace halvox::pipewire_reporter {

// Parameters come from other processes. These functions therefore accept anything, null included.
// Any thread may call.

// Returns the format in a Format parameter; std::nullopt if it is not a readable audio format.
std::optional<StreamFormat> decodeFormat(const spa_pod* param);

// Returns the volume controls in a Props parameter. Controls that are missing, or have another
// type, stay unset.
VolumeChange decodeVolume(const spa_pod* param);

}  // namespace halvox::pipewire_reporter
