#include "service/ReportingQueue.h"
#include "service/ServiceTest.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::JobWeight;
using platform::LogLevel;
using platform::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::UnorderedElementsAre;

constexpr const char* kSessionSeven =
    "reporterID=7,serviceName=unknown,ownerPid=100,HostApplicationDisplayID=Unknown,started=1";

class HVReportingClientServerInstanceRequestsTest : public ServiceTest {
 protected:
  HVReportingClientServerInstanceRequestsTest() { forgetSteps(); }

  void startMany(int sessions) {
    for (int id = 101; id <= 100 + sessions; ++id) createAndStart(client_, id);
  }
  Call getServiceType(const Connection& from, std::int64_t id) {
    return call(from, "getServiceNameForReporterID", {id});
  }
  Call validate(const Connection& from, std::int64_t id) {
    return call(from, "reporterIDValid", {id});
  }
  Call configure(const Connection& from, const Dictionary& configuration, std::int64_t id) {
    return call(from, "setConfiguration", {configuration, id});
  }

  Connection client_ = connect(100);
  Connection other_ = connect(101);
};

TEST_F(HVReportingClientServerInstanceRequestsTest, RequestsAreQueuedAndAnsweredFromTheQueue) {
  const Call call = post(client_, "createReportingSession", {7});
  EXPECT_FALSE(call->isAnswered());
  EXPECT_THAT(steps(), IsEmpty());

  run();

  EXPECT_EQ(call->value(), Value(true));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, OnlyRequestsThatMayWaitAreHeavy) {
  const std::size_t before = platform_.dispatch.weights(gReportingQueueName).size();
  post(client_, "createReportingSession", {7});
  post(client_, "setServiceType", {3, 7});
  post(client_, "getServiceNameForReporterID", {7});
  post(client_, "setConfiguration", {Dictionary{}, 7});
  post(client_, "startReportingSessionForID", {7});
  post(client_, "sendMessage", {Dictionary{}, kCategory, kType, Array{}});
  post(client_, "stopReportingSessionForID", {7});
  post(client_, "destroyReportingSession", {7});
  post(client_, "reporterIDValid", {7});
  post(client_, "getAllReporters", {});

  auto weights = platform_.dispatch.weights(gReportingQueueName);
  weights.erase(weights.begin(), weights.begin() + static_cast<std::ptrdiff_t>(before));
  EXPECT_THAT(weights, ElementsAre(JobWeight::kBrief, JobWeight::kBrief, JobWeight::kBrief,
                                   JobWeight::kBrief, JobWeight::kMayBlock, JobWeight::kBrief,
                                   JobWeight::kMayBlock, JobWeight::kMayBlock, JobWeight::kBrief,
                                   JobWeight::kBrief));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, ARequestIsOpenUntilItWasCarriedOut) {
  post(client_, "createReportingSession", {7});
  post(client_, "startReportingSessionForID", {7});
  EXPECT_EQ(client_->openRequests(), 2U);

  run();

  EXPECT_EQ(client_->openRequests(), 0U);
}

TEST_F(HVReportingClientServerInstanceRequestsTest, RequestsAreCounted) {
  post(client_, "createReportingSession", {7});
  post(client_, "getAllReporters", {});
  EXPECT_EQ(platform_.statistics.value("requests", "received"), 2U);
  EXPECT_EQ(platform_.statistics.value("requests", "carried out"), 0U);

  run();

  EXPECT_EQ(platform_.statistics.value("requests", "carried out"), 2U);
}

// --- create -------------------------------------------------------------------------------------

TEST_F(HVReportingClientServerInstanceRequestsTest, CreateStepsInOrder) {
  create(client_, 7);

  EXPECT_THAT(steps(), ElementsAre("creating session for reporter 7", "0x21044814",
                                   "created reporting session for ID: 7", "0x21044828",
                                   "session created for reporter 7", "createReportingSession"));
  EXPECT_THAT(lines(LogLevel::kDebug), ElementsAre("creating session for reporter 7"));
  EXPECT_THAT(lines(LogLevel::kDefault), ElementsAre("session created for reporter 7"));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, CreatedSessionBelongsToTheClientsProcess) {
  create(client_, 7);

  EXPECT_THAT(sessionOf(client_, 7)->processIdentifiers(), ElementsAre(100));
  EXPECT_FALSE(sessionOf(client_, 7)->started());
}

TEST_F(HVReportingClientServerInstanceRequestsTest, CreateTakesIDZero) {
  EXPECT_EQ(create(client_, 0)->value(), Value(true));

  EXPECT_NE(sessionOf(client_, 0), nullptr);
}

TEST_F(HVReportingClientServerInstanceRequestsTest, CreateReplacesASessionWithoutStoppingIt) {
  const Call heldStart = createAndStart(client_, 7);
  const auto first = sessionOf(client_, 7);

  create(client_, 7);

  EXPECT_NE(sessionOf(client_, 7), first);
  EXPECT_FALSE(sessionOf(client_, 7)->started());
  EXPECT_TRUE(first->started());
  EXPECT_EQ(clientOf(client_)->clientReportingSessionMap().size(), 1U);
  EXPECT_EQ(delegate_->activeSessionCount(), 1);
  EXPECT_THAT(delegate_->getAllActiveReportingSessions(), IsEmpty());
  EXPECT_FALSE(heldStart->isAnswered());
}

TEST_F(HVReportingClientServerInstanceRequestsTest, AReplacedSessionIsReleasedBeforeTheLastLine) {
  createAndStart(client_, 7);
  forgetSteps();

  create(client_, 7);

  EXPECT_THAT(steps(), ElementsAre("creating session for reporter 7", "0x21044814",
                                   "created reporting session for ID: 7", "0x21044828",
                                   "0x21044834", "deallocing this session 7",
                                   "session created for reporter 7", "createReportingSession"));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, SessionsGetTheLinkWhileTheCounterIsAtMostFive) {
  delegate_->setActiveSessionCount(5);
  create(client_, 7);
  EXPECT_TRUE(sessionOf(client_, 7)->tlmReportingEnabled());

  delegate_->setActiveSessionCount(6);
  create(client_, 8);
  EXPECT_FALSE(sessionOf(client_, 8)->tlmReportingEnabled());
}

// --- service type -------------------------------------------------------------------------------

TEST_F(HVReportingClientServerInstanceRequestsTest, SetServiceTypeStepsInOrder) {
  create(client_, 7);
  forgetSteps();

  EXPECT_EQ(setServiceType(client_, AudioServiceType::kHaptics, 7)->value(), Value(true));

  EXPECT_THAT(steps(),
              ElementsAre("setting service type 3 for reporter 7", "setting service type haptics",
                          "service type 3 set for reporter  7", "setServiceType"));
  EXPECT_THAT(lines(LogLevel::kDebug), ElementsAre("setting service type 3 for reporter 7"));
  EXPECT_THAT(lines(LogLevel::kDefault), ElementsAre("service type 3 set for reporter  7"));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, SetServiceTypeIgnoresIDZero) {
  create(client_, 0);

  EXPECT_EQ(setServiceType(client_, AudioServiceType::kHaptics, 0)->value(), Value(true));

  EXPECT_EQ(sessionOf(client_, 0)->serviceType(), AudioServiceType::kUnknown);
}

TEST_F(HVReportingClientServerInstanceRequestsTest, SetServiceTypeLeavesSessionsOfOthersAlone) {
  create(other_, 7);
  forgetSteps();

  EXPECT_EQ(setServiceType(client_, AudioServiceType::kHaptics, 7)->value(), Value(true));

  EXPECT_EQ(sessionOf(other_, 7)->serviceType(), AudioServiceType::kUnknown);
  EXPECT_THAT(steps(), ElementsAre("setting service type 3 for reporter 7", "setServiceType"));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, GetServiceTypeStepsInOrder) {
  create(client_, 7);
  setServiceType(client_, AudioServiceType::kHaptics, 7);
  forgetSteps();

  EXPECT_EQ(getServiceType(client_, 7)->value(), Value(3));

  EXPECT_THAT(steps(), ElementsAre("fetching seviceType", "getServiceNameForReporterID",
                                   "returning service type 3 for reporter  7"));
  EXPECT_THAT(lines(LogLevel::kDebug), ElementsAre("fetching seviceType"));
  EXPECT_THAT(lines(LogLevel::kDefault), ElementsAre("returning service type 3 for reporter  7"));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, GetServiceTypeForIDZeroRepliesTwice) {
  const Call call = getServiceType(client_, 0);

  EXPECT_THAT(call->replies(), ElementsAre(ok(65535), ok(65535)));
  EXPECT_THAT(steps(), ElementsAre("fetching seviceType", "getServiceNameForReporterID",
                                   "getServiceNameForReporterID",
                                   "returning service type 65535 for reporter  0"));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, GetServiceTypeReadsSessionsOfOthers) {
  create(other_, 7);
  setServiceType(other_, AudioServiceType::kAlarms, 7);

  EXPECT_EQ(getServiceType(client_, 7)->value(), Value(4));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, OwnSessionsComeBeforeThoseOfEarlierClients) {
  create(client_, 7);
  create(other_, 7);
  setServiceType(client_, AudioServiceType::kAlarms, 7);
  setServiceType(other_, AudioServiceType::kAlerts, 7);

  EXPECT_EQ(getServiceType(other_, 7)->value(), Value(10));
  EXPECT_EQ(getServiceType(connect(102), 7)->value(), Value(4));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, ServiceTypeOfAnUnknownIDIsUnknown) {
  EXPECT_EQ(getServiceType(client_, 99)->value(), Value(65535));
}

// --- configuration ------------------------------------------------------------------------------

TEST_F(HVReportingClientServerInstanceRequestsTest, SetConfigurationMerges) {
  create(client_, 7);
  forgetSteps();

  EXPECT_EQ(configure(client_, {{"a", 1}, {"b", 1}}, 7)->value(), Value(true));
  configure(client_, {{"b", 2}}, 7);

  EXPECT_EQ(sessionOf(client_, 7)->configuration(), (Dictionary{{"a", 1}, {"b", 2}}));
  EXPECT_THAT(lines(LogLevel::kDebug),
              ElementsAre("setting configuration", "setting configuration"));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, SetConfigurationChangesOnlyOwnSessions) {
  create(other_, 7);

  EXPECT_EQ(configure(client_, {{"a", 1}}, 7)->value(), Value(true));

  EXPECT_TRUE(sessionOf(other_, 7)->configuration().empty());
}

TEST_F(HVReportingClientServerInstanceRequestsTest, SetConfigurationTakesIDZeroLikeAnyOther) {
  create(client_, 0);

  configure(client_, {{"a", 1}}, 0);

  EXPECT_EQ(sessionOf(client_, 0)->configuration(), (Dictionary{{"a", 1}}));
}

// --- start --------------------------------------------------------------------------------------

TEST_F(HVReportingClientServerInstanceRequestsTest, StartStepsInOrder) {
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

TEST_F(HVReportingClientServerInstanceRequestsTest, TheReplyOfAStartComesBeforeThatOfTheStop) {
  const Call started = createAndStart(client_, 7);
  EXPECT_FALSE(started->isAnswered());
  forgetSteps();

  const Call stopped = stop(client_, 7);

  EXPECT_EQ(started->value(), Value(true));
  EXPECT_EQ(stopped->value(), Value(true));
  EXPECT_THAT(platform_.journal.texts(platform::JournalKind::kReply),
              ElementsAre("startReportingSessionForID", "stopReportingSessionForID"));
}

TEST_F(HVReportingClientServerInstanceRequestsTest,
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

TEST_F(HVReportingClientServerInstanceRequestsTest, StartOfUnknownSessionsRepliesAtOnce) {
  create(client_, 0);
  create(other_, 8);

  EXPECT_EQ(start(client_, 0)->value(), Value(true));
  EXPECT_EQ(start(client_, 99)->value(), Value(true));
  EXPECT_EQ(start(client_, 8)->value(), Value(true));

  EXPECT_FALSE(sessionOf(client_, 0)->started());
  EXPECT_FALSE(sessionOf(other_, 8)->started());
  EXPECT_EQ(delegate_->activeSessionCount(), 0);
}

TEST_F(HVReportingClientServerInstanceRequestsTest, TheFifthStartedSessionGetsTheLinkTheSixthNot) {
  startMany(6);

  EXPECT_TRUE(sessionOf(client_, 105)->tlmReportingEnabled());
  EXPECT_FALSE(sessionOf(client_, 106)->tlmReportingEnabled());
  EXPECT_EQ(delegate_->activeSessionCount(), 6);
}

TEST_F(HVReportingClientServerInstanceRequestsTest, AStartDecidesAboutTheLinkAnew) {
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

TEST_F(HVReportingClientServerInstanceRequestsTest, AHeldReplyIsDeliveredByTheStartThatReplacesIt) {
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

TEST_F(HVReportingClientServerInstanceRequestsTest, ATracingTestRepliesAtOnceAndAgainAtTheStop) {
  platform_.featureFlags.set("Acoustat", "Tracing", platform::FakeFeatureFlagService::State::kOn);
  platform_.performanceTraces.completeAtStop("file:///trace");
  create(client_, 7);
  setServiceType(client_, AudioServiceType::kTest, 7);
  forgetSteps();

  const Call started = start(client_, 7);
  EXPECT_THAT(started->replies(), ElementsAre(ok(true)));
  // After the features were read and before the list of active sessions.
  ASSERT_GE(steps().size(), 10U);
  EXPECT_EQ(steps()[8], "getting features");
  EXPECT_EQ(steps()[9], "startReportingSessionForID");

  stop(client_, 7);
  EXPECT_THAT(started->replies(), ElementsAre(ok(true), ok(true)));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, OnlyTracingTestsReplyAtOnce) {
  create(client_, 7);
  setServiceType(client_, AudioServiceType::kTest, 7);
  EXPECT_FALSE(start(client_, 7)->isAnswered());

  platform_.featureFlags.set("Acoustat", "Tracing", platform::FakeFeatureFlagService::State::kOn);
  EXPECT_FALSE(createAndStart(client_, 8)->isAnswered());
}

// --- stop ---------------------------------------------------------------------------------------

TEST_F(HVReportingClientServerInstanceRequestsTest, StopStepsInOrder) {
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

TEST_F(HVReportingClientServerInstanceRequestsTest, StopOfASessionThatIsNotStartedOnlyReplies) {
  create(client_, 7);
  forgetSteps();

  EXPECT_EQ(stop(client_, 7)->value(), Value(true));

  EXPECT_THAT(steps(), ElementsAre("stopping session for reporter 7", "0x2104481C", "stopping 7",
                                   "stopReportingSessionForID"));
  EXPECT_EQ(delegate_->activeSessionCount(), 0);
}

TEST_F(HVReportingClientServerInstanceRequestsTest, StopOfIDZeroRepliesWithoutItsLastLine) {
  EXPECT_EQ(stop(client_, 0)->value(), Value(true));

  EXPECT_THAT(steps(), ElementsAre("stopping session for reporter 0", "0x2104481C",
                                   "stopReportingSessionForID"));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, StopLeavesSessionsOfOthersAlone) {
  createAndStart(other_, 7);

  EXPECT_EQ(stop(client_, 7)->value(), Value(true));

  EXPECT_TRUE(sessionOf(other_, 7)->started());
  EXPECT_EQ(delegate_->activeSessionCount(), 1);
}

TEST_F(HVReportingClientServerInstanceRequestsTest, AStoppedSessionCanBeStartedAgain) {
  createAndStart(client_, 7);
  stop(client_, 7);

  const Call again = start(client_, 7);

  EXPECT_TRUE(sessionOf(client_, 7)->started());
  EXPECT_EQ(delegate_->activeSessionCount(), 1);
  stop(client_, 7);
  EXPECT_EQ(again->value(), Value(true));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, HeldRepliesAreAccountedFor) {
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

TEST_F(HVReportingClientServerInstanceRequestsTest, DestroyStepsInOrder) {
  create(client_, 7);
  forgetSteps();

  EXPECT_EQ(destroy(client_, 7)->value(), Value(true));

  EXPECT_THAT(steps(),
              ElementsAre("destroying session for reporter 7", "0x21044820", "0x21044834",
                          "deallocing this session 7", "destroying 7", "destroyReportingSession"));
  EXPECT_THAT(lines(LogLevel::kDebug), ElementsAre("destroying session for reporter 7"));
  EXPECT_THAT(lines(LogLevel::kDefault), ElementsAre("destroying 7"));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, DestroyOfAStartedSessionStopsIt) {
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

TEST_F(HVReportingClientServerInstanceRequestsTest,
       DestroyNeitherCountsDownNorDeliversTheHeldReply) {
  const Call started = createAndStart(client_, 7);

  destroy(client_, 7);

  EXPECT_EQ(delegate_->activeSessionCount(), 1);
  EXPECT_FALSE(started->isAnswered());
}

TEST_F(HVReportingClientServerInstanceRequestsTest, DestroyOfIDZeroRepliesWithoutItsLastLine) {
  create(client_, 0);
  forgetSteps();

  EXPECT_EQ(destroy(client_, 0)->value(), Value(true));

  EXPECT_NE(sessionOf(client_, 0), nullptr);
  EXPECT_THAT(steps(), ElementsAre("destroying session for reporter 0", "0x21044820",
                                   "destroyReportingSession"));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, DestroyLeavesSessionsOfOthersAlone) {
  create(other_, 7);

  EXPECT_EQ(destroy(client_, 7)->value(), Value(true));

  EXPECT_NE(sessionOf(other_, 7), nullptr);
}

// --- queries ------------------------------------------------------------------------------------

TEST_F(HVReportingClientServerInstanceRequestsTest, ValidatingStepsInOrder) {
  create(client_, 7);
  setServiceType(client_, AudioServiceType::kHaptics, 7);
  forgetSteps();

  EXPECT_EQ(validate(client_, 7)->value(),
            Value(Dictionary{{"reporterID", 7}, {"serviceType", 3}}));

  EXPECT_THAT(steps(),
              ElementsAre("validating reporter 7", "validating reporter 7", "reporterIDValid"));
  EXPECT_EQ(platform_.log.lines()[0].level, LogLevel::kDebug);
  EXPECT_EQ(platform_.log.lines()[1].level, LogLevel::kDefault);
}

TEST_F(HVReportingClientServerInstanceRequestsTest, ValidatingFindsSessionsOfOthers) {
  create(other_, 7);

  EXPECT_EQ(validate(client_, 7)->value(),
            Value(Dictionary{{"reporterID", 7}, {"serviceType", 65535}}));
}

TEST_F(HVReportingClientServerInstanceRequestsTest, ValidatingAnUnknownIDAnswersTheDefaults) {
  const Value defaults(Dictionary{{"reporterID", 0}, {"serviceType", 65535}});

  EXPECT_EQ(validate(client_, 99)->value(), defaults);
  EXPECT_EQ(validate(client_, 0)->value(), defaults);
}

TEST_F(HVReportingClientServerInstanceRequestsTest, AllReportersAreThoseOfAllClientsInOrder) {
  create(other_, 5);
  createAndStart(client_, 7);
  create(other_, 7);
  forgetSteps();

  const Array all = call(client_, "getAllReporters", {})->value().array();

  ASSERT_EQ(all.size(), 3U);
  EXPECT_EQ(all[0], Value(7));
  EXPECT_THAT((std::vector{all[1].toInt64(), all[2].toInt64()}), UnorderedElementsAre(5, 7));
  EXPECT_THAT(platform_.log.texts(), IsEmpty());
}

TEST_F(HVReportingClientServerInstanceRequestsTest, KillEndsTheProcessAtOnceWithoutAReply) {
  createAndStart(client_, 7);
  post(client_, "stopReportingSessionForID", {7});
  forgetSteps();

  EXPECT_THROW(post(client_, "killService", {}), platform::FakeTermination);

  EXPECT_THAT(platform_.process.terminations(), ElementsAre(2));
  EXPECT_EQ(steps()[0], "DESTROYING SERVICE");
  EXPECT_EQ(platform_.log.lines()[0].level, LogLevel::kDefault);
  EXPECT_THAT(platform_.journal.texts(platform::JournalKind::kReply), IsEmpty());
  EXPECT_TRUE(sessionOf(client_, 7)->started());
}

}  // namespace
}  // namespace halvox
