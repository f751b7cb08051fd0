#include "platform/linux/store/blocks/BlockKeys.h"

#include <algorithm>

namespace halvox::platform::linux_ {
namespace {

// FNV-1a with a last step that mixes the upper bits into the lower ones. std::hash cannot be used,
// because other builds must find the same keys.
class Hash {
 public:
  explicit Hash(BlockKeyKind kind) { add(static_cast<std::uint8_t>(kind)); }
  void add(std::uint8_t byte) { state_ = (state_ ^ byte) * 0x100000001B3ULL; }
  [[nodiscard]] BlockKey key() const {
    const std::uint64_t mixed = (state_ ^ state_ >> 33U) * 0xFF51AFD7ED558CCDULL;
    return static_cast<BlockKey>(mixed >> 48U);
  }

 private:
  std::uint64_t state_ = 0xCBF29CE484222325ULL;
};

BlockKey keyAt(std::string_view keys, std::size_t index) {
  const auto low = static_cast<std::uint8_t>(keys[2 * index]);
  const auto high = static_cast<std::uint8_t>(keys[2 * index + 1]);
  return static_cast<BlockKey>(low | high << 8U);
}

}  // namespace

BlockKey blockKey(BlockKeyKind kind, std::string_view text) {
  Hash hash(kind);
  for (const char byte : text) hash.add(static_cast<std::uint8_t>(byte));
  return hash.key();
}

BlockKey sessionKey(std::int64_t sessionID) {
  Hash hash(BlockKeyKind::kSession);
  for (unsigned shift = 0; shift < 64; shift += 8) {
    hash.add(static_cast<std::uint8_t>(static_cast<std::uint64_t>(sessionID) >> shift));
  }
  return hash.key();
}

std::string_view BlockKeys::bytes() {
  std::sort(keys_.begin(), keys_.end());
  keys_.erase(std::unique(keys_.begin(), keys_.end()), keys_.end());
  bytes_.clear();
  for (const BlockKey key : keys_) {
    bytes_.push_back(static_cast<char>(key & 0xFFU));
    bytes_.push_back(static_cast<char>(key >> 8U));
  }
  return bytes_;
}

bool mayHave(std::string_view keys, BlockKey key) {
  if (keys.empty() || keys.size() % 2 != 0) return true;
  std::size_t from = 0;
  std::size_t to = keys.size() / 2;
  while (from < to) {
    const std::size_t middle = (from + to) / 2;
    const BlockKey found = keyAt(keys, middle);
    if (found == key) return true;
    if (found < key) {
      from = middle + 1;
    } else {
      to = middle;
    }
  }
  return false;
}

}  // namespace halvox::platform::linux_
