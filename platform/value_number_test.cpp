#include <cmath>
#include <cstdint>
#include <limits>
#include <random>
#include <vector>

#include <gtest/gtest.h>

#include "platform/value.h"

namespace halvox::platform {
namespace {

template <typename Number>
using Limits = std::numeric_limits<Number>;

constexpr std::int64_t kTwoTo53 = std::int64_t{1} << 53;
constexpr double kTwoTo63 = 9223372036854775808.0;
constexpr double kTwoTo64 = 18446744073709551616.0;

// Values of all number kinds that hold that small number.
std::vector<Value> inAllKinds(std::uint8_t number) {
  return {Value(number),
          Value(static_cast<std::int8_t>(number)),
          Value(static_cast<std::int16_t>(number)),
          Value(static_cast<std::uint16_t>(number)),
          Value(static_cast<std::int32_t>(number)),
          Value(static_cast<std::uint32_t>(number)),
          Value(static_cast<std::int64_t>(number)),
          Value(static_cast<std::uint64_t>(number)),
          Value(static_cast<float>(number)),
          Value(static_cast<double>(number))};
}

TEST(ValueNumberTest, RemembersItsKind) {
  EXPECT_EQ(Value(true).numberKind(), NumberKind::kBool);
  EXPECT_EQ(Value(std::uint8_t{1}).numberKind(), NumberKind::kUInt8);
  EXPECT_EQ(Value(std::int8_t{1}).numberKind(), NumberKind::kInt16);
  EXPECT_EQ(Value(std::int16_t{1}).numberKind(), NumberKind::kInt16);
  EXPECT_EQ(Value(std::uint16_t{1}).numberKind(), NumberKind::kUInt16);
  EXPECT_EQ(Value(std::int32_t{1}).numberKind(), NumberKind::kInt32);
  EXPECT_EQ(Value(std::uint32_t{1}).numberKind(), NumberKind::kUInt32);
  EXPECT_EQ(Value(std::int64_t{1}).numberKind(), NumberKind::kInt64);
  EXPECT_EQ(Value(std::uint64_t{1}).numberKind(), NumberKind::kUInt64);
  EXPECT_EQ(Value(1.0F).numberKind(), NumberKind::kFloat);
  EXPECT_EQ(Value(1.0).numberKind(), NumberKind::kDouble);
  EXPECT_EQ(Value(1LL).numberKind(), NumberKind::kInt64);
  EXPECT_EQ(Value(1ULL).numberKind(), NumberKind::kUInt64);
}

TEST(ValueNumberTest, ASmallNumberIsEqualInAllKinds) {
  for (const std::uint8_t number : {std::uint8_t{0}, std::uint8_t{1}, std::uint8_t{100}}) {
    for (const Value& left : inAllKinds(number)) {
      for (const Value& right : inAllKinds(number)) EXPECT_EQ(left, right);
      for (const Value& right : inAllKinds(number + 1)) EXPECT_NE(left, right);
    }
  }
}

TEST(ValueNumberTest, TrueIsOneAndFalseIsZero) {
  EXPECT_EQ(Value(true), Value(1));
  EXPECT_EQ(Value(true), Value(1.0));
  EXPECT_EQ(Value(false), Value(0));
  EXPECT_EQ(Value(false), Value(-0.0));
  EXPECT_NE(Value(true), Value(2));
}

TEST(ValueNumberTest, NegativeNumbersEqualNoUnsignedOne) {
  EXPECT_NE(Value(std::int64_t{-1}), Value(Limits<std::uint64_t>::max()));
  EXPECT_NE(Value(-1), Value(Limits<std::uint32_t>::max()));
  EXPECT_NE(Value(Limits<std::int64_t>::min()), Value(std::uint64_t{1} << 63U));
  EXPECT_EQ(Value(Limits<std::int64_t>::max()),
            Value(static_cast<std::uint64_t>(Limits<std::int64_t>::max())));
  EXPECT_EQ(Value(std::int16_t{-1}), Value(std::int64_t{-1}));
  EXPECT_EQ(Value(std::int64_t{-1}), Value(-1.0));
}

TEST(ValueNumberTest, IntegersThatNoDoubleHoldsEqualNone) {
  const auto rounded = static_cast<double>(kTwoTo53);
  EXPECT_EQ(Value(kTwoTo53), Value(rounded));
  EXPECT_NE(Value(kTwoTo53 + 1), Value(rounded));
  EXPECT_NE(Value(rounded), Value(kTwoTo53 + 1));
  EXPECT_NE(Value(-kTwoTo53 - 1), Value(-rounded));
}

TEST(ValueNumberTest, TheEndsOfTheIntegersAreComparedExactlyWithDoubles) {
  EXPECT_NE(Value(Limits<std::int64_t>::max()), Value(kTwoTo63));
  EXPECT_EQ(Value(std::uint64_t{1} << 63U), Value(kTwoTo63));
  EXPECT_EQ(Value(Limits<std::int64_t>::min()), Value(-kTwoTo63));
  EXPECT_NE(Value(Limits<std::uint64_t>::max()), Value(kTwoTo64));
  EXPECT_NE(Value(Limits<std::uint64_t>::max()), Value(-1.0));
}

TEST(ValueNumberTest, FractionsAndInfinitiesEqualNoInteger) {
  EXPECT_NE(Value(1), Value(1.5));
  EXPECT_NE(Value(1.5F), Value(1U));
  EXPECT_NE(Value(Limits<std::int64_t>::max()), Value(Limits<double>::infinity()));
  EXPECT_NE(Value(Limits<std::int64_t>::min()), Value(-Limits<double>::infinity()));
}

TEST(ValueNumberTest, FloatsCompareAsTheDoublesThatTheyAre) {
  EXPECT_EQ(Value(0.5F), Value(0.5));
  EXPECT_NE(Value(0.1F), Value(0.1));
  EXPECT_EQ(Value(0.1F), Value(static_cast<double>(0.1F)));
}

TEST(ValueNumberTest, EveryNanEqualsEveryNanAndNothingElse) {
  const Value nan(Limits<double>::quiet_NaN());
  EXPECT_EQ(nan, Value(-Limits<double>::quiet_NaN()));
  EXPECT_EQ(nan, Value(Limits<float>::quiet_NaN()));
  EXPECT_NE(nan, Value(0));
  EXPECT_NE(Value(std::uint64_t{0}), nan);
  EXPECT_NE(nan, Value(Limits<double>::infinity()));
}

TEST(ValueNumberTest, ZeroHasNoSign) {
  EXPECT_EQ(Value(-0.0), Value(0.0));
  EXPECT_EQ(Value(-0.0), Value(0));
  EXPECT_EQ(Value(0U), Value(-0.0F));
}

TEST(ValueNumberTest, EqualityIsSymmetricAndTransitive) {
  std::vector<Value> numbers;
  for (const double number : {0.0, -0.0, 1.0, -1.0, 0.5, kTwoTo63, kTwoTo64, -kTwoTo63, 1e300,
                              Limits<double>::infinity(), std::nan("")}) {
    numbers.insert(numbers.end(), {Value(number), Value(static_cast<float>(number)),
                                   Value(Value(number).toInt64()), Value(Value(number).toUInt64()),
                                   Value(Value(number).toBool())});
  }
  for (const Value& a : numbers) {
    for (const Value& b : numbers) {
      EXPECT_EQ(a == b, b == a);
      for (const Value& c : numbers) EXPECT_TRUE(!(a == b && b == c) || a == c);
    }
  }
}

TEST(ValueNumberTest, RandomIntegersEqualTheDoubleThatHoldsThemExactly) {
  std::mt19937_64 random(11);  // the same values in every run
  for (int round = 0; round < 100'000; ++round) {
    const auto number = static_cast<std::int64_t>(random() >> (random() % 64));
    const auto rounded = static_cast<double>(number);
    const bool exact = rounded < kTwoTo63 && static_cast<std::int64_t>(rounded) == number;
    ASSERT_EQ(Value(number) == Value(rounded), exact) << number;
  }
}

TEST(ValueNumberTest, ReadsBackWhatItWasMadeFrom) {
  EXPECT_EQ(Value(Limits<std::int64_t>::min()).toInt64(), Limits<std::int64_t>::min());
  EXPECT_EQ(Value(Limits<std::int64_t>::max()).toInt64(), Limits<std::int64_t>::max());
  EXPECT_EQ(Value(Limits<std::uint64_t>::max()).toUInt64(), Limits<std::uint64_t>::max());
  EXPECT_EQ(Value(Limits<double>::max()).toDouble(), Limits<double>::max());
  EXPECT_EQ(Value(0.1F).toDouble(), static_cast<double>(0.1F));
  EXPECT_TRUE(Value(true).toBool());
  EXPECT_FALSE(Value(false).toBool());
}

TEST(ValueNumberTest, IntegersAreReadWithTheNearestEndOfTheirRange) {
  EXPECT_EQ(Value(Limits<std::uint64_t>::max()).toInt64(), Limits<std::int64_t>::max());
  EXPECT_EQ(Value(-1).toUInt64(), 0U);
  EXPECT_EQ(Value(1e300).toInt64(), Limits<std::int64_t>::max());
  EXPECT_EQ(Value(-1e300).toInt64(), Limits<std::int64_t>::min());
  EXPECT_EQ(Value(kTwoTo63).toInt64(), Limits<std::int64_t>::max());
  EXPECT_EQ(Value(-kTwoTo63).toInt64(), Limits<std::int64_t>::min());
  EXPECT_EQ(Value(kTwoTo64).toUInt64(), Limits<std::uint64_t>::max());
  EXPECT_EQ(Value(kTwoTo63).toUInt64(), std::uint64_t{1} << 63U);
  EXPECT_EQ(Value(-Limits<double>::infinity()).toUInt64(), 0U);
}

TEST(ValueNumberTest, FractionsAreCutOff) {
  EXPECT_EQ(Value(2.9).toInt64(), 2);
  EXPECT_EQ(Value(-2.9).toInt64(), -2);
  EXPECT_EQ(Value(2.9F).toUInt64(), 2U);
  EXPECT_EQ(Value(-0.9).toUInt64(), 0U);
}

TEST(ValueNumberTest, ANanIsReadAsTheIntegerZero) {
  EXPECT_EQ(Value(std::nan("")).toInt64(), 0);
  EXPECT_EQ(Value(std::nan("")).toUInt64(), 0U);
  EXPECT_TRUE(std::isnan(Value(std::nan("")).toDouble()));
}

TEST(ValueNumberTest, EveryNumberButZeroIsReadAsTrue) {
  EXPECT_TRUE(Value(0.5).toBool());
  EXPECT_TRUE(Value(-1).toBool());
  EXPECT_TRUE(Value(std::nan("")).toBool());
  EXPECT_FALSE(Value(-0.0).toBool());
}

}  // namespace
}  // namespace halvox::platform
