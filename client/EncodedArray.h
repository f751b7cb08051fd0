#pragma once

#include <cstddef>
#include <span>
#include <string_view>

#include "client/ByteBuffer.h"
#include "client/WireValue.h"

namespace halvox::client {

class EncodedDictionary;

// A list of values in their encoding on the wire. Belongs to the program. Several threads may read
// an array at the same time. While one thread changes it, no other thread may use it.
//
// The padding between elements depends on where the first element is in its message: at a multiple
// of 8, or 4 bytes after one. The array keeps its elements in both forms. A message copies the form
// that fits, without decoding it.
class EncodedArray {
 public:
  EncodedArray();
  EncodedArray(const EncodedArray&) = delete;
  EncodedArray& operator=(const EncodedArray&) = delete;

  [[nodiscard]] std::size_t size() const { return size_; }

  // These functions append a copy of one value. If they throw std::bad_alloc, the array is
  // unchanged. If a text is not UTF-8 or contains a NUL, append() returns false and changes
  // nothing.
  template <platform::ArithmeticNumber Number>
  void append(Number number) {
    appendVariant(wireNumber(number));
  }
  void append(platform::Date date) { appendVariant(date); }
  void append(std::span<const std::byte> bytes) { appendVariant(WireData{bytes}); }
  void append(const EncodedArray& array);
  void append(const EncodedDictionary& dictionary);
  [[nodiscard]] bool append(std::string_view text);
  [[nodiscard]] bool append(const char* text) { return append(std::string_view(text)); }

  // Returns the elements; valid until this array is changed.
  [[nodiscard]] WireArray wireForm() const {
    return {atEight_.bytes(), atFour_.bytes().subspan(kFour), levels_};
  }

 private:
  // How many bytes there are before the first element in `atFour_`.
  static constexpr std::size_t kFour = 4;

  void reserve(std::size_t room);
  template <typename WireForm>
  void appendVariant(const WireForm& value);

  std::size_t size_ = 0;
  unsigned levels_ = 0;
  ByteBuffer<128> atEight_;
  ByteBuffer<128> atFour_;  // begins with kFour bytes that belong to no element
};

}  // namespace halvox::client
