#pragma once

#include <string>
#include <string_view>

#include "platform/clock.h"

namespace halvox {

// What the name of a session's summary file is made of.
struct SummaryFileNameParts {
  platform::LocalTime time;
  std::string_view appName;      // as a client gave it, in UTF-8
  std::string_view serviceName;  // one of the service's own names
};

// "20231114-221320+0000-halvox-com.example.player-haptics.json". Always one usable name of a file
// in the directory that it is joined to, of 255 bytes at most, whatever a client calls itself. In
// the application's name, "_" stands for each slash, each control character (NUL and DEL among
// them, and those from U+0080 to U+009F) and each leading dot, and its end is cut off, never within
// a character, when the whole would be too long.
[[nodiscard]] std::string makeSummaryFileName(const SummaryFileNameParts& parts);

}  // namespace halvox
