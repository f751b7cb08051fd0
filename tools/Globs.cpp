#include "tools/Globs.h"

#include <algorithm>

#include <fnmatch.h>

namespace halvox::tools {

bool matchesAnyGlob(const std::vector<std::string>& patterns, const std::string& text) {
  return std::ranges::any_of(patterns, [&](const std::string& pattern) {
    return ::fnmatch(pattern.c_str(), text.c_str(), 0) == 0;
  });
}

}  // namespace halvox::tools
