#pragma once

#include <cstddef>
#include <cstring>
#include <memory>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform::linux_ {

// A text that grows by parts and by values. Writes values as compact JSON, in the form that
// PayloadEncoder documents. RapidJSON's writer is slower: it writes texts character by character,
// and updates its account of commas and nesting for each value.
//
// Belongs to one thread. Cannot fail.
class JsonText {
 public:
  [[nodiscard]] std::string_view view() const { return {memory_.get(), size_}; }
  [[nodiscard]] std::size_t size() const { return size_; }
  [[nodiscard]] std::size_t capacity() const { return capacity_; }

  // Removes everything after the first `size` bytes.
  void truncate(std::size_t size) { size_ = size; }
  // Frees the memory.
  void free() {
    memory_.reset();
    size_ = capacity_ = 0;
  }

  // Appends a part of another text, as it is.
  void appendPart(std::string_view part) {
    char* const out = reserve(part.size());
    std::memcpy(out, part.data(), part.size());
    size_ += part.size();
  }
  void append(char character) {
    *reserve(1) = character;
    ++size_;
  }
  // Appends a text in quotes, with escapes where JSON needs them.
  void append(std::string_view text);
  void append(const Value& value);
  void append(const Dictionary& dictionary);

 private:
  // Makes room for that many bytes and returns where they begin.
  [[nodiscard]] char* reserve(std::size_t bytes) {
    if (capacity_ - size_ < bytes) grow(bytes);
    return memory_.get() + size_;
  }
  void grow(std::size_t bytes);
  void append(const Array& array);
  void appendNumber(const Value& value);
  void appendDate(Date date);
  void appendBase64(const Data& data);
  void appendUnusual(std::string_view text);
  template <typename Real>
  void appendReal(Real number);
  template <typename Number>
  void appendDecimal(Number number);

  std::unique_ptr<char[]> memory_;
  std::size_t size_ = 0;
  std::size_t capacity_ = 0;
};

}  // namespace halvox::platform::linux_
