#include "tools/export/RecordJson.h"

#include <cmath>
#include <string>

#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

#include "platform/linux/base/Utf8.h"
#include "tools/export/RecordTime.h"

namespace halvox::tools {
namespace {

rapidjson::SizeType sizeOf(std::string_view text) {
  return static_cast<rapidjson::SizeType>(text.size());
}

}  // namespace

void writeKey(JsonWriter& writer, std::string_view key) { writer.Key(key.data(), sizeOf(key)); }

void writeText(JsonWriter& writer, std::string_view text) {
  if (platform::linux_::isUtf8(text)) {
    writer.String(text.data(), sizeOf(text));
  } else {
    const std::string valid = platform::linux_::replaceInvalidUtf8(text);
    writer.String(valid.data(), sizeOf(valid));
  }
}

void writeTime(JsonWriter& writer, double seconds) {
  if (!std::isfinite(seconds)) {
    writer.Null();
    return;
  }
  const std::string text = timeNumber(seconds);
  writer.RawValue(text.data(), text.size(), rapidjson::kNumberType);
}

bool isJsonOnOneLine(std::string_view text) {
  // Iterative, because a payload may be nested deeply. Numbers are not converted.
  constexpr unsigned kFlags = rapidjson::kParseIterativeFlag |
                              rapidjson::kParseNumbersAsStringsFlag |
                              rapidjson::kParseValidateEncodingFlag;
  if (text.empty() || text.find_first_of("\r\n") != std::string_view::npos) return false;
  rapidjson::MemoryStream stream(text.data(), text.size());
  rapidjson::Reader reader;
  rapidjson::BaseReaderHandler<> handler;
  // The reader takes a NUL for the end of the text.
  return !reader.Parse<kFlags>(stream, handler).IsError() && stream.Tell() == text.size();
}

void writeJson(JsonWriter& writer, std::string_view json) {
  if (isJsonOnOneLine(json)) {
    writer.RawValue(json.data(), json.size(), rapidjson::kObjectType);
  } else {
    writeText(writer, json);
  }
}

}  // namespace halvox::tools
