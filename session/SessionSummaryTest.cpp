#include <algorithm>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"
#include "session/SummaryFixture.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Value;
using testing::ElementsAre;
using testing::IsEmpty;

class SessionSummaryTest : public SummaryFixture {
 protected:
  static constexpr int kLongMessages = 1500;

  void restartWithLink(const std::optional<platform::Array>& backends) {
    session_->stop();
    session_->setTlmReportingEnabled(true);
    platform_.tlmReporting.answerDiscoveries(platform::FakeTlmReportingService::Answering::kLater,
                                             backends);
    session_->start();
  }
  // So many that their history goes on outside memory.
  void sendManyLongMessages() {
    std::string text(1000, 'x');
    for (int number = 0; number < kLongMessages; ++number) {
      send({{"foo", std::to_string(number) + text}});
    }
  }
};

// --- the summary event --------------------------------------------------------------------------

TEST_F(SessionSummaryTest, AnEmptyHistoryHasNoSummary) {
  EXPECT_EQ(session_->createSummaryEventForSession(), std::nullopt);
}

TEST_F(SessionSummaryTest, ASessionThatIsNotStartedHasNoSummary) {
  send({{"foo", 1}});
  session_->stop();

  EXPECT_EQ(session_->createSummaryEventForSession(), std::nullopt);
}

TEST_F(SessionSummaryTest, JoinsTheValuesOfAKeyInOrderOfTheHistory) {
  send({{"foo", 1}});
  send({{"foo", 2}});

  EXPECT_EQ(session_->createSummaryEventForSession(),
            platform::Message(Dictionary{{"HV_Session_Summary_Event", "3"},
                                         {"foo", "1,2"},
                                         {"audiotag", "PlaybackStart,PlaybackStart"}}));
}

TEST_F(SessionSummaryTest, KeysThatOnlySomeMessagesHaveAreJoinedToo) {
  send({{"foo", 1}, {"bar", "x"}});
  send({{"other", true}});
  send({{"bar", "y"}, {"foo", 2}});

  const Dictionary summary = *session_->createSummaryEventForSession();

  EXPECT_EQ(*summary.find("foo"), Value("1,2"));
  EXPECT_EQ(*summary.find("bar"), Value("x,y"));
  EXPECT_EQ(*summary.find("other"), Value("1"));
}

TEST_F(SessionSummaryTest, NumbersAreInTheirShortestForm) {
  send({{"n", 0.1}});
  send({{"n", 48000.0}});
  send({{"n", std::int64_t{-7}}});
  send({{"n", 1.0F / 3}});

  EXPECT_EQ(*session_->createSummaryEventForSession()->find("n"), Value("0.1,48000,-7,0.33333334"));
}

TEST_F(SessionSummaryTest, ValuesThatRepeatAreThereEachTime) {
  const Dictionary repeated{{"empty", ""}, {"comma", "a,"}, {"number", 0.5}, {"flag", true}};
  for (int number = 1; number <= 3; ++number) {
    Dictionary message = repeated;
    message.set("different", number);
    send(message);
  }
  send({{"number", 7}});
  send({{"number", 7}, {"different", 4}});

  const Dictionary summary = *session_->createSummaryEventForSession();

  EXPECT_EQ(*summary.find("empty"), Value(",,"));
  EXPECT_EQ(*summary.find("comma"), Value("a,,a,,a,"));
  EXPECT_EQ(*summary.find("number"), Value("0.5,0.5,0.5,7,7"));
  EXPECT_EQ(*summary.find("flag"), Value("1,1,1"));
  EXPECT_EQ(*summary.find("different"), Value("1,2,3,4"));
}

TEST_F(SessionSummaryTest, ContainersAreShownAsTheLogShowsThem) {
  send({{"list", platform::Array{1, "x"}}});
  send({{"list", Dictionary{{"k", 2}}}});
  send({{"list", ""}});

  EXPECT_EQ(*session_->createSummaryEventForSession()->find("list"), Value("(1, x),{k = 2},"));
}

TEST_F(SessionSummaryTest, AClientsOwnSummaryKeyFollowsTheServiceType) {
  send({{"HV_Session_Summary_Event", "mine"}});

  EXPECT_EQ(*session_->createSummaryEventForSession()->find("HV_Session_Summary_Event"),
            Value("3,mine"));
}

// --- stop ---------------------------------------------------------------------------------------

TEST_F(SessionSummaryTest, StopOfAnEmptyRunReportsNothing) {
  platform_.journal.clear();

  session_->stop();

  EXPECT_THAT(platform_.journal.texts(),
              ElementsAre("ending session 7", "ending session 7", "0x21044830"));
}

TEST_F(SessionSummaryTest, StopWithoutStartReportsNothing) {
  session_->stop();
  platform_.journal.clear();

  session_->stop();

  EXPECT_THAT(platform_.journal.texts(), ElementsAre("ending session 7"));
}

TEST_F(SessionSummaryTest, WithoutVolumeThereIsASummaryEventAlone) {
  send({{"foo", 1}});
  platform_.journal.clear();
  platform_.log.clear();

  session_->stop();

  EXPECT_THAT(platform_.journal.texts(),
              ElementsAre("ending session 7", "ending session 7", "0x21044830",
                          "sending summary event for reporter 7",
                          "sending message for session owned by 7", "0x21044838"));
  EXPECT_THAT(platform_.log.texts(platform::LogLevel::kDefault),
              ElementsAre("sending summary event for reporter 7"));
  EXPECT_EQ(platform_.log.lines().back().category, "hvrr");
}

TEST_F(SessionSummaryTest, StopStepsInOrder) {
  playTwoVolumes();
  platform_.analytics.wantOnly({"com.tarno.halvox.Volume.Summary"});
  platform_.journal.clear();

  session_->stop();

  const std::string send = "sending message for session owned by 7";
  const std::string ofAll = "com.tarno.halvox.Volume.Summary";
  const std::string ofService = "com.tarno.haptics.Volume.Summary";
  EXPECT_THAT(platform_.journal.texts(),
              ElementsAre("ending session 7", "ending session 7", "0x21044830",
                          "sending volume event for reporter 7",        //
                          send, "0x21044838", ofAll, ofAll, ofService,  //
                          send, "0x21044838", ofAll, ofAll, ofService,  //
                          "sending summary event for reporter 7", send, "0x21044838"));
}

TEST_F(SessionSummaryTest, VolumeIsLoggedAtDefaultLevelOnce) {
  playTwoVolumes();
  platform_.log.clear();

  session_->stop();

  EXPECT_THAT(
      platform_.log.texts(platform::LogLevel::kDefault),
      ElementsAre("sending volume event for reporter 7", "sending summary event for reporter 7"));
}

TEST_F(SessionSummaryTest, VolumeMessagesThatCannotBeReadAreNotAnnounced) {
  session_ = std::make_shared<HVReportingSession>(ReporterID{7},
                                                  HVReportingSession::ProcessIdentifiers{12},
                                                  SessionCounters::make(platform_.statistics));
  session_->chargeTo(std::make_shared<ResourceAccount>());
  platform_.overflow.setMemoryPerClient(0);
  session_->start();
  for (int number = 0; number < 1000; ++number) playing(number % 2 == 0 ? 0.25 : 0.75, number);
  platform_.overflow.setReadError(platform::Error{.description = "bad block"});
  platform_.log.clear();

  session_->stop();

  EXPECT_THAT(platform_.log.texts(platform::LogLevel::kDefault),
              ElementsAre("sending summary event for reporter 7"));
  EXPECT_THAT(platform_.log.texts(platform::LogLevel::kError),
              ElementsAre("cannot read the rest of the history of reporter 7: bad block; the "
                          "summary lacks the remaining messages"));
}

TEST_F(SessionSummaryTest, AnalyticsGetTheVolumeMessagesUntagged) {
  playTwoVolumes();

  session_->stop();

  const auto events = platform_.analytics.events("com.tarno.halvox.Volume.Summary");
  ASSERT_EQ(events.size(), 2U);
  EXPECT_EQ(*events[0].payload, (Dictionary{{"session_selected_format", "Unknown"},
                                            {"active_devices", "Unknown"},
                                            {"RQSessionVolumeOperationProcess", "Unknown"},
                                            {"RQSessionVolume", 0.5},
                                            {"RQSessionVolumeBucketed", "0.5"},
                                            {"play_seconds", 10},
                                            {"play_secondsBucketed", "10"},
                                            {"HostApplicationDisplayID", "Unknown"}}));
  EXPECT_EQ(*events[1].payload->find("RQSessionVolume"), Value(0.75));
}

TEST_F(SessionSummaryTest, AnalyticsGetNoSummaryEvent) {
  send({{"foo", 1}});

  session_->stop();

  EXPECT_THAT(platform_.analytics.sentNames(), IsEmpty());
}

// The minimum playing time is half a second.
TEST_F(SessionSummaryTest, VolumesOfHalfASecondAreNotReported) {
  playing(0.5, 10);
  playing(0.75, 10.5);
  silent(11.25);

  session_->stop();

  const auto events = platform_.analytics.events("com.tarno.halvox.Volume.Summary");
  ASSERT_EQ(events.size(), 1U);
  EXPECT_EQ(*events[0].payload->find("RQSessionVolume"), Value(0.75));
}

TEST_F(SessionSummaryTest, TheLinkGetsVolumeMessagesThenTheSummaryThenTheFlush) {
  session_->stop();
  session_->setTlmReportingEnabled(true);
  platform_.tlmReporting.answerDiscoveries(platform::FakeTlmReportingService::Answering::kLater,
                                           platform::Array{"server"});
  session_->start();
  playTwoVolumes();
  platform_.dispatch.runUntilIdle();
  platform_.journal.clear();

  session_->stop();
  platform_.dispatch.runUntilIdle();

  EXPECT_THAT(platform_.journal.texts(platform::JournalKind::kLink),
              ElementsAre("send session 1 14/11", "send session 1 14/11",
                          "send session 1 65535/65535", "flush session 1"));
  EXPECT_EQ(*platform_.tlmReporting.messages().back().payload.find("audiotag"),
            Value("UndefinedUnknown"));
}

TEST_F(SessionSummaryTest, TheSummaryHasAllBitsOfItsCategoryAndTypeSet) {
  session_->stop();
  session_->setTlmReportingEnabled(true);
  platform_.tlmReporting.answerDiscoveries(platform::FakeTlmReportingService::Answering::kLater,
                                           platform::Array{"server"});
  session_->start();
  send({{"foo", 1}});

  session_->stop();
  platform_.dispatch.runUntilIdle();

  const auto lines = platform_.log.texts(platform::LogLevel::kDebug);
  EXPECT_EQ(
      std::ranges::count_if(
          lines, [](const auto& text) { return text.ends_with(" : category -1 : type 65535"); }),
      1);
}

// All clients wait for a stop, and making the event of a long history takes long.
TEST_F(SessionSummaryTest, TheLinksJobMakesTheEventAndReleasesTheHistory) {
  restartWithLink(platform::Array{"server"});
  sendManyLongMessages();

  session_->stop();
  EXPECT_FALSE(session_->started());
  EXPECT_GT(platform_.overflow.keptBytes(), 0U);
  platform_.dispatch.runUntilIdle();

  EXPECT_EQ(platform_.overflow.keptBytes(), 0U);
  const Dictionary summary = platform_.tlmReporting.messages().back().payload;
  EXPECT_EQ(std::ranges::count(summary.find("foo")->string(), ','), kLongMessages - 1);
}

TEST_F(SessionSummaryTest, AShortSummaryIsSentBeforeTheStopReturns) {
  platform_.dispatch.letThreadsEnter();
  platform_.tlmReporting.setOnlyNotesMessages(true);
  restartWithLink(platform::Array{"server"});
  platform_.dispatch.runUntilIdle();
  for (int number = 0; number < 2000; ++number) send({{"foo", number}});

  session_->stop();

  const Dictionary summary = platform_.tlmReporting.messages().back().payload;
  ASSERT_TRUE(summary.contains("HV_Session_Summary_Event"));
  EXPECT_EQ(std::ranges::count(summary.find("foo")->string(), ','), 1999);
}

TEST_F(SessionSummaryTest, ALongSummaryIsNotMadeDuringTheStop) {
  platform_.dispatch.letThreadsEnter();
  platform_.tlmReporting.setOnlyNotesMessages(true);
  restartWithLink(platform::Array{"server"});
  platform_.dispatch.runUntilIdle();
  for (int number = 0; number < 2001; ++number) send({{"foo", number}});

  session_->stop();
  EXPECT_EQ(platform_.tlmReporting.messages().size(), 2001U);
  platform_.dispatch.runUntilIdle();

  EXPECT_EQ(platform_.tlmReporting.messages().size(), 2002U);
}

TEST_F(SessionSummaryTest, OneLongSummaryAtATimeIsMade) {
  restartWithLink(platform::Array{"server"});
  for (int number = 0; number < 2001; ++number) send({{"foo", number}});
  const auto first = session_;
  session_ = std::make_shared<HVReportingSession>(ReporterID{8},
                                                  HVReportingSession::ProcessIdentifiers{12},
                                                  SessionCounters::make(platform_.statistics));
  restartWithLink(platform::Array{"server"});
  for (int number = 0; number < 2001; ++number) send({{"foo", number}});
  platform_.dispatch.runUntilIdle();
  const std::size_t before = platform_.tlmReporting.messages().size();
  // When the first summary is about to be made, all other jobs that can run do so.
  const auto other = platform_.dispatch.createSerialQueue(
      "other", platform::QualityOfService::kUtility, platform::QueueThreading::kShared);
  int begun = 0;
  int begunMeanwhile = 0;
  platform_.journal.whenRecorded([&](const platform::JournalEntry& entry) {
    const bool isSending = entry.text.find("-[HVReportingSession sendMessage") != std::string::npos;
    if (!isSending || ++begun > 1) return;
    const auto done = platform_.dispatch.createSemaphore(0);
    other->async(platform::JobWeight::kBrief, [done] { done->signal(); });
    done->wait();
    begunMeanwhile = begun - 1;
  });

  first->stop();
  session_->stop();
  platform_.dispatch.runUntilIdle();
  platform_.journal.whenRecorded(nullptr);

  EXPECT_EQ(begunMeanwhile, 0);
  EXPECT_EQ(begun, 2);
  EXPECT_EQ(platform_.dispatch.waitingQueues(), 0U);
  EXPECT_EQ(platform_.tlmReporting.messages().size(), before + 2);
}

TEST_F(SessionSummaryTest, ARunThatBeginsMeanwhileHasNoPartInTheEvent) {
  restartWithLink(platform::Array{"server"});
  send({{"foo", 1}});
  session_->stop();

  session_->setServiceType(AudioServiceType::kAlarms);
  session_->start();
  send({{"foo", 2}});
  platform_.dispatch.runUntilIdle();

  const Dictionary summary = platform_.tlmReporting.messages().at(1).payload;
  EXPECT_EQ(*summary.find("foo"), Value("1"));
  EXPECT_EQ(*summary.find("HV_Session_Summary_Event"), Value("3"));
}

TEST_F(SessionSummaryTest, WithoutALinkNoEventIsMade) {
  sendManyLongMessages();
  platform_.overflow.setReadError(platform::Error{.description = "bad block"});

  session_->stop();

  EXPECT_EQ(platform_.overflow.keptBytes(), 0U);
  EXPECT_THAT(platform_.log.texts(platform::LogLevel::kError), IsEmpty());
}

TEST_F(SessionSummaryTest, WithoutABackendNoEventIsMade) {
  restartWithLink(std::nullopt);
  platform_.dispatch.runUntilIdle();
  platform_.log.clear();
  sendManyLongMessages();
  platform_.overflow.setReadError(platform::Error{.description = "bad block"});

  session_->stop();
  platform_.dispatch.runUntilIdle();

  EXPECT_EQ(platform_.overflow.keptBytes(), 0U);
  EXPECT_THAT(platform_.log.texts(platform::LogLevel::kError), IsEmpty());
}

TEST_F(SessionSummaryTest, AnEventOfADamagedHistorySaysSo) {
  restartWithLink(platform::Array{"server"});
  sendManyLongMessages();
  platform_.overflow.setReadError(platform::Error{.description = "bad block"});

  session_->stop();
  platform_.dispatch.runUntilIdle();

  EXPECT_THAT(platform_.log.texts(platform::LogLevel::kError),
              ElementsAre("cannot read the rest of the history of reporter 7: bad block; the "
                          "summary lacks the remaining messages"));
}

TEST_F(SessionSummaryTest, TheEventCountsAsARecordedMessage) {
  send({{"foo", 1}});
  const auto recorded = [this] {
    return platform_.statistics.counter("session", "recorded").value();
  };
  const auto before = recorded();

  session_->stop();

  EXPECT_EQ(recorded(), before + 1);
}

TEST_F(SessionSummaryTest, VolumesThatNeverPlayedSendNoVolumeEvent) {
  sendVolume(0.5, 0, 10);
  sendVolume(0.75, 0, 20);
  sendVolume(0.5, 0, 30);

  session_->stop();

  EXPECT_THAT(platform_.log.texts(platform::LogLevel::kDefault),
              ElementsAre("sending summary event for reporter 7"));
  EXPECT_THAT(platform_.analytics.sentNames(), IsEmpty());
}

TEST_F(SessionSummaryTest, TheSummaryCoversTheVolumeMessages) {
  session_->setTlmReportingEnabled(true);
  playTwoVolumes();
  platform_.tlmReporting.answerDiscoveries(platform::FakeTlmReportingService::Answering::kLater,
                                           platform::Array{"server"});
  session_->stop();
  session_->start();
  playTwoVolumes();

  session_->stop();
  platform_.dispatch.runUntilIdle();

  const Dictionary summary = platform_.tlmReporting.messages().back().payload;
  EXPECT_EQ(*summary.find("play_seconds"), Value("10,5"));
  EXPECT_EQ(*summary.find("RQSessionVolume"), Value("0.5,0.75,0.75,0.5,0.75"));
}

TEST_F(SessionSummaryTest, EqualVolumeMessagesInARowAreRecordedOnce) {
  playing(0.5, 10);
  silent(20);
  playing(0.5, 30);
  silent(40);
  platform_.log.clear();

  session_->stop();

  EXPECT_TRUE(platform_.log.containsText("dropping redundant event"));
  EXPECT_EQ(platform_.analytics.events("com.tarno.halvox.Volume.Summary").size(), 2U);
}

TEST_F(SessionSummaryTest, OnOtherThanInternalBuildsNoFileIsWritten) {
  send({{"foo", 1}});

  session_->stop();

  EXPECT_THAT(platform_.files.steps(), IsEmpty());
}

}  // namespace
}  // namespace halvox
