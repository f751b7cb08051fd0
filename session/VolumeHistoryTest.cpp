#include "session/VolumeHistory.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HistoryFixture.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Value;

constexpr auto kPlayback = AudioEventCategory::kPlayback;
constexpr auto kState = AudioEventType::kState;
constexpr double kMinimum = 0.5;  // of every service

class VolumeHistoryTest : public testing::Test {
 protected:
  void record(const Dictionary& message) {
    volumes_.add(message, history_.append(history_.base(kPlayback, kState), message));
  }
  void playing(double volume, double stamp) {
    record({{"RQSessionVolume", volume},
            {"RQSessionVolumePlayingState", 1},
            {"hvreporting_timestamp", stamp}});
  }
  std::vector<Dictionary> taken() {
    std::vector<Dictionary> result;
    const auto ended = volumes_.take();
    if (ended == nullptr) return result;
    for (const RecordedMessage& one : messagesOf(*ended)) result.push_back(one.message);
    return result;
  }

  platform::FakePlatform platform_;
  MessageHistory history_;
  VolumeHistory volumes_;
};

TEST_F(VolumeHistoryTest, WithoutVolumesThereIsNothingAndItTakesNoMemory) {
  for (int number = 0; number < 100; ++number) record({{"number", number}});

  EXPECT_EQ(volumes_.memorySize(), 0U);
  EXPECT_EQ(volumes_.take(), nullptr);
}

// Messages with more sequences of keys than a history has forms, among them messages without a
// volume whose format and devices count.
TEST_F(VolumeHistoryTest, FindsWhatAWalkOverTheWholeHistoryFinds) {
  for (int number = 0; number < 400; ++number) {
    const double stamp = 100 + 0.3 * number;
    Dictionary message{{"key" + std::to_string(number % 13), number}};
    if (number % 3 != 0) message.set("RQSessionVolume", static_cast<double>(number / 7 % 4) / 4);
    if (number % 5 != 0) message.set("RQSessionVolumePlayingState", number % 11 != 0);
    if (number % 17 == 0)
      message.set("session_selected_format", "format " + std::to_string(number));
    if (number % 19 == 0) message.set("active_devices", platform::Array{number});
    if (number % 23 == 0) message.set("RQSessionVolumeOperationProcess", number);
    message.set("hvreporting_timestamp", stamp);
    record(message);
  }

  const std::vector<Dictionary> expected = createVolumeMessages(history_, kMinimum);

  EXPECT_GT(expected.size(), 50U);
  EXPECT_EQ(taken(), expected);
}

TEST_F(VolumeHistoryTest, WhatWasTakenIsForgotten) {
  playing(0.5, 10);
  playing(0.75, 20);
  EXPECT_EQ(taken().size(), 1U);

  EXPECT_TRUE(taken().empty());
  playing(1, 30);
  EXPECT_EQ(taken().size(), 1U);
}

TEST_F(VolumeHistoryTest, TheMemoryOfKeptTextsAndMessagesCounts) {
  record({{"session_selected_format", std::string(10'000, 'f')}});
  EXPECT_GE(volumes_.memorySize(), 10'000U);

  record({{"session_selected_format", "short"}});
  EXPECT_LT(volumes_.memorySize(), 1000U);

  playing(0.5, 10);
  playing(0.75, 20);
  EXPECT_GT(volumes_.movableSize(), 0U);
  EXPECT_GT(volumes_.memorySize(), volumes_.movableSize());
}

TEST_F(VolumeHistoryTest, MessagesThatWereMovedOutAreReadBack) {
  playing(0.5, 10);
  playing(0.75, 20);
  ASSERT_EQ(volumes_.moveOut(), std::nullopt);
  EXPECT_GT(platform_.overflow.keptBytes(), 0U);
  playing(1, 30);

  const std::vector<Dictionary> messages = taken();

  ASSERT_EQ(messages.size(), 2U);
  EXPECT_EQ(*messages[0].find("RQSessionVolume"), Value(0.5));
  EXPECT_EQ(*messages[1].find("RQSessionVolume"), Value(0.75));
  EXPECT_EQ(platform_.overflow.keptBytes(), 0U);
}

}  // namespace
}  // namespace halvox
