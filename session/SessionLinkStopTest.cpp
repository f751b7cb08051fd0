#include <chrono>
#include <memory>
#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "session/LinkFixture.h"

namespace halvox::link_test {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using namespace std::chrono_literals;

class SessionLinkStopTest : public LinkFixture {};

TEST_F(SessionLinkStopTest, StopFlushesAfterAllMessages) {
  open();
  send({{"a", 1}});
  platform_.journal.clear();

  stop();

  EXPECT_THAT(frameworkSteps(),
              ElementsAre("send session 1 4/1", "send session 1 65535/65535", "flush session 1"));
  EXPECT_TRUE(holdsNothing());
  EXPECT_EQ(framework_.liveSessions(), 0U);
}

TEST_F(SessionLinkStopTest, StopLogsAroundTheFlush) {
  open();
  framework_.answerFlushes(Fake::Answering::kWhenTold);
  linkLines();

  stop();
  EXPECT_THAT(linkLines(), ElementsAre(kStopEntered));

  framework_.completeFlush();
  run();
  EXPECT_THAT(linkLines(), ElementsAre(kClosed));
}

TEST_F(SessionLinkStopTest, TheSessionOfTheFrameworkStaysUntilItIsFlushed) {
  open();
  framework_.answerFlushes(Fake::Answering::kWhenTold);

  stop();
  platform_.dispatch.advance(1h);
  EXPECT_NE(session_->link().tlmReportingSession(), nullptr);
  EXPECT_TRUE(session_->link().tlmReportingSessionStarted());

  framework_.completeFlush();
  run();
  EXPECT_TRUE(holdsNothing());
  EXPECT_FALSE(session_->link().tlmReportingSessionStarted());
}

TEST_F(SessionLinkStopTest, WhileAFlushIsOutNothingElseOfTheLinkRuns) {
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

TEST_F(SessionLinkStopTest, AFlushTakesNoSignalOfADiscovery) {
  holdDiscoveries();
  start();
  platform_.dispatch.advance(9s);
  framework_.answerDiscovery(kServers);  // too late: the signal remains
  stop();
  framework_.answerFlushes(Fake::Answering::kWhenTold);
  holdDiscoveries();
  start();  // consumes the signal and gives up
  stop();   // has nothing to flush
  framework_.answerDiscovery(kServers);

  start();
  EXPECT_EQ(framework_.waitingFlushes(), 0U);
  EXPECT_EQ(framework_.sessions().size(), 3U);
}

TEST_F(SessionLinkStopTest, StopWithoutAFrameworkSessionFlushesNothing) {
  start();
  linkLines();
  platform_.journal.clear();

  stop();

  EXPECT_THAT(frameworkSteps(), IsEmpty());
  EXPECT_THAT(linkLines(), ElementsAre(kStopEntered, kClosed));
}

TEST_F(SessionLinkStopTest, StopDuringTheWaitClosesTheLinkAfterIt) {
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

TEST_F(SessionLinkStopTest, ASessionCanBeStartedAgainWithANewFrameworkSession) {
  open();
  stop();

  start();
  send({{"a", 1}});
  run();

  EXPECT_EQ(framework_.tokens().size(), 2U);
  EXPECT_EQ(framework_.messages().back().session, 2U);
}

TEST_F(SessionLinkStopTest, ASessionThatWaitsDelaysNoOther) {
  holdDiscoveries();
  start();
  framework_.answerDiscoveries(Fake::Answering::kLater, kServers);
  const auto other =
      std::make_shared<HVReportingSession>(ReporterID{8}, HVReportingSession::ProcessIdentifiers{},
                                           SessionCounters::make(platform_.statistics));
  other->setTlmReportingEnabled(true);

  other->start();
  other->sendMessage(Dictionary{{"a", 1}}, kPlayback, kStart, nullptr);
  run();

  EXPECT_EQ(framework_.messages().size(), 1U);
  EXPECT_EQ(framework_.messages().at(0).session, 2U);
}

TEST_F(SessionLinkStopTest, TheLastJobKeepsTheSessionUntilItIsFlushed) {
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

// Checked by ThreadSanitizer: the discovery answers on a thread of the framework.
TEST_F(SessionLinkStopTest, DiscoveryMayAnswerOnAnotherThread) {
  holdDiscoveries();
  start();

  std::thread([this] { framework_.answerDiscovery(kServers); }).join();
  run();

  EXPECT_EQ(linkLines().back(), kContinuing);
}

}  // namespace
}  // namespace halvox::link_test
