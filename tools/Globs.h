#pragma once

#include <string>
#include <vector>

namespace halvox::tools {

// Whether one of the patterns, which are for fnmatch(3), matches the whole text.
[[nodiscard]] bool matchesAnyGlob(const std::vector<std::string>& patterns,
                                  const std::string& text);

}  // namespace halvox::tools
