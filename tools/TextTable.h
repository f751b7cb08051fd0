#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

namespace halvox::tools {

// Returns how many columns of a terminal a text takes: a wide character takes two, a combining one
// none. The text must be free of control characters.
[[nodiscard]] std::size_t displayWidth(std::string_view text);

// Returns the text if it fits, otherwise as much of its beginning as fits with a "…" after it.
[[nodiscard]] std::string cutTo(std::string_view text, std::size_t width);

// The same with the end of the text, after a "…".
[[nodiscard]] std::string cutToEnd(std::string_view text, std::size_t width);

// Returns the width of the terminal behind a descriptor; nothing if there is no terminal.
[[nodiscard]] std::optional<std::size_t> terminalWidth(int descriptor);

// A table with aligned columns, made for a person. At a terminal it fits the width: columns that
// may shrink do, their values are cut, and if that is not enough, columns are left out in the order
// of their rank. Elsewhere every value is whole.
class TextTable {
 public:
  enum class Align : std::uint8_t { kLeft, kRight };
  struct Column {
    std::string heading;
    Align align = Align::kLeft;
    std::size_t least = 0;  // how narrow it may become; 0: it keeps its width
    int rank = 0;           // the highest is left out first; 0: never
  };

  explicit TextTable(std::vector<Column> columns) : columns_(std::move(columns)) {}

  // Adds a row with one text for each column. The texts must be free of control characters.
  void add(std::vector<std::string> row);
  // Prints the headings and the rows. `width` is that of the terminal, if there is one.
  void print(std::ostream& out, std::optional<std::size_t> width) const;

 private:
  struct Shown {
    std::size_t column;
    std::size_t width;
  };
  [[nodiscard]] std::vector<Shown> fit(std::optional<std::size_t> width) const;
  void printRow(std::ostream& out, const std::vector<std::string>& row,
                const std::vector<Shown>& shown) const;

  std::vector<Column> columns_;
  std::vector<std::vector<std::string>> rows_;
};

}  // namespace halvox::tools
