#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "client/HalvoxClient.h"

// Converts the texts of single arguments to values. On failure the message says what was found and
// what was expected. Pure functions: any thread may call.
namespace halvox::tools {

struct ArgumentError {
  std::string message;
};
template <typename T>
using Parsed = std::variant<T, ArgumentError>;

// A 64-bit whole number, decimal, or hexadecimal after 0x.
Parsed<client::ReporterID> parseReporterID(std::string_view text);
Parsed<std::int64_t> parseNumber(std::string_view text);
// A whole number of 0 or more, decimal, or hexadecimal after 0x.
Parsed<std::uint64_t> parseCount(std::string_view text);
// A name in upper or lower case, or a number.
Parsed<client::Category> parseCategory(std::string_view text);
Parsed<client::EventType> parseEventType(std::string_view text);
Parsed<client::ServiceType> parseServiceType(std::string_view text);
// A number of seconds, more than 0; fractions are allowed.
Parsed<std::chrono::milliseconds> parseSeconds(std::string_view text);

}  // namespace halvox::tools
