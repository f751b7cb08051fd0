#include "analysis/DriverReport.h"

#include <charconv>
#include <limits>

namespace halvox::analysis {
namespace {

// Removes a number from the front of `text`.
std::optional<std::int64_t> takeNumber(std::string_view& text) {
  std::int64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc()) return std::nullopt;
  text.remove_prefix(static_cast<std::size_t>(end - text.data()));
  return number;
}

bool takeLetter(std::string_view& text, char letter) {
  if (!text.starts_with(letter)) return false;
  text.remove_prefix(1);
  return true;
}

}  // namespace

std::optional<DriverReportKey> parseDriverReportKey(std::string_view key, std::string_view type) {
  // No part contains an underscore.
  const std::size_t channel = key.rfind('_');
  if (channel == std::string_view::npos) return std::nullopt;
  std::string_view before = key.substr(0, channel);
  if (!before.ends_with(type)) return std::nullopt;
  before.remove_suffix(type.size());
  if (!before.empty() && !before.ends_with('_')) return std::nullopt;
  return DriverReportKey{before.substr(0, before.find('_')), key.substr(channel + 1)};
}

std::optional<std::string_view> parseDriverHistogram(std::string_view text,
                                                     const DriverBucket& bucket) {
  constexpr std::string_view kUnit = "unit=";
  const std::size_t unit = text.find(kUnit);
  const std::size_t end = text.find("::");
  if (unit == std::string_view::npos || end == std::string_view::npos || end < unit) {
    return std::nullopt;
  }
  const std::size_t begin = unit + kUnit.size();
  std::string_view rest = text.substr(end + 2);
  do {
    const auto lower = takeNumber(rest);
    if (!lower || !takeLetter(rest, '-')) return std::nullopt;
    const auto upper = takeNumber(rest);
    if (!upper || !takeLetter(rest, ':')) return std::nullopt;
    const auto hits = takeNumber(rest);
    if (!hits || *hits < 0 || *upper < *lower) return std::nullopt;
    const bool isBounded = *upper != std::numeric_limits<std::int64_t>::max();
    bucket(static_cast<double>(*lower),
           isBounded ? static_cast<double>(*upper) : std::numeric_limits<double>::infinity(),
           static_cast<std::uint64_t>(*hits));
  } while (takeLetter(rest, ';'));
  if (!rest.empty()) return std::nullopt;
  return text.substr(begin, end - begin);
}

}  // namespace halvox::analysis
