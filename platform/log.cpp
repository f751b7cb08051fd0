#include "platform/log.h"

namespace halvox::platform {

std::string_view levelName(LogLevel level) {
  switch (level) {
    case LogLevel::kDebug:
      return "debug";
    case LogLevel::kInfo:
      return "info";
    case LogLevel::kDefault:
      return "default";
    case LogLevel::kError:
      return "error";
  }
  return "error";
}

namespace detail {

std::string logPrefix(std::string_view unit, std::uint32_t line) {
  constexpr std::size_t kUnitWidth = 25;
  constexpr std::size_t kLineWidth = 5;
  // Build the prefix without snprintf or fmt, because every enabled line needs it.
  std::string prefix;
  if (unit.size() < kUnitWidth) prefix.append(kUnitWidth - unit.size(), ' ');
  prefix += unit;
  prefix += ':';
  const std::string number = std::to_string(line);
  prefix += number;
  if (number.size() < kLineWidth) prefix.append(kLineWidth - number.size(), ' ');
  prefix += ' ';
  return prefix;
}

}  // namespace detail
}  // namespace halvox::platform
