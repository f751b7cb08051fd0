#include "tools/JsonText.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <ctime>
#include <limits>
#include <sstream>
#include <utility>
#include <vector>

#include <rapidjson/document.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include "platform/linux/base/Utf8.h"
#include "tools/JsonError.h"

namespace halvox::tools {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using platform::linux_::Failure;
using platform::linux_::Result;
using Writer = rapidjson::Writer<rapidjson::StringBuffer>;

// The deepest nesting that fits on the wire, where each dictionary counts twice: once for itself
// and once for the variant around a value in it.
constexpr int kMaxDepth = 32;
// Full precision, because the fast conversion of the library can be wrong in the last digit.
// Iterative, because deep nesting would overflow the stack of the recursive parser before a depth
// could be tested.
constexpr unsigned kParseFlags = rapidjson::kParseFullPrecisionFlag |
                                 rapidjson::kParseIterativeFlag |
                                 rapidjson::kParseValidateEncodingFlag;

std::string_view textOf(const rapidjson::Value& value) {
  return {value.GetString(), value.GetStringLength()};
}

// Converts parsed JSON to values. After a failure it knows the place of the error.
class Converter {
 public:
  bool convert(const rapidjson::Value& json, Dictionary& dictionary) {
    if (++depth_ > kMaxDepth) return fail("nested too deep");
    dictionary.reserve(json.MemberCount());
    for (const auto& member : json.GetObject()) {
      const std::size_t length = path_.size();
      path_.append(length > 0 ? "." : "").append(textOf(member.name));
      // JSON permits it, but a dictionary would silently drop the first value.
      if (dictionary.contains(textOf(member.name))) return fail("the key occurs twice");
      Value value;
      if (!convert(member.value, value)) return false;
      dictionary.set(textOf(member.name), std::move(value));
      path_.resize(length);
    }
    --depth_;
    return true;
  }

  [[nodiscard]] Failure<> error() const { return {"\"" + path_ + "\": " + reason_}; }

 private:
  bool fail(const char* reason) {
    reason_ = reason;
    return false;
  }

  bool convert(const rapidjson::Value& json, Value& value) {
    switch (json.GetType()) {
      case rapidjson::kNullType:
        return fail("a message cannot hold null; omit the key");
      case rapidjson::kFalseType:
      case rapidjson::kTrueType:
        value = json.GetBool();
        return true;
      case rapidjson::kStringType:
        // A D-Bus string cannot contain NUL.
        if (textOf(json).find('\0') != std::string_view::npos) {
          return fail("a message cannot hold a NUL character");
        }
        value = textOf(json);
        return true;
      case rapidjson::kNumberType:
        value = number(json);
        return true;
      case rapidjson::kArrayType:
        return convertArray(json, value);
      case rapidjson::kObjectType: {
        Dictionary dictionary;
        if (!convert(json, dictionary)) return false;
        value = dictionary;
        return true;
      }
    }
    return fail("of an unknown kind");
  }

  static Value number(const rapidjson::Value& json) {
    // The signed kind is tried first: most numbers fit both kinds, and only larger numbers need the
    // unsigned one.
    if (json.IsInt64()) return json.GetInt64();
    if (json.IsUint64()) return json.GetUint64();
    return json.GetDouble();
  }

  bool convertArray(const rapidjson::Value& json, Value& value) {
    if (++depth_ > kMaxDepth) return fail("nested too deep");
    std::vector<Value> values;
    for (const auto& element : json.GetArray()) {
      const std::size_t length = path_.size();
      path_.append("[").append(std::to_string(values.size())).append("]");
      if (!convert(element, values.emplace_back())) return false;
      path_.resize(length);
    }
    value = Array(values);
    --depth_;
    return true;
  }

  int depth_ = 0;
  std::string path_;
  std::string reason_;
};

void write(Writer& writer, std::string_view text) {
  writer.String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
}

// The shortest form of a number that reads back the same; the library's own form is sometimes
// longer. JSON keeps a fraction (1.0), so that the number reads back as a double.
std::string jsonNumber(double number) {
  std::string text = shortNumber(number);
  return text.find_first_not_of("-0123456789") == std::string::npos ? text + ".0" : text;
}

bool writeRaw(Writer& writer, const std::string& number) {
  return writer.RawValue(number.data(), number.size(), rapidjson::kNumberType);
}

void writeDouble(Writer& writer, double number) {
  if (std::isfinite(number)) {
    writeRaw(writer, jsonNumber(number));
  } else if (std::isnan(number)) {
    writer.String("NaN");
  } else {
    writer.String(number > 0 ? "Infinity" : "-Infinity");
  }
}

void writeNumber(Writer& writer, const Value& value) {
  switch (value.numberKind()) {
    case platform::NumberKind::kBool:
      writer.Bool(value.toBool());
      break;
    case platform::NumberKind::kUInt8:
    case platform::NumberKind::kUInt16:
    case platform::NumberKind::kUInt32:
    case platform::NumberKind::kUInt64:
      writer.Uint64(value.toUInt64());
      break;
    case platform::NumberKind::kInt16:
    case platform::NumberKind::kInt32:
    case platform::NumberKind::kInt64:
      writer.Int64(value.toInt64());
      break;
    case platform::NumberKind::kFloat:
    case platform::NumberKind::kDouble:
      writeDouble(writer, value.toDouble());
      break;
  }
}

void write(Writer& writer, const Value& value) {
  switch (value.kind()) {
    case platform::ValueKind::kNone:
      writer.Null();
      break;
    case platform::ValueKind::kNumber:
      writeNumber(writer, value);
      break;
    case platform::ValueKind::kString:
      write(writer, value.string());
      break;
    case platform::ValueKind::kDate:
    case platform::ValueKind::kData:
      write(writer, std::string_view(platform::describe(value)));
      break;
    case platform::ValueKind::kArray: {
      writer.StartArray();
      const Array array = value.array();
      for (const Value& element : array) write(writer, element);
      writer.EndArray();
      break;
    }
    case platform::ValueKind::kDictionary: {
      writer.StartObject();
      const Dictionary dictionary = value.dictionary();
      for (const auto& entry : dictionary) {
        const auto key = entry.key.text();
        writer.Key(key.data(), static_cast<rapidjson::SizeType>(key.size()));
        write(writer, entry.value);
      }
      writer.EndObject();
      break;
    }
  }
}

// Characters that control a terminal, or that make a name look like another one or like none:
// controls, marks of direction, separators and characters without a sign. Kept equal to those that
// the page of the report shows by their numbers.
constexpr std::array<std::pair<char32_t, char32_t>, 15> kHarmful{{{0x00, 0x1F},
                                                                  {0x7F, 0x9F},
                                                                  {0xAD, 0xAD},
                                                                  {0x061C, 0x061C},
                                                                  {0x115F, 0x1160},
                                                                  {0x180E, 0x180E},
                                                                  {0x200B, 0x200F},
                                                                  {0x2028, 0x202E},
                                                                  {0x2060, 0x206F},
                                                                  {0x2800, 0x2800},
                                                                  {0x3164, 0x3164},
                                                                  {0xFEFF, 0xFEFF},
                                                                  {0xFFA0, 0xFFA0},
                                                                  {0xFFF9, 0xFFFB},
                                                                  {0xE0000, 0xE007F}}};

bool isHarmful(char32_t character) {
  if (character >= 0x20 && character < 0x7F) return false;  // most texts
  return std::ranges::any_of(kHarmful, [character](const auto& range) {
    return character >= range.first && character <= range.second;
  });
}

void appendEscape(std::string& result, const char* format, unsigned number) {
  std::array<char, 16> escape{};
  std::snprintf(escape.data(), escape.size(), format, number);
  result += escape.data();
}

// As JSON escapes it: in two halves if it needs more than 16 bits.
void appendEscaped(std::string& result, char32_t character) {
  constexpr const char* kFormat = "\\u%04x";
  constexpr char32_t kHalves = 0x10000;
  if (character < kHalves) return appendEscape(result, kFormat, character);
  appendEscape(result, kFormat, 0xD800 + ((character - kHalves) >> 10U));
  appendEscape(result, kFormat, 0xDC00 + ((character - kHalves) & 0x3FFU));
}

enum class InvalidByte : std::uint8_t { kReplaced, kShown };

std::string harmless(std::string_view text, InvalidByte treatment) {
  std::string result;
  result.reserve(text.size());
  while (!text.empty()) {
    // Texts come from clients and archives, and may hold anything.
    const auto step = platform::linux_::nextUtf8(text);
    if (step.valid && !isHarmful(step.character)) {
      result += text.substr(0, step.length);
    } else if (step.valid) {
      appendEscaped(result, step.character);
    } else if (treatment == InvalidByte::kShown) {
      appendEscape(result, "\\x%02x", static_cast<unsigned char>(text.front()));
    } else {
      result += "\uFFFD";
    }
    text.remove_prefix(step.length);
  }
  return result;
}

// The characters that would make "key=value key=value" ambiguous.
bool canStandWithoutQuotes(std::string_view text) {
  return !text.empty() && text.find_first_of(" \"'=\\{}[],") == std::string_view::npos;
}

// Writes parsed JSON again, with numbers in the form for people.
class FieldWriter final : public Writer {
 public:
  using Writer::Writer;
  bool Double(double number) { return writeRaw(*this, shortNumber(number)); }
};

std::string compact(const rapidjson::Value& json) {
  rapidjson::StringBuffer buffer;
  FieldWriter writer(buffer);
  json.Accept(writer);
  return {buffer.GetString(), buffer.GetSize()};
}

}  // namespace

Result<Dictionary> parseDictionary(std::string_view json) {
  rapidjson::Document document;
  document.Parse<kParseFlags>(json.data(), json.size());
  if (document.HasParseError()) {
    std::istringstream text{std::string(json)};
    return Failure<>{describeJsonError(text, document.GetErrorOffset(), document.GetParseError())};
  }
  if (!document.IsObject()) {
    return Failure<>{"expected a JSON object, such as {\"sample_rate\": 48000}"};
  }
  Converter converter;
  Dictionary dictionary;
  if (!converter.convert(document, dictionary)) return converter.error();
  return dictionary;
}

std::string shortNumber(double number) {
  std::array<char, 32> text{};  // the longest double has 24 characters
  const auto written = std::to_chars(text.data(), text.data() + text.size(), number);
  return {text.data(), written.ptr};
}

std::string toJson(const Value& value) {
  rapidjson::StringBuffer buffer;
  Writer writer(buffer);
  write(writer, value);
  return {buffer.GetString(), buffer.GetSize()};
}

std::string quoted(std::string_view text) {
  return toJson(Value(platform::linux_::replaceInvalidUtf8(text)));
}

std::string harmlessJson(std::string_view json) { return harmless(json, InvalidByte::kReplaced); }

std::string harmlessText(std::string_view text) { return harmless(text, InvalidByte::kShown); }

std::string fieldsOfJson(std::string_view json) {
  rapidjson::Document document;
  document.Parse<kParseFlags>(json.data(), json.size());
  // Another text is shown as it is, because a person can read more from it than from an error.
  if (document.HasParseError() || !document.IsObject()) return harmlessText(json);
  std::string fields;
  for (const auto& member : std::as_const(document).GetObject()) {
    if (!fields.empty()) fields += ' ';
    const auto key = textOf(member.name);
    fields += canStandWithoutQuotes(key) ? harmlessText(key) : harmlessJson(compact(member.name));
    fields += '=';
    const bool isPlain = member.value.IsString() && canStandWithoutQuotes(textOf(member.value));
    fields += isPlain ? harmlessText(textOf(member.value)) : harmlessJson(compact(member.value));
  }
  return fields;
}

}  // namespace halvox::tools
