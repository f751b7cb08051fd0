// What a history does when it takes much memory.

#include <algorithm>
#include <chrono>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HistoryFixture.h"
#include "session/MessageHistory.h"
#include "session/SessionHistory.h"

namespace halvox {
namespace {

using platform::Dictionary;
using ::testing::HasSubstr;
using namespace std::chrono_literals;
using Outcome = SessionHistory::Outcome;

constexpr auto kPlayback = AudioEventCategory::kPlayback;
constexpr auto kStart = AudioEventType::kStart;
constexpr auto kState = AudioEventType::kState;
constexpr std::size_t kMiB = 1024 * 1024;
constexpr std::size_t kTextBytes = 1000;

// A message that is stored in full, because its text differs from that of the message before.
Dictionary messageOf(int number) {
  std::string text = std::to_string(number) + " ";
  text.resize(kTextBytes, 'x');
  return {{"text", text}, {"number", number}};
}

class MessageHistoryOverflowTest : public testing::Test {
 protected:
  MessageHistoryOverflowTest() { held_.chargeTo(account_); }

  void record(int first, int end) {
    for (int number = first; number < end; ++number) {
      ++outcomes_[history_.record(kPlayback, kStart, messageOf(number))];
    }
  }
  // Each message ends an interval of a second, for which there is a volume message.
  void recordVolumes(int first, int end) {
    for (int number = first; number < end; ++number) {
      const Dictionary message{{"RQSessionVolume", number % 2 == 0 ? 0.25 : 0.75},
                               {"RQSessionVolumePlayingState", 1},
                               {"hvreporting_timestamp", number + 0.123456}};
      ++outcomes_[history_.record(kPlayback, kStart, message)];
    }
  }
  std::vector<RecordedMessage> recorded() {
    const auto history = history_.lock();
    return messagesOf(**history);
  }
  std::vector<std::string> errors() const {
    std::vector<std::string> errors;
    for (const auto& line : platform_.log.lines()) {
      if (line.level == platform::LogLevel::kError) errors.push_back(line.line);
    }
    return errors;
  }

  platform::FakePlatform platform_;
  const std::shared_ptr<ResourceAccount> account_ = std::make_shared<ResourceAccount>();
  ResourceTally held_;
  SessionHistory history_{ReporterID{7}, held_};
  std::map<SessionHistory::Outcome, std::size_t> outcomes_;
};

TEST_F(MessageHistoryOverflowTest, AShortHistoryStaysInMemory) {
  history_.begin();
  record(0, 500);

  EXPECT_EQ(platform_.overflow.keptBytes(), 0U);
}

TEST_F(MessageHistoryOverflowTest, ALongHistoryHoldsAboutAMebibyteInMemory) {
  history_.begin();
  std::size_t most = 0;
  for (int number = 0; number < 10'000; ++number) {
    record(number, number + 1);
    most = std::max(most, account_->use().bytes);
  }

  EXPECT_LE(most, 3 * kMiB / 2);
  EXPECT_GE(platform_.overflow.keptBytes(), 8 * kMiB);
}

TEST_F(MessageHistoryOverflowTest, AHistoryOfWhichPartsWereMovedIsReadWhole) {
  history_.begin();
  record(0, 5000);

  const auto messages = recorded();

  ASSERT_EQ(messages.size(), 5000U);
  for (int number = 0; number < 5000; ++number) {
    const RecordedMessage& message = messages[static_cast<std::size_t>(number)];
    ASSERT_EQ(message.identifier, "Playback_Start_" + std::to_string(number + 1));
    ASSERT_EQ(message.message, messageOf(number));
  }
}

TEST_F(MessageHistoryOverflowTest, AReaderGoesOnWhileWhatItReadsIsMoved) {
  MessageHistory history;
  MessageHistory::Reader reader(history);
  for (int number = 0; number < 1000; ++number) {
    history.append(history.base(kPlayback, kStart), messageOf(number));
    if (number % 7 == 0) {
      ASSERT_EQ(history.moveOut(), std::nullopt);
    }
    const MessageHistory::Entry* entry = reader.next();
    ASSERT_NE(entry, nullptr);
    ASSERT_EQ(entry->message(), messageOf(number));
  }
}

TEST_F(MessageHistoryOverflowTest, TheEndGivesTheRoomBack) {
  history_.begin();
  record(0, 5000);
  EXPECT_GT(platform_.overflow.keptBytes(), 0U);

  history_.end().reset();

  EXPECT_EQ(platform_.overflow.keptBytes(), 0U);
  EXPECT_EQ(account_->use().bytes, 0U);
}

// Each of many sessions of one client is small, but together they are large.
TEST_F(MessageHistoryOverflowTest, AClientOverItsShareMovesEvenShortHistories) {
  platform_.overflow.setMemoryPerClient(100'000);
  ResourceTally tally;
  tally.chargeTo(account_);
  tally.change(0, 100'000);
  history_.begin();

  record(0, 100);

  EXPECT_GE(platform_.overflow.keptBytes(), 90 * kTextBytes);
  EXPECT_EQ(recorded().size(), 100U);
}

TEST_F(MessageHistoryOverflowTest, VolumeMessagesDoNotMakeMessagesMoveOneByOne) {
  platform_.overflow.setMemoryPerClient(0);
  history_.begin();

  recordVolumes(0, 1000);

  EXPECT_GE(platform_.overflow.keptPieces(), 2U);
  EXPECT_LE(platform_.overflow.keptPieces(), 8U);
  EXPECT_EQ(recorded().size(), 1000U);
}

TEST_F(MessageHistoryOverflowTest, AMessageIsKeptIfOnlyTheVolumeMessagesCannotBeMoved) {
  history_.begin();
  recordVolumes(0, 1000);  // both parts have some kilobytes now
  outcomes_.clear();
  platform_.overflow.setMemoryPerClient(0);
  platform_.overflow.setWriteError(platform::Error{.description = "disk full"}, 1);

  recordVolumes(1000, 1010);

  EXPECT_EQ(platform_.overflow.keptPieces(), 1U);
  EXPECT_EQ(platform_.overflow.failedWrites(), 1U);
  EXPECT_EQ(outcomes_[Outcome::kRecorded], 10U);
  EXPECT_EQ(outcomes_[Outcome::kNoRoom], 0U);
  EXPECT_EQ(recorded().size(), 1010U);
}

TEST_F(MessageHistoryOverflowTest, AFullDiskCostsTheHistoryMessagesAndNothingElse) {
  history_.begin();
  platform_.overflow.setWriteError(platform::Error{.description = "cannot write: disk full"});

  record(0, 5000);
  record(4999, 5000);  // a repetition is still seen

  const std::size_t lost = outcomes_[Outcome::kNoRoom];
  EXPECT_GT(lost, 3000U);
  EXPECT_EQ(outcomes_[Outcome::kRecorded], 5000U - lost);
  EXPECT_EQ(outcomes_[Outcome::kRedundant], 1U);
  EXPECT_EQ(recorded().size(), 5000U - lost);
  EXPECT_LE(account_->use().bytes, 3 * kMiB / 2);
  ASSERT_EQ(errors().size(), 1U);
  EXPECT_THAT(errors()[0], HasSubstr("cannot write: disk full"));
  EXPECT_THAT(errors()[0], HasSubstr("the history of reporter 7 "));
}

TEST_F(MessageHistoryOverflowTest, AFullDiskIsTriedFourTimesASecond) {
  history_.begin();
  platform_.overflow.setWriteError(platform::Error{.description = "disk full"});
  for (int number = 0; number < 5000; ++number) {
    record(number, number + 1);
    platform_.clock.advance(1ms);
  }

  // Nothing fails in the first second: a thousand messages of 1,000 bytes fit into memory.
  EXPECT_GE(platform_.overflow.failedWrites(), 15U);
  EXPECT_LE(platform_.overflow.failedWrites(), 16U);
}

TEST_F(MessageHistoryOverflowTest, MessagesAreLostUntilTheDiskIsTriedAgain) {
  history_.begin();
  platform_.overflow.setWriteError(platform::Error{.description = "disk full"});
  record(0, 2000);
  platform_.overflow.setWriteError(std::nullopt);
  const std::size_t lost = outcomes_[Outcome::kNoRoom];

  platform_.clock.advance(249ms);
  record(2000, 2001);
  EXPECT_EQ(outcomes_[Outcome::kNoRoom], lost + 1);
  platform_.clock.advance(1ms);
  record(2001, 2002);

  EXPECT_EQ(outcomes_[Outcome::kNoRoom], lost + 1);
  EXPECT_EQ(recorded().back().identifier, "Playback_Start_2002");
}

TEST_F(MessageHistoryOverflowTest, ANewRunTriesAtOnce) {
  history_.begin();
  platform_.overflow.setWriteError(platform::Error{.description = "disk full"});
  record(0, 2000);
  platform_.overflow.setWriteError(std::nullopt);
  outcomes_.clear();

  history_.begin();
  record(0, 2000);

  EXPECT_EQ(outcomes_[Outcome::kNoRoom], 0U);
}

TEST_F(MessageHistoryOverflowTest, IdentifiersGoOnAfterALoss) {
  history_.begin();
  platform_.overflow.setWriteError(platform::Error{.description = "disk full"});
  record(0, 5000);
  platform_.overflow.setWriteError(std::nullopt);
  platform_.clock.advance(250ms);

  record(5000, 5001);

  EXPECT_EQ(recorded().back().identifier, "Playback_Start_5001");
  EXPECT_EQ(recorded().back().message, messageOf(5000));
}

TEST_F(MessageHistoryOverflowTest, AHistoryThatCannotBeReadEndsBeforeTheGap) {
  MessageHistory history;
  for (int number = 0; number < 100; ++number) {
    history.append(history.base(kPlayback, kState), messageOf(number));
  }
  ASSERT_EQ(history.moveOut(), std::nullopt);
  platform_.overflow.setReadError(platform::Error{.description = "bad block"});

  MessageHistory::Reader reader(history);

  EXPECT_EQ(reader.next(), nullptr);
  ASSERT_TRUE(reader.error().has_value());
  EXPECT_EQ(reader.error()->description, "bad block");
  EXPECT_EQ(reader.next(), nullptr);
}

TEST_F(MessageHistoryOverflowTest, AHistoryWhoseBytesAreDamagedEndsBeforeTheDamage) {
  MessageHistory history;
  MessageHistory::Base& base = history.base(kPlayback, kState);
  history.append(base, {{"number", 1}});
  const std::size_t ofFirst = 4;  // the form, the bits, the type of the number and its difference
  history.append(base, {{"number", 2}});
  ASSERT_EQ(history.moveOut(), std::nullopt);
  platform_.overflow.damage(ofFirst, std::byte{100});  // a form that the history does not have

  MessageHistory::Reader reader(history);

  const MessageHistory::Entry* first = reader.next();
  ASSERT_NE(first, nullptr);
  EXPECT_EQ(first->message(), (Dictionary{{"number", 1}}));
  EXPECT_EQ(reader.next(), nullptr);
  ASSERT_TRUE(reader.error().has_value());
  EXPECT_THAT(reader.error()->description,
              HasSubstr("piece 0 of the history is damaged from byte 4 on"));
}

// The newest message of a base is the same whether it was kept in a form, with its keys, or not at
// all.
TEST_F(MessageHistoryOverflowTest, TheNewestMessageIsKnownHoweverItWasKept) {
  MessageHistory history;
  MessageHistory::Base& base = history.base(kPlayback, kState);
  const auto newest = [&] { return *history.newestMessage(base); };

  for (int round = 0; round < 3; ++round) {
    for (int form = 0; form < 12; ++form) {  // more than a base may have forms
      const Dictionary message{{"key" + std::to_string(form), round}};
      history.append(base, message);
      EXPECT_EQ(newest(), message);
    }
    const Dictionary lost{{"key0", "lost"}};
    history.lose(base, lost);
    EXPECT_EQ(newest(), lost);
    history.append(base, {{"key0", "kept"}});
    EXPECT_EQ(newest(), (Dictionary{{"key0", "kept"}}));
  }
}

TEST_F(MessageHistoryOverflowTest, TheMemoryOfAFormFollowsItsValues) {
  MessageHistory history;
  MessageHistory::Base& base = history.base(kPlayback, kState);
  const std::string text(10'000, 'x');
  history.append(base, {{"text", "short"}});
  const std::size_t small = history.memorySize() - history.movableSize();

  history.append(base, {{"text", text}});
  const std::size_t large = history.memorySize() - history.movableSize();
  history.append(base, {{"text", "short again"}});

  EXPECT_GE(large, small + text.size());
  EXPECT_EQ(history.memorySize() - history.movableSize(), small);
}

}  // namespace
}  // namespace halvox
