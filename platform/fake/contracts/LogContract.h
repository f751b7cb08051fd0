#pragma once

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/log.h"

namespace halvox::platform::contract {

// What every LogService promises.
//
// `Harness` is constructed with the lowest level that is wanted and has
//   LogService& service();
//   std::vector<std::string> lines();  all lines so far in order, without times and names
template <typename Harness>
class LogContract : public ::testing::Test {};
TYPED_TEST_SUITE_P(LogContract);

TYPED_TEST_P(LogContract, SameNamesGiveTheSameCategory) {
  TypeParam harness(LogLevel::kDefault);
  LogService& service = harness.service();

  EXPECT_EQ(&service.createCategory("s", "c"), &service.createCategory("s", "c"));
  EXPECT_NE(&service.createCategory("s", "c"), &service.createCategory("s", "d"));
  EXPECT_NE(&service.createCategory("s", "c"), &service.createCategory("t", "c"));
}

TYPED_TEST_P(LogContract, LevelsFromTheThresholdUpAreEnabled) {
  TypeParam harness(LogLevel::kDefault);
  const LogCategory& category = harness.service().createCategory("s", "c");

  EXPECT_FALSE(category.isEnabled(LogLevel::kDebug));
  EXPECT_FALSE(category.isEnabled(LogLevel::kInfo));
  EXPECT_TRUE(category.isEnabled(LogLevel::kDefault));
  EXPECT_TRUE(category.isEnabled(LogLevel::kError));
}

TYPED_TEST_P(LogContract, LinesComeInTheOrderInWhichTheyWereWritten) {
  TypeParam harness(LogLevel::kDebug);
  LogCategory& first = harness.service().createCategory("s", "c");
  LogCategory& second = harness.service().createCategory("s", "d");

  first.write(LogLevel::kInfo, "one");
  second.write(LogLevel::kError, "two");
  first.write(LogLevel::kDebug, "three");

  EXPECT_EQ(harness.lines(), (std::vector<std::string>{"one", "two", "three"}));
}

REGISTER_TYPED_TEST_SUITE_P(LogContract, SameNamesGiveTheSameCategory,
                            LevelsFromTheThresholdUpAreEnabled,
                            LinesComeInTheOrderInWhichTheyWereWritten);

}  // namespace halvox::platform::contract
