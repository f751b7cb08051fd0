#include <chrono>
#include <cstdint>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "service/ServiceFixture.h"

// What is charged to which client while its messages wait. The connection refuses requests of a
// client that is over its limit.
namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using namespace std::chrono_literals;

class HVReportingClientServerInstanceChargesTest : public ServiceFixture {
 protected:
  ~HVReportingClientServerInstanceChargesTest() override { platform_.dispatch.clear(); }

  static std::uint64_t bytes(const Connection& connection) {
    return connection->exportedObject()->resourceUse().bytes;
  }

  const Connection owner_ = connect(100);
  const Connection sender_ = connect(200);
  const Dictionary large_{{"a", std::string(1000, 'x')}};
};

TEST_F(HVReportingClientServerInstanceChargesTest, AMessageIsChargedFromItsDeliveryOn) {
  post(sender_, "sendMessage", {large_, kCategory, kType, Array{Array{99}}});
  EXPECT_GE(bytes(sender_), 1000U);

  run();  // there is no session 99

  EXPECT_EQ(bytes(sender_), 0U);
}

TEST_F(HVReportingClientServerInstanceChargesTest, AConfigurationIsChargedFromItsDeliveryOn) {
  post(sender_, "setConfiguration", {large_, std::int64_t{99}});
  EXPECT_GE(bytes(sender_), 1000U);

  run();

  EXPECT_EQ(bytes(sender_), 0U);
}

TEST_F(HVReportingClientServerInstanceChargesTest, AStandaloneMessageIsChargedForItsSecond) {
  sendToAll(sender_, large_);
  platform_.dispatch.advance(999ms);
  EXPECT_GE(bytes(sender_), 1000U);

  platform_.dispatch.advance(1ms);

  EXPECT_EQ(bytes(sender_), 0U);
  EXPECT_EQ(platform_.tlmReporting.singleMessages().size(), 1U);
}

TEST_F(HVReportingClientServerInstanceChargesTest, AMessageToASessionOfAnotherIsTheSendersAffair) {
  create(owner_, 7);

  send(sender_, {7}, large_);
  EXPECT_GE(bytes(sender_), 1000U);
  EXPECT_EQ(bytes(owner_), 0U);
  platform_.dispatch.advance(1s);

  EXPECT_EQ(bytes(sender_), 0U);
}

TEST_F(HVReportingClientServerInstanceChargesTest, AMessageToAllActiveSessionsIsTheSendersAffair) {
  platform_.tlmReporting.answerDiscoveries(platform::FakeTlmReportingService::Answering::kWhenTold);
  createAndStart(owner_, 7);
  const std::uint64_t before = bytes(owner_);

  sendToAll(sender_, large_);
  const std::uint64_t history = bytes(owner_) - before;

  EXPECT_GE(bytes(sender_), 1000U);
  EXPECT_GE(history, 1000U);
  platform_.tlmReporting.answerDiscovery(Array{"server"});
  run();
  EXPECT_EQ(bytes(sender_), 0U);
  EXPECT_EQ(bytes(owner_) - before, history) << "charged for its history alone";
}

TEST_F(HVReportingClientServerInstanceChargesTest, AnAnsweredMessageIsSentAfterItsClientHasLeft) {
  const Call answered = sendToAll(sender_, large_);
  sender_->invalidate();
  run();

  platform_.dispatch.advance(1s);

  EXPECT_EQ(answered->replies().size(), 1U);
  EXPECT_EQ(platform_.tlmReporting.singleMessages().size(), 1U);
}

}  // namespace
}  // namespace halvox
