#define TOML_IMPLEMENTATION
// toml++ asserts that a table header begins with a key before it checks it and reports a mistake
// such as "[=]". The assertion would end the program.
#define TOML_ASSERT(expr) static_cast<void>(0)
#include "platform/linux/configuration/ConfigurationReader.h"

#include <algorithm>
#include <cmath>
#include <numeric>

#include <fmt/format.h>

#include "platform/linux/base/Utf8.h"
#include "platform/linux/configuration/ConfigurationEnvironment.h"
#include "platform/linux/configuration/GlobPattern.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kLongestError = 1024;
constexpr std::size_t kLongestQuote = 60;
constexpr double kLongestSeconds = 86'400;

std::string inQuotes(std::string_view text) {
  std::string result = "\"";
  const std::size_t taken = appendEscaped(result, text, kLongestQuote);
  return result + (taken < text.size() ? "…\"" : "\"");
}

// Describes the value in the file for the user.
std::string found(const toml::node& node) {
  if (const auto* text = node.as_string()) return "the string " + inQuotes(text->get());
  if (const auto* number = node.as_integer()) return fmt::format("{}", number->get());
  if (const auto* number = node.as_floating_point()) return fmt::format("{}", number->get());
  if (const auto* flag = node.as_boolean()) return flag->get() ? "true" : "false";
  if (node.is_table()) return "a table";
  if (node.is_array()) return "an array";
  return "a date or time";
}

std::size_t editDistance(std::string_view left, std::string_view right) {
  // One row of the table of distances is enough, because each number depends only on its own row
  // and the previous one.
  std::vector<std::size_t> row(right.size() + 1);
  std::iota(row.begin(), row.end(), std::size_t{0});
  for (std::size_t i = 0; i < left.size(); ++i) {
    std::size_t diagonal = std::exchange(row[0], i + 1);
    for (std::size_t j = 0; j < right.size(); ++j) {
      const std::size_t replaced = diagonal + (left[i] == right[j] ? 0U : 1U);
      diagonal = row[j + 1];
      row[j + 1] = std::min({replaced, row[j] + 1, row[j + 1] + 1});
    }
  }
  return row.back();
}

// The known key with the smallest edit distance to `key`. Compares only the first bytes of `key`,
// because the cost grows with the length and a long key is not a typing mistake.
std::string_view closest(std::string_view key, const std::vector<std::string>& known) {
  const std::string_view start = key.substr(0, kLongestQuote);
  const auto best = std::ranges::min_element(
      known, {}, [start](const std::string& candidate) { return editDistance(start, candidate); });
  return *best;
}

std::optional<Date> toDate(const toml::date_time& time) {
  // Without an offset, the moment would depend on the time zone of the machine.
  if (!time.offset.has_value()) return std::nullopt;
  const std::chrono::year_month_day day{std::chrono::year(time.date.year),
                                        std::chrono::month(time.date.month),
                                        std::chrono::day(time.date.day)};
  const auto whole = std::chrono::sys_days(day) + std::chrono::hours(time.time.hour) +
                     std::chrono::minutes(time.time.minute) +
                     std::chrono::seconds(time.time.second) -
                     std::chrono::minutes(time.offset->minutes);
  const std::chrono::duration<double> sinceEpoch =
      whole.time_since_epoch() + std::chrono::nanoseconds(time.time.nanosecond);
  return Date{sinceEpoch.count()};
}

}  // namespace

void ConfigurationMistakes::add(const toml::source_position& where, std::string_view what) {
  // The checks run in the order of the code, but users fix a file from its top.
  if (first_.has_value() && !(where < firstPosition_)) return;
  std::string line;
  appendEscaped(line, fmt::format("{}:{}:{}: {}", file_, where.line, where.column, what),
                kLongestError);
  firstPosition_ = where;
  first_ = Failure<ConfigurationError>{ConfigurationError::kWrong, std::move(line)};
}

TableReader TableReader::table(std::string_view key) {
  const toml::node* node = find(key);
  if (node != nullptr && !node->is_table()) expected(*node, key, "a table");
  return {node == nullptr ? nullptr : node->as_table(), fullName(key), mistakes_};
}

void TableReader::read(std::string_view key, bool& result) {
  const toml::node* node = find(key);
  if (node == nullptr) return;
  const auto* flag = node->as_boolean();
  if (flag == nullptr) return expected(*node, key, "true or false");
  result = flag->get();
}

void TableReader::read(std::string_view key, std::string& result) {
  const toml::node* node = find(key);
  if (node == nullptr) return;
  const auto* text = node->as_string();
  if (text == nullptr || text->get().empty()) return expected(*node, key, "a string");
  result = text->get();
}

void TableReader::read(std::string_view key, std::vector<std::string>& result) {
  constexpr std::string_view kExpected = "an array of strings";
  const toml::node* node = find(key);
  if (node == nullptr) return;
  const toml::array* array = node->as_array();
  if (array == nullptr) return expected(*node, key, kExpected);
  // Collect the values in another variable, because after a mistake, `result` must still have its
  // default.
  std::vector<std::string> texts;
  for (const toml::node& element : *array) {
    const auto* text = element.as_string();
    if (text == nullptr) return expected(element, key, kExpected);
    texts.push_back(text->get());
  }
  result = std::move(texts);
}

void TableReader::readText(std::string_view key, TextForm matches, std::string_view what,
                           std::string& result) {
  const toml::node* node = find(key);
  if (node == nullptr) return;
  const auto* text = node->as_string();
  if (text == nullptr || !matches(text->get())) return expected(*node, key, what);
  result = text->get();
}

void TableReader::readTexts(std::string_view key, TextForm matches, std::string_view what,
                            std::vector<std::string>& result) {
  const toml::node* node = find(key);
  if (node == nullptr) return;
  const std::string list = fmt::format("an array of {}", what);
  const toml::array* array = node->as_array();
  if (array == nullptr || array->empty()) return expected(*node, key, list);
  std::vector<std::string> texts;
  for (const toml::node& element : *array) {
    const auto* text = element.as_string();
    if (text == nullptr || !matches(text->get())) return expected(element, key, list);
    texts.push_back(text->get());
  }
  result = std::move(texts);
}

void TableReader::readPatterns(std::string_view key, std::string_view what,
                               std::vector<std::string>& result) {
  const toml::node* node = find(key);
  if (node == nullptr) return;
  const std::string list = fmt::format("an array of {}", what);
  const toml::array* array = node->as_array();
  if (array == nullptr || array->empty()) return expected(*node, key, list);
  std::vector<std::string> patterns;
  for (const toml::node& element : *array) {
    const auto* text = element.as_string();
    if (text == nullptr) return expected(element, key, list);
    if (const auto mistake = findPatternMistake(text->get())) {
      mistakes_.add(element.source().begin, fmt::format("{}: expected a pattern, found {}: {}",
                                                        fullName(key), found(element), *mistake));
      return;
    }
    patterns.push_back(text->get());
  }
  result = std::move(patterns);
}

void TableReader::refuse(std::string_view key, std::string_view what) {
  if (const toml::node* node = find(key)) expected(*node, key, what);
}

void TableReader::read(std::string_view key, std::filesystem::path& result, std::size_t longest) {
  const toml::node* node = find(key);
  if (node == nullptr) return;
  const auto* text = node->as_string();
  const auto path = text == nullptr ? std::nullopt : expandedPath(text->get());
  if (!path.has_value()) return expected(*node, key, "an absolute path");
  if (path->native().size() > longest) {
    return expected(*node, key, fmt::format("an absolute path of at most {} bytes", longest));
  }
  result = *path;
}

void TableReader::read(std::string_view key, NumberRange range, std::uint64_t& result) {
  const toml::node* node = find(key);
  if (node == nullptr) return;
  const auto* number = node->as_integer();
  // TOML's integers are signed and the limits are unsigned. A plain comparison would treat -1 as a
  // large number.
  if (number == nullptr || std::cmp_less(number->get(), range.least) ||
      std::cmp_greater(number->get(), range.greatest)) {
    return expected(*node, key,
                    fmt::format("an integer from {} to {}", range.least, range.greatest));
  }
  result = static_cast<std::uint64_t>(number->get());
}

void TableReader::readSeconds(std::string_view key, std::chrono::milliseconds& result) {
  const toml::node* node = find(key);
  if (node == nullptr) return;
  const std::optional<double> seconds = node->is_number() ? node->value<double>() : std::nullopt;
  // This form of the comparison rejects NaN.
  if (!(seconds.has_value() && *seconds >= 0.001 && *seconds <= kLongestSeconds)) {
    return expected(*node, key,
                    fmt::format("a number of seconds from 0.001 to {}", kLongestSeconds));
  }
  result = std::chrono::milliseconds(std::llround(*seconds * 1000));
}

void TableReader::readChoice(std::string_view key, std::initializer_list<std::string_view> names,
                             std::size_t& result) {
  const toml::node* node = find(key);
  if (node == nullptr) return;
  const auto* text = node->as_string();
  const auto* chosen = text == nullptr ? names.end() : std::ranges::find(names, text->get());
  if (chosen == names.end()) {
    std::string all;
    for (const std::string_view name : names) all += (all.empty() ? "" : " or ") + inQuotes(name);
    return expected(*node, key, all);
  }
  result = static_cast<std::size_t>(chosen - names.begin());
}

Dictionary TableReader::readValues() {
  Dictionary values;
  if (table_ == nullptr) return values;
  for (const auto& [key, node] : *table_) {
    known_.emplace_back(key.str());
    if (auto value = toValue(node, known_.back())) values.set(key.str(), *std::move(value));
  }
  return values;
}

std::vector<std::pair<std::string, TableReader>> TableReader::readTables() {
  std::vector<std::pair<std::string, TableReader>> tables;
  if (table_ == nullptr) return tables;
  for (const auto& entry : *table_) {
    tables.emplace_back(std::string(entry.first.str()), table(entry.first.str()));
  }
  return tables;
}

std::map<std::string, bool, std::less<>> TableReader::readSwitches() {
  std::map<std::string, bool, std::less<>> switches;
  if (table_ == nullptr) return switches;
  for (const auto& entry : *table_) {
    const std::string key(entry.first.str());
    read(key, switches[key]);
  }
  return switches;
}

void TableReader::finish() {
  if (table_ == nullptr) return;
  for (const auto& entry : *table_) {
    const std::string_view key = entry.first.str();
    if (std::ranges::find(known_, key) != known_.end()) continue;
    mistakes_.add(entry.first.source().begin,
                  fmt::format("{}: expected a known key, found an unknown one; the closest is {}",
                              fullName(key), inQuotes(closest(key, known_))));
  }
}

const toml::node* TableReader::find(std::string_view key) {
  // Remember the name even if the file does not have the key, because the error for an unknown key
  // suggests one of these names.
  known_.emplace_back(key);
  return table_ == nullptr ? nullptr : table_->get(key);
}

std::string TableReader::fullName(std::string_view key) const {
  return name_.empty() ? std::string(key) : fmt::format("{}.{}", name_, key);
}

void TableReader::expected(const toml::node& node, std::string_view key, std::string_view what) {
  mistakes_.add(node.source().begin,
                fmt::format("{}: expected {}, found {}", fullName(key), what, found(node)));
}

std::optional<Value> TableReader::toValue(const toml::node& node, const std::string& key) {
  if (const auto* text = node.as_string()) return Value(std::string_view(text->get()));
  if (const auto* number = node.as_integer()) return Value(number->get());
  if (const auto* number = node.as_floating_point()) return Value(number->get());
  if (const auto* flag = node.as_boolean()) return Value(flag->get());
  if (const auto* table = node.as_table()) {
    return Value(TableReader(table, fullName(key), mistakes_).readValues());
  }
  if (const auto* array = node.as_array()) {
    std::vector<Value> values;
    for (const toml::node& element : *array) {
      if (auto value = toValue(element, key)) values.push_back(*std::move(value));
    }
    return Value(Array(values));
  }
  if (const auto* time = node.as_date_time()) {
    if (const auto date = toDate(time->get())) return Value(*date);
  }
  expected(node, key, "a string, a number, a switch, a table, an array or a time with its offset");
  return std::nullopt;
}

}  // namespace halvox::platform::linux_
