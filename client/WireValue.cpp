#include "client/WireValue.h"

#include <cstring>
#include <utility>
#include <vector>

#include <systemd/sd-bus.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/Utf8.h"

namespace halvox::client {
namespace {

// The deepest nesting of arrays, structs and variants that the wire allows.
constexpr int kMaxNesting = 64;

// Appends values and remembers the reason of a failure. `path` is the current place in the message.
class ValueWriter {
 public:
  explicit ValueWriter(sd_bus_message* message) : message_(message) {}

  bool append(const Dictionary& dictionary) {
    if (!open('a', "{sv}")) return false;
    for (const auto& entry : dictionary) {
      const std::size_t length = path_.size();
      if (length > 0) path_ += '.';
      path_ += entry.key.text();
      const bool done = isOk(sd_bus_message_open_container(message_, 'e', "sv")) &&
                        appendText(entry.key.text(), "the key is") && appendVariant(entry.value) &&
                        isOk(sd_bus_message_close_container(message_));
      if (!done) return false;
      path_.resize(length);
    }
    return close();
  }

  [[nodiscard]] std::string error() const {
    return path_.empty() ? reason_ : "\"" + path_ + "\": " + reason_;
  }

 private:
  bool fail(std::string reason) {
    reason_ = std::move(reason);
    return false;
  }
  bool isOk(int result) {
    return result >= 0 ||
           fail("the message cannot hold it: " + platform::linux_::errnoText(-result));
  }
  bool open(char type, const char* content) {
    if (++depth_ > kMaxNesting) return fail("nested too deep");
    return isOk(sd_bus_message_open_container(message_, type, content));
  }
  bool close() {
    --depth_;
    return isOk(sd_bus_message_close_container(message_));
  }
  template <typename Raw>
  bool basic(char type, Raw raw) {
    return open('v', std::string(1, type).c_str()) &&
           isOk(sd_bus_message_append_basic(message_, type, &raw)) && close();
  }

  bool appendText(std::string_view text, const char* subject) {
    if (!platform::linux_::isUtf8WithoutNul(text))
      return fail(std::string(subject) + " not UTF-8 without NUL");
    char* room = nullptr;
    if (!isOk(sd_bus_message_append_string_space(message_, text.size(), &room))) return false;
    if (!text.empty()) std::memcpy(room, text.data(), text.size());
    return true;
  }

  bool appendNumber(const Value& value) {
    switch (value.numberKind()) {
      case platform::NumberKind::kBool:
        return basic('b', static_cast<int>(value.toBool()));
      case platform::NumberKind::kUInt8:
        return basic('y', static_cast<std::uint8_t>(value.toUInt64()));
      case platform::NumberKind::kInt16:
        return basic('n', static_cast<std::int16_t>(value.toInt64()));
      case platform::NumberKind::kUInt16:
        return basic('q', static_cast<std::uint16_t>(value.toUInt64()));
      case platform::NumberKind::kInt32:
        return basic('i', static_cast<std::int32_t>(value.toInt64()));
      case platform::NumberKind::kUInt32:
        return basic('u', static_cast<std::uint32_t>(value.toUInt64()));
      case platform::NumberKind::kInt64:
        return basic('x', value.toInt64());
      case platform::NumberKind::kUInt64:
        return basic('t', value.toUInt64());
      case platform::NumberKind::kFloat:
      case platform::NumberKind::kDouble:
        return basic('d', value.toDouble());
    }
    return fail("a number of an unknown kind");
  }

  bool appendDate(platform::Date date) {
    return open('v', "(d)") && open('r', "d") &&
           isOk(sd_bus_message_append_basic(message_, 'd', &date.secondsSince1970)) && close() &&
           close();
  }

  bool appendData(const platform::Data& data) {
    const auto bytes = data.bytes();
    if (depth_ + 1 >= kMaxNesting) return fail("nested too deep");
    return open('v', "ay") &&
           isOk(sd_bus_message_append_array(message_, 'y', bytes.data(), bytes.size())) && close();
  }

  bool appendArray(const platform::Array& array) {
    if (!open('v', "av") || !open('a', "v")) return false;
    for (std::size_t index = 0; index < array.size(); ++index) {
      const std::size_t length = path_.size();
      path_ += "[" + std::to_string(index) + "]";
      if (!appendVariant(array[index])) return false;
      path_.resize(length);
    }
    return close() && close();
  }

  bool appendVariant(const Value& value) {
    switch (value.kind()) {
      case platform::ValueKind::kNone:
        return fail("there is no value");
      case platform::ValueKind::kNumber:
        return appendNumber(value);
      case platform::ValueKind::kString:
        return open('v', "s") && appendText(value.string(), "the text is") && close();
      case platform::ValueKind::kDate:
        return appendDate(value.date());
      case platform::ValueKind::kData:
        return appendData(value.data());
      case platform::ValueKind::kArray:
        return appendArray(value.array());
      case platform::ValueKind::kDictionary:
        return open('v', "a{sv}") && append(value.dictionary()) && close();
    }
    return fail("a value of an unknown kind");
  }

  sd_bus_message* message_;
  int depth_ = 0;
  std::string path_;
  std::string reason_;
};

template <typename Raw>
std::optional<Value> readBasic(sd_bus_message* message, char type) {
  Raw raw{};
  if (sd_bus_message_read_basic(message, type, &raw) <= 0) return std::nullopt;
  return Value(raw);
}

std::optional<Value> readBoolean(sd_bus_message* message) {
  int raw = 0;
  if (sd_bus_message_read_basic(message, 'b', &raw) <= 0) return std::nullopt;
  return Value(raw != 0);
}

std::optional<Value> readData(sd_bus_message* message) {
  const void* bytes = nullptr;
  std::size_t size = 0;
  if (sd_bus_message_read_array(message, 'y', &bytes, &size) < 0) return std::nullopt;
  return platform::Data(std::span(static_cast<const std::byte*>(bytes), size));
}

std::optional<Value> readVariant(sd_bus_message* message, const char* contents) {
  if (sd_bus_message_enter_container(message, 'v', contents) <= 0) return std::nullopt;
  auto value = readValue(message);
  if (!value || sd_bus_message_exit_container(message) < 0) return std::nullopt;
  return value;
}

std::optional<Value> readDate(sd_bus_message* message) {
  if (sd_bus_message_enter_container(message, 'r', "d") <= 0) return std::nullopt;
  double seconds = 0;
  if (sd_bus_message_read_basic(message, 'd', &seconds) <= 0) return std::nullopt;
  if (sd_bus_message_exit_container(message) < 0) return std::nullopt;
  return platform::Date{seconds};
}

std::optional<Value> readDictionary(sd_bus_message* message, const std::string& contents) {
  if (sd_bus_message_enter_container(message, 'a', contents.c_str()) <= 0) return std::nullopt;
  const std::string entryContents = contents.substr(1, contents.size() - 2);
  Dictionary dictionary;
  int entered = 0;
  while ((entered = sd_bus_message_enter_container(message, 'e', entryContents.c_str())) > 0) {
    const char* key = nullptr;
    if (sd_bus_message_read_basic(message, 's', &key) <= 0) return std::nullopt;
    auto value = readValue(message);
    if (!value || sd_bus_message_exit_container(message) < 0) return std::nullopt;
    dictionary.set(key, std::move(*value));
  }
  if (entered < 0 || sd_bus_message_exit_container(message) < 0) return std::nullopt;
  return Value(dictionary);
}

std::optional<Value> readArray(sd_bus_message* message, const char* contents) {
  if (contents == nullptr) return std::nullopt;
  if (std::strcmp(contents, "y") == 0) return readData(message);
  if (std::strncmp(contents, "{s", 2) == 0) return readDictionary(message, contents);
  if (sd_bus_message_enter_container(message, 'a', contents) <= 0) return std::nullopt;
  std::vector<Value> values;
  int atEnd = 0;
  while ((atEnd = sd_bus_message_at_end(message, 0)) == 0) {
    auto value = readValue(message);
    if (!value) return std::nullopt;
    values.push_back(std::move(*value));
  }
  if (atEnd < 0 || sd_bus_message_exit_container(message) < 0) return std::nullopt;
  return Value(platform::Array(values));
}

std::optional<Value> readText(sd_bus_message* message, char type) {
  const char* text = nullptr;
  if (sd_bus_message_read_basic(message, type, &text) <= 0) return std::nullopt;
  return Value(text);
}

std::optional<Value> readNumber(sd_bus_message* message, char type) {
  switch (type) {
    case 'b':
      return readBoolean(message);
    case 'y':
      return readBasic<std::uint8_t>(message, type);
    case 'n':
      return readBasic<std::int16_t>(message, type);
    case 'q':
      return readBasic<std::uint16_t>(message, type);
    case 'i':
      return readBasic<std::int32_t>(message, type);
    case 'u':
      return readBasic<std::uint32_t>(message, type);
    case 'x':
      return readBasic<std::int64_t>(message, type);
    case 't':
      return readBasic<std::uint64_t>(message, type);
    case 'd':
      return readBasic<double>(message, type);
    default:  // what a peer may send is not an enumeration of ours
      return std::nullopt;
  }
}

}  // namespace

std::optional<std::string> appendDictionary(sd_bus_message* message, const Dictionary& dictionary) {
  ValueWriter writer(message);
  if (writer.append(dictionary)) return std::nullopt;
  return writer.error();
}

std::optional<Value> readValue(sd_bus_message* message) {
  char type = 0;
  const char* contents = nullptr;
  if (sd_bus_message_peek_type(message, &type, &contents) <= 0) return std::nullopt;
  switch (type) {
    case 's':
    case 'o':
    case 'g':
      return readText(message, type);
    case 'v':
      return readVariant(message, contents);
    case 'r':
      return readDate(message);
    case 'a':
      return readArray(message, contents);
    default:
      return readNumber(message, type);
  }
}

}  // namespace halvox::client
