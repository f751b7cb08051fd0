#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace halvox::platform::linux_ {

enum class MetricType : std::uint8_t {
  kUnknown,
  kCounter,
  kGauge,
  kHistogram,
  kStateset,
  kOther,  // valid, but nothing that a driver channel could be made of
};

// A number as it was written. Whole numbers of 64 bits keep all their digits.
struct MetricNumber {
  double value = 0;
  std::optional<std::int64_t> whole{};

  // None when the text is no number.
  [[nodiscard]] static std::optional<MetricNumber> parse(std::string_view text);
  // The number, cut down to a whole one; none when 64 bits cannot hold it.
  [[nodiscard]] std::optional<std::int64_t> cutDown() const;
};

struct MetricLabel {
  std::string name;
  std::string value;
  friend bool operator==(const MetricLabel&, const MetricLabel&) = default;
  // NOLINTNEXTLINE(modernize-use-nullptr): what the compiler makes of the operator
  friend auto operator<=>(const MetricLabel&, const MetricLabel&) = default;
};
using MetricLabels = std::vector<MetricLabel>;  // in the order of their names

// One line with a value.
struct MetricSample {
  std::string suffix;  // what the sample's name has behind that of its family: "_total"
  MetricLabels labels;
  MetricNumber number;
  std::size_t line = 0;
};

// All samples of one metric.
struct MetricFamily {
  std::string name;
  MetricType type = MetricType::kUnknown;
  std::string unit{};
  std::vector<MetricSample> samples{};
};

// What is wrong with a text, and in which line.
struct MetricError {
  std::size_t line = 0;
  std::string what{};
};

// Metrics as text, in the form of OpenMetrics or in the older one of the text files that exporters
// collect, which has no "# EOF". The text comes from anybody: whatever is not as it should be is an
// error, and all sizes have a bound.
class OpenMetricsText {
 public:
  static constexpr std::size_t kLargestText = 1U << 20U;
  static constexpr std::size_t kLongestLine = 8192;
  static constexpr std::size_t kMostLabels = 32;
  static constexpr std::size_t kMostSamples = 20'000;

  using Families = std::vector<MetricFamily>;

  // The families in the order in which they begin.
  [[nodiscard]] static std::variant<Families, MetricError> parse(std::string_view text);
};

}  // namespace halvox::platform::linux_
