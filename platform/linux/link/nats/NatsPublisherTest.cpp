#include "platform/linux/link/nats/NatsPublisher.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/runtime/CounterStatisticsService.h"

namespace halvox::platform::linux_ {
namespace {

using testing::HasSubstr;

class NatsPublisherTest : public testing::Test {
 protected:
  OutgoingMessage messageOf(std::size_t bytes) {
    OutgoingMessage message;
    message.bytes = bytes;
    message.ledger = ledger_;
    message.number = ledger_->add();
    return message;
  }
  std::uint64_t counted(std::string_view name) {
    return statistics_.counter("link to NATS", name).value();
  }
  // Returns the tally of a flush of all messages so far; std::nullopt if the flush still waits.
  std::optional<AckTally> flushed() {
    std::optional<AckTally> tally;
    ledger_->flush([&tally](const AckTally& reported) { tally = reported; });
    return tally;
  }

  FakePlatform platform_;
  CounterStatisticsService statistics_;
  const Configuration::Link options_{};
  int wakes_ = 0;
  const std::shared_ptr<AckLedger> ledger_ = std::make_shared<AckLedger>();
  NatsPublisher publisher_{options_, statistics_, nullptr, [this] { ++wakes_; }};
};

TEST_F(NatsPublisherTest, TakesMessagesUpToItsBoundInBytes) {
  OutgoingMessage largest = messageOf(OutgoingQueue::kQueueBytes);
  OutgoingMessage another = messageOf(1);

  EXPECT_FALSE(publisher_.take(largest).has_value());
  const std::optional<Error> error = publisher_.take(another);

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->domain, "com.tarno.halvox.link");
  EXPECT_THAT(error->description, HasSubstr("1 messages"));
  EXPECT_TRUE(another.ledger) << "a message that is not taken stays with its sender";
}

TEST_F(NatsPublisherTest, TakesMessagesAgainAfterItsQueueFailed) {
  OutgoingMessage largest = messageOf(OutgoingQueue::kQueueBytes);
  ASSERT_FALSE(publisher_.take(largest).has_value());

  publisher_.failQueued("no server");

  EXPECT_TRUE(publisher_.isDone());
  EXPECT_EQ(counted("failed: no server"), 1U);
  EXPECT_EQ(flushed(), (AckTally{.acknowledged = 0, .notAcknowledged = 1}));
  OutgoingMessage next = messageOf(OutgoingQueue::kQueueBytes);
  EXPECT_FALSE(publisher_.take(next).has_value());
}

TEST_F(NatsPublisherTest, ARefusedMessageCountsForNoFlush) {
  publisher_.refuse(messageOf(1));

  EXPECT_EQ(counted("failed: refused"), 1U);
  EXPECT_EQ(flushed(), (AckTally{.acknowledged = 0, .notAcknowledged = 0}));
}

TEST_F(NatsPublisherTest, AbandonsTheQueueAtTheEnd) {
  OutgoingMessage message = messageOf(1);
  ASSERT_FALSE(publisher_.take(message).has_value());

  publisher_.abandonAll();

  EXPECT_FALSE(publisher_.hasUnsent());
  EXPECT_EQ(counted("failed: the service ended"), 1U);
  EXPECT_EQ(flushed(), (AckTally{.acknowledged = 0, .notAcknowledged = 1}));
}

TEST_F(NatsPublisherTest, KeepsItsQueueFromOneConnectionToTheNext) {
  OutgoingMessage message = messageOf(1);
  ASSERT_FALSE(publisher_.take(message).has_value());

  publisher_.detach();

  EXPECT_TRUE(publisher_.hasUnsent());
  EXPECT_TRUE(publisher_.canPublish({}));
}

TEST_F(NatsPublisherTest, ALostConnectionWithNothingUnacknowledgedHoldsNothing) {
  publisher_.holdAfterLoss();

  EXPECT_FALSE(publisher_.probeTime().has_value());
  EXPECT_FALSE(publisher_.canPublish({}));
  EXPECT_EQ(wakes_, 0);
}

}  // namespace
}  // namespace halvox::platform::linux_
