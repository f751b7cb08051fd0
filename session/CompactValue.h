#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

#include "platform/value.h"

// How a history writes values: each as its difference from the value that the same key had before.
// Most values of a message repeat or grow a little. Most differences therefore take one to three
// bytes.
//
// Only this process reads the bytes. It does not trust them, because they may have been on a disk
// meanwhile. A value is read as it was written, down to the type of its numbers.
namespace halvox {

// True if a history need not write `value` again after `previous`: both have the same type and the
// same text form. May be false for equal arrays and dictionaries.
[[nodiscard]] inline bool isRepetition(const platform::Value& previous,
                                       const platform::Value& value) {
  return previous.isIdenticalTo(value) ||
         (value.isString() && previous.isString() && previous.string() == value.string());
}

// Appends values to a list of bytes. Owns nothing; belongs to one thread.
class CompactWriter {
 public:
  explicit CompactWriter(std::vector<std::byte>& bytes) : bytes_(bytes) {}

  // Writes seven bits into each byte, the lowest bits first. A number below 128 takes one byte.
  void append(std::uint64_t number);
  void append(std::string_view text);
  void append(const platform::Value& previous, const platform::Value& value);
  // Entries with their keys.
  void append(const platform::Dictionary& dictionary);

 private:
  void appendByte(std::uint64_t byte) { bytes_.push_back(static_cast<std::byte>(byte)); }
  void appendNumber(const platform::Value& previous, const platform::Value& value);
  void appendBits(std::uint64_t tag, std::uint64_t difference);
  void appendArray(const platform::Array& array);

  std::vector<std::byte>& bytes_;
};

// Reads what a CompactWriter wrote, in the same order. Bytes that no CompactWriter writes are
// damage: after them isIntact() is false, and everything that is read is zero or empty. The bytes
// must outlive the reader. Belongs to one thread.
class CompactReader {
 public:
  explicit CompactReader(std::span<const std::byte> bytes) : bytes_(bytes) {}

  [[nodiscard]] bool isIntact() const { return isIntact_; }
  [[nodiscard]] bool isAtEnd() const { return position_ == bytes_.size(); }
  [[nodiscard]] std::size_t position() const { return position_; }
  std::uint64_t number();
  // Reads the number of items that follow. Every item takes at least one byte. If the number is
  // larger than the number of remaining bytes, the bytes are damaged and the result is 0. The
  // caller may therefore reserve memory for the items.
  std::size_t count();
  // The results of bytes() and text() are valid as long as the bytes that this object reads.
  std::span<const std::byte> bytes(std::size_t length);
  std::string_view text();
  platform::Value value(const platform::Value& previous);
  // Entries with their keys.
  platform::Dictionary dictionary();
  // Marks the bytes as damaged: isIntact() is false from now on. For a caller that finds a value
  // that cannot be right.
  void giveUp();

 private:
  std::uint8_t byte() {
    if (position_ < bytes_.size()) return static_cast<std::uint8_t>(bytes_[position_++]);
    giveUp();
    return 0;
  }
  std::uint64_t bits(unsigned leftOut, bool isShiftedUp);
  platform::Array array();

  std::span<const std::byte> bytes_;
  std::size_t position_ = 0;
  unsigned depth_ = 0;  // of the container that is read
  bool isIntact_ = true;
};

}  // namespace halvox
