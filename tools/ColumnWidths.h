#pragma once

#include <algorithm>
#include <array>
#include <cstddef>
#include <string>
#include <vector>

namespace halvox::tools {

// Returns the length in bytes of the longest text of each column.
template <std::size_t kColumns>
std::array<std::size_t, kColumns> columnWidths(
    const std::vector<std::array<std::string, kColumns>>& rows) {
  std::array<std::size_t, kColumns> widths{};
  for (const auto& row : rows) {
    for (std::size_t column = 0; column < kColumns; ++column) {
      widths[column] = std::max(widths[column], row[column].size());
    }
  }
  return widths;
}

}  // namespace halvox::tools
