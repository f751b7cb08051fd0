#include <array>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/value.h"

namespace halvox::platform {
namespace {

const StringConstant kLongConstant("a constant that is longer than fits in place");
const StringConstant kShortConstant("short one");
const StringConstant kEmptyNeighbour("short two");

constexpr std::string_view kInlineText = "fourteen bytes";
constexpr std::string_view kSharedText = "fifteen bytes..";

Data dataOf(std::string_view text) { return Data(std::as_bytes(std::span(text))); }

// One value of every kind, with contents on the heap if the kind can have them.
std::vector<Value> oneOfEachKind() {
  return {Value(),
          Value(1),
          Value("text"),
          Value(kSharedText),
          Value(kLongConstant),
          Value(Date{1.5}),
          Value(dataOf("bytes")),
          Value(Array{1, kSharedText}),
          Value(Dictionary{{"key", kSharedText}})};
}

// --- Kinds --------------------------------------------------------------------------------------

TEST(ValueTest, KnowsItsKind) {
  EXPECT_EQ(Value().kind(), ValueKind::kNone);
  EXPECT_EQ(Value(1).kind(), ValueKind::kNumber);
  EXPECT_EQ(Value(true).kind(), ValueKind::kNumber);
  EXPECT_EQ(Value("").kind(), ValueKind::kString);
  EXPECT_EQ(Value(kSharedText).kind(), ValueKind::kString);
  EXPECT_EQ(Value(kLongConstant).kind(), ValueKind::kString);
  EXPECT_EQ(Value(Date{}).kind(), ValueKind::kDate);
  EXPECT_EQ(Value(dataOf("")).kind(), ValueKind::kData);
  EXPECT_EQ(Value(Array{}).kind(), ValueKind::kArray);
  EXPECT_EQ(Value(Dictionary{}).kind(), ValueKind::kDictionary);
}

TEST(ValueTest, GivesAnEmptyContentForAnotherKind) {
  const Value number(1);
  EXPECT_EQ(number.string(), "");
  EXPECT_EQ(number.date(), Date{});
  EXPECT_TRUE(number.data().bytes().empty());
  EXPECT_TRUE(number.array().empty());
  EXPECT_TRUE(number.dictionary().empty());
  EXPECT_EQ(Value("7").toInt64(), 0);
  EXPECT_EQ(Value("7").toUInt64(), 0U);
  EXPECT_EQ(Value("7").toDouble(), 0.0);
  EXPECT_FALSE(Value("7").toBool());
}

TEST(ValueTest, OnlyTheSameKindIsEqual) {
  const std::vector<Value> values = {
      Value(),           Value(0),       Value(""),          Value(Date{}),
      Value(dataOf("")), Value(Array{}), Value(Dictionary{})};
  for (std::size_t left = 0; left < values.size(); ++left) {
    for (std::size_t right = 0; right < values.size(); ++right) {
      EXPECT_EQ(values[left] == values[right], left == right) << left << " and " << right;
    }
  }
}

// --- Strings ------------------------------------------------------------------------------------

TEST(ValueStringTest, KeepsItsTextWhereverItIsHeld) {
  for (const std::size_t length : {0U, 1U, 13U, 14U, 15U, 63U, 64U, 65U, 10'000U}) {
    const std::string text(length, 'x');
    EXPECT_EQ(Value(text).string(), text);
  }
}

TEST(ValueStringTest, HoldsZeroBytes) {
  const std::string text("a\0b", 3);
  EXPECT_EQ(Value(text).string(), text);
  EXPECT_NE(Value(text), Value("a"));
}

TEST(ValueStringTest, FourteenBytesNeedNoMemory) {
  EXPECT_EQ(kInlineText.size(), 14U);
  EXPECT_EQ(Value(kInlineText).memorySize(), 0U);
  EXPECT_GE(Value(kSharedText).memorySize(), kSharedText.size());
}

TEST(ValueStringTest, CopiesShareALongText) {
  const Value text(kSharedText);
  const Value copy = text;  // NOLINT(performance-unnecessary-copy-initialization): tested
  EXPECT_EQ(copy.string().data(), text.string().data());
}

TEST(ValueStringTest, ATextEqualToAConstantIsThatConstant) {
  const Value decoded(std::string("a constant that is longer than fits in place"));
  EXPECT_TRUE(decoded.isIdenticalTo(kLongConstant));
  EXPECT_TRUE(Value("short one").isIdenticalTo(kShortConstant));
  EXPECT_TRUE(Value("short two").isIdenticalTo(kEmptyNeighbour));
  EXPECT_EQ(decoded.memorySize(), 0U);
}

TEST(ValueStringTest, OtherTextsAreIdenticalToNoConstant) {
  EXPECT_FALSE(Value("short thr").isIdenticalTo(kShortConstant));
  EXPECT_FALSE(Value("short two").isIdenticalTo(kShortConstant));
  EXPECT_FALSE(Value(1).isIdenticalTo(kShortConstant));
  EXPECT_FALSE(Value().isIdenticalTo(kShortConstant));
}

TEST(ValueStringTest, CopiesOfAConstantStayIdenticalAndEqual) {
  const Value constant(kLongConstant);
  const Value copy = constant;  // NOLINT(performance-unnecessary-copy-initialization): tested
  EXPECT_TRUE(copy.isIdenticalTo(kLongConstant));
  EXPECT_EQ(copy, Value(kLongConstant.text()));
}

// --- Dates and data -----------------------------------------------------------------------------

TEST(ValueDateTest, ComparesByItsSeconds) {
  EXPECT_EQ(Value(Date{1.5}), Value(Date{1.5}));
  EXPECT_NE(Value(Date{1.5}), Value(Date{2.5}));
  EXPECT_NE(Value(Date{1.5}), Value(1.5));
  EXPECT_EQ(Value(Date{1.5}).date().secondsSince1970, 1.5);
}

TEST(ValueDateTest, DatesThatAreNoNumberAreEqual) {
  const double nan = std::numeric_limits<double>::quiet_NaN();
  EXPECT_EQ(Value(Date{nan}), Value(Date{nan}));
  EXPECT_NE(Value(Date{nan}), Value(Date{0}));
}

TEST(ValueDataTest, ComparesByteForByte) {
  EXPECT_EQ(Value(dataOf("abc")), Value(dataOf("abc")));
  EXPECT_NE(Value(dataOf("abc")), Value(dataOf("abd")));
  EXPECT_NE(Value(dataOf("abc")), Value(dataOf("ab")));
  EXPECT_NE(Value(dataOf("abc")), Value("abc"));
}

TEST(ValueDataTest, CopiesShareTheBytes) {
  const Data data = dataOf("some bytes");
  const Value value(data);
  EXPECT_EQ(value.data().bytes().data(), data.bytes().data());
}

TEST(ValueDataTest, EmptyDataHasNoBytesAndEqualsItself) {
  EXPECT_TRUE(dataOf("").bytes().empty());
  EXPECT_EQ(Value(dataOf("")), Value(dataOf("")));
  EXPECT_EQ(Value(dataOf("")).memorySize(), 0U);
}

// --- Arrays -------------------------------------------------------------------------------------

TEST(ArrayTest, ComparesElementByElement) {
  EXPECT_EQ((Array{1, "a", true}), (Array{1.0, "a", 1}));
  EXPECT_NE((Array{1, 2}), (Array{2, 1}));
  EXPECT_NE((Array{1, 2}), (Array{1}));
  EXPECT_EQ(Array{}, Array(std::span<const Value>{}));
}

TEST(ArrayTest, KeepsItsOrderAndSharesItsValues) {
  const Array array{3, "b", Array{1}};
  const Array copy = array;  // NOLINT(performance-unnecessary-copy-initialization): tested
  EXPECT_EQ(copy.begin(), array.begin());
  ASSERT_EQ(array.size(), 3U);
  EXPECT_EQ(array[0], Value(3));
  EXPECT_EQ(array[1], Value("b"));
  EXPECT_EQ(array[2].array(), Array{1});
}

// --- Copying and moving -------------------------------------------------------------------------

TEST(ValueCopyTest, CopiesOfEveryKindAreEqual) {
  for (const Value& value : oneOfEachKind()) {
    const Value copy = value;  // NOLINT(performance-unnecessary-copy-initialization): tested
    EXPECT_EQ(copy, value);
    EXPECT_EQ(copy.kind(), value.kind());
  }
}

TEST(ValueCopyTest, EveryKindCanTakeThePlaceOfEveryOther) {
  for (const Value& from : oneOfEachKind()) {
    for (const Value& to : oneOfEachKind()) {
      Value changed = to;
      changed = from;
      EXPECT_EQ(changed, from);
      Value moved = to;
      moved = Value(from);
      EXPECT_EQ(moved, from);
    }
  }
}

TEST(ValueCopyTest, SelfAssignmentKeepsEveryKind) {
  for (const Value& value : oneOfEachKind()) {
    Value same = value;
    Value& alias = same;
    same = alias;
    EXPECT_EQ(same, value);
    same = std::move(alias);
    EXPECT_EQ(same, value);
  }
}

TEST(ValueCopyTest, AValueCanTakeThePlaceOfWhatHoldsIt) {
  Value array(Array{Value(kSharedText), 2});
  array = array.array()[0];
  EXPECT_EQ(array, Value(kSharedText));

  Value dictionary(Dictionary{{"inner", Array{kSharedText}}});
  const Value* inner = dictionary.dictionary().find("inner");  // is part of `dictionary`
  dictionary = *inner;
  EXPECT_EQ(dictionary, Value(Array{kSharedText}));
}

TEST(ValueCopyTest, MovedFromValuesAreNoneAndCanBeUsedAgain) {
  for (Value& value : oneOfEachKind()) {
    const Value moved = std::move(value);
    EXPECT_EQ(value.kind(), ValueKind::kNone);  // NOLINT(bugprone-use-after-move): tested
    value = moved;
    EXPECT_EQ(value, moved);
  }
}

TEST(ValueCopyTest, MovedFromContainersAreEmptyAndCanBeUsedAgain) {
  Array array{1, 2};
  const Array movedArray = std::move(array);
  EXPECT_TRUE(array.empty());  // NOLINT(bugprone-use-after-move): tested
  array = movedArray;
  EXPECT_EQ(array.size(), 2U);

  Dictionary dictionary{{"a", 1}};
  const Dictionary movedDictionary = std::move(dictionary);
  EXPECT_TRUE(dictionary.empty());  // NOLINT(bugprone-use-after-move): tested
  dictionary.set("b", 2);
  EXPECT_EQ(dictionary, (Dictionary{{"b", 2}}));

  Data data = dataOf("x");
  const Data movedData = std::move(data);
  EXPECT_TRUE(data.bytes().empty());  // NOLINT(bugprone-use-after-move): tested
}

TEST(ValueCopyTest, ContentsLiveAsLongAsTheirLastHolder) {
  auto dictionary = std::make_unique<Dictionary>();
  dictionary->set("list", Array{kSharedText});
  const Value list = *dictionary->find("list");
  dictionary.reset();
  EXPECT_EQ(list.array()[0].string(), kSharedText);
}

// --- Memory -------------------------------------------------------------------------------------

TEST(ValueMemoryTest, AValueTakesSixteenBytes) { EXPECT_EQ(sizeof(Value), 16U); }

TEST(ValueMemoryTest, NumbersDatesAndShortTextsAreHeldInPlace) {
  for (const Value& value : {Value(), Value(1), Value(1.5), Value(Date{1}), Value("text")}) {
    EXPECT_EQ(value.memorySize(), 0U);
  }
}

TEST(ValueMemoryTest, ContainersCountWhatTheyHold) {
  const std::string text(1000, 'x');
  EXPECT_GE(Value(text).memorySize(), 1000U);
  EXPECT_GE(Value(dataOf(text)).memorySize(), 1000U);
  EXPECT_GE(Value(Array{text, text}).memorySize(), 2032U);
  EXPECT_GE(Value(Dictionary{{"a", Array{text}}}).memorySize(), 1000U + 16 + 24);
}

// --- Lent texts ---------------------------------------------------------------------------------

TEST(LentValueTest, HasTheTextWhereItIs) {
  const std::string text(kSharedText);
  const Value value = Value::lending(text);

  EXPECT_TRUE(value.isString());
  EXPECT_EQ(value.string().data(), text.data());
  EXPECT_EQ(value, Value(text));
  EXPECT_EQ(describe(value), text);
  EXPECT_EQ(value.memorySize(), text.size());
}

TEST(LentValueTest, CopyOwnsItsText) {
  std::string text(kSharedText);
  const Value lent = Value::lending(text);

  const Value copy = lent;  // NOLINT(performance-unnecessary-copy-initialization): what is tested
  Value assigned = 1;
  assigned = lent;
  text.assign(text.size(), '-');

  EXPECT_EQ(copy.string(), kSharedText);
  EXPECT_EQ(assigned.string(), kSharedText);
  EXPECT_EQ(Array({lent})[0].string(), text);
}

TEST(LentValueTest, ShortTextsAndConstantsAreAsAlways) {
  std::string text(kInlineText);
  const Value value = Value::lending(text);
  text.assign(text.size(), '-');

  EXPECT_EQ(value.string(), kInlineText);
  EXPECT_EQ(value.memorySize(), 0U);
  EXPECT_TRUE(Value::lending(std::string(kLongConstant.text())).isIdenticalTo(kLongConstant));
}

TEST(LentValueTest, DictionaryNeverKeepsALentText) {
  std::string text(kSharedText);
  Dictionary dictionary;
  dictionary.set("set", Value::lending(text));
  dictionary.add("added", Value::lending(text));
  dictionary.set("replaced", 1);
  dictionary.set("replaced", Value::lending(text));
  dictionary.setAt(0, Value::lending(text));
  text.assign(text.size(), '-');

  for (const Dictionary::Entry& entry : dictionary) EXPECT_EQ(entry.value.string(), kSharedText);
}

}  // namespace
}  // namespace halvox::platform
