#pragma once

#include <algorithm>
#include <bit>
#include <cstddef>
#include <cstring>
#include <span>
#include <string>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform::linux_::dbus {

// Appends numbers, texts and values in wire form, little endian, to a buffer in which a message
// starts at `start`: boundaries are counted from there. The buffer is the caller's and outlives
// this.
class ValueEncoder {
 public:
  ValueEncoder(std::string& out, std::size_t start) : out_(out), start_(start) {}

  // Appends one value for each type of a signature. False when a value has no form in its type, or
  // there are more of one than of the other; what was appended until then is left in the buffer.
  // FrameWriter.h has the rules.
  [[nodiscard]] bool appendAll(std::string_view signature, std::span<const Value> values);

  void align(std::size_t alignment);
  // A number at its natural boundary.
  template <typename Number>
  void appendNumber(Number number) {
    align(sizeof number);
    char bytes[sizeof number];
    std::memcpy(bytes, &number, sizeof number);
    if constexpr (std::endian::native == std::endian::big)
      std::reverse(bytes, bytes + sizeof bytes);
    out_.append(bytes, sizeof bytes);
  }
  // Their characters are not looked at.
  void appendText(std::string_view text);
  void appendSignature(std::string_view signature);
  // Writes over a number that is already there.
  void replaceLength(std::size_t position, std::size_t length);

 private:
  bool append(std::string_view type, const Value& value, unsigned level);
  bool appendNumberAs(char code, const Value& value);
  bool appendStringAs(char code, const Value& value);
  bool appendContainer(std::string_view type, const Value& value, unsigned level);
  bool appendVariant(const Value& value, unsigned level);
  bool appendData(const Value& value);
  bool appendArray(std::string_view type, const Array& array, unsigned level);
  bool appendDictionary(std::string_view type, const Dictionary& dictionary, unsigned level);

  std::size_t beginArray(std::size_t elementAlignment, std::size_t& lengthPosition);
  bool endArray(std::size_t lengthPosition, std::size_t firstElement);

  std::string& out_;
  std::size_t start_;
};

}  // namespace halvox::platform::linux_::dbus
