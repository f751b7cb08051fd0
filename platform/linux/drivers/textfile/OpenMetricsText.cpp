#include "platform/linux/drivers/textfile/OpenMetricsText.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <limits>
#include <unordered_map>
#include <unordered_set>
#include <utility>

#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_ {
namespace {

// Thrown if the current line has an error, and caught in this file.
struct Mistake {
  std::string what;
};

bool isLetter(char character) {
  return (character >= 'a' && character <= 'z') || (character >= 'A' && character <= 'Z') ||
         character == '_';
}
bool isDigit(char character) { return character >= '0' && character <= '9'; }

// Reads one line from left to right. Throws a Mistake where something else is expected.
class LineCursor {
 public:
  explicit LineCursor(std::string_view line) : rest_(line) {}

  [[nodiscard]] bool isAtEnd() const { return rest_.empty(); }
  [[nodiscard]] bool startsWith(char character) const { return rest_.starts_with(character); }
  bool skip(char character) {
    if (!rest_.starts_with(character)) return false;
    rest_.remove_prefix(1);
    return true;
  }
  void skipBlanks() { rest_.remove_prefix(std::min(rest_.find_first_not_of(" \t"), rest_.size())); }
  void expect(char character, const char* what) {
    if (!skip(character)) throw Mistake{std::string("expected ") + what};
  }
  std::string_view takeUntilBlank() {
    return take(std::min(rest_.find_first_of(" \t"), rest_.size()));
  }
  std::string_view takeRest() { return take(rest_.size()); }
  std::string_view takeName(const char* what, bool withColons) {
    std::size_t size = 0;
    while (size < rest_.size() && (isLetter(rest_[size]) || (withColons && rest_[size] == ':') ||
                                   (size > 0 && isDigit(rest_[size])))) {
      ++size;
    }
    if (size == 0) throw Mistake{std::string("expected ") + what};
    return take(size);
  }
  // A quoted text without its quotes and escapes.
  std::string takeText() {
    expect('"', "a text in quotes");
    std::string text;
    while (!skip('"')) {
      if (rest_.empty()) throw Mistake{"expected the end of a text in quotes"};
      const char character = take(1).front();
      text += character == '\\' ? takeEscaped() : character;
    }
    return text;
  }

 private:
  std::string_view take(std::size_t size) {
    const std::string_view taken = rest_.substr(0, size);
    rest_.remove_prefix(size);
    return taken;
  }
  char takeEscaped() {
    if (skip('n')) return '\n';
    if (skip('\\')) return '\\';
    if (skip('"')) return '"';
    throw Mistake{"expected \\n, \\\\ or \\\" as the only escapes"};
  }

  std::string_view rest_;
};

std::optional<double> namedNumber(std::string_view text) {
  constexpr double kInfinity = std::numeric_limits<double>::infinity();
  std::string lower(text);
  std::ranges::transform(lower, lower.begin(), [](char character) {
    return character >= 'A' && character <= 'Z' ? static_cast<char>(character + 32) : character;
  });
  // OpenMetrics allows these names in any case.
  if (lower == "nan") return std::numeric_limits<double>::quiet_NaN();
  const bool isNegative = lower.starts_with('-');
  if (isNegative || lower.starts_with('+')) lower.erase(0, 1);
  if (lower == "inf" || lower == "infinity") return isNegative ? -kInfinity : kInfinity;
  return std::nullopt;
}

MetricNumber parseNumber(std::string_view text) {
  auto number = MetricNumber::parse(text);
  if (!number.has_value()) throw Mistake{"expected a number"};
  return *number;
}

MetricLabels parseLabels(LineCursor& line) {
  MetricLabels labels;
  line.skipBlanks();
  while (!line.skip('}')) {
    if (labels.size() == OpenMetricsText::kMostLabels) {
      throw Mistake{"expected at most " + std::to_string(OpenMetricsText::kMostLabels) + " labels"};
    }
    std::string name(line.takeName("a label or }", false));
    line.skipBlanks();
    line.expect('=', "= after the label");
    line.skipBlanks();
    labels.push_back({std::move(name), line.takeText()});
    line.skipBlanks();
    if (!line.skip(',') && !line.startsWith('}')) throw Mistake{"expected , or } after the label"};
    line.skipBlanks();
  }
  // Sort the labels, because the same labels in another order name the same series.
  std::ranges::sort(labels);
  const auto twice = std::ranges::adjacent_find(labels, {}, &MetricLabel::name);
  if (twice != labels.end()) throw Mistake{"the label " + twice->name + " appears twice"};
  return labels;
}

// Returns whether a sample's name may have this suffix after the name of a family of that type.
bool takesSuffix(MetricType type, std::string_view suffix) {
  // A histogram has no value without a suffix, because its values are those of its parts.
  if (suffix.empty()) return type != MetricType::kHistogram;
  switch (type) {
    case MetricType::kCounter:
      return suffix == "_total" || suffix == "_created";
    case MetricType::kHistogram:
      return suffix == "_bucket" || suffix == "_count" || suffix == "_sum" || suffix == "_created";
    case MetricType::kOther:
      return true;
    case MetricType::kUnknown:
    case MetricType::kGauge:
    case MetricType::kStateset:
      return false;
  }
  return false;
}

std::optional<MetricType> typeNamed(std::string_view name) {
  using Named = std::pair<std::string_view, MetricType>;
  constexpr std::array kTypes{
      Named{"counter", MetricType::kCounter},     Named{"gauge", MetricType::kGauge},
      Named{"histogram", MetricType::kHistogram}, Named{"stateset", MetricType::kStateset},
      Named{"unknown", MetricType::kUnknown},     Named{"untyped", MetricType::kUnknown},
      Named{"info", MetricType::kOther},          Named{"summary", MetricType::kOther},
      Named{"gaugehistogram", MetricType::kOther}};
  const auto* found = std::ranges::find(kTypes, name, &Named::first);
  if (found == kTypes.end()) return std::nullopt;
  return found->second;
}

// Parses one text. Used once. Stops at the first error, because a file that has one is not used at
// all.
class Parser {
 public:
  std::variant<OpenMetricsText::Families, MetricError> parse(std::string_view text) {
    try {
      parseLines(text);
    } catch (const Mistake& mistake) {
      return MetricError{line_, mistake.what};
    }
    return std::move(families_);
  }

 private:
  void parseLines(std::string_view text) {
    line_ = 1;
    if (text.size() > OpenMetricsText::kLargestText) {
      throw Mistake{"expected at most " + std::to_string(OpenMetricsText::kLargestText) + " bytes"};
    }
    while (!text.empty()) {
      const std::size_t end = text.find('\n');
      const std::string_view line = text.substr(0, end);
      if (isEnded_) throw Mistake{"expected nothing after # EOF"};
      checkLine(line);
      parseLine(line);
      // A daemon may still be writing the file, and a last number without its last digits would be
      // a smaller one.
      if (end == std::string_view::npos && !isEnded_) {
        throw Mistake{"the last line has no line break: the file is incomplete"};
      }
      text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
      ++line_;
    }
  }

  static void checkLine(std::string_view line) {
    if (line.size() > OpenMetricsText::kLongestLine) {
      throw Mistake{"expected a line of at most " + std::to_string(OpenMetricsText::kLongestLine) +
                    " bytes"};
    }
    if (!isUtf8(line)) throw Mistake{"the line is not valid UTF-8"};
  }

  void parseLine(std::string_view text) {
    LineCursor line(text);
    line.skipBlanks();
    if (line.isAtEnd()) return;
    if (text == "# EOF") {
      isEnded_ = true;
    } else if (line.skip('#')) {
      parseComment(line);
    } else {
      parseSample(line);
    }
  }

  void parseComment(LineCursor& line) {
    line.skipBlanks();
    const std::string_view kind = line.takeUntilBlank();
    if (kind != "TYPE" && kind != "UNIT") return;  // HELP, or a remark
    line.skipBlanks();
    const std::string name(line.takeName("the name of a metric", true));
    line.skipBlanks();
    if (kind == "UNIT") return setUnit(name, line.takeRest());
    const std::string_view typeName = line.takeUntilBlank();
    line.skipBlanks();
    const auto type = typeNamed(typeName);
    if (!type.has_value() || !line.isAtEnd()) throw Mistake{"expected a type of metric"};
    setType(name, *type);
  }

  void setType(const std::string& name, MetricType type) {
    MetricFamily& family = familyNamed(name);
    if (!typed_.insert(name).second) throw Mistake{"the type of " + name + " is declared twice"};
    if (!family.samples.empty()) {
      throw Mistake{"the type of " + name + " is declared after its values"};
    }
    family.type = type;
  }

  void setUnit(const std::string& name, std::string_view unit) {
    MetricFamily& family = familyNamed(name);
    if (!family.unit.empty() && family.unit != unit) {
      throw Mistake{"the unit of " + name + " is declared twice with different values"};
    }
    family.unit = unit;
  }

  void parseSample(LineCursor& line) {
    const std::string name(line.takeName("the name of a metric", true));
    line.skipBlanks();
    MetricSample sample{.suffix = {}, .labels = {}, .number = {}, .line = line_};
    if (line.skip('{')) sample.labels = parseLabels(line);
    line.skipBlanks();
    sample.number = parseNumber(line.takeUntilBlank());
    line.skipBlanks();
    // Skip a time stamp, because counters are sampled now.
    if (!line.isAtEnd() && !line.startsWith('#'))
      static_cast<void>(parseNumber(line.takeUntilBlank()));
    line.skipBlanks();
    if (line.skip('#')) parseExemplar(line);
    if (!line.isAtEnd()) throw Mistake{"expected the end of the line"};
    addSample(name, std::move(sample));
  }

  static void parseExemplar(LineCursor& line) {
    line.skipBlanks();
    line.expect('{', "{");
    static_cast<void>(parseLabels(line));
    line.skipBlanks();
    static_cast<void>(parseNumber(line.takeUntilBlank()));
    line.skipBlanks();
    if (!line.isAtEnd()) static_cast<void>(parseNumber(line.takeUntilBlank()));
    line.skipBlanks();
  }

  void addSample(const std::string& name, MetricSample sample) {
    if (++sampleCount_ > OpenMetricsText::kMostSamples) {
      throw Mistake{"expected at most " + std::to_string(OpenMetricsText::kMostSamples) +
                    " values"};
    }
    std::string series = name;
    // A label's value may contain any character. Without its length, two series could have the same
    // text.
    for (const auto& label : sample.labels) {
      series += '\n' + label.name + '=' + std::to_string(label.value.size()) + ':' + label.value;
    }
    if (!series_.insert(std::move(series)).second) throw Mistake{"this value appears twice"};
    MetricFamily& family = familyOfSample(name);
    sample.suffix = name.substr(family.name.size());
    if (!takesSuffix(family.type, sample.suffix)) {
      throw Mistake{"the name " + name + " does not suit the type of " + family.name};
    }
    family.samples.push_back(std::move(sample));
  }

  // The family with the sample's name, or with that name without its last suffix if the type allows
  // the suffix.
  MetricFamily& familyOfSample(const std::string& name) {
    if (!positions_.contains(name)) {
      const std::size_t underscore = name.rfind('_');
      if (underscore != std::string::npos && underscore > 0) {
        const auto found = positions_.find(name.substr(0, underscore));
        if (found != positions_.end() &&
            takesSuffix(families_[found->second].type, name.substr(underscore))) {
          return families_[found->second];
        }
      }
    }
    return familyNamed(name);
  }

  // Returns the family of that name. Adds it if it is new.
  MetricFamily& familyNamed(const std::string& name) {
    const auto [found, isNew] = positions_.try_emplace(name, families_.size());
    if (isNew) families_.push_back({.name = name});
    return families_[found->second];
  }

  std::size_t line_ = 0;
  bool isEnded_ = false;
  std::size_t sampleCount_ = 0;
  OpenMetricsText::Families families_;
  std::unordered_map<std::string, std::size_t> positions_;
  std::unordered_set<std::string> typed_;
  std::unordered_set<std::string> series_;
};

}  // namespace

std::optional<MetricNumber> MetricNumber::parse(std::string_view text) {
  if (const auto named = namedNumber(text)) return MetricNumber{*named, std::nullopt};
  std::string_view digits = text;
  // OpenMetrics allows a plus sign, but std::from_chars() does not.
  if (digits.starts_with('+')) digits.remove_prefix(1);
  const bool isSigned = digits.starts_with('-') && digits.size() == text.size();
  const std::size_t first = isSigned ? 1 : 0;
  // Without this test, std::from_chars() would also accept the names of infinities, which are
  // handled above.
  if (digits.size() <= first || (!isDigit(digits[first]) && digits[first] != '.')) {
    return std::nullopt;
  }
  const char* const end = digits.data() + digits.size();
  std::int64_t whole = 0;
  if (const auto parsed = std::from_chars(digits.data(), end, whole);
      parsed.ec == std::errc() && parsed.ptr == end) {
    return MetricNumber{static_cast<double>(whole), whole};
  }
  double value = 0;
  const auto parsed = std::from_chars(digits.data(), end, value);
  if (parsed.ec != std::errc() || parsed.ptr != end) return std::nullopt;
  return MetricNumber{value, std::nullopt};
}

std::optional<std::int64_t> MetricNumber::cutDown() const {
  if (whole.has_value()) return whole;
  const double down = std::floor(value);
  // Written so that a NaN fails. The upper bound is 2^63, which a signed integer of 64 bits cannot
  // hold.
  if (!(down >= -0x1p63 && down < 0x1p63)) return std::nullopt;
  return static_cast<std::int64_t>(down);
}

std::variant<OpenMetricsText::Families, MetricError> OpenMetricsText::parse(std::string_view text) {
  return Parser().parse(text);
}

}  // namespace halvox::platform::linux_
