#include "service/ServiceFixture.h"

// How start, stop and destroy affect a session and the held reply of its start.

namespace halvox {
namespace {

using platform::LogLevel;
using platform::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::UnorderedElementsAre;

constexpr const char* kSessionSeven =
    "reporterID=7,serviceName=unknown,ownerPid=100,HostApplicationDisplayID=Unknown,started=1";

class HVReportingClientServerInstanceStartStopTest : public ServiceFixture {
 protected:
  HVReportingClientServerInstanceStartStopTest() { forgetSteps(); }

  void startMany(int sessions) {
    for (int id = 101; id <= 100 + sessions; ++id) createAndStart(client_, id);
  }

  Connection client_ = connect(100);
  Connection other_ = connect(101);
};

// --- start --------------------------------------------------------------------------------------

TEST_F(HVReportingClientServerInstanceStartStopTest, StartStepsInOrder) {
  create(client_, 7);
  forgetSteps();

  start(client_, 7);

  EXPECT_THAT(steps(),
              ElementsAre("starting session for reporter 7", "0x21044818",
                          "starting session owned by 7", "0x2104482C", "getting features",
                          std::string("sessions for client 100 : (") + kSessionSeven + ")",
                          "sessions for client 101 : ()",
                          std::string("1 active reporting session(s) (") + kSessionSeven + ")"));
  EXPECT_EQ(lines(LogLevel::kDefault).size(), 4U);
  EXPECT_EQ(lines(LogLevel::kDebug).size(), 2U);
}

TEST_F(HVReportingClientServerInstanceStartStopTest, TheReplyOfAStartComesBeforeThatOfTheStop) {
  const Call started = createAndStart(client_, 7);
  EXPECT_FALSE(started->isAnswered());
  forgetSteps();

  const Call stopped = stop(client_, 7);

  EXPECT_EQ(started->value(), Value(true));
  EXPECT_EQ(stopped->value(), Value(true));
  EXPECT_THAT(platform_.journal.texts(platform::JournalKind::kReply),
              ElementsAre("startReportingSessionForID", "stopReportingSessionForID"));
}

TEST_F(HVReportingClientServerInstanceStartStopTest,
       StartOfAStartedSessionRepliesAndChangesNothing) {
  const Call first = createAndStart(client_, 7);
  send(client_, {7});
  forgetSteps();

  EXPECT_EQ(start(client_, 7)->value(), Value(true));

  EXPECT_FALSE(first->isAnswered());
  EXPECT_EQ(delegate_->activeSessionCount(), 1);
  EXPECT_EQ(historySize(client_, 7), 1U);
  EXPECT_THAT(steps(), ElementsAre("starting session for reporter 7", "0x21044818",
                                   "startReportingSessionForID"));
}

TEST_F(HVReportingClientServerInstanceStartStopTest, StartOfUnknownSessionsRepliesAtOnce) {
  create(client_, 0);
  create(other_, 8);

  EXPECT_EQ(start(client_, 0)->value(), Value(true));
  EXPECT_EQ(start(client_, 99)->value(), Value(true));
  EXPECT_EQ(start(client_, 8)->value(), Value(true));

  EXPECT_FALSE(sessionOf(client_, 0)->started());
  EXPECT_FALSE(sessionOf(other_, 8)->started());
  EXPECT_EQ(delegate_->activeSessionCount(), 0);
}

TEST_F(HVReportingClientServerInstanceStartStopTest, TheFifthStartedSessionGetsTheLinkTheSixthNot) {
  startMany(6);

  EXPECT_TRUE(sessionOf(client_, 105)->tlmReportingEnabled());
  EXPECT_FALSE(sessionOf(client_, 106)->tlmReportingEnabled());
  EXPECT_EQ(delegate_->activeSessionCount(), 6);
}

TEST_F(HVReportingClientServerInstanceStartStopTest, AStartDecidesAboutTheLinkAgain) {
  create(client_, 7);
  EXPECT_TRUE(sessionOf(client_, 7)->tlmReportingEnabled());
  delegate_->setActiveSessionCount(5);

  start(client_, 7);
  EXPECT_FALSE(sessionOf(client_, 7)->tlmReportingEnabled());

  stop(client_, 7);
  delegate_->setActiveSessionCount(4);
  start(client_, 7);
  EXPECT_TRUE(sessionOf(client_, 7)->tlmReportingEnabled());
}

TEST_F(HVReportingClientServerInstanceStartStopTest,
       AHeldReplyIsDeliveredByTheStartThatReplacesIt) {
  create(client_, 7);
  int calls = 0;
  sessionOf(client_, 7)->setTransactionCompleteBlock([&calls](const auto& error, bool value) {
    EXPECT_EQ(error, std::nullopt);
    EXPECT_TRUE(value);
    ++calls;
  });

  const Call started = start(client_, 7);

  EXPECT_EQ(calls, 1);
  EXPECT_FALSE(started->isAnswered());
  stop(client_, 7);
  EXPECT_EQ(calls, 1);
  EXPECT_EQ(started->value(), Value(true));
}

TEST_F(HVReportingClientServerInstanceStartStopTest, ATracingTestRepliesAtOnceAndAgainAtTheStop) {
  platform_.featureFlags.set("Acoustat", "Tracing", platform::FakeFeatureFlagService::State::kOn);
  platform_.performanceTraces.completeAtStop("file:///trace");
  create(client_, 7);
  setServiceType(client_, AudioServiceType::kTest, 7);
  forgetSteps();

  const Call started = start(client_, 7);
  EXPECT_THAT(started->replies(), ElementsAre(ok(true)));
  // The first reply comes after the features are read and before the active sessions are listed.
  ASSERT_GE(steps().size(), 10U);
  EXPECT_EQ(steps()[8], "getting features");
  EXPECT_EQ(steps()[9], "startReportingSessionForID");

  stop(client_, 7);
  EXPECT_THAT(started->replies(), ElementsAre(ok(true), ok(true)));
}

TEST_F(HVReportingClientServerInstanceStartStopTest, OnlyTracingTestsReplyAtOnce) {
  create(client_, 7);
  setServiceType(client_, AudioServiceType::kTest, 7);
  EXPECT_FALSE(start(client_, 7)->isAnswered());

  platform_.featureFlags.set("Acoustat", "Tracing", platform::FakeFeatureFlagService::State::kOn);
  EXPECT_FALSE(createAndStart(client_, 8)->isAnswered());
}

// --- stop ---------------------------------------------------------------------------------------

TEST_F(HVReportingClientServerInstanceStartStopTest, StopStepsInOrder) {
  createAndStart(client_, 7);
  forgetSteps();

  stop(client_, 7);

  EXPECT_THAT(steps(),
              ElementsAre("stopping session for reporter 7", "0x2104481C", "ending session 7",
                          "ending session 7", "0x21044830", "startReportingSessionForID",
                          "sessions for client 100 : (reporterID=7,serviceName=unknown,"
                          "ownerPid=100,HostApplicationDisplayID=Unknown,started=0)",
                          "sessions for client 101 : ()", "0 active reporting session(s) ()",
                          "stopping 7", "stopReportingSessionForID"));
  EXPECT_THAT(lines(LogLevel::kDefault).back(), "stopping 7");
}

TEST_F(HVReportingClientServerInstanceStartStopTest, StopLogsEachRequestAtDebugLevel) {
  createAndStart(client_, 7);
  forgetSteps();

  stop(client_, 7);

  EXPECT_THAT(lines(LogLevel::kDebug), ElementsAre("stopping session for reporter 7",
                                                   "ending session 7", "ending session 7"));
}

TEST_F(HVReportingClientServerInstanceStartStopTest, StopOfASessionThatIsNotStartedOnlyReplies) {
  create(client_, 7);
  forgetSteps();

  EXPECT_EQ(stop(client_, 7)->value(), Value(true));

  EXPECT_THAT(steps(), ElementsAre("stopping session for reporter 7", "0x2104481C", "stopping 7",
                                   "stopReportingSessionForID"));
  EXPECT_EQ(delegate_->activeSessionCount(), 0);
}

TEST_F(HVReportingClientServerInstanceStartStopTest, StopOfIDZeroRepliesWithoutItsLastLine) {
  EXPECT_EQ(stop(client_, 0)->value(), Value(true));

  EXPECT_THAT(steps(), ElementsAre("stopping session for reporter 0", "0x2104481C",
                                   "stopReportingSessionForID"));
}

TEST_F(HVReportingClientServerInstanceStartStopTest, StopLeavesSessionsOfOthersAlone) {
  createAndStart(other_, 7);

  EXPECT_EQ(stop(client_, 7)->value(), Value(true));

  EXPECT_TRUE(sessionOf(other_, 7)->started());
  EXPECT_EQ(delegate_->activeSessionCount(), 1);
}

TEST_F(HVReportingClientServerInstanceStartStopTest, AStoppedSessionCanBeStartedAgain) {
  createAndStart(client_, 7);
  stop(client_, 7);

  const Call again = start(client_, 7);

  EXPECT_TRUE(sessionOf(client_, 7)->started());
  EXPECT_EQ(delegate_->activeSessionCount(), 1);
  stop(client_, 7);
  EXPECT_EQ(again->value(), Value(true));
}

TEST_F(HVReportingClientServerInstanceStartStopTest, HeldRepliesAreAccountedFor) {
  createAndStart(client_, 7);
  stop(client_, 7);
  createAndStart(client_, 8);
  destroy(client_, 8);
  createAndStart(client_, 9);

  EXPECT_THAT(platform_.statistics.values("start replies"),
              UnorderedElementsAre(Pair("held back", 3U), Pair("delivered", 1U),
                                   Pair("dropped: session released", 1U)));
}

// --- destroy ------------------------------------------------------------------------------------

TEST_F(HVReportingClientServerInstanceStartStopTest, DestroyStepsInOrder) {
  create(client_, 7);
  forgetSteps();

  EXPECT_EQ(destroy(client_, 7)->value(), Value(true));

  EXPECT_THAT(steps(),
              ElementsAre("destroying session for reporter 7", "0x21044820", "0x21044834",
                          "deallocing this session 7", "destroying 7", "destroyReportingSession"));
  EXPECT_THAT(lines(LogLevel::kDebug), ElementsAre("destroying session for reporter 7"));
  EXPECT_THAT(lines(LogLevel::kDefault), ElementsAre("destroying 7"));
}

TEST_F(HVReportingClientServerInstanceStartStopTest, DestroyOfAStartedSessionStopsIt) {
  createAndStart(client_, 7);
  forgetSteps();

  destroy(client_, 7);

  EXPECT_THAT(steps(),
              ElementsAre("destroying session for reporter 7", "0x21044820", "ending session 7",
                          "ending session 7", "0x21044830", "destroying 7",
                          "destroyReportingSession",  // the link's last job held the session
                          "0x21044834", "deallocing this session 7"));
  EXPECT_THAT(delegate_->getAllActiveReportingSessions(), IsEmpty());
}

TEST_F(HVReportingClientServerInstanceStartStopTest,
       DestroyNeitherCountsDownNorDeliversTheHeldReply) {
  const Call started = createAndStart(client_, 7);

  destroy(client_, 7);

  EXPECT_EQ(delegate_->activeSessionCount(), 1);
  EXPECT_FALSE(started->isAnswered());
}

TEST_F(HVReportingClientServerInstanceStartStopTest, DestroyOfIDZeroRepliesWithoutItsLastLine) {
  create(client_, 0);
  forgetSteps();

  EXPECT_EQ(destroy(client_, 0)->value(), Value(true));

  EXPECT_NE(sessionOf(client_, 0), nullptr);
  EXPECT_THAT(steps(), ElementsAre("destroying session for reporter 0", "0x21044820",
                                   "destroyReportingSession"));
}

TEST_F(HVReportingClientServerInstanceStartStopTest, DestroyLeavesSessionsOfOthersAlone) {
  create(other_, 7);

  EXPECT_EQ(destroy(client_, 7)->value(), Value(true));

  EXPECT_NE(sessionOf(other_, 7), nullptr);
}

}  // namespace
}  // namespace halvox
