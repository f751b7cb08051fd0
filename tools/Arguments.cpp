#include "tools/Arguments.h"

#include <charconv>
#include <cmath>
#include <optional>
#include <span>
#include <string>

#include "client/Vocabulary.h"

namespace halvox::tools {
namespace {

using client::NamedNumber;
using platform::linux_::Failure;
using platform::linux_::Result;

template <typename Number>
std::optional<Number> parseWhole(std::string_view text) {
  int base = 10;
  if (text.starts_with("0x") || text.starts_with("0X")) {
    text.remove_prefix(2);
    base = 16;
    if (text.starts_with('-')) return std::nullopt;  // from_chars() would accept "0x-5"
  }
  Number number{};
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number, base);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

// Parses a finite number. Refuses "inf" and "nan", which the conversion would accept.
std::optional<double> parseReal(std::string_view text) {
  double number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  const bool whole = error == std::errc() && end == text.data() + text.size();
  if (!whole || !std::isfinite(number)) return std::nullopt;
  return number;
}

std::string listNames(std::span<const NamedNumber> table) {
  std::string list;
  for (const auto& entry : table) {
    if (!list.empty()) list += ", ";
    list.append(entry.name).append(" (").append(std::to_string(entry.number)).append(")");
  }
  return list;
}

std::string listDomains() {
  std::string list;
  for (const auto& domain : client::domains()) {
    if (!list.empty()) list += ", ";
    list.append(domain.name).append("_");
  }
  return list;
}

// Parses "Session_99": a category without a name, in a domain.
std::optional<client::Category> parseNumberInDomain(std::string_view text) {
  const auto separator = text.find('_');
  if (separator == std::string_view::npos) return std::nullopt;
  // The look-up finds a domain only together with a category. "Undefined" is category 0, which adds
  // no bits to the domain.
  const auto domain = client::findCategory(std::string(text.substr(0, separator)) + "_Undefined");
  const auto number = parseWhole<std::uint16_t>(text.substr(separator + 1));
  if (!domain || !number) return std::nullopt;
  return *domain | *number;
}

Failure<> unknown(std::string_view text, const std::string& expected) {
  return {"\"" + std::string(text) + "\" is not known; expected " + expected};
}

}  // namespace

Result<client::ReporterID> parseReporterID(std::string_view text) {
  if (const auto id = parseWhole<client::ReporterID>(text)) return *id;
  return Failure<>{"\"" + std::string(text) +
                   "\" is not a reporter ID; expected a whole number of 64 bits, such as 7"};
}

Result<std::int64_t> parseNumber(std::string_view text) {
  if (const auto number = parseWhole<std::int64_t>(text)) return *number;
  return Failure<>{"\"" + std::string(text) + "\" is not a number; expected a whole number"};
}

Result<std::uint64_t> parseCount(std::string_view text) {
  if (const auto count = parseWhole<std::uint64_t>(text)) return *count;
  return Failure<>{"\"" + std::string(text) +
                   "\" is not a number; expected a whole number of 0 or more, such as 10"};
}

Result<client::Category> parseCategory(std::string_view text) {
  // Numbers are tried first: a category can have any 32 bits, and most of them have no name.
  if (const auto number = parseWhole<client::Category>(text)) return *number;
  if (const auto category = client::findCategory(text)) return *category;
  if (const auto category = parseNumberInDomain(text)) return *category;
  return unknown(text, "a number of 32 bits or one of " + listNames(client::categories()) +
                           ", alone or after one of " + listDomains());
}

Result<client::EventType> parseEventType(std::string_view text) {
  if (const auto number = parseWhole<client::EventType>(text)) return *number;
  if (const auto type = client::findEventType(text)) return *type;
  return unknown(text, "a number up to 65535 or one of " + listNames(client::eventTypes()));
}

Result<client::ServiceType> parseServiceType(std::string_view text) {
  if (const auto number = parseWhole<client::ServiceType>(text)) return *number;
  if (const auto type = client::findServiceType(text)) return *type;
  return unknown(text, "a number up to 65535 or one of " + listNames(client::serviceTypes()));
}

Result<std::chrono::milliseconds> parseSeconds(std::string_view text) {
  // About 30 years. The bound keeps the conversion to milliseconds and later sums of times within
  // 64 bits.
  constexpr double kMost = 1e9;
  const auto seconds = parseReal(text);
  if (!seconds || *seconds <= 0 || *seconds > kMost) {
    return Failure<>{"\"" + std::string(text) +
                     "\" is not a time; expected seconds, more than 0, such as 0.5 or 10"};
  }
  // Rounded up: 0.0001 seconds must not become 0.
  return std::chrono::ceil<std::chrono::milliseconds>(std::chrono::duration<double>(*seconds));
}

}  // namespace halvox::tools
