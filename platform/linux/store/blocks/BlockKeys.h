#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace halvox::platform::linux_ {

// What a reader may look for in a block. Stored in databases: never change a number.
enum class BlockKeyKind : std::uint8_t {
  kSession = 1,      // of a link message
  kApplication = 2,  // of an event, or the client of a link message
  kName = 3,         // of an event, or the service of a link message
};

// 16 bits of a hash. A reader that looks for a key that a block of 300 keys lacks seems to find it
// in 1 of 200 cases, and then reads the block in vain.
using BlockKey = std::uint16_t;
[[nodiscard]] BlockKey blockKey(BlockKeyKind kind, std::string_view text);
[[nodiscard]] BlockKey sessionKey(std::int64_t sessionID);

// The keys of one block. A reader that looks for one session or application unpacks only the blocks
// that have its key. A block's row of `message_spans` has them in `keys`, two bytes each with the
// lower one first, in ascending order.
// A plain value.
class BlockKeys {
 public:
  void add(BlockKey key) { keys_.push_back(key); }
  void clear() { keys_.clear(); }
  // Returns the bytes to store, valid until any other call.
  [[nodiscard]] std::string_view bytes();

 private:
  std::vector<BlockKey> keys_;
  std::string bytes_;
};

// Returns true if stored keys may include `key`: always when they are the key's, and also when the
// bytes are damaged.
[[nodiscard]] bool mayHave(std::string_view keys, BlockKey key);

}  // namespace halvox::platform::linux_
