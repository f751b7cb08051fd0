#include <chrono>
#include <memory>
#include <string>
#include <thread>

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include "client/HalvoxClient.h"
#include "client/testing/TestService.h"

namespace halvox::client {
namespace {

using namespace std::chrono_literals;

constexpr auto kShort = 50ms;

class HalvoxConnectionTest : public testing::Test {
 protected:
  HalvoxConnectionTest() : socketPath_(scratch_.path("reporting.sock")), service_(socketPath_) {
    connection_ = connect();
  }
  std::unique_ptr<HalvoxConnection> connect(std::chrono::milliseconds timeout = 5s) {
    auto opened = HalvoxConnection::open(socketPath_, timeout);
    EXPECT_TRUE(opened) << (opened.failure ? opened.failure->message : "");
    return opened ? std::move(*opened.value) : nullptr;
  }

  ScratchDirectory scratch_;
  std::string socketPath_;
  TestService service_;
  std::unique_ptr<HalvoxConnection> connection_;
};

TEST_F(HalvoxConnectionTest, TakesASessionThroughItsLife) {
  EXPECT_EQ(connection_->createReportingSession(7).value, true);
  EXPECT_EQ(connection_->setServiceType(2, 7).value, true);
  EXPECT_EQ(connection_->setConfiguration({{"HostApplicationDisplayID", "test"}}, 7).value, true);
  EXPECT_EQ(connection_->startReportingSessionForID(7).value, true);
  EXPECT_EQ(connection_->sendMessage({{"n", 1}}, 4, 1, {{7}}).value, true);
  EXPECT_EQ(connection_->stopReportingSessionForID(7).value, true);
  EXPECT_EQ(connection_->destroyReportingSession(7).value, true);

  EXPECT_EQ(service_.members(),
            "createReportingSession setServiceType setConfiguration startReportingSessionForID "
            "reporterIDValid sendMessage stopReportingSessionForID destroyReportingSession");
}

TEST_F(HalvoxConnectionTest, QueriesGiveWhatTheServiceAnswers) {
  connection_->createReportingSession(7);
  connection_->createReportingSession(-3);
  connection_->setServiceType(11, 7);

  EXPECT_EQ(connection_->getServiceNameForReporterID(7).value, 11);
  EXPECT_EQ(connection_->getServiceNameForReporterID(8).value, 65535);
  EXPECT_EQ(connection_->reporterIDValid(7).value,
            (Dictionary{{"reporterID", 7}, {"serviceType", 11}}));
  EXPECT_EQ(connection_->getAllReporters().value, (std::vector<ReporterID>{-3, 7}));
}

TEST_F(HalvoxConnectionTest, CountersHaveTheirPieceAndName) {
  connection_->sendMessage({{"n", 1}}, 4, 1, std::nullopt);

  EXPECT_EQ(connection_->getCounters().value, (Dictionary{{"messages, received", 1}}));
}

TEST_F(HalvoxConnectionTest, MessagesArriveWithCategoryTypeAndRecipients) {
  connection_->sendMessage({{"n", 1}}, 0x08000004, 17, {{7, 8}});
  connection_->sendMessage({}, 4, 1, std::vector<ReporterID>{});
  connection_->sendMessage({}, 4, 1, std::nullopt);

  using platform::Array;
  const auto calls = service_.calls();
  ASSERT_EQ(calls.size(), 3U);
  EXPECT_EQ(calls[0].arguments,
            (std::vector<Value>{Dictionary{{"n", 1}}, 0x08000004, 17, Array{Value(Array{7, 8})}}));
  EXPECT_EQ(calls[1].arguments.at(3), Value(Array{Value(Array{})}));
  EXPECT_EQ(calls[2].arguments.at(3), Value(Array{}));
}

TEST_F(HalvoxConnectionTest, AStartIsAnsweredAtTheStop) {
  connection_->createReportingSession(7);
  connection_->startReportingSessionForID(7);

  const auto early = connection_->waitForStartReply(7, kShort);
  connection_->stopReportingSessionForID(7);
  const auto late = connection_->waitForStartReply(7, 5s);

  ASSERT_TRUE(early.failure);
  EXPECT_EQ(early.failure->kind, Failure::Kind::kTimedOut);
  EXPECT_EQ(late.value, true);
}

TEST_F(HalvoxConnectionTest, WaitingForAStartThatWasNotMadeIsABadRequest) {
  const auto waited = connection_->waitForStartReply(7, 5s);

  ASSERT_TRUE(waited.failure);
  EXPECT_EQ(waited.failure->kind, Failure::Kind::kBadRequest);
}

TEST_F(HalvoxConnectionTest, GivesTheNameAndTextOfARefusal) {
  service_.refuse("sendMessage");

  const auto sent = connection_->sendMessage({}, 4, 1, std::nullopt);

  ASSERT_TRUE(sent.failure);
  EXPECT_EQ(sent.failure->kind, Failure::Kind::kRefused);
  EXPECT_EQ(sent.failure->name, "com.tarno.audio.reporting.Code1");
  EXPECT_EQ(sent.failure->message, "refused by the test");
}

TEST_F(HalvoxConnectionTest, ARefusedStartIsToldAtOnce) {
  connection_->createReportingSession(7);
  service_.refuse("startReportingSessionForID", "org.freedesktop.DBus.Error.LimitsExceeded");

  const auto started = connection_->startReportingSessionForID(7);

  ASSERT_TRUE(started.failure);
  EXPECT_EQ(started.failure->name, "org.freedesktop.DBus.Error.LimitsExceeded");
}

TEST_F(HalvoxConnectionTest, AValueWithoutFormOnTheWireIsABadRequest) {
  const auto sent = connection_->sendMessage({{"x", Value()}}, 4, 1, std::nullopt);

  ASSERT_TRUE(sent.failure);
  EXPECT_EQ(sent.failure->kind, Failure::Kind::kBadRequest);
  EXPECT_EQ(sent.failure->message, "\"x\": there is no value");
}

TEST_F(HalvoxConnectionTest, KillingTheServiceIsToldByTheEndOfTheConnection) {
  EXPECT_EQ(connection_->killService().value, true);

  const auto after = connection_->createReportingSession(7);
  ASSERT_TRUE(after.failure);
  EXPECT_EQ(after.failure->kind, Failure::Kind::kNoService);
}

TEST_F(HalvoxConnectionTest, AStalledServiceRunsIntoTheTimeOut) {
  const auto impatient = connect(kShort);
  service_.setStalled(true);

  const auto created = impatient->createReportingSession(7);

  ASSERT_TRUE(created.failure);
  EXPECT_EQ(created.failure->kind, Failure::Kind::kTimedOut);
}

TEST_F(HalvoxConnectionTest, AStalledServiceDoesNotHoldUpOpening) {
  service_.setStalled(true);

  const auto opened = HalvoxConnection::open(socketPath_, kShort);

  ASSERT_TRUE(opened.failure);
  EXPECT_EQ(opened.failure->kind, Failure::Kind::kTimedOut);
}

TEST_F(HalvoxConnectionTest, OpeningWithoutAServiceSaysWhereItLooked) {
  service_.vanish();

  const auto opened = HalvoxConnection::open(socketPath_);

  ASSERT_TRUE(opened.failure);
  EXPECT_EQ(opened.failure->kind, Failure::Kind::kNoService);
  EXPECT_NE(opened.failure->message.find(socketPath_), std::string::npos);
}

TEST_F(HalvoxConnectionTest, APathTooLongForASocketIsNoService) {
  const auto opened = HalvoxConnection::open(std::string(200, 'x'));

  ASSERT_TRUE(opened.failure);
  EXPECT_EQ(opened.failure->kind, Failure::Kind::kNoService);
}

}  // namespace
}  // namespace halvox::client
