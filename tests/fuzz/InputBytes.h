#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <span>

namespace halvox::fuzzing {

// Gives out the bytes of a run from the front; zeros after their end. Does not own them.
class InputBytes {
 public:
  explicit InputBytes(std::span<const std::uint8_t> bytes) : rest_(bytes) {}

  [[nodiscard]] bool isEmpty() const { return rest_.empty(); }
  std::uint8_t byte() {
    if (rest_.empty()) return 0;
    const std::uint8_t first = rest_.front();
    rest_ = rest_.subspan(1);
    return first;
  }
  // Takes that many bytes, or all if there are fewer.
  std::span<const std::uint8_t> take(std::size_t length) {
    const auto taken = rest_.first(std::min(length, rest_.size()));
    rest_ = rest_.subspan(taken.size());
    return taken;
  }

 private:
  std::span<const std::uint8_t> rest_;
};

}  // namespace halvox::fuzzing
