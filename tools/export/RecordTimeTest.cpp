#include "tools/export/RecordTime.h"

#include <limits>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

TEST(RecordTimeTest, NumbersHaveNoExponentAndReadBackTheSame) {
  EXPECT_EQ(timeNumber(1'700'000'000), "1700000000");
  EXPECT_EQ(timeNumber(1795374997.0606802), "1795374997.0606802");
  EXPECT_EQ(timeNumber(0), "0");
  EXPECT_EQ(timeNumber(-0.5), "-0.5");
  EXPECT_EQ(std::stod(timeNumber(1e-300)), 1e-300);
  EXPECT_EQ(timeNumber(1e300), "1e+300");
}

TEST(RecordTimeTest, DatesAreInUtcAndRoundedDown) {
  EXPECT_EQ(utcTime(1'700'000'000.9999), "2023-11-14T22:13:20.999Z");
  EXPECT_EQ(utcTime(-0.25), "1969-12-31T23:59:59.750Z");
  EXPECT_EQ(utcTime(1e300), "");
  EXPECT_EQ(utcTime(std::numeric_limits<double>::quiet_NaN()), "");
}

}  // namespace
}  // namespace halvox::tools
