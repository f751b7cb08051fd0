#pragma once

#include <string>
#include <string_view>

#include "platform/clock.h"

namespace halvox {

// The variable parts of the name of a session's summary file.
struct SummaryFileNameParts {
  platform::LocalTime time;
  std::string_view appName;      // as a client gave it, in UTF-8
  std::string_view serviceName;  // one of the service's own names
};

// Returns "20231114-221320+0000-halvox-com.example.player-haptics.json".
//
// The result is always a valid file name of at most 255 bytes, whatever a client calls itself. In
// the application's name, "_" replaces each slash, each leading dot and each control character
// (including NUL, DEL and U+0080 to U+009F). If the result would be too long, the name is shortened
// after a whole character.
[[nodiscard]] std::string makeSummaryFileName(const SummaryFileNameParts& parts);

}  // namespace halvox
