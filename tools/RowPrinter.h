#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/store/reading/StoreReader.h"
#include "tools/Command.h"
#include "tools/RowCursor.h"

namespace halvox::tools {

// One column of a row. The text is free of control characters.
struct RowCell {
  enum class Look : std::uint8_t { kPlain, kName, kProblem };
  std::string text;
  Look look = Look::kPlain;
  // Which end is shown if the text is too long: names of events differ at their ends.
  bool keepsEnd = false;
};

// How rows are printed.
struct RowStyle {
  OutputForm form = OutputForm::kText;
  std::string command{};               // for the cursors
  std::optional<std::size_t> width{};  // of the terminal; nothing: lines of any length
  bool isUtc = false;                  // the times; otherwise local
  bool isFull = false;                 // no text is cut
  bool hasColour = false;
};

// Prints stored rows one by one, oldest or newest first. Belongs to one thread. Keeps no rows.
//
// Elsewhere than at a terminal a line is the time and the columns, with two blanks between them. At
// a terminal the columns are aligned: each is as wide as the widest text so far, because the rows
// are not known in advance. All of them fit the width: a long text is cut, the last column gets the
// rest. A terminal that is too narrow for dates gets a line with the date when it changes.
class RowPrinter {
 public:
  // `out` must outlive it.
  RowPrinter(std::ostream& out, RowStyle style) : out_(out), style_(std::move(style)) {}

  // Prints one row. cells() returns a std::vector<RowCell>, json() an object without its cursor;
  // only the one of the form is called.
  template <typename Cells, typename Json>
  void print(platform::linux_::StoredRecordID id, double time, Cells cells, Json json) {
    last_ = {style_.command, id, time};
    ++rows_;
    if (style_.form == OutputForm::kJson) {
      printJson(json());
    } else {
      printText(time, cells());
    }
  }

  // Returns how many rows were printed.
  [[nodiscard]] std::uint64_t rows() const { return rows_; }
  // Returns the cursor of the last row; nothing if there was no row.
  [[nodiscard]] std::optional<RowCursor> last() const {
    return rows_ == 0 ? std::nullopt : std::optional(last_);
  }
  [[nodiscard]] std::ostream& out() { return out_; }

 private:
  void printJson(const std::string& json);
  void printText(double time, const std::vector<RowCell>& cells);
  [[nodiscard]] std::string timeCell(double time);
  void widen(const std::vector<RowCell>& cells, std::size_t timeWidth);

  std::ostream& out_;
  RowStyle style_;
  std::vector<std::size_t> widths_;  // of all columns but the last
  std::string date_;                 // in the last line with a date
  RowCursor last_{};
  std::uint64_t rows_ = 0;
};

}  // namespace halvox::tools
