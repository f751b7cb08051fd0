#pragma once

#include <chrono>
#include <cstdint>
#include <string_view>

#include "client/HalvoxClient.h"
#include "platform/linux/base/Result.h"

// Converts the text of an argument to a value. On failure the message says what was found and
// what was expected. Pure functions: any thread may call.
namespace halvox::tools {

// A 64-bit whole number, decimal, or hexadecimal after 0x.
platform::linux_::Result<client::ReporterID> parseReporterID(std::string_view text);
platform::linux_::Result<std::int64_t> parseNumber(std::string_view text);
// A whole number of 0 or more, decimal, or hexadecimal after 0x.
platform::linux_::Result<std::uint64_t> parseCount(std::string_view text);
// A name in upper or lower case, or a number.
platform::linux_::Result<client::Category> parseCategory(std::string_view text);
platform::linux_::Result<client::EventType> parseEventType(std::string_view text);
platform::linux_::Result<client::ServiceType> parseServiceType(std::string_view text);
// A number of seconds, more than 0; fractions are allowed.
platform::linux_::Result<std::chrono::milliseconds> parseSeconds(std::string_view text);

}  // namespace halvox::tools
