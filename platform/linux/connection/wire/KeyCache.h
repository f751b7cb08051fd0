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
// Messages of a client have the same keys again and again. If the cache knows the first bytes of an
// entry, the decoder need not check the key's text, look the key up in the table of interned keys
// or check the variant's signature. Without the cache, these steps are half of the work for a
// message.
//
// A key can be in only one of two slots, which its text chooses. The slot remembers the last
// dictionary that had the key, and thereby shows whether a dictionary has the key twice. With a
// single slot for each text, two of the ten keys of an ordinary message had the same one, and were
// looked up anew in each message: a tenth of the work of decoding it. The cache stores only
// interned keys, because their texts live as long as the process. Belongs to one thread. Owned by
// the caller of the decoder.
class KeyCache {
 public:
  // The head of an entry: its first bytes, with the key and the signature of the value.
  struct Head {
    const Key* key = nullptr;  // null if the head is not known
    std::size_t bytes = 0;     // the head's length; its last byte but one is the type
    bool isRepeated = false;   // the dictionary had this key before
  };

  // Begins a dictionary. Only one dictionary at a time can use the cache.
  void beginDictionary() { ++dictionary_; }
  // Looks for the head at the start of `bytes`. The bytes must be in the byte order of this machine
  // and begin at a multiple of 8 in the message.
  [[nodiscard]] Head find(std::string_view bytes);
  // Stores the head at the start of `bytes`, from which `key` was decoded without an error. Ignores
  // the head unless the key is interned and the type of the value is a basic one.
  void note(std::string_view bytes, const Key& key);

 private:
  struct Slot {
    std::optional<Key> key;
    std::string_view text;  // of the key
    std::uint32_t tail = 0;
    std::uint32_t dictionary = 0;  // the last one that had the key
  };

  // More slots than a busy client has keys. The slots take 24 KiB.
  static constexpr std::size_t kSlots = 512;

  [[nodiscard]] Slot& slotOf(std::string_view text);

  std::array<Slot, kSlots> slots_;
  std::uint32_t dictionary_ = 0;
};

}  // namespace halvox::platform::linux_::dbus
