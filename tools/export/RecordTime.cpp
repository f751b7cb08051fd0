#include "tools/export/RecordTime.h"

#include <array>
#include <charconv>
#include <cmath>

#include "tools/JsonText.h"
#include "tools/TimeText.h"

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
  std::string time = utcClockTime(seconds);
  return time.replace(time.find(' '), 1, 1, 'T');
}

}  // namespace halvox::tools
