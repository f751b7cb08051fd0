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

// Appends numbers, texts and values in wire format, little endian, to a buffer in which a message
// starts at `start`. Alignment is relative to `start`. The caller owns the buffer, which must
// outlive this.
class ValueEncoder {
 public:
  ValueEncoder(std::string& out, std::size_t start) : out_(out), start_(start) {}

  // Appends one value for each type of a signature. Returns false if a value does not fit its type,
  // or if the numbers of values and types differ. Bytes that were appended before the failure stay
  // in the buffer. FrameWriter.h says which values fit which types.
  [[nodiscard]] bool appendAll(std::string_view signature, std::span<const Value> values);

  void align(std::size_t alignment);
  // Appends padding, then the number. The alignment of a number is its size.
  template <typename Number>
  void appendNumber(Number number) {
    align(sizeof number);
    char bytes[sizeof number];
    std::memcpy(bytes, &number, sizeof number);
    if constexpr (std::endian::native == std::endian::big)
      std::reverse(bytes, bytes + sizeof bytes);
    out_.append(bytes, sizeof bytes);
  }
  // These two functions do not check the characters of the text.
  void appendText(std::string_view text);
  void appendSignature(std::string_view signature);
  // Replaces a length that was appended as 0.
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
