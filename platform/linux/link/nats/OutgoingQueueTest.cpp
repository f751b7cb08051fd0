#include "platform/linux/link/nats/OutgoingQueue.h"

#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/store/spool/testing/FakeLinkSpool.h"

namespace halvox::platform::linux_ {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using Time = OutgoingQueue::Time;

class OutgoingQueueTest : public testing::Test {
 protected:
  // Open the library, because messages cannot be created before.
  static void SetUpTestSuite() { ASSERT_EQ(nats_Open(-1), NATS_OK); }
  static void TearDownTestSuite() { EXPECT_EQ(nats_CloseAndWait(5000), NATS_OK); }

  OutgoingQueueTest() {
    queue_.resume([this] { ++wakes_; });
    queue_.setOnline(true);
  }

  static OutgoingMessage messageOf(int number) {
    OutgoingMessage message;
    EXPECT_EQ(makeMessage("halvox.a", std::to_string(number), "{}", message), NATS_OK);
    return message;
  }
  void take(int number) {
    OutgoingMessage message = messageOf(number);
    EXPECT_FALSE(queue_.take(message, pending_, kept_, now_).has_value());
    EXPECT_FALSE(message.message) << "a message that was taken belongs to the queue";
  }
  // Publishes the next message, as if the library had taken it, and returns its identifier.
  std::string publish() {
    OutgoingMessage next = queue_.takeNext();
    const char* identifier = "";
    EXPECT_EQ(natsMsgHeader_Get(next.message.get(), kMessageIdHeader, &identifier), NATS_OK);
    std::string text = identifier;
    pending_.add(next.message.get(),
                 {.bytes = next.bytes, .published = now_, .spooled = next.spooled});
    published_.push_back(std::move(next.message));
    return text;
  }
  std::vector<std::string> publishAll() {
    std::vector<std::string> identifiers;
    while (queue_.hasNext()) identifiers.push_back(publish());
    return identifiers;
  }
  void acknowledge(std::size_t index) {
    const auto entry = pending_.take(published_[index].get());
    ASSERT_TRUE(entry.has_value());
    if (entry->spooled != 0) queue_.settle(entry->spooled);
  }
  // Reads from the spool until the queue wants nothing more of it or waits for the store. Publishes
  // what comes, and returns the identifiers.
  std::vector<std::string> readAll() {
    std::vector<std::string> identifiers;
    while (queue_.mustRead(now_)) {
      readOnce();
      for (const std::string& identifier : publishAll()) identifiers.push_back(identifier);
    }
    return identifiers;
  }
  void readOnce() {
    const OutgoingQueue::ReadPlan plan = queue_.planRead();
    const auto read = spool_.readAfter(plan.after);
    ASSERT_TRUE(read);
    std::vector<OutgoingMessage> messages;
    for (const auto& [number, message] : read->messages) {
      messages.push_back(messageOf(std::stoi(message.identifier)));
      messages.back().spooled = number;
    }
    queue_.addRead(plan, *read, std::move(messages));
  }

  // Loses the server for so long that messages go into the spool.
  void loseServer() {
    queue_.setOnline(false);
    queue_.keep(pending_, kept_);
  }

  Time now_ = std::chrono::steady_clock::now();
  CounterStatisticsService statistics_;
  FakeLinkSpool spool_;
  PendingAcks pending_{AckWindow{}};
  std::vector<NatsMessage> published_;
  OutgoingQueue::Kept kept_;
  int wakes_ = 0;
  OutgoingQueue queue_{&spool_, statistics_};
};

TEST_F(OutgoingQueueTest, WhileAServerIsThereMessagesStayInMemory) {
  take(1);
  take(2);

  EXPECT_THAT(publishAll(), ElementsAre("1", "2"));
  EXPECT_THAT(spool_.identifiers(), IsEmpty());
  EXPECT_FALSE(queue_.hasUnsent());
}

TEST_F(OutgoingQueueTest, WithoutAServerMessagesGoIntoTheSpoolAfterThoseBefore) {
  take(1);
  publish();
  take(2);
  queue_.setOnline(false);
  now_ += OutgoingQueue::kMemoryTime;
  take(3);

  EXPECT_THAT(spool_.identifiers(), ElementsAre("1", "2", "3"));
  EXPECT_TRUE(queue_.hasUnsent());
  EXPECT_FALSE(queue_.hasNext());
}

TEST_F(OutgoingQueueTest, AServerThatComesBackSoonLeavesTheSpoolEmpty) {
  take(1);
  queue_.setOnline(false);
  now_ += OutgoingQueue::kMemoryTime - std::chrono::milliseconds(1);
  take(2);
  queue_.setOnline(true);

  EXPECT_THAT(spool_.identifiers(), IsEmpty());
  EXPECT_THAT(publishAll(), ElementsAre("1", "2"));
}

TEST_F(OutgoingQueueTest, MessagesComeBackInOrderAndNewOnesFollowThem) {
  loseServer();
  for (int number = 1; number <= 9; ++number) take(number);
  queue_.setOnline(true);

  EXPECT_THAT(readAll(), ElementsAre("1", "2", "3", "4", "5", "6", "7", "8", "9"));
  take(10);
  EXPECT_THAT(publishAll(), ElementsAre("10"));
  for (std::size_t index = 0; index < published_.size(); ++index) acknowledge(index);
  EXPECT_THAT(spool_.identifiers(), IsEmpty());
}

TEST_F(OutgoingQueueTest, NewMessagesWaitInMemoryForTheLastOnesOfTheSpool) {
  loseServer();
  spool_.hold();
  take(1);
  queue_.setOnline(true);
  EXPECT_THAT(readAll(), IsEmpty());
  take(2);

  EXPECT_FALSE(queue_.hasNext()) << "2 would overtake 1";
  EXPECT_EQ(wakes_, 0);
  spool_.store();
  EXPECT_EQ(wakes_, 1);

  EXPECT_THAT(readAll(), ElementsAre("1", "2"));
}

TEST_F(OutgoingQueueTest, TheStoreWakesNobodyWhoDoesNotWaitForIt) {
  loseServer();
  take(1);
  take(2);

  EXPECT_EQ(wakes_, 0);
}

TEST_F(OutgoingQueueTest, WhatWasKeptAndAcknowledgedIsNotSentAgain) {
  take(1);
  take(2);
  publishAll();
  queue_.keep(pending_, kept_);
  EXPECT_THAT(spool_.identifiers(), ElementsAre("1", "2"));
  acknowledge(0);

  static_cast<void>(pending_.takeAll());
  queue_.rewind();

  EXPECT_THAT(spool_.identifiers(), ElementsAre("2"));
  EXPECT_THAT(readAll(), ElementsAre("2"));
}

TEST_F(OutgoingQueueTest, PublishedMessagesThatWereKeptAreNotReadBeforeTheyAreGivenBack) {
  take(1);
  publish();
  queue_.keep(pending_, kept_);
  take(2);

  EXPECT_THAT(readAll(), ElementsAre("2"));
}

TEST_F(OutgoingQueueTest, AMessageIsKeptWhenItHasWaitedTooLong) {
  EXPECT_FALSE(queue_.keepTime(pending_).has_value());
  take(1);
  const auto queued = queue_.keepTime(pending_);
  publish();
  const auto published = queue_.keepTime(pending_);

  ASSERT_TRUE(queued.has_value());
  EXPECT_GE(*queued, now_ + OutgoingQueue::kMemoryTime);
  EXPECT_EQ(published, now_ + OutgoingQueue::kMemoryTime);
  queue_.keep(pending_, kept_);
  EXPECT_FALSE(queue_.keepTime(pending_).has_value());
}

TEST_F(OutgoingQueueTest, WhileTheStoreFailsMessagesWaitInMemory) {
  spool_.setCanKeep(false);
  queue_.setOnline(false);
  take(1);
  now_ += OutgoingQueue::kMemoryTime;
  take(2);

  EXPECT_THAT(spool_.identifiers(), IsEmpty());
  EXPECT_FALSE(queue_.keepTime(pending_).has_value());
  queue_.setOnline(true);
  EXPECT_THAT(publishAll(), ElementsAre("1", "2"));
}

TEST_F(OutgoingQueueTest, AStoreThatBeginsToFailGetsNoFurtherMessages) {
  loseServer();
  take(1);
  spool_.setCanKeep(false);
  take(2);
  EXPECT_THAT(spool_.identifiers(), ElementsAre("1"));
  queue_.setOnline(true);

  EXPECT_THAT(readAll(), ElementsAre("1", "2"));
}

TEST_F(OutgoingQueueTest, AFlushNeedNotWaitForAKeptMessage) {
  const auto ledger = std::make_shared<AckLedger>();
  loseServer();
  OutgoingMessage message = messageOf(1);
  message.ledger = ledger;
  message.number = 7;

  EXPECT_FALSE(queue_.take(message, pending_, kept_, now_).has_value());

  EXPECT_THAT(kept_, ElementsAre(testing::Pair(ledger, 7U)));
}

TEST_F(OutgoingQueueTest, AClosedStoreRefusesMessages) {
  loseServer();
  take(1);
  spool_.close();
  OutgoingMessage message = messageOf(2);

  const auto error = queue_.take(message, pending_, kept_, now_);

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->description, "the store is closed");
  EXPECT_TRUE(message.message) << "a message that is not taken stays with its sender";
}

TEST_F(OutgoingQueueTest, MessagesThatTheStoreHasLostHoldNothingUp) {
  loseServer();
  for (int number = 1; number <= 6; ++number) take(number);
  spool_.lose(1);
  spool_.lose(4);
  queue_.setOnline(true);

  EXPECT_THAT(readAll(), ElementsAre("2", "3", "5", "6"));
  for (std::size_t index = 0; index < published_.size(); ++index) acknowledge(index);
  EXPECT_FALSE(queue_.hasUnsent());
}

TEST_F(OutgoingQueueTest, ARunGoesOnWithWhatAnotherHasKept) {
  loseServer();
  take(1);
  take(2);

  OutgoingQueue next(&spool_, statistics_);
  next.resume([] {});

  EXPECT_TRUE(next.hasUnsent());
  EXPECT_EQ(next.planRead().after, 0U);
}

TEST_F(OutgoingQueueTest, ReadsAgainAfterAPauseWhenAReadFailed) {
  loseServer();
  take(1);
  queue_.setOnline(true);

  queue_.noteFailedRead(now_);

  EXPECT_FALSE(queue_.mustRead(now_));
  ASSERT_EQ(queue_.nextRead(), now_ + OutgoingQueue::kReadPause);
  EXPECT_TRUE(queue_.mustRead(now_ + OutgoingQueue::kReadPause));
}

TEST_F(OutgoingQueueTest, WhatWasReadForAnotherStateIsReadAgain) {
  loseServer();
  take(1);
  take(2);
  queue_.setOnline(true);
  const OutgoingQueue::ReadPlan plan = queue_.planRead();
  const auto read = spool_.readAfter(plan.after);
  ASSERT_TRUE(read);
  EXPECT_THAT(readAll(), ElementsAre("1", "2"));

  std::vector<OutgoingMessage> messages;
  messages.push_back(messageOf(1));
  queue_.addRead(plan, *read, std::move(messages));

  EXPECT_FALSE(queue_.hasNext());
}

TEST_F(OutgoingQueueTest, WithoutASpoolItHoldsMessagesUpToItsBound) {
  OutgoingQueue queue(nullptr, statistics_);
  OutgoingMessage largest = messageOf(1);
  largest.bytes = OutgoingQueue::kQueueBytes;
  OutgoingMessage another = messageOf(2);

  EXPECT_FALSE(queue.take(largest, pending_, kept_, now_).has_value());
  const auto error = queue.take(another, pending_, kept_, now_);

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->description, "the queue to NATS is full: 1 messages wait for a server");
  EXPECT_FALSE(queue.keepTime(pending_).has_value());
  EXPECT_FALSE(queue.mustRead(now_));
}

TEST_F(OutgoingQueueTest, WithASpoolAFullMemoryGoesThere) {
  OutgoingMessage largest = messageOf(1);
  largest.bytes = OutgoingQueue::kQueueBytes;
  ASSERT_FALSE(queue_.take(largest, pending_, kept_, now_).has_value());

  take(2);

  EXPECT_THAT(spool_.identifiers(), ElementsAre("1", "2"));
}

}  // namespace
}  // namespace halvox::platform::linux_
