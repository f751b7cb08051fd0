#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

#include "client/ByteBuffer.h"
#include "client/WireValue.h"

namespace halvox::client {

class EncodedArray;

// A dictionary in its encoding on the wire. It is made for messages that are sent again and again:
// sending copies the bytes, and a new number for a key overwrites the old one in place.
// Belongs to the program. Several threads may read a dictionary at the same time, and sending it
// counts as reading. While one thread changes it, no other thread may use it.
//
//   bytes    │ key, variant │pad│ key, variant │pad│ key, variant │
//             ▲ 0                ▲ entries_[1]      ▲ entries_[2]   ▲ no padding after the last one
//
// Each entry begins at a multiple of 8. An entry can therefore move by a multiple of 8 without a
// change of its padding. Up to 512 bytes and 16 entries need no memory except the object itself.
//
// set() copies the key and the value. If it throws std::bad_alloc, the dictionary is unchanged. An
// existing key keeps its position. A number or a date that replaces one of the same type allocates
// nothing.
class EncodedDictionary {
 public:
  EncodedDictionary() = default;
  EncodedDictionary(const EncodedDictionary&) = delete;
  EncodedDictionary& operator=(const EncodedDictionary&) = delete;

  [[nodiscard]] std::size_t size() const { return entries_.size(); }

  // These functions return false and change nothing if the key or the text is not UTF-8 or contains
  // a NUL.
  template <platform::ArithmeticNumber Number>
  bool set(std::string_view key, Number number) {
    return setNumber(key, wireNumber(number));
  }
  bool set(std::string_view key, platform::Date date);
  bool set(std::string_view key, std::string_view text);
  bool set(std::string_view key, const char* text) { return set(key, std::string_view(text)); }
  bool set(std::string_view key, std::span<const std::byte> bytes);
  // Stores a copy of the inner container, which may be this dictionary.
  bool set(std::string_view key, const EncodedDictionary& dictionary);
  bool set(std::string_view key, const EncodedArray& array);
  // Returns false if there was no such key.
  bool remove(std::string_view key);

  // Returns the entries; valid until this dictionary is changed.
  [[nodiscard]] WireDictionary wireForm() const { return {bytes_.bytes(), levels_}; }
  // Returns the same dictionary as a value; std::nullopt if it is longer or nested deeper than a
  // message can be.
  [[nodiscard]] std::optional<platform::Dictionary> decode() const;

 private:
  static constexpr std::size_t kInlineEntries = 16;
  // Up to this number of entries, comparing all hashes is faster than a table.
  static constexpr std::size_t kMostWithoutTable = 64;

  // The members are not initialized, because a program makes thousands of dictionaries a second and
  // most of them have few entries.
  struct Entry {
    std::uint32_t start;   // in units of 8 bytes
    std::uint32_t hash;    // of the key
    std::uint8_t levels;   // of the value
    std::uint8_t padding;  // the bytes after the entry, up to a multiple of 8
  };
  // The list of entries. A few entries are in the object itself. If there are more, all of them are
  // on the heap.
  class Entries {
   public:
    [[nodiscard]] std::size_t size() const { return size_; }
    Entry& operator[](std::size_t index) { return begin_[index]; }
    const Entry& operator[](std::size_t index) const { return begin_[index]; }
    void reserveOne();
    void append(const Entry& entry) { begin_[size_++] = entry; }
    void removeLast() { --size_; }

   private:
    Entry inline_[kInlineEntries];
    std::vector<Entry> heap_;
    std::size_t size_ = 0;
    std::size_t capacity_ = kInlineEntries;
    Entry* begin_ = inline_;
  };

  bool setNumber(std::string_view key, const WireNumber& number);
  template <typename WireForm>
  bool setVariant(std::string_view key, const WireForm& value);
  template <typename WireForm>
  void append(std::string_view key, std::uint32_t hash, const WireForm& value);
  void reserve(std::size_t room);
  void reserveEntry();
  void moveLastTo(std::size_t index, std::size_t sizeBefore);
  void countLevels();
  [[nodiscard]] std::size_t find(std::string_view key, std::uint32_t hash) const;
  [[nodiscard]] std::size_t findSeen(std::string_view key, std::uint32_t hash) const;
  [[nodiscard]] bool hasKey(const Entry& entry, std::string_view key) const;
  [[nodiscard]] char* startOf(std::size_t index) {
    return bytes_.data() + std::size_t{entries_[index].start} * 8;
  }
  [[nodiscard]] char* variantOf(std::size_t index, std::string_view key);
  static std::uint64_t seenBit(std::uint32_t hash) { return std::uint64_t{1} << (hash % 64); }
  void fillTable();
  void addToTable(std::size_t index);

  ByteBuffer<512> bytes_;
  Entries entries_;
  unsigned levels_ = 0;  // of the deepest value
  // Bit n is set if a key whose hash is n modulo 64 was ever stored. For most new keys the bit is
  // not set, and they need no comparison.
  std::uint64_t seen_ = 0;
  // Used only by a large dictionary. Has the index of each entry plus 1, at a place that the
  // entry's hash chooses; 0 if the place is free. The size is a power of two.
  std::vector<std::uint32_t> table_;
};

}  // namespace halvox::client
