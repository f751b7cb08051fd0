#include "session/CompactValue.h"

#include <cmath>
#include <iterator>
#include <limits>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

namespace halvox {
namespace {

using platform::Array;
using platform::Data;
using platform::Date;
using platform::Dictionary;
using platform::NumberKind;
using platform::Value;
using platform::ValueKind;

std::vector<std::byte> written(const Value& previous, const Value& value) {
  std::vector<std::byte> bytes;
  CompactWriter(bytes).append(previous, value);
  return bytes;
}

Value readBack(const Value& previous, const Value& value) {
  const std::vector<std::byte> bytes = written(previous, value);
  CompactReader reader(bytes);
  Value read = reader.value(previous);
  EXPECT_TRUE(reader.isAtEnd()) << describe(value) << " after " << describe(previous);
  return read;
}

std::vector<Value> someValues() {
  const std::string bytes("\0\xff\x01", 3);
  return {Value(),
          true,
          false,
          std::uint8_t{255},
          std::int16_t{-32768},
          std::uint16_t{65535},
          std::numeric_limits<std::int32_t>::min(),
          std::numeric_limits<std::uint32_t>::max(),
          std::numeric_limits<std::int64_t>::min(),
          std::numeric_limits<std::int64_t>::max(),
          std::numeric_limits<std::uint64_t>::max(),
          std::int64_t{0},
          0.0,
          -0.0,
          1.5F,
          -std::numeric_limits<float>::infinity(),
          48000.0,
          1.7e9 + 0.001,
          0.1,
          std::numeric_limits<double>::denorm_min(),
          std::numeric_limits<double>::infinity(),
          Date{1.7e9},
          Date{-std::numeric_limits<double>::infinity()},
          "",
          "short",
          "a text that is too long to be held within a value itself",
          Data(std::as_bytes(std::span(bytes))),
          Array{1, "x", Array{Value()}},
          Dictionary{{"a", 1}, {"b", Dictionary{{"c", 2.5}}}}};
}

TEST(CompactValueTest, EveryValueIsReadAsItWasWrittenAfterEveryOther) {
  for (const Value& previous : someValues()) {
    for (const Value& value : someValues()) {
      const Value read = readBack(previous, value);
      EXPECT_EQ(read, value) << describe(value) << " after " << describe(previous);
      EXPECT_EQ(read.kind(), value.kind());
      if (value.isNumber()) {
        EXPECT_EQ(read.numberKind(), value.numberKind());
      }
      EXPECT_EQ(describe(read), describe(value)) << " after " << describe(previous);
    }
  }
}

TEST(CompactValueTest, ANumberThatIsNoneStaysNone) {
  EXPECT_TRUE(std::isnan(readBack(1.5, std::nan("")).toDouble()));
  EXPECT_TRUE(std::isnan(readBack(std::nan(""), std::nanf("")).toDouble()));
}

TEST(CompactValueTest, AZeroKeepsItsSign) {
  EXPECT_TRUE(std::signbit(readBack(0.0, -0.0).toDouble()));
}

TEST(CompactValueTest, ATextThatEqualsAConstantIsTheConstant) {
  static const platform::StringConstant kConstant("a constant for this test of values");

  EXPECT_TRUE(readBack(Value(), Value(kConstant)).isIdenticalTo(kConstant));
}

TEST(CompactValueTest, NumbersThatGrowALittleTakeTwoBytes) {
  EXPECT_EQ(written(std::int64_t{1'000'000}, std::int64_t{1'000'001}).size(), 2U);
  EXPECT_EQ(written(std::uint64_t{5}, std::uint64_t{4}).size(), 2U);
}

TEST(CompactValueTest, TimesCloseToEachOtherAndShortFractionsTakeFewBytes) {
  EXPECT_LE(written(1.7e9, 1.7e9 + 0.001).size(), 6U);
  EXPECT_LE(written(0.5, 0.75).size(), 3U);
  EXPECT_LE(written(Value(), 48000.0).size(), 5U);
}

TEST(CompactValueTest, OnlyWhatReadsTheSameIsARepetition) {
  EXPECT_TRUE(isRepetition(1, 1));
  EXPECT_TRUE(isRepetition("a text that is too long to be held within a value",
                           "a text that is too long to be held within a value"));
  EXPECT_FALSE(isRepetition(1, 1.0));
  EXPECT_FALSE(isRepetition(1, std::int64_t{1}));
  EXPECT_FALSE(isRepetition(0.0, -0.0));
  EXPECT_FALSE(isRepetition(1, true));
  EXPECT_FALSE(isRepetition("a", "b"));
  EXPECT_FALSE(isRepetition(Value(), 0));
  EXPECT_TRUE(isRepetition(Value(), Value()));
}

// Every beginning of every value, as if the rest had been lost.
TEST(CompactValueTest, ABeginningOfAValueIsNotIntact) {
  for (const Value& value : someValues()) {
    const std::vector<std::byte> bytes = written(Value(), value);
    for (std::size_t length = 0; length < bytes.size(); ++length) {
      const std::span<const std::byte> beginning(bytes.data(), length);
      CompactReader reader(beginning);
      static_cast<void>(reader.value(Value()));
      EXPECT_FALSE(reader.isIntact()) << describe(value) << " cut to " << length;
      EXPECT_TRUE(reader.isAtEnd());
    }
  }
}

TEST(CompactValueTest, AnUnknownKindOfValueIsNotIntact) {
  const std::vector<std::byte> bytes{std::byte{15}, std::byte{0}};
  CompactReader reader(bytes);

  EXPECT_EQ(reader.value(Value()).kind(), ValueKind::kNone);
  EXPECT_FALSE(reader.isIntact());
}

TEST(CompactValueTest, ACountOfMoreThanWhatIsLeftIsNotIntact) {
  std::vector<std::byte> bytes;
  CompactWriter(bytes).append(std::uint64_t{1} << 40U);
  CompactReader reader(bytes);

  EXPECT_EQ(reader.count(), 0U);
  EXPECT_FALSE(reader.isIntact());
}

TEST(CompactValueTest, EndlessNestingIsNotIntact) {
  constexpr std::byte kArrayOfOne[] = {std::byte{10}, std::byte{1}};
  std::vector<std::byte> bytes;
  for (int depth = 0; depth < 10'000; ++depth) {
    bytes.insert(bytes.end(), std::begin(kArrayOfOne), std::end(kArrayOfOne));
  }
  CompactReader reader(bytes);

  static_cast<void>(reader.value(Value()));

  EXPECT_FALSE(reader.isIntact());
}

}  // namespace
}  // namespace halvox
