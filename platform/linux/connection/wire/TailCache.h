#pragma once

#include <array>
#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value.h"

namespace halvox::platform::linux_::dbus {

// The arguments after the first one, of some recent messages.
//
// The messages of a session name the same category, type and reporter IDs most of the time. Equal
// bytes decode to equal values. Values are immutable, and those of the earlier message can
// therefore be used again. This saves two allocations a message, for the lists of reporter IDs.
// Belongs to one thread. Owned by the caller of the decoder.
class TailCache {
 public:
  // Longer arguments are not stored.
  static constexpr std::size_t kMostBytes = 64;

  // The encoded arguments. Two equal sources decode to equal values.
  struct Source {
    std::string_view types;
    std::string_view bytes;  // up to the end of the message
    std::size_t position;    // of the first byte in the message: alignment depends on it
    bool bigEndian;
  };

  // Returns the values of an equal source, or null. They are valid until the next call of note().
  [[nodiscard]] const std::vector<Value>* find(const Source& source) const;
  // Stores the values that were decoded from `source`.
  void note(const Source& source, const Value* begin, const Value* end);

 private:
  struct Slot {
    std::string types;
    std::string bytes;
    std::size_t alignment = 0;
    bool bigEndian = false;
    std::vector<Value> values;
  };

  static constexpr std::size_t kSlots = 16;

  [[nodiscard]] static std::size_t indexOf(std::string_view bytes);

  std::array<Slot, kSlots> slots_;
};

}  // namespace halvox::platform::linux_::dbus
