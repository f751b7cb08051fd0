#pragma once

#include <string>
#include <string_view>

#include "platform/linux/base/Result.h"
#include "platform/value.h"

// Dictionaries as JSON, and text that is safe to show.
namespace halvox::tools {

// Parses a JSON object. Whole numbers keep their 64 bits, other numbers become doubles, true and
// false become booleans. It is an error, with its place, if the text is anything but one object,
// has a null, which messages cannot hold, or has a key twice.
platform::linux_::Result<platform::Dictionary> parseDictionary(std::string_view json);

// Formats a finite number with the fewest digits that read back as the same number: "0.1", "48000".
std::string shortNumber(double number);

// Formats a value as JSON on one line. Dates become RFC 3339 text, data becomes hexadecimal text,
// and numbers that JSON cannot hold become the texts "NaN", "Infinity" and "-Infinity".
std::string toJson(const platform::Value& value);

// Formats a text as a JSON string with quotes. Bytes that are not UTF-8 become U+FFFD.
std::string quoted(std::string_view text);

// Escapes the characters of a JSON text that could control a terminal, reorder a line or stay
// invisible. Such characters occur only inside strings, and escapes do not change the meaning.
std::string harmlessJson(std::string_view json);

// Makes a text safe to print on one line: control characters and invisible ones become escapes.
std::string harmlessText(std::string_view text);

// Formats the fields of a JSON object as "key=value" with blanks between. Texts have no quotes
// unless they would be ambiguous. Returns other text than a JSON object unchanged.
std::string fieldsOfJson(std::string_view json);

}  // namespace halvox::tools
