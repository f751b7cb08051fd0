#include "platform/linux/configuration/GlobPattern.h"

#include <algorithm>
#include <array>

#include <fmt/format.h>

namespace halvox::platform::linux_ {
namespace {

constexpr std::array<std::string_view, 12> kClasses{"alnum", "alpha", "blank", "cntrl",
                                                    "digit", "graph", "lower", "print",
                                                    "punct", "space", "upper", "xdigit"};

// Reads one pattern from its start to its end, or to the first mistake. Refers to the pattern.
class PatternParser {
 public:
  explicit PatternParser(std::string_view pattern) : pattern_(pattern) {}

  std::optional<std::string> findMistake() {
    while (!mistake_.has_value() && at_ < pattern_.size()) {
      if (startsWith("[")) {
        readList();
      } else {
        if (pattern_[at_] == '\0') mistake(at_, "the character has the number 0");
        ++at_;
      }
    }
    return mistake_;
  }

 private:
  [[nodiscard]] bool startsWith(std::string_view text) const {
    return pattern_.substr(at_).starts_with(text);
  }

  void mistake(std::size_t at, std::string_view what) {
    if (!mistake_.has_value()) mistake_ = fmt::format("character {}: {}", at + 1, what);
  }

  // Stands at the "[" and reads to after the "]".
  void readList() {
    const std::size_t start = at_++;
    if (startsWith("!") || startsWith("^")) ++at_;
    // A "]" that is the first character of the list belongs to the list.
    const std::size_t first = at_;
    while (!mistake_.has_value() && at_ < pattern_.size()) {
      if (at_ != first && startsWith("]")) {
        ++at_;
        return;
      }
      readElement(first);
    }
    mistake(start, "the list has no \"]\" at its end");
  }

  void readElement(std::size_t first) {
    if (startsWith("[:")) return readClass();
    if (startsWith("[=") || startsWith("[.")) {
      return mistake(at_, "a list cannot have \"[=\" or \"[.\"");
    }
    // A "-" stands for itself at the start and at the end of a list, and is otherwise part of a
    // range. What it means after a range or a class is not defined.
    if (at_ != first && isRange_ && startsWith("-") && !startsWith("-]")) {
      return mistake(at_, "a range cannot begin with a range or a class");
    }
    isRange_ = false;
    const unsigned char low = readCharacter();
    if (!startsWith("-") || startsWith("-]") || at_ + 1 >= pattern_.size()) return;
    readEndOfRange(low);
  }

  // Stands at the "-" between the ends of a range.
  void readEndOfRange(unsigned char low) {
    const std::size_t start = at_ - 1;
    ++at_;
    if (startsWith("[:") || startsWith("[=") || startsWith("[.")) {
      return mistake(at_, "a range cannot end with a class");
    }
    const unsigned char high = readCharacter();
    isRange_ = true;
    if (low > high) {
      mistake(start, fmt::format("the range {} is empty, because its end is before its start",
                                 pattern_.substr(start, at_ - start)));
    }
  }

  unsigned char readCharacter() {
    const auto character = static_cast<unsigned char>(pattern_[at_]);
    if (character == 0 || character >= 0x80) {
      mistake(at_, "a list can have only characters of ASCII");
    }
    ++at_;
    return character;
  }

  // Stands at the "[:" and reads to after the ":]".
  void readClass() {
    const std::size_t start = at_;
    const std::size_t end = pattern_.find(":]", start + 2);
    if (end == std::string_view::npos) return mistake(start, "the class has no \":]\" at its end");
    const std::string_view name = pattern_.substr(start + 2, end - start - 2);
    if (std::ranges::find(kClasses, name) == kClasses.end()) {
      return mistake(start, fmt::format("unknown class \"{}\"; the classes are {}", name,
                                        fmt::join(kClasses, ", ")));
    }
    at_ = end + 2;
    isRange_ = true;
  }

  const std::string_view pattern_;
  std::size_t at_ = 0;
  bool isRange_ = false;  // whether a range or a class was just read
  std::optional<std::string> mistake_;
};

}  // namespace

std::optional<std::string> findPatternMistake(std::string_view pattern) {
  if (pattern.empty()) return "an empty pattern matches nothing";
  return PatternParser(pattern).findMistake();
}

}  // namespace halvox::platform::linux_
