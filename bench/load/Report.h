#pragma once

#include <optional>
#include <string>
#include <vector>

namespace halvox::bench {

// One measured quantity of the service and, where it makes sense, that of the echo in the same run.
struct Measurement {
  std::string name;
  std::string unit;
  double value = 0;
  std::optional<double> echo;
  // The bounds of the ratio (with an echo) or of the value (without).
  std::optional<double> atMost;
  std::optional<double> atLeast;

  // value / echo, or the value itself.
  [[nodiscard]] double compared() const;
  // True if the bounds are met; also true without bounds.
  [[nodiscard]] bool holds() const;
};

// Formats the measurements as a table for people, and as JSON.
std::string formatTable(const std::vector<Measurement>& measurements);
std::string formatJson(const std::vector<Measurement>& measurements);

// The value at that rank of the sorted values; 0 without values.
double median(std::vector<double> values);
double percentile(std::vector<double> values, double percent);

}  // namespace halvox::bench
