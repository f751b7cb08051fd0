#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace halvox::analysis {

// Counts names over time in equal steps. The whole time need not be known before: when it does not
// fit any more, neighbouring steps are joined, for all names alike. Memory is bounded. Belongs to
// one thread.
class NameCounts {
 public:
  static constexpr std::size_t kSteps = 256;
  // Further names are counted together, without a name: clients choose names.
  static constexpr std::size_t kMostNames = 256;

  struct Series {
    std::string name;
    std::uint64_t count = 0;
    double first = 0;  // seconds since 1970
    double last = 0;
    std::array<std::uint32_t, kSteps> steps{};
  };

  // Times are seconds since 1970, in any order.
  void add(std::string_view name, double time);

  // When the first step begins, in seconds since 1970, and how long each is, in seconds.
  [[nodiscard]] double from() const { return static_cast<double>(origin_) * step_; }
  [[nodiscard]] double step() const { return step_; }
  // In the order of falling counts.
  [[nodiscard]] std::vector<const Series*> series() const;
  // Events of names beyond kMostNames.
  [[nodiscard]] std::uint64_t otherNames() const { return otherNames_; }

 private:
  struct Hash {
    using is_transparent = void;
    std::size_t operator()(std::string_view text) const {
      return std::hash<std::string_view>()(text);
    }
  };

  [[nodiscard]] Series* find(std::string_view name, double time);
  [[nodiscard]] std::size_t stepOf(double time);
  void joinSteps();
  void moveOrigin(std::int64_t origin);

  // In half a second an xrun is still recognised; a day needs 8 minutes.
  double step_ = 0.5;
  // The number of the first step, counted from 1970. Steps of all lengths begin at multiples of
  // their length, so that two neighbours join into one of the next length.
  std::int64_t origin_ = 0;
  std::int64_t end_ = 0;  // after the last step that is used
  bool isEmpty_ = true;
  std::unordered_map<std::string, Series, Hash, std::equal_to<>> names_;
  std::uint64_t otherNames_ = 0;
};

}  // namespace halvox::analysis
