#include <atomic>
#include <chrono>
#include <memory>
#include <optional>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "session/LinkFixture.h"

namespace halvox::link_test {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using namespace std::chrono_literals;

class SessionLinkTest : public LinkFixture {};

// --- start --------------------------------------------------------------------------------------

TEST_F(SessionLinkTest, StartOnlySubmitsItsJob) {
  session_->start();

  EXPECT_THAT(frameworkSteps(), IsEmpty());
  EXPECT_EQ(platform_.dispatch.waitingJobs(), 1U);
  EXPECT_THAT(platform_.dispatch.weights("com.tarno.halvox.session.tlmreporting"),
              ElementsAre(platform::JobWeight::kMayBlock));
}

TEST_F(SessionLinkTest, ASessionWithoutTheLinkHasNoQueueAndAsksForNothing) {
  session_->setTlmReportingEnabled(false);

  start();
  send({{"a", 1}});
  stop();

  EXPECT_THAT(platform_.dispatch.createdQueues(), IsEmpty());
  EXPECT_THAT(frameworkSteps(), IsEmpty());
}

TEST_F(SessionLinkTest, StartJobStepsInOrder) {
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

TEST_F(SessionLinkTest, LinesGoToTheLinksCategoryUnderTheSessionsName) {
  platform_.log.clear();

  start();

  const auto line = platform_.log.lines(LogLevel::kError).at(0);
  EXPECT_EQ(line.subsystem, "com.tarno.halvox");
  EXPECT_EQ(line.category, "hvri");
  EXPECT_EQ(line.line.substr(0, 26), "       HVReportingSession:");
}

TEST_F(SessionLinkTest, TheSessionInfoDescribesTheLink) {
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

TEST_F(SessionLinkTest, UseOfInterfacesIsReportedUnbatched) {
  session_->setServiceType(AudioServiceType::kAPIUsage);

  open();

  const Dictionary info = framework_.sessions().at(0).sessionInfo;
  EXPECT_EQ(*info.find("TLMReportingSessionInfoBatchEvent"), platform::Value(false));
  EXPECT_EQ(*info.find("TLMReportingSessionInfoContainsRealtimeEvents"), platform::Value(true));
}

TEST_F(SessionLinkTest, TheApplicationIsTheClientBundleAndTheRestUserInfo) {
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

TEST_F(SessionLinkTest, AConfigurationOverridesTheUserInfo) {
  session_->setConfiguration(Dictionary{{"TLMReportingUserInfoClientName", "me"}});

  open();

  EXPECT_EQ(*framework_.sessions().at(0).userInfo.find("TLMReportingUserInfoClientName"),
            platform::Value("me"));
}

TEST_F(SessionLinkTest, TheJobSeesTheSessionAsItWasStarted) {
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

TEST_F(SessionLinkTest, ATestSessionNeverReachesTheFramework) {
  session_->setServiceType(AudioServiceType::kTest);

  open();
  send({{"a", 1}});
  stop();

  EXPECT_THAT(frameworkSteps(), IsEmpty());
  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kStopEntered));
  EXPECT_EQ(platform_.statistics.value("link", "dropped: test session"), 2U);  // one is the summary
}

TEST_F(SessionLinkTest, BackendsThatAreFoundOpenTheLink) {
  holdDiscoveries();
  start();
  EXPECT_FALSE(session_->link().tlmReportingSessionStarted());

  platform_.dispatch.advance(8s);
  framework_.answerDiscovery(kServers);
  run();

  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kList, kContinuing));
  EXPECT_NE(session_->link().tlmReportingSession(), nullptr);
  EXPECT_EQ(session_->link().tlmReportingAgentToken()->text(), "token 1");
  EXPECT_TRUE(session_->link().tlmReportingSessionStarted());
}

TEST_F(SessionLinkTest, BackendsAreListedAfterTheWaitForThem) {
  open();

  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kList, kContinuing));
  EXPECT_TRUE(session_->link().tlmReportingSessionStarted());
}

// The framework's thread may answer before the start job waits.
TEST_F(SessionLinkTest, BackendsFoundBeforeTheDiscoveryReturnsAreListedAfterTheWaitToo) {
  framework_.answerDiscoveries(Fake::Answering::kBeforeReturning, kServers);

  start();

  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kList, kContinuing));
  EXPECT_TRUE(session_->link().tlmReportingSessionStarted());
}

TEST_F(SessionLinkTest, NoBackendsBeforeTheDiscoveryReturnsIsLoggedAfterTheWaitToo) {
  framework_.answerDiscoveries(Fake::Answering::kBeforeReturning);

  start();

  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kNone, kFailed));
  EXPECT_TRUE(holdsNothing());
}

TEST_F(SessionLinkTest, AnEmptyListIsAListAllTheSame) {
  framework_.answerDiscoveries(Fake::Answering::kBeforeReturning, Array{});

  start();

  EXPECT_TRUE(session_->link().tlmReportingSessionStarted());
  EXPECT_TRUE(platform_.log.containsText("list of backends ()"));
}

TEST_F(SessionLinkTest, WithoutBackendsTheLinkFails) {
  holdDiscoveries();
  start();

  framework_.answerDiscovery(std::nullopt);
  run();

  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kNone, kFailed));
  EXPECT_TRUE(holdsNothing());
  EXPECT_EQ(framework_.liveSessions(), 0U);
  EXPECT_FALSE(session_->link().tlmReportingSessionStarted());
}

TEST_F(SessionLinkTest, WithoutACallbackTheWaitEndsAfterNineSeconds) {
  holdDiscoveries();
  start();

  platform_.dispatch.advance(8999ms);
  EXPECT_NE(session_->link().tlmReportingSession(), nullptr);
  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting));

  platform_.dispatch.advance(1ms);
  EXPECT_THAT(linkLines(), ElementsAre(kTimedOut));
  EXPECT_TRUE(holdsNothing());
}

TEST_F(SessionLinkTest, ALateCallbackSetsTheFlagAloneAndSendsNothing) {
  holdDiscoveries();
  start();
  platform_.dispatch.advance(9s);

  framework_.answerDiscovery(kServers);
  send({{"a", 1}});
  run();

  EXPECT_TRUE(session_->link().tlmReportingSessionStarted());
  EXPECT_TRUE(holdsNothing());
  EXPECT_THAT(framework_.messages(), IsEmpty());
}

TEST_F(SessionLinkTest, ASignalThatCameTooLateFailsTheNextStartAtOnce) {
  holdDiscoveries();
  start();
  platform_.dispatch.advance(9s);
  framework_.answerDiscovery(kServers);
  stop();
  linkLines();

  start();
  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kFailed));
  EXPECT_TRUE(holdsNothing());

  // The second start no longer waits when the framework answers. The signal of this answer ends the
  // wait of the third start.
  framework_.answerDiscovery(kServers);
  stop();
  linkLines();
  start();
  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kFailed));
}

TEST_F(SessionLinkTest, ACallbackAfterTheStopLeavesTheFlagToTheNextStart) {
  holdDiscoveries();
  start();
  platform_.dispatch.advance(9s);
  stop();
  framework_.answerDiscovery(kServers);
  linkLines();

  start();

  EXPECT_THAT(linkLines(), ElementsAre(kStartEntered, kWaiting, kContinuing));
  EXPECT_NE(session_->link().tlmReportingSession(), nullptr);
}

TEST_F(SessionLinkTest, TheStartedStateCanBeWatched) {
  const std::atomic<bool>* state = session_->link().getTLMReportingStartedState();
  EXPECT_FALSE(*state);

  open();
  EXPECT_TRUE(*state);

  stop();
  EXPECT_FALSE(*state);
}

TEST_F(SessionLinkTest, ACallbackThatNeverComesKeepsNoSession) {
  holdDiscoveries();
  start();
  platform_.dispatch.advance(9s);
  const std::weak_ptr<HVReportingSession> session = session_;

  session_.reset();

  EXPECT_TRUE(session.expired());
  EXPECT_EQ(framework_.waitingDiscoveries(), 1U);
}

TEST_F(SessionLinkTest, ACallbackForADestroyedSessionOnlyLogs) {
  holdDiscoveries();
  start();
  platform_.dispatch.advance(9s);
  session_.reset();
  linkLines();

  framework_.answerDiscovery(std::nullopt);

  EXPECT_THAT(linkLines(), ElementsAre(kNone));
}

}  // namespace
}  // namespace halvox::link_test
