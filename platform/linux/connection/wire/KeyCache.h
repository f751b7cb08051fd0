#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform::linux_::dbus {

// The recent keys of entries of a{sv} dictionaries, each with the type of its last value.
//
// Messages of a client have the same keys again and again. An entry whose first bytes are known
// needs no check of its text, no look-up in the table of interned keys and no check of its
// variant's signature: these are half of the work for a message without the cache.
//
// A key has one slot, which depends on its text only. The cache can therefore tell whether a
// dictionary has a key twice. Keeps interned keys only, because they live as long as the process.
// Belongs to one thread. Owned by the caller of the decoder.
class KeyCache {
 public:
  // The front of an entry: the key and the signature of its value.
  struct Head {
    const Key* key = nullptr;  // null if the head is not known
    std::size_t bytes = 0;     // its length on the wire; the last but one is the type
    bool isRepeated = false;   // the dictionary had this key before
  };

  // Begins a dictionary. Only one can be decoded at a time.
  void beginDictionary() { ++dictionary_; }
  // Looks for the head at the front of `bytes`, which are in the byte order of this machine and
  // begin at a multiple of 8 bytes of the message.
  [[nodiscard]] Head find(std::string_view bytes);
  // Keeps the head at the front of `bytes`, which was decoded without an error to `key`. Ignores it
  // unless the key is interned and the value has a type of one character.
  void note(std::string_view bytes, const Key& key);

 private:
  struct Slot {
    std::optional<Key> key;
    std::string_view text;  // of the key
    std::uint32_t tail = 0;
    std::uint32_t dictionary = 0;  // the last one that had the key
  };

  // More than a busy client's vocabulary; 12 KiB.
  static constexpr std::size_t kSlots = 256;

  [[nodiscard]] Slot& slotOf(std::string_view text);

  std::array<Slot, kSlots> slots_;
  std::uint32_t dictionary_ = 0;
};

}  // namespace halvox::platform::linux_::dbus
