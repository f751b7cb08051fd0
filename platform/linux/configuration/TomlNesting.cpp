#include "platform/linux/configuration/TomlNesting.h"

#include <algorithm>
#include <utility>
#include <vector>

namespace halvox::platform::linux_ {
namespace {

// Counts the brackets and dots of a text outside quotes and comments. Does not parse and does not
// recurse, because the text may be anything.
class NestingScan {
 public:
  explicit NestingScan(std::string_view text) : rest_(text) {}

  // Returns the number of bytes up to the place where the nesting becomes too deep; none if it
  // never does.
  std::optional<std::size_t> find() {
    const std::size_t size = rest_.size();
    while (!rest_.empty()) {
      take(rest_.front());
      if (depth_ > kDeepestNesting) return size - rest_.size();
    }
    return std::nullopt;
  }

 private:
  void take(char character) {
    if (character == '"' || character == '\'') return skipQuoted(character);
    if (character == '#') return skip(rest_.find('\n'));
    rest_.remove_prefix(1);
    const bool beginsLine = isLineStart_;
    isLineStart_ = character == '\n' || (beginsLine && (character == ' ' || character == '\t'));
    // A dot in a number counts, too, but only until the number ends. The result is therefore at
    // most one level too high.
    if (character == '.') {
      deepen(1);
    } else if (character == '[' || character == '{') {
      open(beginsLine);
    } else if (character == ']' || character == '}') {
      close();
    } else if (character == ',' || (character == '\n' && levels_.size() == 1)) {
      forgetElement();
    }
  }

  void deepen(std::size_t levels) {
    levels_.back() += levels;
    depth_ += levels;
  }
  // Ends the current key or number, whose dots no longer count.
  void forgetElement() {
    depth_ -= levels_.back();
    levels_.back() = 0;
  }

  // A bracket at the start of a line, outside all other brackets, opens a table header.
  void open(bool beginsLine) {
    if (levels_.size() == 1) {
      isHeader_ = beginsLine;
      if (isHeader_) depth_ -= std::exchange(header_, 0);
    }
    levels_.push_back(0);
    deepen(1);
  }

  // The levels of a header count for all lines until the next header.
  void close() {
    if (levels_.size() == 1) return;
    const std::size_t levels = levels_.back();
    levels_.pop_back();
    if (isHeader_) {
      header_ += levels;
    } else {
      depth_ -= levels;
    }
  }

  void skip(std::size_t count) {
    rest_.remove_prefix(std::min(count, rest_.size()));
    isLineStart_ = false;
  }

  void skipQuoted(char quote) {
    const bool isLong = rest_.size() >= 3 && rest_[1] == quote && rest_[2] == quote;
    const std::string_view end = rest_.substr(0, isLong ? 3 : 1);
    skip(end.size());
    while (!rest_.empty() && !rest_.starts_with(end)) {
      if (!isLong && rest_.front() == '\n') return;
      skip(quote == '"' && rest_.front() == '\\' ? 2 : 1);
    }
    skip(end.size());
    // Up to two quotes directly before the closing three belong to the text.
    for (int extra = 0; isLong && extra < 2 && rest_.starts_with(quote); ++extra) skip(1);
  }

  std::string_view rest_;
  std::vector<std::size_t> levels_{0};  // of the current element, for each open bracket
  std::size_t header_ = 0;              // levels of the current table header
  std::size_t depth_ = 0;               // sum of levels_ and header_
  bool isHeader_ = false;
  bool isLineStart_ = true;
};

}  // namespace

std::optional<std::size_t> lineNestedTooDeep(std::string_view text) {
  const auto read = NestingScan(text).find();
  if (!read.has_value()) return std::nullopt;
  return static_cast<std::size_t>(std::ranges::count(text.substr(0, *read), '\n')) + 1;
}

}  // namespace halvox::platform::linux_
