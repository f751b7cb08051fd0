#pragma once

#include <cstdint>
#include <optional>

namespace halvox::analysis {

// A rate with its uncertainty, from sums over groups of events. Events within a group depend on
// each other: a stream that stutters once stutters again. The groups are taken as independent, so
// that the differences between them show how far the rate can be trusted. Belongs to one thread.
class RateSums {
 public:
  // Fewer groups show nothing about their differences.
  static constexpr std::uint64_t kFewestGroups = 3;

  // Adds a group that had `count` in `hours`. A group without hours counts only if it has a count.
  void add(double hours, double count);

  [[nodiscard]] std::uint64_t groups() const { return groups_; }
  [[nodiscard]] double hours() const { return hours_; }
  [[nodiscard]] double count() const { return count_; }
  // Nothing if there were no hours.
  [[nodiscard]] std::optional<double> perHour() const;
  // The variance of the rate's logarithm, from the differences between the groups. Nothing if there
  // are fewer than kFewestGroups of them, or if the rate is 0.
  [[nodiscard]] std::optional<double> logVariance() const;

 private:
  std::uint64_t groups_ = 0;
  double hours_ = 0;
  double count_ = 0;
  double squaredCounts_ = 0;
  double squaredHours_ = 0;
  double products_ = 0;  // of a group's hours and count
};

}  // namespace halvox::analysis
