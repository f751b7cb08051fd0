#include "tools/TerminalColour.h"

#include <cstdlib>
#include <string_view>

namespace halvox::tools {

bool isColourWanted() {
  const auto valueOf = [](const char* variable) {
    const char* const value = std::getenv(variable);
    return value == nullptr ? std::string_view() : std::string_view(value);
  };
  const std::string_view terminal = valueOf("TERM");
  return valueOf("NO_COLOR").empty() && !terminal.empty() && terminal != "dumb";
}

}  // namespace halvox::tools
