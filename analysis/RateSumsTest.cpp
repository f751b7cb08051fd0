#include "analysis/RateSums.h"

#include <cmath>

#include <gtest/gtest.h>

namespace halvox::analysis {
namespace {

TEST(RateSumsTest, ARateIsTheCountsOverTheHours) {
  RateSums sums;
  sums.add(1, 2);
  sums.add(3, 4);

  EXPECT_EQ(sums.groups(), 2U);
  EXPECT_EQ(sums.perHour(), 1.5);
}

TEST(RateSumsTest, WithoutHoursThereIsNoRate) {
  RateSums sums;
  sums.add(0, 3);

  EXPECT_EQ(sums.groups(), 1U);
  EXPECT_EQ(sums.perHour(), std::nullopt);
  EXPECT_EQ(sums.logVariance(), std::nullopt);
}

TEST(RateSumsTest, AGroupWithNothingIsNoGroup) {
  RateSums sums;
  sums.add(0, 0);

  EXPECT_EQ(sums.groups(), 0U);
}

TEST(RateSumsTest, EqualGroupsVaryByNothing) {
  RateSums sums;
  for (int group = 0; group < 5; ++group) sums.add(2, 6);

  ASSERT_TRUE(sums.logVariance());
  EXPECT_NEAR(*sums.logVariance(), 0, 1e-12);
}

// The rate is 4 an hour; the groups are 4 below, 0 and 4 above it: 3/2 * 32 / 12².
TEST(RateSumsTest, DifferencesBetweenGroupsAreTheUncertainty) {
  RateSums sums;
  sums.add(1, 0);
  sums.add(1, 4);
  sums.add(1, 8);

  ASSERT_TRUE(sums.logVariance());
  EXPECT_NEAR(*sums.logVariance(), 1.5 * 32 / 144, 1e-12);
}

TEST(RateSumsTest, TwoGroupsAreTooFew) {
  RateSums sums;
  sums.add(1, 4);
  sums.add(1, 8);

  EXPECT_EQ(sums.logVariance(), std::nullopt);
}

}  // namespace
}  // namespace halvox::analysis
