#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace halvox::platform::linux_ {

// What a reader may look for in a block. Never change a number, because databases store keys that
// depend on it.
enum class BlockKeyKind : std::uint8_t {
  kSession = 1,      // of a link message
  kApplication = 2,  // of an event, or the client of a link message
  kName = 3,         // of an event, or the service of a link message
};

// 16 bits of a hash. In 1 of 200 cases a block of 300 keys seems to have a key that it lacks. The
// reader then reads the block in vain.
using BlockKey = std::uint16_t;
[[nodiscard]] BlockKey blockKey(BlockKeyKind kind, std::string_view text);
[[nodiscard]] BlockKey sessionKey(std::int64_t sessionID);

// The keys of one block. A reader that looks for one session, application or name unpacks only the
// blocks that have its key. The column `keys` of a block's row in `message_spans` has the keys in
// ascending order, two bytes each with the lower byte first.
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

// Returns true if the stored `keys` include `key`, and also if `keys` is empty or damaged, because
// the block may then have the key.
[[nodiscard]] bool mayHave(std::string_view keys, BlockKey key);

}  // namespace halvox::platform::linux_
