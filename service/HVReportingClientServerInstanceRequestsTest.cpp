#include "service/ReportingQueue.h"
#include "service/ServiceFixture.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::JobWeight;
using platform::LogLevel;
using platform::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

class HVReportingClientServerInstanceRequestsTest : public ServiceFixture {
 protected:
  HVReportingClientServerInstanceRequestsTest() { forgetSteps(); }

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
