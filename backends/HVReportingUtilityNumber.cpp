#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>

#include "backends/HVReportingUtility.h"

namespace halvox {

using platform::NumberKind;
using platform::Value;

namespace {

// Returns the number in decimal digits without an exponent: all digits of an integer, and the
// shortest digits of a fraction that read back as the same number. Therefore 0.35 is halfway
// between 0.3 and 0.4, as its writer expects, although its binary value is slightly smaller.
std::string plainDecimal(const Value& number) {
  // The longest text is that of the smallest doubles: a sign, "0.", 323 zeros and 17 digits.
  std::array<char, 400> buffer;
  char* const begin = buffer.data();
  char* const end = begin + buffer.size();
  std::to_chars_result written{};
  switch (number.numberKind()) {
    case NumberKind::kFloat:
      written = std::to_chars(begin, end, static_cast<float>(number.toDouble()),
                              std::chars_format::fixed);
      break;
    case NumberKind::kDouble:
      written = std::to_chars(begin, end, number.toDouble(), std::chars_format::fixed);
      break;
    case NumberKind::kInt16:
    case NumberKind::kInt32:
    case NumberKind::kInt64:
      written = std::to_chars(begin, end, number.toInt64());
      break;
    case NumberKind::kBool:
    case NumberKind::kUInt8:
    case NumberKind::kUInt16:
    case NumberKind::kUInt32:
    case NumberKind::kUInt64:
      written = std::to_chars(begin, end, number.toUInt64());
      break;
  }
  return {begin, written.ptr};
}

// Adds one to the last digit of a decimal text and carries to the left.
void incrementLastDigit(std::string& decimal) {
  for (std::size_t at = decimal.size(); at > 0; --at) {
    char& digit = decimal[at - 1];
    if (digit == '.') continue;
    if (digit == '-') break;
    if (digit != '9') {
      ++digit;
      return;
    }
    digit = '0';
  }
  decimal.insert(decimal.front() == '-' ? 1 : 0, 1, '1');
}

// Shortens a decimal text with a point to `digits` fraction digits, rounding half to even.
void roundFraction(std::string& decimal, std::size_t point, std::size_t digits) {
  const std::size_t cut = point + 1 + digits;
  if (cut >= decimal.size()) return;
  const char first = decimal[cut];
  const bool moreFollows = decimal.find_first_not_of('0', cut + 1) != std::string::npos;
  const char lastKept = digits == 0 ? decimal[point - 1] : decimal[cut - 1];
  const bool lastKeptIsOdd = (lastKept - '0') % 2 != 0;
  const bool up = first > '5' || (first == '5' && (moreFollows || lastKeptIsOdd));
  decimal.resize(digits == 0 ? point : cut);
  if (up) incrementLastDigit(decimal);
}

std::string formatBucket(const Value& bucket, std::uint64_t fractionDigits) {
  // Infinities and NaN have no decimal digits to round.
  if (!std::isfinite(bucket.toDouble())) return platform::describe(bucket);
  std::string decimal = plainDecimal(bucket);
  const std::size_t point = decimal.find('.');
  if (point != std::string::npos) {
    // More digits than the text has change nothing. The bound prevents an overflow when
    // roundFraction() adds them to a position.
    const auto digits = static_cast<std::size_t>(
        std::min<std::uint64_t>(fractionDigits, std::uint64_t{decimal.size()}));
    roundFraction(decimal, point, digits);
  }
  const std::size_t keptPoint = decimal.find('.');
  if (keptPoint == std::string::npos) return fractionDigits == 0 ? decimal : decimal + ".0";
  // Remove trailing zeros, but keep one fraction digit.
  const std::size_t lastDigit = std::max(decimal.find_last_not_of('0'), keptPoint + 1);
  decimal.resize(lastDigit + 1);
  return decimal;
}

}  // namespace

double HVReportingUtilityRoundWithPlaces(double value, std::int32_t places) {
  const double scale = std::pow(10.0, static_cast<double>(places));
  return std::round(value * scale) / scale;
}

std::optional<std::string> HVReportingUtilityBucketNumberToString(
    const platform::Value& number, const platform::Array& buckets,
    const platform::Value& fractionDigits) {
  const Value* chosen = nullptr;
  double distance = -1;
  for (const Value& bucket : buckets) {
    const double next = std::fabs(number.toDouble() - bucket.toDouble());
    // Stops only at a bucket that is strictly farther away: of two equally near buckets the later
    // one wins.
    if (distance >= 0 && next > distance) break;
    chosen = &bucket;
    distance = next;
  }
  if (chosen == nullptr) return std::nullopt;
  return formatBucket(*chosen, fractionDigits.toUInt64());
}

}  // namespace halvox
