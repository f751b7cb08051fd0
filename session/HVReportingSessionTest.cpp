#include "session/HVReportingSession.h"

#include <chrono>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HistoryFixture.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::JournalEntry;
using platform::LogLevel;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr ReporterID kReporter{7};

class HVReportingSessionTest : public testing::Test {
 protected:
  std::shared_ptr<HVReportingSession> makeSession(HVReportingSession::ProcessIdentifiers pids = {
                                                      12, 13}) {
    return std::make_shared<HVReportingSession>(kReporter, std::move(pids),
                                                SessionCounters::make(platform_.statistics));
  }
  static void send(HVReportingSession& session, int value) {
    session.sendMessage(Dictionary{{"a", value}}, AudioEventCategory::kPlayback,
                        AudioEventType::kStart, nullptr);
  }
  std::vector<JournalEntry> steps() const {
    return platform_.journal.entries(
        {platform::JournalKind::kLogLine, platform::JournalKind::kTracePoint});
  }
  void forgetSteps() {
    platform_.journal.clear();
    platform_.log.clear();
    platform_.kdebug.clear();
  }
  static JournalEntry line(std::string text) {
    return {platform::JournalKind::kLogLine, std::move(text)};
  }
  static JournalEntry point(std::string code) {
    return {platform::JournalKind::kTracePoint, std::move(code)};
  }

  platform::FakePlatform platform_;
};

TEST_F(HVReportingSessionTest, CreationLogsThenEmitsItsTracePoint) {
  const auto session = makeSession();

  EXPECT_THAT(steps(),
              ElementsAre(line("created reporting session for ID: 7"), point("0x21044828")));
  EXPECT_EQ(platform_.log.lines()[0].level, LogLevel::kInfo);
}

TEST_F(HVReportingSessionTest, LinesGoToTheSessionsCategoryUnderItsName) {
  const auto session = makeSession();

  const auto logged = platform_.log.lines()[0];
  EXPECT_EQ(logged.subsystem, "com.tarno.halvox");
  EXPECT_EQ(logged.category, "hvrr");
  EXPECT_EQ(logged.line.substr(0, 26), "       HVReportingSession:");
}

TEST_F(HVReportingSessionTest, TracePointsHaveFourZeroArguments) {
  const auto session = makeSession();

  const platform::FakeKdebugService::Point expected{0x21044828, {0, 0, 0, 0}};
  EXPECT_THAT(platform_.kdebug.points(), ElementsAre(expected));
}

TEST_F(HVReportingSessionTest, NewSessionHasItsIdentityAndNothingElse) {
  const auto session = makeSession();

  EXPECT_EQ(session->reporterID(), kReporter);
  EXPECT_THAT(session->processIdentifiers(), ElementsAre(12, 13));
  EXPECT_EQ(session->serviceType(), AudioServiceType::kUnknown);
  EXPECT_EQ(session->serviceName(), "unknown");
  EXPECT_TRUE(session->configuration().empty());
  EXPECT_FALSE(session->started());
  EXPECT_FALSE(session->tlmReportingEnabled());
  EXPECT_FALSE(session->transactionCompleteBlock());
  EXPECT_FALSE(session->nestedAggregatedPayloadData()->has_value());
  EXPECT_THAT(platform_.dispatch.createdQueues(), IsEmpty());
}

TEST_F(HVReportingSessionTest, DescriptionOfANewSession) {
  EXPECT_EQ(makeSession()->description(),
            "reporterID=7,serviceName=unknown,ownerPid=12,HostApplicationDisplayID=Unknown,"
            "started=0");
}

TEST_F(HVReportingSessionTest, DescriptionFollowsTheState) {
  const auto session = makeSession();
  session->setServiceType(AudioServiceType::kHaptics);
  session->setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.player"}});
  session->start();

  EXPECT_EQ(session->description(),
            "reporterID=7,serviceName=haptics,ownerPid=12,"
            "HostApplicationDisplayID=com.example.player,started=1");
}

TEST_F(HVReportingSessionTest, DescriptionWithoutProcessesNamesPidZero) {
  EXPECT_EQ(makeSession({})->description(),
            "reporterID=7,serviceName=unknown,ownerPid=0,HostApplicationDisplayID=Unknown,"
            "started=0");
}

TEST_F(HVReportingSessionTest, SettingTheServiceTypeSetsTheNameAndLogsIt) {
  const auto session = makeSession();

  session->setServiceType(AudioServiceType::kTelephony);

  EXPECT_EQ(session->serviceType(), AudioServiceType::kTelephony);
  EXPECT_EQ(session->serviceName(), "telephony");
  EXPECT_THAT(platform_.log.texts(LogLevel::kInfo),
              ElementsAre("created reporting session for ID: 7", "setting service type telephony"));
}

TEST_F(HVReportingSessionTest, AnUnlistedServiceTypeIsCalledTelephony) {
  const auto session = makeSession();

  session->setServiceType(AudioServiceType{14});

  EXPECT_EQ(session->serviceType(), AudioServiceType{14});
  EXPECT_EQ(session->serviceName(), "telephony");
}

TEST_F(HVReportingSessionTest, SetConfigurationKeepsTheUnionWithTheSecondValueWinning) {
  const auto session = makeSession();

  session->setConfiguration(Dictionary{{"a", 1}, {"b", 1}});
  session->setConfiguration(Dictionary{{"b", 2}, {"c", 2}});

  EXPECT_EQ(session->configuration(), (Dictionary{{"a", 1}, {"b", 2}, {"c", 2}}));
}

TEST_F(HVReportingSessionTest, SetConfigurationWithNoneChangesNothing) {
  const auto session = makeSession();
  session->setConfiguration(Dictionary{{"a", 1}});

  session->setConfiguration(std::nullopt);

  EXPECT_EQ(session->configuration(), (Dictionary{{"a", 1}}));
}

TEST_F(HVReportingSessionTest, UpdateConfigurationMergesToo) {
  const auto session = makeSession();

  session->updateConfigurationWithContentsOfConfiguration({{"a", 1}, {"b", 1}});
  session->updateConfigurationWithContentsOfConfiguration({{"b", 2}});

  EXPECT_EQ(session->configuration(), (Dictionary{{"a", 1}, {"b", 2}}));
}

TEST_F(HVReportingSessionTest, AConfigurationThatWasReadDoesNotChangeUnderItsReader) {
  const auto session = makeSession();
  session->setConfiguration(Dictionary{{"a", 1}});
  const Dictionary read = session->configuration();

  session->setConfiguration(Dictionary{{"a", 2}});

  EXPECT_EQ(read, (Dictionary{{"a", 1}}));
  EXPECT_EQ(session->configuration(), (Dictionary{{"a", 2}}));
}

TEST_F(HVReportingSessionTest, NeverReportsOrientation) {
  const auto session = makeSession();
  EXPECT_FALSE(session->shouldReportOrientation());
  session->start();
  EXPECT_FALSE(session->shouldReportOrientation());
}

TEST_F(HVReportingSessionTest, OffersTheKeysThatAreNotRead) {
  EXPECT_EQ(kHVReportingSessionBlacklistFieldsKey, "_comparison_field_blacklist");
  EXPECT_EQ(kHVReportingSessionThrottleSecondsKey, "_throttle_seconds");
}

TEST_F(HVReportingSessionTest, StartBeginsAnEmptyHistory) {
  const auto session = makeSession();

  session->start();

  EXPECT_TRUE(session->started());
  ASSERT_TRUE(session->nestedAggregatedPayloadData()->has_value());
  EXPECT_TRUE((*session->nestedAggregatedPayloadData())->empty());
}

TEST_F(HVReportingSessionTest, StartLogsThenEmitsItsTracePoint) {
  const auto session = makeSession();
  forgetSteps();

  session->start();

  EXPECT_THAT(steps(), ElementsAre(line("starting session owned by 7"), point("0x2104482C")));
  EXPECT_THAT(platform_.log.texts(LogLevel::kDebug), ElementsAre("starting session owned by 7"));
}

TEST_F(HVReportingSessionTest, SecondStartOnlyLogs) {
  const auto session = makeSession();
  session->start();
  send(*session, 1);
  forgetSteps();

  session->start();

  EXPECT_THAT(steps(),
              ElementsAre(line("starting session owned by 7"), line("7 is already started")));
  EXPECT_THAT(platform_.log.texts(LogLevel::kInfo), ElementsAre("7 is already started"));
  EXPECT_EQ((*session->nestedAggregatedPayloadData())->size(), 1U);
}

TEST_F(HVReportingSessionTest, StopLogsTwiceThenEmitsItsTracePoint) {
  const auto session = makeSession();
  session->start();
  forgetSteps();

  session->stop();

  EXPECT_THAT(steps(),
              ElementsAre(line("ending session 7"), line("ending session 7"), point("0x21044830")));
  EXPECT_EQ(platform_.log.texts(LogLevel::kDebug).size(), 2U);
  EXPECT_FALSE(session->started());
  EXPECT_FALSE(session->nestedAggregatedPayloadData()->has_value());
}

TEST_F(HVReportingSessionTest, StopWithoutStartOnlyLogsOnce) {
  const auto session = makeSession();
  forgetSteps();

  session->stop();

  EXPECT_THAT(steps(), ElementsAre(line("ending session 7")));
  EXPECT_THAT(platform_.analytics.sentNames(), IsEmpty());
}

TEST_F(HVReportingSessionTest, RestartForgetsHistoryOfPreviousRun) {
  const auto session = makeSession();
  session->start();
  send(*session, 1);
  session->stop();

  session->start();
  send(*session, 1);

  const auto history = session->nestedAggregatedPayloadData();
  ASSERT_EQ((*history)->size(), 1U);
  EXPECT_EQ(messagesOf(**history)[0].identifier, "Playback_Start_1");
  EXPECT_EQ((*history)->count("Playback_Start"), 1U);
}

TEST_F(HVReportingSessionTest, StopKeepsTypeAndConfiguration) {
  const auto session = makeSession();
  session->setServiceType(AudioServiceType::kHaptics);
  session->setConfiguration(Dictionary{{"a", 1}});
  session->start();

  session->stop();

  EXPECT_EQ(session->serviceName(), "haptics");
  EXPECT_EQ(session->configuration(), (Dictionary{{"a", 1}}));
}

TEST_F(HVReportingSessionTest, DestructionEmitsItsTracePointThenLogs) {
  auto session = makeSession();
  forgetSteps();

  session.reset();

  EXPECT_THAT(steps(), ElementsAre(point("0x21044834"), line("deallocing this session 7")));
  EXPECT_THAT(platform_.log.texts(LogLevel::kInfo), ElementsAre("deallocing this session 7"));
}

TEST_F(HVReportingSessionTest, DestructionOfAStartedSessionDoesNotStopIt) {
  auto session = makeSession();
  session->start();
  forgetSteps();

  session.reset();

  EXPECT_THAT(platform_.kdebug.codes(), ElementsAre(0x21044834));
}

TEST_F(HVReportingSessionTest, ATransactionCompleteBlockIsTakenOnceAndNeverCalledByTheSession) {
  const auto session = makeSession();
  int calls = 0;
  session->setTransactionCompleteBlock([&calls](const auto&, bool) { ++calls; });
  session->start();
  session->stop();
  EXPECT_EQ(calls, 0);
  EXPECT_TRUE(session->transactionCompleteBlock());

  const BoolReply taken = session->takeTransactionCompleteBlock();

  EXPECT_TRUE(taken);
  EXPECT_FALSE(session->transactionCompleteBlock());
}

TEST_F(HVReportingSessionTest, AReplyDestroyedWithItsSessionIsCounted) {
  auto session = makeSession();
  session->setTransactionCompleteBlock([](const auto&, bool) {});

  session.reset();

  EXPECT_EQ(platform_.statistics.value("start replies", "dropped: session released"), 1U);
}

TEST_F(HVReportingSessionTest, TheQueueIsMadeAtItsFirstUseAndKept) {
  const auto session = makeSession();

  const auto queue = session->link().tlmReportingQueue();

  EXPECT_EQ(session->link().tlmReportingQueue(), queue);
  ASSERT_EQ(platform_.dispatch.createdQueues().size(), 1U);
  const auto traits = platform_.dispatch.createdQueues()[0];
  EXPECT_EQ(traits.label, "com.tarno.halvox.session.tlmreporting");
  EXPECT_EQ(traits.quality, platform::QualityOfService::kUtility);
  EXPECT_EQ(traits.threading, platform::QueueThreading::kShared);
}

TEST_F(HVReportingSessionTest, ChargesHistoryAndConfigurationToItsAccount) {
  const auto account = std::make_shared<ResourceAccount>();
  const auto session = makeSession();
  session->chargeTo(account);
  session->setConfiguration(Dictionary{{"a", std::string(1000, 'x')}});
  const auto configured = account->use().bytes;
  EXPECT_GE(configured, 1000U);

  session->start();
  send(*session, 1);

  EXPECT_EQ(account->use().bytes,
            configured + (*session->nestedAggregatedPayloadData())->memorySize());
}

TEST_F(HVReportingSessionTest, StopGivesTheHistoryBackAndDestructionTheRest) {
  const auto account = std::make_shared<ResourceAccount>();
  auto session = makeSession();
  session->chargeTo(account);
  session->setConfiguration(Dictionary{{"a", std::string(1000, 'x')}});
  const auto configured = account->use().bytes;
  session->start();
  send(*session, 1);

  session->stop();
  EXPECT_EQ(account->use().bytes, configured);

  session.reset();
  EXPECT_EQ(account->use().bytes, 0U);
}

// Categories without a text share the base "Undefined". A repetition under a second such category
// records only the new code.
TEST_F(HVReportingSessionTest, RepetitionsUnderAnotherCodeOfTheSameTextAreChargedToo) {
  const auto account = std::make_shared<ResourceAccount>();
  const auto session = makeSession();
  session->chargeTo(account);
  session->start();
  const Dictionary message{{"a", 1}};
  const auto type = AudioEventType::kStart;

  session->sendMessage(message, static_cast<AudioEventCategory>(16), type, nullptr);
  session->sendMessage(message, static_cast<AudioEventCategory>(17), type, nullptr);

  EXPECT_EQ(account->use().bytes, (*session->nestedAggregatedPayloadData())->memorySize());
  session->stop();
  EXPECT_EQ(account->use().bytes, 0U);
}

// A thread that holds the history blocks a start only after the session is marked as started.
TEST_F(HVReportingSessionTest, StartSetsTheFlagBeforeItMakesTheHistory) {
  const auto session = makeSession();
  std::jthread starter;
  {
    const auto history = session->nestedAggregatedPayloadData();
    starter = std::jthread([session] { session->start(); });
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    while (!session->started() && std::chrono::steady_clock::now() < deadline) {
      std::this_thread::yield();
    }
    EXPECT_TRUE(session->started());
    EXPECT_FALSE(history->has_value());
  }
  starter.join();
  EXPECT_TRUE(session->nestedAggregatedPayloadData()->has_value());
}

// Checked by ThreadSanitizer: other threads build payloads from sessions.
TEST_F(HVReportingSessionTest, PropertiesMayBeReadWhileTheyAreWritten) {
  const auto session = makeSession();
  platform_.log.setLevel(LogLevel::kError);
  std::jthread reader([session](const std::stop_token& stop) {
    while (!stop.stop_requested()) {
      const std::size_t entries = session->configuration().size();
      EXPECT_TRUE(entries == 0 || entries == 2);
      EXPECT_FALSE(session->description().empty());
      static_cast<void>(session->tlmReportingEnabled());
      static_cast<void>(session->transactionCompleteBlock());
    }
  });

  for (int round = 0; round < 300; ++round) {
    session->setConfiguration(Dictionary{{"a", round}, {"b", round}});
    session->setServiceType(AudioServiceType::kAlerts);
    session->setTlmReportingEnabled(round % 2 == 0);
    session->setTransactionCompleteBlock([](const auto&, bool) {});
    session->start();
    send(*session, round);
    session->stop();
  }
}

}  // namespace
}  // namespace halvox
