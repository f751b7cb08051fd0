#include "session/SummaryEvent.h"

#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HistoryFixture.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

constexpr auto kPlayback = AudioEventCategory::kPlayback;
constexpr auto kStart = AudioEventType::kStart;
constexpr auto kState = AudioEventType::kState;

class SummaryEventTest : public testing::Test {
 protected:
  void record(const Dictionary& message, AudioEventType type = kState) {
    history_.append(history_.base(kPlayback, type), message);
  }
  Dictionary event() const {
    SummaryEvent event(AudioServiceType::kHaptics);
    MessageHistory::Reader reader(history_);
    while (const MessageHistory::Entry* entry = reader.next()) event.add(*entry);
    return event.take();
  }
  // The same, made in the simplest way.
  Dictionary expectedEvent() const {
    std::vector<std::pair<std::string, std::string>> texts{{"HV_Session_Summary_Event", "3"}};
    for (const RecordedMessage& one : messagesOf(history_)) {
      for (const auto& [key, value] : one.message) {
        auto place = texts.begin();
        while (place != texts.end() && place->first != key.text()) ++place;
        if (place == texts.end()) {
          texts.emplace_back(key.text(), describe(value));
        } else {
          place->second += "," + describe(value);
        }
      }
    }
    Dictionary event;
    for (const auto& [key, text] : texts) event.set(key, text);
    return event;
  }
  static std::vector<std::string> keysOf(const Dictionary& message) {
    std::vector<std::string> keys;
    for (const auto& entry : message) keys.emplace_back(entry.key.text());
    return keys;
  }

  platform::FakePlatform platform_;
  MessageHistory history_;
};

TEST_F(SummaryEventTest, RepeatedValuesOfOneFormAreThereEachTime) {
  for (int number = 0; number < 1000; ++number) {
    record({{"number", number}, {"constant", 0.1}, {"empty", ""}, {"seldom", number / 300}});
  }

  EXPECT_EQ(event(), expectedEvent());
}

// A value can be unchanged within its form although another form has added others to its key.
TEST_F(SummaryEventTest, FormsThatShareKeysTakeTurns) {
  for (int number = 0; number < 200; ++number) {
    record({{"shared", "a"}, {"number", number}});
    if (number % 3 == 0) record({{"number", number}, {"shared", number % 2 == 0 ? "a" : "b"}});
    if (number % 5 == 0) record({{"shared", "a"}, {"number", number}}, kStart);
  }

  EXPECT_EQ(event(), expectedEvent());
}

TEST_F(SummaryEventTest, MessagesWithoutAFormCountToo) {
  for (int number = 0; number < 60; ++number) {
    // More sequences of keys than a category and type may have forms.
    record({{"key" + std::to_string(number % 12), "x"}, {"shared", number / 4}});
  }

  EXPECT_EQ(event(), expectedEvent());
}

TEST_F(SummaryEventTest, ValuesOfAllKindsRepeat) {
  const std::string text(100, 't');
  for (int round = 0; round < 5; ++round) {
    record({{"round", round},
            {"none", Value()},
            {"array", Array{1, "x"}},
            {"dictionary", Dictionary{{"k", 2}}},
            {"text", text},
            {"float", 1.0F / 3},
            {"minus", -7}});
  }

  EXPECT_EQ(event(), expectedEvent());
}

TEST_F(SummaryEventTest, KeysAreInTheOrderOfTheirFirstUse) {
  record({{"b", 1}, {"a", 1}});
  record({{"c", 1}, {"a", 2}});

  EXPECT_EQ(keysOf(event()), (std::vector<std::string>{"HV_Session_Summary_Event", "b", "a", "c"}));
}

}  // namespace
}  // namespace halvox
