#include "client/testing/BusValue.h"

#include <cstring>
#include <utility>
#include <vector>

#include <systemd/sd-bus.h>

namespace halvox::client {
namespace {

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
    default:  // a peer may send any character
      return std::nullopt;
  }
}

}  // namespace

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
