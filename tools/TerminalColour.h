#pragma once

namespace halvox::tools {

// Returns true if texts on this terminal may have colours: $NO_COLOR is unset or empty, and the
// terminal is not "dumb".
[[nodiscard]] bool isColourWanted();

}  // namespace halvox::tools
