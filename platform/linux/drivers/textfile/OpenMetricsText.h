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
  kOther,  // valid, but cannot become a driver channel
};

// A number as it was written. An integer of 64 bits keeps all its digits, which a double would lose
// above 2^53.
struct MetricNumber {
  double value = 0;
  std::optional<std::int64_t> whole{};

  // Returns std::nullopt if the text is not a number.
  [[nodiscard]] static std::optional<MetricNumber> parse(std::string_view text);
  // Returns the number rounded down to an integer; std::nullopt for NaN, or if 64 bits cannot hold
  // it.
  [[nodiscard]] std::optional<std::int64_t> cutDown() const;
};

struct MetricLabel {
  std::string name;
  std::string value;
  friend bool operator==(const MetricLabel&, const MetricLabel&) = default;
  // NOLINTNEXTLINE(modernize-use-nullptr): the compiler generates the operator
  friend auto operator<=>(const MetricLabel&, const MetricLabel&) = default;
};
using MetricLabels = std::vector<MetricLabel>;  // sorted by name

// One line with a value.
struct MetricSample {
  std::string suffix;  // the part of the sample's name after the family's, such as "_total"
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

// The error in a text, and its line.
struct MetricError {
  std::size_t line = 0;
  std::string what{};
};

// Parses metrics in the OpenMetrics text format, or in the older format of exporters' text files,
// which has no "# EOF".
//
// Any program may write these files, and their content is not trusted. Whatever the format does not
// allow is an error, and all sizes are bounded. The bounds are far above real files. They keep one
// file from using up the service's memory or the 50 ms that a reading may take. Pure functions; any
// thread may call them.
class OpenMetricsText {
 public:
  static constexpr std::size_t kLargestText = 1U << 20U;
  static constexpr std::size_t kLongestLine = 8192;
  static constexpr std::size_t kMostLabels = 32;
  static constexpr std::size_t kMostSamples = 20'000;

  using Families = std::vector<MetricFamily>;

  // The families in the order in which they begin, or the first error.
  [[nodiscard]] static std::variant<Families, MetricError> parse(std::string_view text);
};

}  // namespace halvox::platform::linux_
