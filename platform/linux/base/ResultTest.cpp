#include "platform/linux/base/Result.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

enum class Code : std::uint8_t { kMissing, kRefused };

Result<int, Code> half(int number) {
  if (number % 2 != 0) return Failure<Code>{Code::kRefused, "an odd number"};
  return number / 2;
}

Result<std::optional<std::string>> find(bool exists) {
  if (!exists) return std::nullopt;
  return "text";
}

TEST(ResultTest, HoldsAValueOrAnError) {
  const Result<int, Code> good = half(4);
  const Result<int, Code> bad = half(3);

  ASSERT_TRUE(good);
  EXPECT_EQ(*good, 2);
  ASSERT_FALSE(bad);
  EXPECT_EQ(bad.error().code, Code::kRefused);
  EXPECT_EQ(bad.error().message, "an odd number");
}

TEST(ResultTest, WhatConvertsToTheValueIsReturnedAsItIs) {
  const auto none = find(false);
  const auto some = find(true);

  ASSERT_TRUE(none);
  EXPECT_FALSE(none->has_value());
  ASSERT_TRUE(some);
  EXPECT_EQ(**some, "text");
}

TEST(ResultTest, GivesAwayWhatCannotBeCopied) {
  Result<std::unique_ptr<int>> result(std::make_unique<int>(7));

  const std::unique_ptr<int> taken = *std::move(result);

  ASSERT_NE(taken, nullptr);
  EXPECT_EQ(*taken, 7);
}

TEST(ResultTest, ErrorPassesOnToAResultOfAnotherType) {
  const auto outer = [](int number) -> Result<std::string, Code> {
    auto inner = half(number);
    if (!inner) return std::move(inner).error();
    return std::to_string(*inner);
  };

  EXPECT_EQ(*outer(8), "4");
  EXPECT_EQ(outer(7).error().message, "an odd number");
}

Result<void, Code> check(int number) {
  if (number < 0) return Failure<Code>{Code::kRefused, "negative"};
  return {};
}

TEST(ResultTest, SuccessMayHaveNoValue) {
  EXPECT_TRUE(check(1));
  ASSERT_FALSE(check(-1));
  EXPECT_EQ(check(-1).error().code, Code::kRefused);
  EXPECT_EQ(check(-1).error().message, "negative");
}

TEST(ResultDeathTest, TakingWhatIsNotThereEndsTheProcess) {
  const Result<int, Code> good = half(4);
  const Result<int, Code> bad = half(3);

  EXPECT_DEATH(static_cast<void>(*bad), "");
  EXPECT_DEATH(static_cast<void>(good.error()), "");
  EXPECT_DEATH(static_cast<void>(check(1).error()), "");
}

}  // namespace
}  // namespace halvox::platform::linux_
