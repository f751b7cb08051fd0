#include "tools/TextTable.h"

#include <algorithm>
#include <array>
#include <utility>

#include <sys/ioctl.h>
#include <unistd.h>

#include "platform/linux/base/Utf8.h"

namespace halvox::tools {
namespace {

using platform::linux_::nextUtf8;

constexpr std::string_view kGap = "  ";
constexpr std::string_view kCut = "…";

struct Range {
  char32_t first;
  char32_t last;
};

// wcwidth(3) would need a locale, which may be "C".
constexpr std::array kCombining{
    Range{0x300, 0x36F},   Range{0x483, 0x489},   Range{0x591, 0x5BD},   Range{0x610, 0x61A},
    Range{0x64B, 0x65F},   Range{0x1AB0, 0x1AFF}, Range{0x1DC0, 0x1DFF}, Range{0x200B, 0x200D},
    Range{0x20D0, 0x20FF}, Range{0xFE00, 0xFE0F}, Range{0xFE20, 0xFE2F}, Range{0xFEFF, 0xFEFF}};
constexpr std::array kWide{
    Range{0x1100, 0x115F},   Range{0x2E80, 0x303E},   Range{0x3041, 0xA4CF},
    Range{0xAC00, 0xD7A3},   Range{0xF900, 0xFAFF},   Range{0xFE30, 0xFE6F},
    Range{0xFF00, 0xFF60},   Range{0xFFE0, 0xFFE6},   Range{0x1F300, 0x1F64F},
    Range{0x1F680, 0x1F6FF}, Range{0x1F900, 0x1FAFF}, Range{0x20000, 0x3FFFD}};

template <typename Ranges>
bool isIn(const Ranges& ranges, char32_t character) {
  return std::ranges::any_of(ranges, [&](const Range& range) {
    return character >= range.first && character <= range.last;
  });
}

std::size_t widthOf(char32_t character) {
  if (character < 0x300) return 1;
  if (isIn(kCombining, character)) return 0;
  return isIn(kWide, character) ? 2 : 1;
}

}  // namespace

std::size_t displayWidth(std::string_view text) {
  std::size_t width = 0;
  while (!text.empty()) {
    const auto step = nextUtf8(text);
    width += step.valid ? widthOf(step.character) : 1;
    text.remove_prefix(step.length);
  }
  return width;
}

std::string cutTo(std::string_view text, std::size_t width) {
  if (displayWidth(text) <= width) return std::string(text);
  if (width == 0) return {};
  std::size_t length = 0;
  std::size_t used = 1;  // the mark
  for (std::string_view rest = text; !rest.empty();) {
    const auto step = nextUtf8(rest);
    used += step.valid ? widthOf(step.character) : 1;
    if (used > width) break;
    length += step.length;
    rest.remove_prefix(step.length);
  }
  return std::string(text.substr(0, length)).append(kCut);
}

std::string cutToEnd(std::string_view text, std::size_t width) {
  std::size_t excess = displayWidth(text);
  if (excess <= width) return std::string(text);
  if (width == 0) return {};
  excess -= width - 1;  // and the mark
  for (std::size_t removed = 0; removed < excess && !text.empty();) {
    const auto step = nextUtf8(text);
    removed += step.valid ? widthOf(step.character) : 1;
    text.remove_prefix(step.length);
  }
  return std::string(kCut).append(text);
}

std::optional<std::size_t> terminalWidth(int descriptor) {
  // A terminal that does not know its size, such as a serial line, has that of old.
  constexpr std::size_t kUsual = 80;
  if (descriptor < 0 || ::isatty(descriptor) == 0) return std::nullopt;
  winsize size{};
  if (::ioctl(descriptor, TIOCGWINSZ, &size) != 0 || size.ws_col == 0) return kUsual;
  return size.ws_col;
}

void TextTable::add(std::vector<std::string> row) {
  row.resize(columns_.size());
  rows_.push_back(std::move(row));
}

std::vector<TextTable::Shown> TextTable::fit(std::optional<std::size_t> width) const {
  std::vector<Shown> shown;
  for (std::size_t column = 0; column < columns_.size(); ++column) {
    std::size_t widest = displayWidth(columns_[column].heading);
    for (const auto& row : rows_) widest = std::max(widest, displayWidth(row[column]));
    shown.push_back({.column = column, .width = widest});
  }
  if (!width) return shown;
  const auto least = [this](const Shown& one) {
    const Column& column = columns_[one.column];
    return column.least == 0
               ? one.width
               : std::min(one.width, std::max(column.least, displayWidth(column.heading)));
  };
  const auto total = [&](const auto& widthOfOne) {
    std::size_t sum = shown.empty() ? 0 : kGap.size() * (shown.size() - 1);
    for (const Shown& one : shown) sum += widthOfOne(one);
    return sum;
  };
  while (total(least) > *width) {
    const auto last = std::ranges::max_element(
        shown, {}, [this](const Shown& one) { return columns_[one.column].rank; });
    if (last == shown.end() || columns_[last->column].rank == 0) break;
    shown.erase(last);
  }
  // The widest column gives first: short values stay whole for longest.
  while (total([](const Shown& one) { return one.width; }) > *width) {
    const auto widest = std::ranges::max_element(
        shown, {}, [&](const Shown& one) { return one.width > least(one) ? one.width : 0; });
    if (widest == shown.end() || widest->width <= least(*widest)) break;
    --widest->width;
  }
  return shown;
}

void TextTable::printRow(std::ostream& out, const std::vector<std::string>& row,
                         const std::vector<Shown>& shown) const {
  std::string line;
  for (const Shown& one : shown) {
    const std::string text = cutTo(row[one.column], one.width);
    const std::string padding(one.width - std::min(one.width, displayWidth(text)), ' ');
    const bool isRight = columns_[one.column].align == Align::kRight;
    line += isRight ? padding + text : text + padding;
    line += kGap;
  }
  line.erase(line.find_last_not_of(' ') + 1);
  out << line << '\n';
}

void TextTable::print(std::ostream& out, std::optional<std::size_t> width) const {
  const std::vector<Shown> shown = fit(width);
  std::vector<std::string> headings;
  for (const Column& column : columns_) headings.push_back(column.heading);
  printRow(out, headings, shown);
  for (const auto& row : rows_) printRow(out, row, shown);
}

}  // namespace halvox::tools
