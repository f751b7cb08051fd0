#include "service/HVReportingClientServerInstance.h"

#include "service/ReportingQueue.h"
#include "service/ServiceFixture.h"

namespace halvox {
namespace {

using platform::Array;
using platform::LogLevel;
using platform::Value;
using testing::ElementsAre;
using Lookup = HVReportingClientServerInstance::Lookup;

class HVReportingClientServerInstanceTest : public ServiceFixture {
 protected:
  Connection client_ = connect(100);
  Connection other_ = connect(101);
};

TEST_F(HVReportingClientServerInstanceTest, ANewClientHasItsPidAndNothingElse) {
  const HVReportingClientServerInstance client(55, delegate_,
                                               ServiceCounters::make(platform_.statistics));

  EXPECT_EQ(client.processIdentifier(), 55);
  EXPECT_EQ(client.clientStartDate(), std::nullopt);
  EXPECT_EQ(client.clientProcessName(), std::nullopt);
  EXPECT_TRUE(client.clientReportingSessionMap().empty());
  EXPECT_EQ(client.resourceUse().bytes, 0U);
  EXPECT_EQ(client.resourceUse().sessions, 0U);
}

TEST_F(HVReportingClientServerInstanceTest, CreationAndDestructionAreLogged) {
  forgetSteps();
  {
    const HVReportingClientServerInstance client(55, delegate_,
                                                 ServiceCounters::make(platform_.statistics));
  }

  EXPECT_THAT(lines(LogLevel::kDefault),
              ElementsAre("new client with pid 55", "dealloc 55 from the server client list"));
}

TEST_F(HVReportingClientServerInstanceTest, TheOwnLookUpKnowsOwnSessionsOnlyAndIDZeroToo) {
  create(client_, 0);
  create(other_, 7);

  const auto client = clientOf(client_);
  EXPECT_NE(client->findReportingSessionForID(ReporterID{0}, Lookup::kOwnSessions), nullptr);
  EXPECT_EQ(client->findReportingSessionForID(ReporterID{7}, Lookup::kOwnSessions), nullptr);
}

TEST_F(HVReportingClientServerInstanceTest, TheWideLookUpKnowsSessionsOfOthers) {
  create(other_, 7);

  EXPECT_EQ(clientOf(client_)->findReportingSessionForID(ReporterID{7}, Lookup::kAcrossAllClients),
            sessionOf(other_, 7));
}

TEST_F(HVReportingClientServerInstanceTest, WithoutADelegateThereAreNoOtherClients) {
  create(other_, 7);
  const auto client = clientOf(client_);
  delegate_.reset();

  EXPECT_EQ(client->findReportingSessionForID(ReporterID{7}, Lookup::kAcrossAllClients), nullptr);
}

TEST_F(HVReportingClientServerInstanceTest, WithoutADelegateRequestsAreAnsweredAllTheSame) {
  delegate_.reset();

  EXPECT_EQ(create(client_, 7)->value(), Value(true));
  start(client_, 7);
  EXPECT_TRUE(sessionOf(client_, 7)->started());
  EXPECT_EQ(stop(client_, 7)->value(), Value(true));
  EXPECT_EQ(destroy(client_, 7)->value(), Value(true));
  EXPECT_EQ(call(client_, "getAllReporters", {})->value(), Value(Array{}));
  EXPECT_EQ(send(client_, {7})->replies().at(0).error->code, 1);
}

TEST_F(HVReportingClientServerInstanceTest, KeepsTheDelegateWeakly) {
  const std::weak_ptr<HVReportingServiceDelegate> delegate = delegate_;

  delegate_.reset();

  EXPECT_TRUE(delegate.expired());
}

TEST_F(HVReportingClientServerInstanceTest, CleaningUpStepsInOrder) {
  createAndStart(client_, 7);
  forgetSteps();

  client_->interrupt();
  run();

  EXPECT_THAT(steps(), ElementsAre("interruptionHandler: connection exited", "ending session 7",
                                   "ending session 7", "0x21044830",
                                   "removing 100 from the server client list", "0x21044834",
                                   "deallocing this session 7"));  // after the link's last job
  EXPECT_EQ(lines(LogLevel::kDefault).back(), "removing 100 from the server client list");
}

TEST_F(HVReportingClientServerInstanceTest, CleaningUpIsQueuedAndMayBlock) {
  createAndStart(client_, 7);

  client_->interrupt();

  EXPECT_TRUE(sessionOf(client_, 7)->started());
  EXPECT_EQ(platform_.dispatch.weights(gReportingQueueName).back(), platform::JobWeight::kMayBlock);
}

TEST_F(HVReportingClientServerInstanceTest, OnlyTheCounterRemainsOfADeadProcess) {
  const Call started = createAndStart(client_, 7);
  create(client_, 8);
  create(other_, 9);

  client_->invalidate();
  run();

  EXPECT_EQ(call(other_, "getAllReporters", {})->value(), Value(Array{9}));
  EXPECT_EQ(delegate_->activeSessionCount(), 1);
  EXPECT_FALSE(started->isAnswered());
  EXPECT_TRUE(platform_.log.containsText("ending session 7"));
  EXPECT_TRUE(platform_.log.containsText("dealloc 100 from the server client list"));
}

TEST_F(HVReportingClientServerInstanceTest, TheSecondConnectionErrorDoesNothing) {
  create(client_, 7);
  client_->interrupt();
  run();
  forgetSteps();

  clientOf(client_)->handleConnectionError();
  run();

  EXPECT_THAT(steps(), testing::IsEmpty());
}

TEST_F(HVReportingClientServerInstanceTest, InterruptionAndInvalidationCleanUpOnce) {
  client_->interrupt();
  client_->invalidate();
  run();

  const auto logged = platform_.log.texts();
  EXPECT_EQ(std::ranges::count(logged, "removing 100 from the server client list"), 1);
}

TEST_F(HVReportingClientServerInstanceTest, TheClientLivesUntilItsCleanUpHasRun) {
  const std::weak_ptr<HVReportingClientServerInstance> client = clientOf(client_);
  client_->invalidate();
  delegate_->removeClient(*client.lock());
  EXPECT_FALSE(client.expired());

  run();

  EXPECT_TRUE(client.expired());
}

TEST_F(HVReportingClientServerInstanceTest, RequestsOfAConnectionThatEndedAreStillCarriedOut) {
  const Call call = post(client_, "createReportingSession", {7});
  client_->invalidate();
  run();

  EXPECT_EQ(call->value(), Value(true));
  EXPECT_EQ(ServiceFixture::call(other_, "getAllReporters", {})->value(), Value(Array{}));
}

TEST_F(HVReportingClientServerInstanceTest, ResourceUseFollowsSessionsAndTheirContents) {
  const auto client = clientOf(client_);
  create(client_, 7);
  createAndStart(client_, 8);
  EXPECT_EQ(client->resourceUse().sessions, 2U);
  EXPECT_EQ(client->resourceUse().bytes, 0U);

  call(client_, "setConfiguration", {platform::Dictionary{{"a", std::string(1000, 'x')}}, 7});
  EXPECT_GE(client->resourceUse().bytes, 1000U);
  send(client_, {8}, {{"a", std::string(2000, 'x')}});
  const std::uint64_t ofBoth = client->resourceUse().bytes;
  EXPECT_GE(ofBoth, 3000U);

  destroy(client_, 7);
  EXPECT_EQ(client->resourceUse().sessions, 1U);
  EXPECT_LE(client->resourceUse().bytes, ofBoth - 1000U);
  EXPECT_GE(client->resourceUse().bytes, 2000U);
  stop(client_, 8);
  EXPECT_EQ(client->resourceUse().bytes, 0U);
}

TEST_F(HVReportingClientServerInstanceTest, AReplacedSessionGivesBackWhatItHeld) {
  platform_.analytics.setBuilding(platform::FakeAnalyticsService::Building::kWhenSent);
  createAndStart(client_, 7);
  send(client_, {7});

  create(client_, 7);

  EXPECT_EQ(clientOf(client_)->resourceUse().sessions, 1U);
  EXPECT_EQ(clientOf(client_)->resourceUse().bytes, 0U);
}

TEST_F(HVReportingClientServerInstanceTest, CleaningUpGivesEverythingBack) {
  const auto client = clientOf(client_);
  createAndStart(client_, 7);
  create(client_, 8);
  send(client_, {7});

  client_->interrupt();
  run();

  EXPECT_EQ(client->resourceUse().sessions, 0U);
  EXPECT_EQ(client->resourceUse().bytes, 0U);
}

}  // namespace
}  // namespace halvox
