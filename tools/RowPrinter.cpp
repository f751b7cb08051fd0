#include "tools/RowPrinter.h"

#include <algorithm>
#include <numeric>

#include "tools/JsonText.h"
#include "tools/TextTable.h"
#include "tools/TimeText.h"

namespace halvox::tools {
namespace {

constexpr std::string_view kGap = "  ";
// Below these widths a line begins with the time of day alone, and without milliseconds.
constexpr std::size_t kWidthForDates = 100;
constexpr std::size_t kWidthForMilliseconds = 60;
constexpr std::size_t kDateLength = 10;         // "2026-11-21"
constexpr std::size_t kTimeOfDayBegin = 11;     // after the date and a blank
constexpr std::size_t kTimeOfDayLength = 8;     // "22:44:05"
constexpr std::size_t kMillisecondsLength = 4;  // ".123"
constexpr std::size_t kLeastWidth = 4;          // of a column
// How much of the line the columns before the last one may take, in percent.
constexpr std::size_t kShareOfFirstColumns = 60;

constexpr const char* kDim = "\x1B[2m";
constexpr const char* kCyan = "\x1B[36m";
constexpr const char* kRed = "\x1B[31m";
constexpr const char* kReset = "\x1B[0m";

const char* colourOf(RowCell::Look look) {
  switch (look) {
    case RowCell::Look::kPlain:
      return nullptr;
    case RowCell::Look::kName:
      return kCyan;
    case RowCell::Look::kProblem:
      return kRed;
  }
  return nullptr;
}

std::string coloured(const std::string& text, const char* colour) {
  return colour == nullptr || text.empty() ? text : colour + text + kReset;
}

}  // namespace

void RowPrinter::printJson(const std::string& json) {
  // After the members of the row, because they are what was recorded.
  out_ << std::string_view(json).substr(0, json.size() - 1)
       << ",\"cursor\":" << tools::quoted(cursorText(last_)) << "}\n";
}

void RowPrinter::printText(double time, const std::vector<RowCell>& cells) {
  const std::string shownTime = timeCell(time);
  const bool isAligned = style_.width.has_value();
  const bool isCut = isAligned && !style_.isFull;
  widths_.resize(cells.empty() ? 0 : cells.size() - 1);
  if (isAligned) widen(cells, shownTime.size());
  std::string line = style_.hasColour ? coloured(shownTime, kDim) : shownTime;
  std::size_t used = shownTime.size();
  for (std::size_t column = 0; column < cells.size(); ++column) {
    const RowCell& cell = cells[column];
    const bool isLast = column + 1 == cells.size();
    used += kGap.size();
    std::string text = cell.text;
    if (isCut) {
      const std::size_t room =
          isLast ? *style_.width - std::min(*style_.width, used) : widths_[column];
      text = cell.keepsEnd ? cutToEnd(text, room) : cutTo(text, room);
    }
    const std::size_t width = displayWidth(text);
    line.append(kGap).append(style_.hasColour ? coloured(text, colourOf(cell.look)) : text);
    if (isAligned && !isLast) {
      line.append(widths_[column] - std::min(widths_[column], width), ' ');
      used += std::max(widths_[column], width);
    }
  }
  out_ << line << '\n';
}

// Returns the time as the line shows it. Prints a line with the date if the line has no room for
// the date.
std::string RowPrinter::timeCell(double time) {
  std::string text = style_.isUtc ? utcClockTime(time) : localTime(time);
  const bool isNarrow = style_.width && *style_.width < kWidthForDates && !style_.isFull;
  if (!isNarrow || text.size() < kTimeOfDayBegin + kTimeOfDayLength) return text;
  std::string date = text.substr(0, kDateLength);
  if (date != date_) {
    date_ = date;
    if (style_.isUtc) date += " UTC";
    out_ << (style_.hasColour ? coloured(date, kDim) : date) << '\n';
  }
  const bool hasMilliseconds = *style_.width >= kWidthForMilliseconds;
  return text.substr(kTimeOfDayBegin,
                     hasMilliseconds ? kTimeOfDayLength + kMillisecondsLength : kTimeOfDayLength);
}

// Makes the columns before the last one as wide as these texts, within their share of the line.
void RowPrinter::widen(const std::vector<RowCell>& cells, std::size_t timeWidth) {
  for (std::size_t column = 0; column < widths_.size(); ++column) {
    widths_[column] = std::max(widths_[column], displayWidth(cells[column].text));
  }
  if (style_.isFull) return;
  const std::size_t taken = std::min(*style_.width, timeWidth + kGap.size() * cells.size());
  const std::size_t share = (*style_.width - taken) * kShareOfFirstColumns / 100;
  // The widest column gives first: short texts stay whole for longest.
  while (std::accumulate(widths_.begin(), widths_.end(), std::size_t{0}) > share) {
    const auto widest = std::ranges::max_element(widths_);
    if (*widest <= kLeastWidth) break;
    --*widest;
  }
}

}  // namespace halvox::tools
