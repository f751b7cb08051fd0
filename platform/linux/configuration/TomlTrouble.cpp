#include "platform/linux/configuration/TomlTrouble.h"

#include <algorithm>
#include <utility>
#include <vector>

#include <fmt/format.h>

namespace halvox::platform::linux_ {
namespace {

// Whether TOML has that character only in quotes and comments, or nowhere.
bool isStrange(char character) {
  const auto byte = static_cast<unsigned char>(character);
  const bool isSpace = character == '\t' || character == '\n' || character == '\r';
  return (byte < 0x20 && !isSpace) || byte >= 0x7F;
}

// Counts the brackets and dots of a text outside quotes and comments. Does not parse and does not
// recurse, because the text may be anything.
class NestingScan {
 public:
  explicit NestingScan(std::string_view text) : text_(text), rest_(text) {
    constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
    if (rest_.starts_with(kByteOrderMark)) rest_.remove_prefix(kByteOrderMark.size());
  }

  std::optional<TomlTrouble> find() {
    while (!rest_.empty()) {
      take(rest_.front());
      if (isStrange_) return TomlTrouble{TomlTrouble::Kind::kCharacter, line()};
      if (depth_ > kDeepestNesting) return TomlTrouble{TomlTrouble::Kind::kTooDeep, line()};
    }
    return std::nullopt;
  }

 private:
  // The number of the line that was read last.
  [[nodiscard]] std::size_t line() const {
    const std::string_view read = text_.substr(0, text_.size() - rest_.size());
    return static_cast<std::size_t>(std::ranges::count(read, '\n')) + 1;
  }

  void take(char character) {
    isStrange_ = isStrange(character);
    if (isStrange_) return;
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

  const std::string_view text_;
  std::string_view rest_;
  std::vector<std::size_t> levels_{0};  // of the current element, for each open bracket
  std::size_t header_ = 0;              // levels of the current table header
  std::size_t depth_ = 0;               // sum of levels_ and header_
  bool isHeader_ = false;
  bool isStrange_ = false;  // the current character
  bool isLineStart_ = true;
};

}  // namespace

std::string TomlTrouble::description() const {
  if (kind == Kind::kCharacter) {
    return "expected TOML, found a mistake: a control or non-ASCII character outside quotes";
  }
  return fmt::format("expected at most {} levels of tables and arrays, found more",
                     kDeepestNesting);
}

std::optional<TomlTrouble> findTomlTrouble(std::string_view text) {
  return NestingScan(text).find();
}

}  // namespace halvox::platform::linux_
