#pragma once

#include <optional>

#include "reporters/pipewire/StreamValues.h"

struct spa_pod;

namespace halvox::pipewire_reporter {

// The format in a Format parameter; nothing when it is no audio format that can be read.
std::optional<StreamFormat> decodeFormat(const spa_pod* param);

// The volume controls in a Props parameter; none are set when it holds none.
VolumeChange decodeVolume(const spa_pod* param);

}  // namespace halvox::pipewire_reporter
