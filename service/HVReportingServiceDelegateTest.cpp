#include "service/HVReportingServiceDelegate.h"

#include "service/HVReportingServiceProtocol.h"
#include "service/ReportingQueue.h"
#include "service/ServiceFixture.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::LogLevel;
using testing::ElementsAre;
using testing::IsEmpty;
using namespace std::chrono_literals;

class HVReportingServiceDelegateTest : public ServiceFixture {
 protected:
  std::vector<platform::ProcessID> clientPids() const {
    std::vector<platform::ProcessID> pids;
    for (const auto& client : delegate_->getAllClients())
      pids.push_back(client->processIdentifier());
    return pids;
  }
  void expectStepsOfAnEndWithoutUptime() {
    EXPECT_THAT(steps(),
                ElementsAre("clientStartDate is nil. clientpid=100 clientprocessname=unknown",
                            "invalidationHandler: connection exited process=unknown uptime_sec=-1",
                            "clientProcessName is nil. clientpid=100"));
  }
  std::vector<std::int64_t> activeIDs() const {
    std::vector<std::int64_t> ids;
    for (const auto& session : delegate_->getAllActiveReportingSessions()) {
      ids.push_back(static_cast<std::int64_t>(session->reporterID()));
    }
    return ids;
  }
};

TEST_F(HVReportingServiceDelegateTest, BeginsEnabledWithoutClientsAndSessions) {
  EXPECT_TRUE(delegate_->isReportingEnabled());
  EXPECT_EQ(delegate_->activeSessionCount(), 0);
  EXPECT_THAT(delegate_->getAllClients(), IsEmpty());
  EXPECT_THAT(delegate_->getAllActiveReportingSessions(), IsEmpty());
}

TEST_F(HVReportingServiceDelegateTest, MakesTheReportingQueue) {
  ASSERT_EQ(platform_.dispatch.createdQueues().size(), 1U);
  const auto traits = platform_.dispatch.createdQueues()[0];
  EXPECT_EQ(traits.label, "com.tarno.halvox.reporting.server");
  EXPECT_EQ(traits.label, gReportingQueueName);
  EXPECT_EQ(traits.quality, platform::QualityOfService::kUserInteractive);
  EXPECT_EQ(traits.threading, platform::QueueThreading::kOwnThread);
}

TEST_F(HVReportingServiceDelegateTest, ASecondDelegateReplacesTheReportingQueue) {
  const auto first = reportingQueue();

  const auto second = std::make_shared<HVReportingServiceDelegate>();

  EXPECT_NE(reportingQueue(), first);
}

TEST_F(HVReportingServiceDelegateTest, AcceptanceLogsTheConnectionThenMakesTheClient) {
  connectUnregistered(100);

  EXPECT_THAT(platform_.log.texts(),
              ElementsAre("newConnection: <FakeConnection pid 100>", "new client with pid 100"));
  for (const auto& line : platform_.log.lines()) {
    EXPECT_EQ(line.level, LogLevel::kDefault);
    EXPECT_EQ(line.subsystem, "com.tarno.halvox");
    EXPECT_EQ(line.category, "hvrs");
    EXPECT_EQ(line.line.substr(0, 27), "HVReportingServiceDelegate:");
  }
}

TEST_F(HVReportingServiceDelegateTest, AcceptanceExportsAClientAndResumes) {
  const Connection connection = connectUnregistered(100);

  EXPECT_TRUE(connection->isAccepted());
  EXPECT_TRUE(connection->isResumed());
  EXPECT_EQ(connection->exportedInterface(), &HVReportingServiceInterface());
  ASSERT_NE(clientOf(connection), nullptr);
  EXPECT_EQ(clientOf(connection)->processIdentifier(), 100);
}

TEST_F(HVReportingServiceDelegateTest, RegistrationIsQueuedAndBrief) {
  const Connection connection = connectUnregistered(100);

  EXPECT_THAT(clientPids(), IsEmpty());
  EXPECT_EQ(clientOf(connection)->clientStartDate(), std::nullopt);
  EXPECT_EQ(clientOf(connection)->clientProcessName(), std::nullopt);
  EXPECT_THAT(platform_.dispatch.weights(gReportingQueueName),
              ElementsAre(platform::JobWeight::kBrief));
}

TEST_F(HVReportingServiceDelegateTest, RegistrationSetsDateAndNameInOrderOfAcceptance) {
  platform_.clock.setCurrentDate({5000.5});
  const Connection first = connectUnregistered(100, "player");
  const Connection second = connectUnregistered(50, "recorder");
  run();

  EXPECT_THAT(clientPids(), ElementsAre(100, 50));
  EXPECT_EQ(clientOf(first)->clientStartDate(), platform::Date{5000.5});
  EXPECT_EQ(clientOf(first)->clientProcessName(), "player");
  EXPECT_EQ(clientOf(second)->clientProcessName(), "recorder");
}

TEST_F(HVReportingServiceDelegateTest, AProcessThatHasEndedHasNoName) {
  const Connection connection = connectUnregistered(100);
  platform_.process.removeProcess(100);
  run();

  EXPECT_EQ(clientOf(connection)->clientProcessName(), std::nullopt);
  EXPECT_NE(clientOf(connection)->clientStartDate(), std::nullopt);
}

TEST_F(HVReportingServiceDelegateTest, RegistrationComesBeforeTheClientsFirstRequest) {
  const Connection connection = connectUnregistered(100);
  const Call call = post(connection, "createReportingSession", {7});
  run();

  EXPECT_EQ(call->value(), platform::Value(true));
  EXPECT_NE(delegate_->findReportingSessionForID(ReporterID{7}), nullptr);
}

TEST_F(HVReportingServiceDelegateTest, AClientReleasedBeforeItsRegistrationIsNotRegistered) {
  const Connection connection = connectUnregistered(100);
  connection->setExportedObject(nullptr);
  run();

  EXPECT_THAT(clientPids(), IsEmpty());
}

TEST_F(HVReportingServiceDelegateTest, DoesNotKeepAClientAliveThroughItsHandlers) {
  const Connection connection = connect(100);
  const std::weak_ptr<HVReportingClientServerInstance> client = clientOf(connection);

  connection->invalidate();
  EXPECT_FALSE(client.expired());
  run();

  EXPECT_TRUE(client.expired());
}

TEST_F(HVReportingServiceDelegateTest, InterruptionIsLoggedAndRemovesTheClient) {
  const Connection connection = connect(100);
  forgetSteps();

  connection->interrupt();
  EXPECT_THAT(steps(), ElementsAre("interruptionHandler: connection exited"));
  EXPECT_EQ(platform_.log.lines()[0].level, LogLevel::kDefault);
  run();

  EXPECT_THAT(clientPids(), IsEmpty());
}

TEST_F(HVReportingServiceDelegateTest, UptimeOfAClientIsReportedWhenItsConnectionEnds) {
  const Connection connection = connect(100, "player");
  platform_.clock.advance(42500ms);
  forgetSteps();

  connection->invalidate();

  EXPECT_THAT(steps(),
              ElementsAre("invalidationHandler: connection exited process=player uptime_sec=42",
                          "com.tarno.halvox.hvreportingclientuptime"));
  EXPECT_EQ(platform_.log.lines()[0].level, LogLevel::kDefault);
  const auto events = platform_.analytics.events("com.tarno.halvox.hvreportingclientuptime");
  ASSERT_EQ(events.size(), 1U);
  EXPECT_EQ(events[0].payload, (Dictionary{{"processName", "player"}, {"seconds", 42.5}}));
  EXPECT_EQ(events[0].payload->find("seconds")->numberKind(), platform::NumberKind::kDouble);
}

TEST_F(HVReportingServiceDelegateTest, TheUptimeEventIsSentWithoutAskingWhetherItIsWanted) {
  const Connection connection = connect(100);
  platform_.analytics.wantOnly({});

  connection->invalidate();

  EXPECT_THAT(platform_.analytics.testedNames(), IsEmpty());
  EXPECT_THAT(platform_.analytics.sentNames(),
              ElementsAre("com.tarno.halvox.hvreportingclientuptime"));
}

TEST_F(HVReportingServiceDelegateTest, AStartDateInTheFutureIsLoggedAsInThePast) {
  platform_.clock.setCurrentDate({5000});
  const Connection connection = connect(100, "player");
  platform_.clock.setCurrentDate({4990});
  forgetSteps();

  connection->invalidate();

  EXPECT_THAT(lines(LogLevel::kDefault),
              ElementsAre("clientStartDate is in the past. clientpid=100 clientprocessname=player",
                          "invalidationHandler: connection exited process=player uptime_sec=10"));
  EXPECT_EQ(platform_.analytics.events()[0].payload,
            (Dictionary{{"processName", "player"}, {"seconds", 10.0}}));
}

TEST_F(HVReportingServiceDelegateTest, AConnectionThatEndsBeforeItsRegistrationHasNoUptime) {
  const Connection connection = connectUnregistered(100);
  forgetSteps();

  connection->invalidate();

  expectStepsOfAnEndWithoutUptime();
  EXPECT_EQ(lines(LogLevel::kDefault).size(), 3U);
  EXPECT_THAT(platform_.analytics.sentNames(), IsEmpty());
}

TEST_F(HVReportingServiceDelegateTest, AConnectionWithoutItsClientHasNoUptime) {
  const Connection connection = connectUnregistered(100);
  connection->setExportedObject(nullptr);
  forgetSteps();

  connection->invalidate();

  expectStepsOfAnEndWithoutUptime();
}

TEST_F(HVReportingServiceDelegateTest, AClientWithoutANameSendsNoUptimeEvent) {
  const Connection connection = connectUnregistered(100);
  platform_.process.removeProcess(100);
  run();
  forgetSteps();

  connection->invalidate();

  EXPECT_THAT(steps(),
              ElementsAre("invalidationHandler: connection exited process=unknown uptime_sec=0",
                          "clientProcessName is nil. clientpid=100"));
}

TEST_F(HVReportingServiceDelegateTest, AClientThatEndsBeforeItsRegistrationLeavesNothing) {
  const Connection connection = connectUnregistered(100);
  connection->invalidate();
  run();

  EXPECT_THAT(clientPids(), IsEmpty());
  EXPECT_TRUE(platform_.log.containsText("dealloc 100 from the server client list"));
}

TEST_F(HVReportingServiceDelegateTest, FindingIDZeroAnswersNullWithoutALine) {
  create(connect(100), 0);
  forgetSteps();

  EXPECT_EQ(delegate_->findReportingSessionForID(ReporterID{0}), nullptr);
  EXPECT_THAT(platform_.log.texts(), IsEmpty());
}

TEST_F(HVReportingServiceDelegateTest, FindingAnUnknownIDLogsAnError) {
  EXPECT_EQ(delegate_->findReportingSessionForID(ReporterID{-99}), nullptr);

  EXPECT_THAT(lines(LogLevel::kError), ElementsAre("failed to find reporting session -99"));
}

TEST_F(HVReportingServiceDelegateTest, FindingLogsTheClientThatHasTheSession) {
  const Connection connection = connect(100);
  create(connection, 7);
  forgetSteps();

  EXPECT_EQ(delegate_->findReportingSessionForID(ReporterID{7}), sessionOf(connection, 7));

  EXPECT_THAT(platform_.log.texts(), ElementsAre("found reporting session 7 for client 100"));
  EXPECT_EQ(platform_.log.lines()[0].level, LogLevel::kInfo);
}

TEST_F(HVReportingServiceDelegateTest, OfTwoClientsWithOneIDTheEarlierRegisteredWins) {
  const Connection early = connect(200);
  const Connection late = connect(100);
  create(late, 7);
  create(early, 7);

  EXPECT_EQ(delegate_->findReportingSessionForID(ReporterID{7}), sessionOf(early, 7));

  destroy(early, 7);
  EXPECT_EQ(delegate_->findReportingSessionForID(ReporterID{7}), sessionOf(late, 7));
}

TEST_F(HVReportingServiceDelegateTest, WhileDisabledEveryLookUpAnswersNullWithoutALine) {
  create(connect(100), 7);
  delegate_->setReportingEnabled(false);
  forgetSteps();

  EXPECT_EQ(delegate_->findReportingSessionForID(ReporterID{7}), nullptr);
  EXPECT_EQ(delegate_->findReportingSessionForID(ReporterID{8}), nullptr);
  EXPECT_THAT(platform_.log.texts(), IsEmpty());
}

TEST_F(HVReportingServiceDelegateTest, ActiveSessionsAreThoseThatAreStarted) {
  const Connection connection = connect(100);
  createAndStart(connection, 1);
  create(connection, 2);

  EXPECT_THAT(activeIDs(), ElementsAre(1));
}

TEST_F(HVReportingServiceDelegateTest, ActiveSessionsComeInTheOrderOfTheirClients) {
  const Connection first = connect(200);
  const Connection second = connect(100);
  createAndStart(second, 1);
  createAndStart(first, 5);
  createAndStart(first, 4);

  const auto ids = activeIDs();
  ASSERT_EQ(ids.size(), 3U);
  EXPECT_THAT((std::vector{ids[0], ids[1]}), testing::UnorderedElementsAre(4, 5));
  EXPECT_EQ(ids[2], 1);
}

TEST_F(HVReportingServiceDelegateTest, ActiveSessionsAreTheSameWhenNoLineIsWanted) {
  const Connection first = connect(200);
  const Connection second = connect(100);
  createAndStart(second, 1);
  createAndStart(first, 5);
  create(first, 6);
  const auto listed = activeIDs();

  platform_.log.setLevel(LogLevel::kError);

  EXPECT_EQ(activeIDs(), listed);
  EXPECT_THAT(listed, ElementsAre(5, 1));
}

TEST_F(HVReportingServiceDelegateTest, ListingTheActiveSessionsLogsAllSessionsOfEveryClient) {
  const Connection first = connect(100);
  connect(101);
  createAndStart(first, 1);
  forgetSteps();

  static_cast<void>(delegate_->getAllActiveReportingSessions());

  EXPECT_THAT(
      lines(LogLevel::kDefault),
      ElementsAre("sessions for client 100 : (reporterID=1,serviceName=unknown,ownerPid=100,"
                  "HostApplicationDisplayID=Unknown,started=1)",
                  "sessions for client 101 : ()"));
}

TEST_F(HVReportingServiceDelegateTest, RemovingAClientRemovesItsSessionsFromAllLookUps) {
  const Connection connection = connect(100);
  createAndStart(connection, 7);

  delegate_->removeClient(*clientOf(connection));

  EXPECT_THAT(clientPids(), IsEmpty());
  EXPECT_THAT(activeIDs(), IsEmpty());
  EXPECT_EQ(delegate_->findReportingSessionForID(ReporterID{7}), nullptr);
}

TEST_F(HVReportingServiceDelegateTest, SessionsThatARemovedClientMakesAreNotFound) {
  const Connection connection = connect(100);
  connection->interrupt();
  run();

  EXPECT_EQ(create(connection, 7)->value(), platform::Value(true));
  start(connection, 7);

  EXPECT_NE(sessionOf(connection, 7), nullptr);
  EXPECT_EQ(delegate_->findReportingSessionForID(ReporterID{7}), nullptr);
  EXPECT_THAT(activeIDs(), IsEmpty());
}

TEST_F(HVReportingServiceDelegateTest, LosingOneClientLeavesTheOthersAlone) {
  const Connection first = connect(100);
  const Connection second = connect(101);
  createAndStart(first, 1);
  createAndStart(second, 2);

  first->invalidate();
  run();

  EXPECT_THAT(clientPids(), ElementsAre(101));
  EXPECT_THAT(activeIDs(), ElementsAre(2));
}

TEST_F(HVReportingServiceDelegateTest, TheActiveSessionCountIsAPlainCounter) {
  delegate_->setActiveSessionCount(17);

  EXPECT_EQ(delegate_->activeSessionCount(), 17);
}

}  // namespace
}  // namespace halvox
