#pragma once

#include <cstdint>
#include <string_view>

#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

// How the exports in JSON write values, over RapidJSON's writer. For sources only: the headers of
// the library are heavy.
namespace halvox::tools {

using JsonBuffer = rapidjson::StringBuffer;
using JsonWriter = rapidjson::Writer<JsonBuffer>;

void writeKey(JsonWriter& writer, std::string_view key);
// Bytes that are not UTF-8 become U+FFFD.
void writeText(JsonWriter& writer, std::string_view text);
// A time in seconds since 1970, with the fewest digits that read back as the same number. null if
// it is not finite.
void writeTime(JsonWriter& writer, double seconds);
// True for one complete JSON value in UTF-8, without line breaks between its parts.
[[nodiscard]] bool isJsonOnOneLine(std::string_view text);
// Writes a JSON text of the store as it stands, so that no digit of a number is lost. Any other
// text becomes a string: a damaged payload must not make the whole line unreadable.
void writeJson(JsonWriter& writer, std::string_view json);

}  // namespace halvox::tools
