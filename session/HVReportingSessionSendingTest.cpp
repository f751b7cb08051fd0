#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"
#include "session/HistoryFixture.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::JournalEntry;
using platform::JournalKind;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::UnorderedElementsAre;

constexpr auto kPlayback = AudioEventCategory::kPlayback;
constexpr auto kError = AudioEventCategory::kError;
constexpr auto kStart = AudioEventType::kStart;
constexpr auto kStop = AudioEventType::kStop;

class HVReportingSessionSendingTest : public testing::Test {
 protected:
  HVReportingSessionSendingTest() { session_->start(); }

  void send(const Dictionary& message, AudioEventCategory category = kPlayback,
            AudioEventType type = kStart) {
    session_->sendMessage(message, category, type, nullptr);
  }
  std::vector<std::string> identifiers() const {
    std::vector<std::string> result;
    const auto history = session_->nestedAggregatedPayloadData();
    for (const RecordedMessage& entry : messagesOf(**history)) result.push_back(entry.identifier);
    return result;
  }
  Dictionary recorded(std::size_t position) const {
    const auto history = session_->nestedAggregatedPayloadData();
    return messagesOf(**history)[position].message;
  }

  platform::FakePlatform platform_;
  std::shared_ptr<HVReportingSession> session_ = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12},
      SessionCounters::make(platform_.statistics));
};

TEST_F(HVReportingSessionSendingTest, LogsThenEmitsItsTracePoint) {
  platform_.journal.clear();

  send({{"a", 1}});

  EXPECT_THAT(
      platform_.journal.entries(),
      ElementsAre(JournalEntry{JournalKind::kLogLine, "sending message for session owned by 7"},
                  JournalEntry{JournalKind::kTracePoint, "0x21044838"}));
  EXPECT_EQ(platform_.log.lines().back().level, platform::LogLevel::kDebug);
}

TEST_F(HVReportingSessionSendingTest, RecordsTheMessageCleanedAndTagged) {
  send({{"sample rate", 48000}, {"a", 1}}, AudioEventCategory::kSession | kPlayback);

  EXPECT_EQ(recorded(0),
            (Dictionary{{"sample_rate", 48000}, {"a", 1}, {"audiotag", "Session_PlaybackStart"}}));
}

TEST_F(HVReportingSessionSendingTest, LeavesTheClientsMessageAlone) {
  const Dictionary message{{"sample rate", 48000}};

  send(message);

  EXPECT_EQ(message, (Dictionary{{"sample rate", 48000}}));
}

TEST_F(HVReportingSessionSendingTest, RecordsNoMessageAtAllAsItsTag) {
  session_->sendMessage(std::nullopt, AudioEventCategory::kSetup, AudioEventType::kSetup, nullptr);

  EXPECT_EQ(recorded(0), (Dictionary{{"audiotag", "SetupSetup"}}));
}

TEST_F(HVReportingSessionSendingTest, SecondOfTwoIdenticalMessagesIsDropped) {
  send({{"a", 1}});
  send({{"a", 1}});

  EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1"));
  EXPECT_EQ((*session_->nestedAggregatedPayloadData())->count("Playback_Start"), 1U);
}

TEST_F(HVReportingSessionSendingTest, DroppingIsLoggedBetweenTheFirstLineAndTheTracePoint) {
  send({{"a", 1}});
  platform_.journal.clear();

  send({{"a", 1}});

  EXPECT_THAT(
      platform_.journal.entries(),
      ElementsAre(JournalEntry{JournalKind::kLogLine, "sending message for session owned by 7"},
                  JournalEntry{JournalKind::kLogLine, "dropping redundant event"},
                  JournalEntry{JournalKind::kTracePoint, "0x21044838"}));
  EXPECT_EQ(platform_.log.lines().back().level, platform::LogLevel::kDebug);
}

class VolatileKeyTest : public HVReportingSessionSendingTest,
                        public testing::WithParamInterface<const char*> {};

TEST_P(VolatileKeyTest, MessagesThatDifferOnlyThereAreRedundant) {
  send({{"a", 1}, {GetParam(), 1}});
  send({{"a", 1}, {GetParam(), 2}});

  EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1"));
  EXPECT_EQ(*recorded(0).find(GetParam()), platform::Value(1));
}

INSTANTIATE_TEST_SUITE_P(Stamps, VolatileKeyTest,
                         testing::Values("hvreporting_timestamp", "systemuptime_sec",
                                         "processuptime_ms"));

TEST_F(HVReportingSessionSendingTest, RepeatedMessagesOfTheErrorTypeAreKept) {
  send({{"a", 1}}, kPlayback, AudioEventType::kError);
  send({{"a", 1}}, kPlayback, AudioEventType::kError);

  EXPECT_THAT(identifiers(), ElementsAre("Playback_Error_1", "Playback_Error_2"));
}

TEST_F(HVReportingSessionSendingTest, RepeatedMessagesOfTheErrorCategoryAreKept) {
  send({{"a", 1}}, kError);
  send({{"a", 1}}, kError);

  EXPECT_THAT(identifiers(), ElementsAre("Error_Start_1", "Error_Start_2"));
}

TEST_F(HVReportingSessionSendingTest, AnErrorCategoryWithADomainIsNotExempt) {
  send({{"a", 1}}, AudioEventCategory::kToolbox | kError);
  send({{"a", 1}}, AudioEventCategory::kToolbox | kError);

  EXPECT_THAT(identifiers(), ElementsAre("Toolbox_Error_Start_1"));
}

TEST_F(HVReportingSessionSendingTest, AMessageThatEqualsOnlyAnOlderOneIsKept) {
  send({{"a", 1}});
  send({{"b", 1}});
  send({{"a", 1}});

  EXPECT_THAT(identifiers(),
              ElementsAre("Playback_Start_1", "Playback_Start_2", "Playback_Start_3"));
}

TEST_F(HVReportingSessionSendingTest, CategoriesAndTypesDoNotSuppressEachOther) {
  send({{"a", 1}}, kPlayback, kStart);
  send({{"a", 1}}, kPlayback, kStop);
  send({{"a", 1}}, AudioEventCategory::kRecord, kStart);

  EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1", "Playback_Stop_1", "Record_Start_1"));
}

TEST_F(HVReportingSessionSendingTest, OthersInBetweenDoNotEndARepetition) {
  send({{"a", 1}}, kPlayback, kStart);
  send({{"b", 1}}, kPlayback, kStop);
  send({{"a", 1}}, kPlayback, kStart);

  EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1", "Playback_Stop_1"));
}

TEST_F(HVReportingSessionSendingTest, TimeDoesNotEndARepetition) {
  send({{"a", 1}});
  platform_.clock.advance(std::chrono::hours(1));
  send({{"a", 1}});

  EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1"));
}

TEST_F(HVReportingSessionSendingTest, UnreadKeysNeitherThrottleNorExclude) {
  const platform::Key blacklist(kHVReportingSessionBlacklistFieldsKey);
  const platform::Key throttle(kHVReportingSessionThrottleSecondsKey);
  send({{"a", 1}, {blacklist, platform::Array{"a"}}, {throttle, 3600}});
  send({{"a", 2}, {blacklist, platform::Array{"a"}}, {throttle, 3600}});

  EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1", "Playback_Start_2"));
}

TEST_F(HVReportingSessionSendingTest, ReplyIsCalledOnceWithNoneBeforeTheCallReturns) {
  std::vector<std::optional<platform::Error>> replies;

  session_->sendMessage(Dictionary{}, kPlayback, kStart, true,
                        [&replies](const auto& error) { replies.push_back(error); });

  EXPECT_THAT(replies, ElementsAre(std::nullopt));
}

TEST_F(HVReportingSessionSendingTest, CreatingAnIdentifierReturnsWhetherTheMessageWasDropped) {
  const auto history = session_->nestedAggregatedPayloadData();
  const Dictionary message{{"a", 1}};

  EXPECT_FALSE(session_->createMessageIdentifierWithCategory(history, kPlayback, kStart, message));
  EXPECT_TRUE(session_->createMessageIdentifierWithCategory(history, kPlayback, kStart, message));
}

TEST_F(HVReportingSessionSendingTest, WithoutAHistoryNothingIsRecordedAndNothingIsRedundant) {
  session_->stop();
  const auto history = session_->nestedAggregatedPayloadData();

  EXPECT_FALSE(session_->createMessageIdentifierWithCategory(history, kPlayback, kStart, {}));
  EXPECT_FALSE(session_->createMessageIdentifierWithCategory(history, kPlayback, kStart, {}));
  EXPECT_FALSE(history->has_value());
}

// The summary event of the stop is counted like any other message.
TEST_F(HVReportingSessionSendingTest, CountsOfMessagesBalance) {
  send({{"a", 1}});
  send({{"a", 1}});
  session_->stop();
  send({{"a", 1}});

  EXPECT_THAT(platform_.statistics.values("session"),
              UnorderedElementsAre(Pair("received", 4U), Pair("recorded", 2U),
                                   Pair("suppressed: redundant", 1U),
                                   Pair("not recorded: not started", 1U)));
}

TEST_F(HVReportingSessionSendingTest, ASessionWithoutTheLinkSubmitsNothing) {
  session_->stop();

  send({{"a", 1}});

  EXPECT_THAT(platform_.dispatch.createdQueues(), IsEmpty());
}

TEST_F(HVReportingSessionSendingTest, BeforeTheStartAMessageIsSentAsASingleOneASecondLater) {
  session_->stop();
  session_->setTlmReportingEnabled(true);
  session_->setServiceType(AudioServiceType::kHaptics);
  send({{"a", 1}});
  platform_.log.clear();

  platform_.dispatch.runUntilIdle();

  EXPECT_THAT(
      platform_.log.texts(platform::LogLevel::kDebug),
      ElementsAre("entering tlmreporting "
                  "-[HVReportingSession sendMessage:category:type:sync:reply:]_block_invoke",
                  "session not started, will send as a single message",
                  "sending single message after delta 0 for service 3"));
  EXPECT_THAT(platform_.dispatch.delays(), ElementsAre(std::chrono::seconds(1)));
}

TEST_F(HVReportingSessionSendingTest, WhetherItWasStartedCountsAtTheMomentOfSending) {
  session_->stop();
  session_->setTlmReportingEnabled(true);
  send({{"a", 1}});

  session_->start();
  platform_.dispatch.runUntilIdle();

  EXPECT_EQ(platform_.dispatch.delayedJobs(), 1U);
}

TEST_F(HVReportingSessionSendingTest, TheServiceTypeCountsWhenTheJobRuns) {
  session_->stop();
  session_->setTlmReportingEnabled(true);
  send({{"a", 1}});

  session_->setServiceType(AudioServiceType::kAlerts);
  platform_.dispatch.runUntilIdle();

  EXPECT_TRUE(platform_.log.containsText("sending single message after delta 0 for service 10"));
}

TEST_F(HVReportingSessionSendingTest, TheJobKeepsTheSession) {
  session_->stop();
  session_->setTlmReportingEnabled(true);
  send({{"a", 1}});
  platform_.kdebug.clear();

  session_.reset();
  EXPECT_THAT(platform_.kdebug.codes(), IsEmpty());

  platform_.dispatch.runUntilIdle();
  EXPECT_THAT(platform_.kdebug.codes(), ElementsAre(0x21044834));
}

TEST_F(HVReportingSessionSendingTest, MessagesOfARunAreNotComparedWithThoseBeforeTheStart) {
  session_->stop();
  send({{"a", 1}});

  session_->start();
  send({{"a", 1}});

  EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1"));
}

}  // namespace
}  // namespace halvox
