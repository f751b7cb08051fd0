#include "tools/export/OtlpValue.h"

#include <charconv>
#include <cstdint>
#include <vector>

#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

namespace halvox::tools {
namespace {

using rapidjson::SizeType;

bool isWhole(std::string_view number) {
  std::int64_t value = 0;
  const auto read = std::from_chars(number.data(), number.data() + number.size(), value);
  return read.ec == std::errc() && read.ptr == number.data() + number.size();
}

// Receives the parts of a JSON text and writes those of the AnyValue. Writes as it reads, because a
// tree of a large payload would take several times its size. Any type of value may stand in an
// array or in a member, which is an object {"key":…,"value":…} that ends with the value.
class ValueWriter : public rapidjson::BaseReaderHandler<rapidjson::UTF8<>, ValueWriter> {
 public:
  explicit ValueWriter(JsonWriter& writer) : writer_(writer) {}

  // The names of these functions are the library's.
  bool Null() {
    writer_.StartObject();
    return end();
  }
  bool Bool(bool value) {
    begin("boolValue");
    writer_.Bool(value);
    return end();
  }
  bool RawNumber(const char* number, SizeType length, bool /*copy*/) {
    if (isWhole({number, length})) {
      begin("intValue");
      writer_.String(number, length);
    } else {
      begin("doubleValue");
      writer_.RawValue(number, length, rapidjson::kNumberType);
    }
    return end();
  }
  bool String(const char* text, SizeType length, bool /*copy*/) {
    begin("stringValue");
    writer_.String(text, length);
    return end();
  }
  bool StartArray() { return beginValues("arrayValue", Container::kArray); }
  bool EndArray(SizeType /*count*/) { return endValues(); }
  bool StartObject() { return beginValues("kvlistValue", Container::kObject); }
  bool EndObject(SizeType /*count*/) { return endValues(); }
  bool Key(const char* key, SizeType length, bool /*copy*/) {
    writer_.StartObject();
    writeKey(writer_, "key");
    writer_.String(key, length);
    writeKey(writer_, "value");
    return true;
  }

 private:
  enum class Container : std::uint8_t { kArray, kObject };

  void begin(std::string_view type) {
    writer_.StartObject();
    writeKey(writer_, type);
  }
  bool end() {
    writer_.EndObject();
    // The member that has this value.
    if (!open_.empty() && open_.back() == Container::kObject) writer_.EndObject();
    return true;
  }
  bool beginValues(std::string_view type, Container container) {
    begin(type);
    writer_.StartObject();
    writeKey(writer_, "values");
    writer_.StartArray();
    open_.push_back(container);
    return true;
  }
  bool endValues() {
    open_.pop_back();
    writer_.EndArray();
    writer_.EndObject();
    return end();
  }

  JsonWriter& writer_;
  std::vector<Container> open_;
};

}  // namespace

void writeOtlpValue(JsonWriter& writer, std::string_view json) {
  // Tested first: a value that turns out to be damaged could not be taken back.
  if (!isJsonOnOneLine(json)) {
    writer.StartObject();
    writeKey(writer, "stringValue");
    writeText(writer, json);
    writer.EndObject();
    return;
  }
  constexpr unsigned kFlags =
      rapidjson::kParseIterativeFlag | rapidjson::kParseNumbersAsStringsFlag;
  rapidjson::MemoryStream stream(json.data(), json.size());
  rapidjson::Reader reader;
  ValueWriter handler(writer);
  reader.Parse<kFlags>(stream, handler);
}

}  // namespace halvox::tools
