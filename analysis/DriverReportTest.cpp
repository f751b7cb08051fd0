#include "analysis/DriverReport.h"

#include <limits>
#include <tuple>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox::analysis {
namespace {

using Buckets = std::vector<std::tuple<double, double, std::uint64_t>>;

Buckets bucketsOf(std::string_view text, std::optional<std::string_view>* unit = nullptr) {
  Buckets buckets;
  const auto parsed =
      parseDriverHistogram(text, [&](double lower, double upper, std::uint64_t hits) {
        buckets.emplace_back(lower, upper, hits);
      });
  if (unit != nullptr) *unit = parsed;
  return buckets;
}

TEST(DriverReportTest, AKeyNamesDeviceAndChannel) {
  const auto key =
      parseDriverReportKey("demo-speakers_Speaker_PipeWire_Histogram_busytime", "Histogram");

  ASSERT_TRUE(key.has_value());
  EXPECT_EQ(key->device, "demo-speakers");
  EXPECT_EQ(key->channel, "busytime");
}

TEST(DriverReportTest, AKeyMayHaveNoDriver) {
  const auto key = parseDriverReportKey("Haptics_Stats_Simple_Pulses", "Simple");

  ASSERT_TRUE(key.has_value());
  EXPECT_EQ(key->device, "Haptics");
  EXPECT_TRUE(parseDriverReportKey("Simple_Pulses", "Simple").has_value());
}

TEST(DriverReportTest, OtherKeysAreNotOfAReport) {
  for (const char* key :
       {"HostApplicationDisplayID", "", "_", "a_b", "NotSimple_x", "a_b_c_Histogram_x"}) {
    EXPECT_FALSE(parseDriverReportKey(key, "Simple").has_value()) << key;
  }
}

TEST(DriverReportTest, AHistogramHasBucketsAndAUnit) {
  std::optional<std::string_view> unit;
  const Buckets buckets = bucketsOf(
      "count=11,lower=0,upper=9223372036854775807,min=0,max=50000,unit=us"
      "::0-50:161;50-100:5;50000-9223372036854775807:1",
      &unit);

  EXPECT_EQ(unit, "us");
  EXPECT_THAT(buckets, testing::ElementsAre(
                           std::make_tuple(0, 50, 161), std::make_tuple(50, 100, 5),
                           std::make_tuple(50'000, std::numeric_limits<double>::infinity(), 1)));
}

TEST(DriverReportTest, DamagedHistogramsAreRefused) {
  for (const char* text : {"", "unit=us", "::", "unit=us::", "unit=us::1-2", "unit=us::1-2:x",
                           "unit=us::2-1:1", "unit=us::1-2:-1", "unit=us::1-2:1;",
                           "unit=us::1-2:1x", "::unit=us", "unit=us::99999999999999999999-1:1"}) {
    std::optional<std::string_view> unit;
    bucketsOf(text, &unit);
    EXPECT_FALSE(unit.has_value()) << text;
  }
}

}  // namespace
}  // namespace halvox::analysis
