#include "platform/linux/store/IndentedJsonArray.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <string>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

TEST(IndentedJsonArrayTest, HoldsEachObjectUnderItsKeyInOrder) {
  IndentedJsonArray json;
  json.appendObject("first", {{"a", 1}, {"b", Array{true, "x"}}});
  json.appendObject("second", {});
  json.end();

  EXPECT_EQ(json.takeText(), R"([
  {
    "first": {
      "a": 1,
      "b": [
        true,
        "x"
      ]
    }
  },
  {
    "second": {}
  }
]
)");
}

TEST(IndentedJsonArrayTest, NothingIsAnEmptyArray) {
  IndentedJsonArray json;
  json.end();

  EXPECT_EQ(json.takeText(), "[]\n");
}

TEST(IndentedJsonArrayTest, ValuesHaveTheFormOfPayloads) {
  IndentedJsonArray json;
  json.appendObject("k\"", {{"nan", std::nan("")},
                            {"large", 1e300},
                            {"real", 0.1},
                            {"whole", std::uint64_t{18446744073709551615U}},
                            {"date", Date{0.25}},
                            {"text", "a\n\xFF"}});
  json.end();

  EXPECT_EQ(json.takeText(), R"([
  {
    "k\"": {
      "nan": "NaN",
      "large": 1e+300,
      "real": 0.1,
      "whole": 18446744073709551615,
      "date": "1970-01-01T00:00:00.250000Z",
      "text": "a\n)"
                             "\uFFFD"
                             R"("
    }
  }
]
)");
}

TEST(IndentedJsonArrayTest, PunctuationWithinStringsIsLeftAlone) {
  IndentedJsonArray json;
  json.appendObject("a{,}:", {{"b[\"", "{\"x\": [1,2]}\\"}, {"c", Array{Array{}, Dictionary{}}}});
  json.end();

  EXPECT_EQ(json.takeText(), R"([
  {
    "a{,}:": {
      "b[\"": "{\"x\": [1,2]}\\",
      "c": [
        [],
        {}
      ]
    }
  }
]
)");
}

TEST(IndentedJsonArrayTest, KeysTakeNoRoomInTheTableOfSharedKeys) {
  IndentedJsonArray json;
  for (int number = 0; number < 100'000; ++number) {
    json.appendObject("one_of_many_keys_" + std::to_string(number), {});
    static_cast<void>(json.takeText());
  }

  EXPECT_TRUE(Key("a key that is new after many in an array").isInterned());
}

TEST(IndentedJsonArrayTest, PiecesTogetherMakeTheSameText) {
  IndentedJsonArray whole;
  IndentedJsonArray pieces;
  std::string text;
  std::size_t longest = 0;
  for (int number = 0; number < 1000; ++number) {
    for (IndentedJsonArray* json : {&whole, &pieces}) {
      json->appendObject("key", {{"number", number}});
    }
    const std::string_view piece = pieces.takeText();
    longest = std::max(longest, piece.size());
    text += piece;
  }
  whole.end();
  pieces.end();
  text += pieces.takeText();

  EXPECT_EQ(text, whole.takeText());
  EXPECT_LT(longest, 100U);
}

TEST(IndentedJsonArrayTest, DeeplyNestedValuesAreIndented) {
  Value nested(1);
  for (int depth = 0; depth < 60; ++depth) nested = Value(Array{nested});
  IndentedJsonArray json;
  json.appendObject("key", {{"nested", nested}});
  json.end();

  const std::string text(json.takeText());
  EXPECT_EQ(std::ranges::count(text, '['), 61);
  EXPECT_EQ(std::ranges::count(text, ']'), 61);
}

}  // namespace
}  // namespace halvox::platform::linux_
