#include "tools/export/RecordTime.h"

#include <array>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <ctime>

#include "tools/JsonText.h"

namespace halvox::tools {
namespace {

// In the year 5138. A clock that was set wrong may be anywhere.
bool hasDate(double seconds) { return std::abs(seconds) < 1e11; }

}  // namespace

std::string timeNumber(double seconds) {
  if (!hasDate(seconds)) return shortNumber(seconds);
  std::array<char, 400> text{};  // a small fraction has many zeroes
  const auto written =
      std::to_chars(text.data(), text.data() + text.size(), seconds, std::chars_format::fixed);
  return {text.data(), written.ptr};
}

std::string utcTime(double seconds) {
  if (!hasDate(seconds)) return {};
  const double whole = std::floor(seconds);
  const auto time = static_cast<std::time_t>(whole);
  std::tm fields{};
  std::array<char, 32> date{};
  if (gmtime_r(&time, &fields) == nullptr ||
      std::strftime(date.data(), date.size(), "%Y-%m-%dT%H:%M:%S", &fields) == 0) {
    return {};
  }
  std::array<char, 8> fraction{};
  std::snprintf(fraction.data(), fraction.size(), ".%03dZ",
                static_cast<int>((seconds - whole) * 1000));
  return std::string(date.data()) + fraction.data();
}

}  // namespace halvox::tools
