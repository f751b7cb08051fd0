#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::JournalKind;
using platform::LogLevel;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::UnorderedElementsAre;
using namespace std::chrono_literals;

using Fake = platform::FakeTlmReportingService;
using Line = std::pair<LogLevel, std::string>;

constexpr auto kPlayback = AudioEventCategory::kPlayback;
constexpr auto kStart = AudioEventType::kStart;
const Array kServers{"server 1", "server 2"};

const Line kStartEntered{LogLevel::kDebug,
                         "entering tlmreporting -[HVReportingSession start]_block_invoke"};
const Line kStopEntered{LogLevel::kDebug,
                        "entering tlmreporting -[HVReportingSession stop]_block_invoke"};
const Line kClosed{LogLevel::kDebug, "stopping and setting session to nil"};
const Line kWaiting{LogLevel::kDefault, "waiting to find backends"};
const Line kTimedOut{LogLevel::kDefault, "timed out waiting for backends"};
const Line kList{LogLevel::kDefault, "list of backends (server 1, server 2)"};
const Line kContinuing{LogLevel::kDefault, "continuing with backends!"};
const Line kNone{LogLevel::kError, "no backends found, this session won't get sent to the server"};
const Line kFailed{LogLevel::kDefault, "failed to find backend"};
const char* const kMessageEntered =
    "entering tlmreporting "
    "-[HVReportingSession sendMessage:category:type:sync:reply:]_block_invoke";

class HVReportingSessionLinkTest : public testing::Test {
 protected:
  HVReportingSessionLinkTest() {
    session_->setServiceType(AudioServiceType::kHaptics);
    session_->setTlmReportingEnabled(true);
  }

  void run() { platform_.dispatch.runUntilIdle(); }
  void start() {
    session_->start();
    run();
  }
  void stop() {
    session_->stop();
    run();
  }
  // From now on discoveries wait for the test.
  void holdDiscoveries() { framework_.answerDiscoveries(Fake::Answering::kWhenTold); }
  void open() {
    framework_.answerDiscoveries(Fake::Answering::kBeforeReturning, kServers);
    start();
  }
  void send(const Dictionary& message, AudioEventCategory category = kPlayback,
            AudioEventType type = kStart) {
    session_->sendMessage(message, category, type, nullptr);
  }
  // What the session logged of its link since the last call, apart from messages.
  std::vector<Line> linkLines() {
    std::vector<Line> result;
    for (const auto& line : platform_.log.lines()) {
      if (line.category == "hvri") result.emplace_back(line.level, line.text);
    }
    platform_.log.clear();
    return result;
  }
  std::vector<std::string> frameworkSteps() const {
    return platform_.journal.texts(JournalKind::kLink);
  }
  std::vector<Dictionary> payloads() const {
    std::vector<Dictionary> result;
    for (const auto& message : framework_.messages()) result.push_back(message.payload);
    return result;
  }
  // Whether the link is down and forgotten.
  bool holdsNothing() const {
    return session_->tlmReportingSession() == nullptr &&
           session_->tlmReportingAgentToken() == nullptr;
  }

  platform::FakePlatform platform_;
  Fake& framework_ = platform_.tlmReporting;
  std::shared_ptr<HVReportingSession> session_ = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12});
};

// --- start --------------------------------------------------------------------------------------

TEST_F(HVReportingSessionLinkTest, StartOnlySubmitsItsJob) {
  session_->start();

  EXPECT_THAT(frameworkSteps(), IsEmpty());
  EXPECT_EQ(platform_.dispatch.waitingJobs(), 1U);
  EXPECT_THAT(platform_.dispatch.weights("com.tarno.halvox.session.tlmreporting"),
              ElementsAre(platform::JobWeight::kMayBlock));
}

TEST_F(HVReportingSessionLinkTest, ASessionWithoutTheLinkHasNoQueueAndAsksForNothing) {
  session_->setTlmReportingEnabled(false);

  start();
  send({{"a", 1}});
  stop();

  EXPECT_THAT(platform_.dispatch.createdQueues(), IsEmpty());
  EXPECT_THAT(frameworkSteps(), IsEmpty());
}

TEST_F(HVReportingSessionLinkTest, StartJobStepsInOrder) {
  holdDiscoveries();
  platform_.journal.clear();
  platform_.log.clear();

  start();

  EXPECT_THAT(
      platform_.journal.texts(),
      ElementsAre("starting session owned by 7", "0x2104482C", kStartEntered.second,
                  "create token 1", "create session 1", "configure session 1", kWaiting.second));
  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting));
}

TEST_F(HVReportingSessionLinkTest, LinesGoToTheLinksCategoryUnderTheSessionsName) {
  platform_.log.clear();

  start();

  const auto line = platform_.log.lines(LogLevel::kError).at(0);
  EXPECT_EQ(line.subsystem, "com.tarno.halvox");
  EXPECT_EQ(line.category, "hvri");
  EXPECT_EQ(line.line.substr(0, 26), "       HVReportingSession:");
}

TEST_F(HVReportingSessionLinkTest, TheSessionInfoTellsWhatTheLinkIs) {
  open();

  EXPECT_EQ(framework_.sessions().at(0).sessionInfo,
            (Dictionary{{"TLMReportingSessionInfoClientType", 19},
                        {"TLMReportingSessionInfoClientVersion", 2.1},
                        {"TLMReportingSessionInfoSessionID", 7},
                        {"TLMReportingSessionInfoBatchEvent", true},
                        {"TLMReportingSessionInfoHierarchyToken", "token 1"},
                        {"TLMReportingSessionInfoContainsRealtimeEvents", false}}));
  EXPECT_EQ(framework_.sessions().at(0).userInfo,
            (Dictionary{{"TLMReportingUserInfoClientName", "com.tarno.halvox"},
                        {"TLMReportingUserInfoServiceName", "haptics_session"}}));
}

TEST_F(HVReportingSessionLinkTest, UseOfInterfacesIsReportedUnbatched) {
  session_->setServiceType(AudioServiceType::kAPIUsage);

  open();

  const Dictionary info = framework_.sessions().at(0).sessionInfo;
  EXPECT_EQ(*info.find("TLMReportingSessionInfoBatchEvent"), platform::Value(false));
  EXPECT_EQ(*info.find("TLMReportingSessionInfoContainsRealtimeEvents"), platform::Value(true));
}

TEST_F(HVReportingSessionLinkTest, TheApplicationIsTheClientBundleAndTheRestUserInfo) {
  session_->setConfiguration(
      Dictionary{{"HostApplicationDisplayID", "com.example.player"}, {"room", "kitchen"}});

  open();

  EXPECT_EQ(*framework_.sessions().at(0).sessionInfo.find("TLMReportingSessionInfoClientBundleID"),
            platform::Value("com.example.player"));
  EXPECT_EQ(framework_.sessions().at(0).userInfo,
            (Dictionary{{"TLMReportingUserInfoClientName", "com.tarno.halvox"},
                        {"TLMReportingUserInfoServiceName", "haptics_session"},
                        {"HostApplicationDisplayID", "com.example.player"},
                        {"room", "kitchen"}}));
}

TEST_F(HVReportingSessionLinkTest, AConfigurationOverridesTheUserInfo) {
  session_->setConfiguration(Dictionary{{"TLMReportingUserInfoClientName", "me"}});

  open();

  EXPECT_EQ(*framework_.sessions().at(0).userInfo.find("TLMReportingUserInfoClientName"),
            platform::Value("me"));
}

TEST_F(HVReportingSessionLinkTest, TheJobSeesTheSessionAsItWasStarted) {
  session_->start();
  session_->setServiceType(AudioServiceType::kAPIUsage);
  session_->setConfiguration(Dictionary{{"late", true}});

  run();

  const auto made = framework_.sessions().at(0);
  EXPECT_EQ(*made.userInfo.find("TLMReportingUserInfoServiceName"),
            platform::Value("haptics_session"));
  EXPECT_FALSE(made.userInfo.contains("late"));
  EXPECT_EQ(*made.sessionInfo.find("TLMReportingSessionInfoBatchEvent"), platform::Value(true));
}

TEST_F(HVReportingSessionLinkTest, ATestSessionNeverReachesTheFramework) {
  session_->setServiceType(AudioServiceType::kTest);

  open();
  send({{"a", 1}});
  stop();

  EXPECT_THAT(frameworkSteps(), IsEmpty());
  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kStopEntered));
  EXPECT_EQ(platform_.statistics.value("link", "dropped: test session"), 2U);  // and the summary
}

TEST_F(HVReportingSessionLinkTest, BackendsThatAreFoundOpenTheLink) {
  holdDiscoveries();
  start();
  EXPECT_FALSE(session_->tlmReportingSessionStarted());

  platform_.dispatch.advance(8s);
  framework_.answerDiscovery(kServers);
  run();

  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kList, kContinuing));
  EXPECT_NE(session_->tlmReportingSession(), nullptr);
  EXPECT_EQ(session_->tlmReportingAgentToken()->text(), "token 1");
  EXPECT_TRUE(session_->tlmReportingSessionStarted());
}

TEST_F(HVReportingSessionLinkTest, BackendsMayBeFoundBeforeTheDiscoveryReturns) {
  open();

  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kList, kWaiting, kContinuing));
  EXPECT_TRUE(session_->tlmReportingSessionStarted());
}

TEST_F(HVReportingSessionLinkTest, AnEmptyListIsAListAllTheSame) {
  framework_.answerDiscoveries(Fake::Answering::kBeforeReturning, Array{});

  start();

  EXPECT_TRUE(session_->tlmReportingSessionStarted());
  EXPECT_TRUE(platform_.log.containsText("list of backends ()"));
}

TEST_F(HVReportingSessionLinkTest, WithoutBackendsTheLinkFails) {
  holdDiscoveries();
  start();

  framework_.answerDiscovery(std::nullopt);
  run();

  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kNone, kFailed));
  EXPECT_TRUE(holdsNothing());
  EXPECT_EQ(framework_.liveSessions(), 0U);
  EXPECT_FALSE(session_->tlmReportingSessionStarted());
}

TEST_F(HVReportingSessionLinkTest, WithoutACallbackTheWaitEndsAfterNineSeconds) {
  holdDiscoveries();
  start();

  platform_.dispatch.advance(8999ms);
  EXPECT_NE(session_->tlmReportingSession(), nullptr);
  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting));

  platform_.dispatch.advance(1ms);
  EXPECT_THAT(linkLines(), ElementsAre(kTimedOut));
  EXPECT_TRUE(holdsNothing());
}

TEST_F(HVReportingSessionLinkTest, ALateCallbackSetsTheFlagAloneAndSendsNothing) {
  holdDiscoveries();
  start();
  platform_.dispatch.advance(9s);

  framework_.answerDiscovery(kServers);
  send({{"a", 1}});
  run();

  EXPECT_TRUE(session_->tlmReportingSessionStarted());
  EXPECT_TRUE(holdsNothing());
  EXPECT_THAT(framework_.messages(), IsEmpty());
}

TEST_F(HVReportingSessionLinkTest, ASignalThatCameTooLateFailsTheNextStartAtOnce) {
  holdDiscoveries();
  start();
  platform_.dispatch.advance(9s);
  framework_.answerDiscovery(kServers);
  stop();
  linkLines();

  start();
  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kFailed));
  EXPECT_TRUE(holdsNothing());

  // The second callback signals into the void again, for the third start to find.
  framework_.answerDiscovery(kServers);
  stop();
  linkLines();
  start();
  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kFailed));
}

TEST_F(HVReportingSessionLinkTest, ACallbackAfterTheStopLeavesTheFlagToTheNextStart) {
  holdDiscoveries();
  start();
  platform_.dispatch.advance(9s);
  stop();
  framework_.answerDiscovery(kServers);
  linkLines();

  start();

  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kContinuing));
  EXPECT_NE(session_->tlmReportingSession(), nullptr);
}

TEST_F(HVReportingSessionLinkTest, TheStartedStateCanBeWatched) {
  const std::atomic<bool>* state = session_->getTLMReportingStartedState();
  EXPECT_FALSE(*state);

  open();
  EXPECT_TRUE(*state);

  stop();
  EXPECT_FALSE(*state);
}

TEST_F(HVReportingSessionLinkTest, ACallbackThatNeverComesKeepsNoSession) {
  holdDiscoveries();
  start();
  platform_.dispatch.advance(9s);
  const std::weak_ptr<HVReportingSession> session = session_;

  session_.reset();

  EXPECT_TRUE(session.expired());
  EXPECT_EQ(framework_.waitingDiscoveries(), 1U);
}

TEST_F(HVReportingSessionLinkTest, ACallbackForASessionThatIsGoneOnlyLogs) {
  holdDiscoveries();
  start();
  platform_.dispatch.advance(9s);
  session_.reset();
  linkLines();

  framework_.answerDiscovery(std::nullopt);

  EXPECT_THAT(linkLines(), ElementsAre(kNone));
}

// --- messages -----------------------------------------------------------------------------------

TEST_F(HVReportingSessionLinkTest, MessagesThatWaitedAreSentInOrder) {
  holdDiscoveries();
  start();
  send({{"a", 1}});
  send({{"a", 2}});
  send({{"a", 3}});
  run();
  EXPECT_THAT(framework_.messages(), IsEmpty());

  framework_.answerDiscovery(kServers);
  run();

  EXPECT_THAT(payloads(), ElementsAre(Dictionary{{"a", 1}, {"audiotag", "PlaybackStart"}},
                                      Dictionary{{"a", 2}, {"audiotag", "PlaybackStart"}},
                                      Dictionary{{"a", 3}, {"audiotag", "PlaybackStart"}}));
}

TEST_F(HVReportingSessionLinkTest, MessagesThatWaitedInVainAreDroppedWithoutALine) {
  holdDiscoveries();
  start();
  send({{"a", 1}});
  platform_.log.clear();

  platform_.dispatch.advance(9s);

  EXPECT_THAT(platform_.log.texts(), ElementsAre(kTimedOut.second, kMessageEntered));
  EXPECT_THAT(framework_.messages(), IsEmpty());
  EXPECT_EQ(platform_.statistics.value("link", "dropped: no back-end"), 1U);
}

TEST_F(HVReportingSessionLinkTest, ASentMessageIsLoggedAsTheClientGaveIt) {
  open();
  platform_.log.clear();

  send({{"sample rate", 48000}}, AudioEventCategory::kToolbox | kPlayback);
  run();

  const auto sent = framework_.messages().at(0);
  EXPECT_EQ(sent.category, 4);
  EXPECT_EQ(sent.type, 1);
  EXPECT_EQ(sent.payload,
            (Dictionary{{"sample_rate", 48000}, {"audiotag", "Toolbox_PlaybackStart"}}));
  EXPECT_THAT(platform_.log.texts(LogLevel::kDebug),
              ElementsAre("sending message for session owned by 7", kMessageEntered,
                          "TLMReportingAgent session 1 : message {sample rate = 48000} : category "
                          "-2147483644 : type 1"));
  EXPECT_EQ(platform_.log.lines().back().category, "hvrr");
}

TEST_F(HVReportingSessionLinkTest, AFailureWithAnErrorIsLoggedAndNotRetried) {
  open();
  framework_.setOutcome({.sent = false, .error = platform::Error{.description = "no route"}});
  platform_.log.clear();

  send({{"a", 1}});
  run();

  EXPECT_THAT(platform_.log.texts(LogLevel::kError), ElementsAre("error sending message no route"));
  EXPECT_EQ(platform_.log.lines().back().category, "hvrr");
  EXPECT_EQ(framework_.messages().size(), 1U);
}

TEST_F(HVReportingSessionLinkTest, AFailureWithoutAnErrorIsSilent) {
  open();
  framework_.setOutcome({.sent = false});
  platform_.log.clear();

  send({{"a", 1}});
  run();

  EXPECT_EQ(platform_.log.texts().back(), kMessageEntered);
  EXPECT_EQ(platform_.statistics.value("link", "failed"), 1U);
}

TEST_F(HVReportingSessionLinkTest, ARedundantMessageIsNotSent) {
  open();

  send({{"a", 1}});
  send({{"a", 1}});
  run();

  EXPECT_EQ(framework_.messages().size(), 1U);
  EXPECT_EQ(platform_.statistics.value("link", "suppressed: redundant"), 1U);
}

TEST_F(HVReportingSessionLinkTest, ASessionThatBecameATestSendsNoMore) {
  open();
  session_->setServiceType(AudioServiceType::kTest);

  send({{"a", 1}});
  run();

  EXPECT_THAT(framework_.messages(), IsEmpty());
}

TEST_F(HVReportingSessionLinkTest, TheReplyComesAtOnceThoughTheLinkFailsLater) {
  open();
  framework_.setOutcome({.sent = false, .error = platform::Error{.description = "no route"}});
  std::vector<std::optional<platform::Error>> replies;

  session_->sendMessage(Dictionary{{"a", 1}}, kPlayback, kStart,
                        [&replies](const auto& error) { replies.push_back(error); });

  EXPECT_THAT(replies, ElementsAre(std::nullopt));
  run();
  EXPECT_EQ(replies.size(), 1U);
}

TEST_F(HVReportingSessionLinkTest, BeforeTheStartAMessageIsASingleOne) {
  send({{"a", 1}});
  platform_.dispatch.advance(1s);

  const auto sent = framework_.singleMessages();
  ASSERT_EQ(sent.size(), 1U);
  EXPECT_EQ(sent[0].payload, (Dictionary{{"a", 1}, {"audiotag", "PlaybackStart"}}));
  const Dictionary info = framework_.singleMessageInfos().at(0).sessionInfo;
  EXPECT_EQ(*info.find("TLMReportingSessionInfoSessionID"), platform::Value(-1));
  EXPECT_EQ(*info.find("TLMReportingSessionInfoClientType"), platform::Value(19));
}

// Whether it was started counts when it is sent, not when its job runs.
TEST_F(HVReportingSessionLinkTest, AMessageOfAStartedSessionIsNoSingleOneThoughTheStopOvertakes) {
  framework_.answerDiscoveries(Fake::Answering::kBeforeReturning, kServers);
  session_->start();
  send({{"a", 1}});
  session_->stop();

  run();

  EXPECT_EQ(framework_.messages().size(), 2U);  // and the summary event
  EXPECT_THAT(framework_.singleMessages(), IsEmpty());
  EXPECT_EQ(platform_.dispatch.delayedJobs(), 0U);
}

TEST_F(HVReportingSessionLinkTest, EveryMessageIsAccountedFor) {
  send({{"a", 0}});  // single
  run();
  start();
  send({{"a", 1}});  // no back-end
  run();
  stop();  // with a summary event
  open();
  send({{"a", 1}});
  send({{"a", 1}});  // redundant
  run();
  framework_.setOutcome({.sent = false});
  send({{"a", 2}});  // failed
  run();

  EXPECT_THAT(
      platform_.statistics.values("link"),
      UnorderedElementsAre(Pair("received", 6U), Pair("sent", 1U), Pair("failed", 1U),
                           Pair("handed on: single message", 1U), Pair("suppressed: redundant", 1U),
                           Pair("dropped: no back-end", 2U)));
}

TEST_F(HVReportingSessionLinkTest, WhatWaitsIsChargedToTheClientUntilItWasSent) {
  const auto account = std::make_shared<ResourceAccount>();
  session_->chargeTo(account);
  holdDiscoveries();
  start();

  for (int count = 0; count < 10; ++count) send({{"a", std::string(1000, 'x')}, {"n", count}});
  const std::size_t history = (*session_->nestedAggregatedPayloadData())->memorySize();
  EXPECT_GE(account->use().bytes, history + std::size_t{10} * 1000);

  framework_.answerDiscovery(kServers);
  run();
  EXPECT_EQ(account->use().bytes, history);
}

TEST_F(HVReportingSessionLinkTest, RedundantMessagesThatWaitAreChargedToo) {
  const auto account = std::make_shared<ResourceAccount>();
  session_->chargeTo(account);
  holdDiscoveries();
  start();
  send({{"a", 1}});
  const std::size_t before = account->use().bytes;

  for (int count = 0; count < 10; ++count) send({{"a", 1}});

  EXPECT_GE(account->use().bytes, before + std::size_t{10} * sizeof(Dictionary::Entry));
}

TEST_F(HVReportingSessionLinkTest, WhatATagReplacedIsChargedWhileItWaits) {
  const auto account = std::make_shared<ResourceAccount>();
  session_->chargeTo(account);
  holdDiscoveries();
  start();

  send({{"audiotag", std::string(100'000, 'x')}});

  EXPECT_GE(account->use().bytes, 100'000U);
}

TEST_F(HVReportingSessionLinkTest, WhatWaitsStaysChargedWhenTheSessionIsStopped) {
  const auto account = std::make_shared<ResourceAccount>();
  session_->chargeTo(account);
  holdDiscoveries();
  start();
  send({{"a", std::string(1000, 'x')}});

  session_->stop();
  EXPECT_GE(account->use().bytes, 1000U);

  session_.reset();
  platform_.dispatch.advance(9s);
  EXPECT_EQ(account->use().bytes, 0U);
}

// --- stop ---------------------------------------------------------------------------------------

TEST_F(HVReportingSessionLinkTest, StopFlushesBehindAllMessages) {
  open();
  send({{"a", 1}});
  platform_.journal.clear();

  stop();

  EXPECT_THAT(frameworkSteps(),
              ElementsAre("send session 1 4/1", "send session 1 65535/65535", "flush session 1"));
  EXPECT_TRUE(holdsNothing());
  EXPECT_EQ(framework_.liveSessions(), 0U);
}

TEST_F(HVReportingSessionLinkTest, StopLogsAroundTheFlush) {
  open();
  framework_.answerFlushes(Fake::Answering::kWhenTold);
  linkLines();

  stop();
  EXPECT_THAT(linkLines(), ElementsAre(kStopEntered));

  framework_.completeFlush();
  run();
  EXPECT_THAT(linkLines(), ElementsAre(kClosed));
}

TEST_F(HVReportingSessionLinkTest, TheSessionOfTheFrameworkStaysUntilItIsFlushed) {
  open();
  framework_.answerFlushes(Fake::Answering::kWhenTold);

  stop();
  platform_.dispatch.advance(1h);
  EXPECT_NE(session_->tlmReportingSession(), nullptr);
  EXPECT_TRUE(session_->tlmReportingSessionStarted());

  framework_.completeFlush();
  run();
  EXPECT_TRUE(holdsNothing());
  EXPECT_FALSE(session_->tlmReportingSessionStarted());
}

TEST_F(HVReportingSessionLinkTest, WhileAFlushIsOutNothingElseOfTheLinkRuns) {
  open();
  framework_.answerFlushes(Fake::Answering::kWhenTold);
  stop();
  session_->start();
  send({{"a", 1}});
  run();
  EXPECT_EQ(framework_.sessions().size(), 1U);

  framework_.completeFlush();
  run();
  EXPECT_EQ(framework_.sessions().size(), 2U);
  EXPECT_EQ(framework_.messages().back().session, 2U);
}

TEST_F(HVReportingSessionLinkTest, AFlushTakesNoSignalOfADiscovery) {
  holdDiscoveries();
  start();
  platform_.dispatch.advance(9s);
  framework_.answerDiscovery(kServers);  // too late: the signal stays
  stop();
  framework_.answerFlushes(Fake::Answering::kWhenTold);
  holdDiscoveries();
  start();  // takes the signal and gives up
  stop();   // has nothing to flush
  framework_.answerDiscovery(kServers);

  start();
  EXPECT_EQ(framework_.waitingFlushes(), 0U);
  EXPECT_EQ(framework_.sessions().size(), 3U);
}

TEST_F(HVReportingSessionLinkTest, StopWithoutAFrameworkSessionFlushesNothing) {
  start();
  linkLines();
  platform_.journal.clear();

  stop();

  EXPECT_THAT(frameworkSteps(), IsEmpty());
  EXPECT_THAT(linkLines(), ElementsAre(kStopEntered, kClosed));
}

TEST_F(HVReportingSessionLinkTest, StopDuringTheWaitClosesBehindIt) {
  holdDiscoveries();
  start();
  session_->stop();
  run();
  linkLines();

  framework_.answerDiscovery(kServers);
  run();

  EXPECT_THAT(linkLines(), ElementsAre(kList, kContinuing, kStopEntered, kClosed));
  EXPECT_EQ(frameworkSteps().back(), "flush session 1");
}

TEST_F(HVReportingSessionLinkTest, ASessionCanBeStartedAgainWithANewFrameworkSession) {
  open();
  stop();

  start();
  send({{"a", 1}});
  run();

  EXPECT_EQ(framework_.tokens().size(), 2U);
  EXPECT_EQ(framework_.messages().back().session, 2U);
}

TEST_F(HVReportingSessionLinkTest, ASessionThatWaitsDelaysNoOther) {
  holdDiscoveries();
  start();
  framework_.answerDiscoveries(Fake::Answering::kBeforeReturning, kServers);
  const auto other =
      std::make_shared<HVReportingSession>(ReporterID{8}, HVReportingSession::ProcessIdentifiers{});
  other->setTlmReportingEnabled(true);

  other->start();
  other->sendMessage(Dictionary{{"a", 1}}, kPlayback, kStart, nullptr);
  run();

  EXPECT_EQ(framework_.messages().size(), 1U);
  EXPECT_EQ(framework_.messages().at(0).session, 2U);
}

TEST_F(HVReportingSessionLinkTest, TheLastJobKeepsTheSessionUntilItIsFlushed) {
  open();
  framework_.answerFlushes(Fake::Answering::kWhenTold);
  stop();
  const std::weak_ptr<HVReportingSession> session = session_;
  session_.reset();
  EXPECT_FALSE(session.expired());

  framework_.completeFlush();
  run();

  EXPECT_TRUE(session.expired());
}

// Runs under ThreadSanitizer: discovery answers on a thread of the framework.
TEST_F(HVReportingSessionLinkTest, DiscoveryMayAnswerOnAnotherThread) {
  holdDiscoveries();
  start();

  std::thread([this] { framework_.answerDiscovery(kServers); }).join();
  run();

  EXPECT_EQ(linkLines().back(), kContinuing);
}

}  // namespace
}  // namespace halvox
