#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "client/HalvoxClient.h"

// The texts of single arguments as what they stand for. Each function says, when it cannot, what
// was wrong and what was expected.
namespace halvox::tools {

struct ArgumentError {
  std::string message;
};
template <typename T>
using Parsed = std::variant<T, ArgumentError>;

// Whole numbers, decimal or with 0x hexadecimal.
Parsed<client::ReporterID> parseReporterID(std::string_view text);
Parsed<std::int64_t> parseNumber(std::string_view text);
// How many: a whole number from 0 on, decimal or with 0x hexadecimal.
Parsed<std::uint64_t> parseCount(std::string_view text);
// Names in any case of letters, or numbers.
Parsed<client::Category> parseCategory(std::string_view text);
Parsed<client::EventType> parseEventType(std::string_view text);
Parsed<client::ServiceType> parseServiceType(std::string_view text);
// Seconds, fractions allowed; more than 0.
Parsed<std::chrono::milliseconds> parseSeconds(std::string_view text);

}  // namespace halvox::tools
