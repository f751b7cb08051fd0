#include "session/MessageHistory.h"

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "backends/HVReportingUtility.h"
#include "platform/fake/FakePlatform.h"
#include "session/HistoryFixture.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Value;

constexpr auto kPlayback = AudioEventCategory::kPlayback;
constexpr auto kStart = AudioEventType::kStart;
constexpr auto kState = AudioEventType::kState;

class MessageHistoryTest : public testing::Test {
 protected:
  void append(AudioEventCategory category, AudioEventType type, const Dictionary& message) {
    history_.append(history_.base(category, type), message);
  }

  platform::FakePlatform platform_;
  MessageHistory history_;
};

TEST_F(MessageHistoryTest, IsEmptyAtFirst) {
  EXPECT_TRUE(history_.empty());
  EXPECT_EQ(history_.count("Playback_Start"), 0U);
  EXPECT_EQ(history_.memorySize(), 0U);
}

TEST_F(MessageHistoryTest, NumbersTheMessagesOfOneBaseFromOneOn) {
  append(kPlayback, kStart, {{"a", 1}});
  append(kPlayback, kStart, {{"a", 2}});

  EXPECT_EQ(messagesOf(history_)[0].identifier, "Playback_Start_1");
  EXPECT_EQ(messagesOf(history_)[1].identifier, "Playback_Start_2");
  EXPECT_EQ(history_.count("Playback_Start"), 2U);
}

TEST_F(MessageHistoryTest, NumbersEveryBaseByItself) {
  append(kPlayback, kStart, {{"a", 1}});
  append(kPlayback, kState, {{"a", 2}});
  append(kPlayback | AudioEventCategory::kSession, kStart, {{"a", 3}});

  EXPECT_EQ(messagesOf(history_)[0].identifier, "Playback_Start_1");
  EXPECT_EQ(messagesOf(history_)[1].identifier, "Playback_State_1");
  EXPECT_EQ(messagesOf(history_)[2].identifier, "Session_Playback_Start_1");
}

TEST_F(MessageHistoryTest, CategoriesWithTheSameTextShareABase) {
  append(AudioEventCategory::kUndefined, kStart, {{"a", 1}});
  append(AudioEventCategory{16}, kStart, {{"a", 2}});

  EXPECT_EQ(messagesOf(history_)[1].identifier, "Undefined_Start_2");
}

TEST_F(MessageHistoryTest, KeepsTheOrderOfAcceptance) {
  append(kPlayback, kStart, {{"a", 1}});
  append(kPlayback, kState, {{"a", 2}});
  append(kPlayback, kStart, {{"a", 3}});

  std::string order;
  for (const RecordedMessage& entry : messagesOf(history_)) order += describe(entry.message);
  EXPECT_EQ(order, "{a = 1}{a = 2}{a = 3}");
}

TEST_F(MessageHistoryTest, FindsTheNewestMessageOfABaseAmongThoseOfOthers) {
  append(kPlayback, kStart, {{"a", 1}});
  append(kPlayback, kStart, {{"a", 2}});
  append(kPlayback, kState, {{"a", 3}});

  const Dictionary* newest = history_.newestMessage(history_.base(kPlayback, kStart));

  ASSERT_NE(newest, nullptr);
  EXPECT_EQ(*newest, (Dictionary{{"a", 2}}));
}

TEST_F(MessageHistoryTest, HasNoNewestMessageOfANewBase) {
  EXPECT_EQ(history_.newestMessage(history_.base(kPlayback, kStart)), nullptr);
}

TEST_F(MessageHistoryTest, StaysWholeWhenItIsMoved) {
  append(kPlayback, kStart, {{"a", 1}});

  MessageHistory moved = std::move(history_);
  moved.append(moved.base(kPlayback, kStart), {{"a", 2}});

  EXPECT_EQ(messagesOf(moved)[0].identifier, "Playback_Start_1");
  EXPECT_EQ(messagesOf(moved)[1].identifier, "Playback_Start_2");
}

TEST_F(MessageHistoryTest, CodesBeyondTheBoundStillFindTheirBase) {
  constexpr std::uint32_t kManyCodes = 10'000;
  for (std::uint32_t code = 0; code < kManyCodes; ++code) {
    append(AudioEventCategory{0x0001'0000U * (code + 1) + 4}, kStart, {{"a", code}});
  }

  // Four of the codes have a domain with a text. All others share one base.
  EXPECT_EQ(history_.count("_Playback_Start"), kManyCodes - 4);
  EXPECT_EQ(history_.count("Session_Playback_Start"), 1U);
}

TEST_F(MessageHistoryTest, AMessageOfTenFieldsThatRepeatMostlyCostsAtMostTwentyBytes) {
  constexpr int kMessages = 10'000;
  const auto message = [](int number) {
    Dictionary fields;
    fields.set("frame_counter", std::int64_t{512} * number);
    for (int field = 1; field < 9; ++field)
      fields.set("field" + std::to_string(field), field * 0.5);
    fields.set("device", "alsa_output.pci-0000_00_1f.3.analog-stereo");
    fields.set("hvreporting_timestamp", 1.7e9 + 0.001 * number);
    fields.set("systemuptime_sec", 1000 + number / 1000);
    fields.set("processuptime_ms", std::uint64_t{1000} + static_cast<std::uint64_t>(number));
    return HVReportingUtilityAddAudioMessageTag(fields, kPlayback, kStart);
  };
  append(kPlayback, kStart, message(0));
  const std::size_t before = history_.memorySize();

  for (int number = 1; number <= kMessages; ++number) append(kPlayback, kStart, message(number));

  EXPECT_LE(history_.memorySize() - before, 20U * kMessages);
  EXPECT_EQ(messagesOf(history_).back().message, message(kMessages));
}

TEST_F(MessageHistoryTest, MessagesAreReadAsTheyWere) {
  const std::string longText(3000, 'x');
  const std::vector<Dictionary> messages{
      {{"a", 1}, {"b", 2.5}, {"c", longText}},
      {{"a", 2}, {"b", 2.5}, {"c", longText}},
      {},
      {{"c", "other"}, {"a", 1.0}, {"b", Value()}},  // the same keys in another order
      {{"a", true}, {"b", platform::Array{1, "x"}}, {"c", platform::Date{1.5}}},
      {{"a", 3}, {"d", Dictionary{{"e", 1}}}},
      {{"a", 3}, {"b", platform::Array{1, "x"}}, {"c", platform::Date{2.5}}}};

  for (const Dictionary& message : messages) append(kPlayback, kStart, message);

  const auto read = messagesOf(history_);
  ASSERT_EQ(read.size(), messages.size());
  for (std::size_t position = 0; position < messages.size(); ++position) {
    EXPECT_EQ(describe(read[position].message), describe(messages[position]));
  }
}

// Each message has keys that no other has: most get no form of their own.
TEST_F(MessageHistoryTest, MessagesOfManyShapesAreReadAsTheyWere) {
  constexpr std::uint32_t kShapes = 1000;
  const auto message = [](std::uint32_t shape) {
    return Dictionary{{"key" + std::to_string(shape), shape},
                      {"text", "of " + std::to_string(shape)}};
  };
  for (std::uint32_t shape = 0; shape < kShapes; ++shape) {
    append(AudioEventCategory{shape % 16}, kStart, message(shape));
  }
  for (std::uint32_t shape = 0; shape < kShapes; ++shape) {
    append(AudioEventCategory{shape % 16}, kStart, message(shape));
  }

  const auto read = messagesOf(history_);
  ASSERT_EQ(read.size(), 2U * kShapes);
  for (std::uint32_t number = 0; number < read.size(); ++number) {
    EXPECT_EQ(read[number].message, message(number % kShapes));
  }
}

TEST_F(MessageHistoryTest, AReaderGoesOnWithMessagesThatAreAddedMeanwhile) {
  MessageHistory::Reader reader(history_);
  EXPECT_EQ(reader.next(), nullptr);

  for (int number = 1; number <= 5000; ++number) {
    append(kPlayback, kStart, {{"a", number}});
    const MessageHistory::Entry* entry = reader.next();
    ASSERT_NE(entry, nullptr) << number;
    EXPECT_EQ(entry->identifier(), "Playback_Start_" + std::to_string(number));
    EXPECT_EQ(reader.next(), nullptr);
  }
}

// A client can invent many categories, which all share one text.
TEST_F(MessageHistoryTest, EachCodeAndEachBaseCostsAboutANodeOfATable) {
  constexpr std::uint32_t kCodes = 100;
  constexpr std::size_t kNode = 48;
  const std::string text = "Undefined_Start";
  const auto category = [](std::uint32_t code) { return static_cast<AudioEventCategory>(code); };
  history_.base(category(16), kStart);
  const std::size_t first = history_.memorySize();
  EXPECT_GE(first, sizeof(MessageHistory::Base) + 2 * text.size() + 2 * kNode);

  for (std::uint32_t code = 1; code <= kCodes; ++code) history_.base(category(16 + code), kStart);
  const std::size_t ofCodes = history_.memorySize() - first;
  EXPECT_GE(ofCodes, kCodes * (kNode + 2 * sizeof(void*)));
  EXPECT_LE(ofCodes, kCodes * 2 * kNode);

  history_.base(category(17), kStart);  // already known
  EXPECT_EQ(history_.memorySize() - first, ofCodes);
}

class EqualApartFromVolatileKeysTest : public testing::Test {
 protected:
  platform::FakePlatform platform_;
};

TEST_F(EqualApartFromVolatileKeysTest, EmptyMessagesAreEqual) {
  EXPECT_TRUE(equalApartFromVolatileKeys({}, {}));
}

TEST_F(EqualApartFromVolatileKeysTest, VolatileKeysMayDiffer) {
  const Dictionary left{
      {"hvreporting_timestamp", 1.5}, {"a", 1}, {"systemuptime_sec", 1}, {"processuptime_ms", 1}};
  const Dictionary right{
      {"hvreporting_timestamp", 2.5}, {"a", 1}, {"systemuptime_sec", 2}, {"processuptime_ms", 2}};
  EXPECT_TRUE(equalApartFromVolatileKeys(left, right));
}

TEST_F(EqualApartFromVolatileKeysTest, VolatileKeysMayBeMissingOnEitherSide) {
  const Dictionary with{{"processuptime_ms", 1}, {"a", 1}};
  const Dictionary without{{"a", 1}};
  EXPECT_TRUE(equalApartFromVolatileKeys(with, without));
  EXPECT_TRUE(equalApartFromVolatileKeys(without, with));
  EXPECT_TRUE(equalApartFromVolatileKeys({{"processuptime_ms", 1}}, {{"systemuptime_sec", 1}}));
}

TEST_F(EqualApartFromVolatileKeysTest, OtherKeysMayNotBeMissing) {
  const Dictionary with{{"a", 1}, {"b", 1}};
  EXPECT_FALSE(equalApartFromVolatileKeys(with, {{"a", 1}}));
  EXPECT_FALSE(equalApartFromVolatileKeys({{"a", 1}}, with));
  EXPECT_FALSE(equalApartFromVolatileKeys({{"a", 1}, {"processuptime_ms", 1}}, with));
  EXPECT_FALSE(equalApartFromVolatileKeys({{"a", 1}, {"b", 1}}, {{"a", 1}, {"c", 1}}));
}

TEST_F(EqualApartFromVolatileKeysTest, OrderDoesNotMatter) {
  const Dictionary left{{"a", 1}, {"processuptime_ms", 1}, {"b", 2}};
  const Dictionary right{{"b", 2}, {"a", 1}, {"processuptime_ms", 9}};
  EXPECT_TRUE(equalApartFromVolatileKeys(left, right));
  EXPECT_FALSE(equalApartFromVolatileKeys(left, {{"b", 2}, {"a", 2}, {"processuptime_ms", 1}}));
}

TEST_F(EqualApartFromVolatileKeysTest, ComparesNestedValuesDeeplyAndNumbersByValue) {
  const Dictionary left{{"list", platform::Array{Dictionary{{"n", 1}}, "x"}}};
  EXPECT_TRUE(
      equalApartFromVolatileKeys(left, {{"list", platform::Array{Dictionary{{"n", 1.0}}, "x"}}}));
  EXPECT_FALSE(
      equalApartFromVolatileKeys(left, {{"list", platform::Array{Dictionary{{"n", 2}}, "x"}}}));
}

TEST_F(EqualApartFromVolatileKeysTest, VolatileNamesInsideNestedValuesCount) {
  const Dictionary left{{"inner", Dictionary{{"systemuptime_sec", 1}}}};
  const Dictionary right{{"inner", Dictionary{{"systemuptime_sec", 2}}}};
  EXPECT_FALSE(equalApartFromVolatileKeys(left, right));
}

}  // namespace
}  // namespace halvox
