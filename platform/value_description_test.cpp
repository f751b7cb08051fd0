#include <cstdint>
#include <limits>
#include <string>

#include <gtest/gtest.h>

#include "platform/value.h"

namespace halvox::platform {
namespace {

TEST(DescribeTest, NoValueIsNull) {
  EXPECT_EQ(describe(Value()), "(null)");
  EXPECT_EQ(describe(Message()), "(null)");
}

TEST(DescribeTest, NumbersAreTheirShortestDecimals) {
  EXPECT_EQ(describe(Value(true)), "1");
  EXPECT_EQ(describe(Value(false)), "0");
  EXPECT_EQ(describe(Value(-7)), "-7");
  EXPECT_EQ(describe(Value(std::uint8_t{200})), "200");
  EXPECT_EQ(describe(Value(std::numeric_limits<std::uint64_t>::max())), "18446744073709551615");
  EXPECT_EQ(describe(Value(std::numeric_limits<std::int64_t>::min())), "-9223372036854775808");
  EXPECT_EQ(describe(Value(0.1)), "0.1");
  EXPECT_EQ(describe(Value(0.1F)), "0.1");
  EXPECT_EQ(describe(Value(2.0)), "2");
  EXPECT_EQ(describe(Value(1e300)), "1e+300");
  EXPECT_EQ(describe(Value(std::numeric_limits<double>::infinity())), "inf");
  EXPECT_EQ(describe(Value(std::numeric_limits<double>::quiet_NaN())), "nan");
}

TEST(DescribeTest, StringsStandAsTheyAre) {
  static const StringConstant constant("a described constant");
  EXPECT_EQ(describe(Value("short")), "short");
  EXPECT_EQ(describe(Value("a text that is held on the heap")), "a text that is held on the heap");
  EXPECT_EQ(describe(Value(constant)), "a described constant");
  EXPECT_EQ(describe(Value("")), "");
}

TEST(DescribeTest, DatesAreInUtc) {
  EXPECT_EQ(describe(Value(Date{0})), "1970-01-01 00:00:00 +0000");
  EXPECT_EQ(describe(Value(Date{1'700'000'000.9})), "2023-11-14 22:13:20 +0000");
  EXPECT_EQ(describe(Value(Date{-0.5})), "1969-12-31 23:59:59 +0000");
  EXPECT_EQ(describe(Value(Date{951'782'400})), "2000-02-29 00:00:00 +0000");
  EXPECT_EQ(describe(Value(Date{-62'135'596'800.0})), "0001-01-01 00:00:00 +0000");
  EXPECT_EQ(describe(Value(Date{253'402'300'799.0})), "9999-12-31 23:59:59 +0000");
}

TEST(DescribeTest, DatesOutsideTheCalendarAreSeconds) {
  EXPECT_EQ(describe(Value(Date{1e300})), "1e+300 s since 1970");
  EXPECT_EQ(describe(Value(Date{253'402'300'800.0})), "253402300800 s since 1970");
  EXPECT_EQ(describe(Value(Date{std::numeric_limits<double>::quiet_NaN()})), "nan s since 1970");
}

TEST(DescribeTest, DataIsHexadecimal) {
  const std::string bytes("\x00\x7f\xff", 3);
  EXPECT_EQ(describe(Value(Data(std::as_bytes(std::span(bytes))))), "<007fff>");
  EXPECT_EQ(describe(Value(Data(std::span<const std::byte>{}))), "<>");
}

TEST(DescribeTest, ArraysAreInParentheses) {
  EXPECT_EQ(describe(Value(Array{})), "()");
  EXPECT_EQ(describe(Value(Array{1, "a", Array{2.5}})), "(1, a, (2.5))");
}

TEST(DescribeTest, EmptyTextsInAnArrayAreSeparatedLikeOthers) {
  EXPECT_EQ(describe(Value(Array{"", ""})), "(, )");
  EXPECT_EQ(describe(Value(Array{"", 1})), "(, 1)");
}

TEST(DescribeTest, DictionariesAreInBracesInTheirOrder) {
  EXPECT_EQ(describe(Dictionary{}), "{}");
  EXPECT_EQ(describe(Dictionary{{"b", 1}, {"a", Dictionary{{"", ""}}}}), "{b = 1; a = { = }}");
  EXPECT_EQ(describe(Message(Dictionary{{"a", 1}})), "{a = 1}");
}

}  // namespace
}  // namespace halvox::platform
