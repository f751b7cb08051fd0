#pragma once

#include <string>
#include <string_view>

#include "platform/value.h"
#include "tools/Arguments.h"

// Dictionaries as JSON, and text that is safe to show.
namespace halvox::tools {

// A JSON object as a dictionary. Whole numbers keep their 64 bits, others are doubles, true and
// false are booleans. Null has no form in a message: it is refused with its place, as are a key
// that occurs twice and anything but one object.
Parsed<platform::Dictionary> parseDictionary(std::string_view json);

// A finite number with as few digits as it takes to read the same number back: "0.1", "48000".
std::string shortNumber(double number);

// A value as JSON on one line: dates as RFC 3339 text, data as hexadecimal text, and numbers that
// JSON cannot hold as the texts "NaN", "Infinity" and "-Infinity".
std::string toJson(const platform::Value& value);

// A text as a JSON string with its quotes. Bytes that are not UTF-8 become U+FFFD.
std::string quoted(std::string_view text);

// JSON text with every character in it that could drive a terminal or reorder a line written as an
// escape. Such characters occur inside strings only, so the meaning stays.
std::string harmlessJson(std::string_view json);

// A text on one line in which nothing can drive a terminal: control characters as escapes.
std::string harmlessText(std::string_view text);

// The fields of a JSON object as "key=value" with blanks between; texts stand without quotes where
// that leaves no doubt. What is no JSON object is shown as it is.
std::string fieldsOfJson(std::string_view json);

}  // namespace halvox::tools
