#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>

namespace halvox::tools {

// What happened in the last minute, counted by seconds. Takes no memory until something happened,
// because most streams never have an xrun. Times are seconds since 1970; what is older than a
// minute, or more than a second in the future, is not counted.
class MinuteCount {
 public:
  struct Total {
    std::uint64_t events = 0;
    double amount = 0;
  };

  void add(double time, std::uint64_t events, double amount);
  [[nodiscard]] Total total(double now) const;

 private:
  static constexpr std::size_t kSeconds = 60;
  struct Second {
    std::int64_t second = 0;
    Total total{};
  };
  std::unique_ptr<std::array<Second, kSeconds>> seconds_;
};

}  // namespace halvox::tools
