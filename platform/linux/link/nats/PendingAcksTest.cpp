#include "platform/linux/link/nats/PendingAcks.h"

#include <vector>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

using Time = PendingAcks::Time;

NatsMessage makeMessage() {
  NatsMessage message;
  EXPECT_EQ(natsMsg_Create(message.out(), "subject", nullptr, "x", 1), NATS_OK);
  return message;
}

PendingAcks::Entry entryOf(std::size_t bytes, Time deadline = Time::max()) {
  return {.ledger = nullptr, .number = 0, .bytes = bytes, .deadline = deadline};
}

Time at(int seconds) { return Time(std::chrono::seconds(seconds)); }

class PendingAcksTest : public ::testing::Test {
 protected:
  // Open the library, because messages cannot be created before.
  static void SetUpTestSuite() { ASSERT_EQ(nats_Open(-1), NATS_OK); }
  static void TearDownTestSuite() { EXPECT_EQ(nats_CloseAndWait(5000), NATS_OK); }

  // Adds a message that was passed to the library.
  const natsMsg* add(NatsMessage& message, Time deadline = Time::max()) {
    pending.add(message.get(), entryOf(1, deadline));
    return message.get();
  }

  PendingAcks pending{{.messages = 2, .bytes = 1000}};
  NatsMessage one = makeMessage();
  NatsMessage two = makeMessage();
  NatsMessage three = makeMessage();
};

TEST_F(PendingAcksTest, WindowIsFullAtItsMessages) {
  add(one);
  EXPECT_TRUE(pending.hasRoom());
  add(two);
  EXPECT_FALSE(pending.hasRoom());
  EXPECT_TRUE(pending.take(two.get()).has_value());

  EXPECT_TRUE(pending.hasRoom());
}

TEST_F(PendingAcksTest, WindowIsFullAtItsBytes) {
  pending.add(one.get(), entryOf(5000));

  EXPECT_FALSE(pending.hasRoom());
}

TEST_F(PendingAcksTest, AMessageIsTakenOnce) {
  pending.add(one.get(), entryOf(7));

  EXPECT_EQ(pending.take(one.get())->bytes, 7U);
  EXPECT_FALSE(pending.take(one.get()).has_value());
  EXPECT_EQ(pending.size(), 0U);
}

TEST_F(PendingAcksTest, WhatWasGivenBackIsPublishedAgainInTheFirstOrder) {
  const natsMsg* const first = add(one);
  const natsMsg* const second = add(two);
  const natsMsg* const third = add(three);
  EXPECT_FALSE(pending.needsAgain());

  EXPECT_TRUE(pending.giveBack(std::move(three)));
  EXPECT_TRUE(pending.giveBack(std::move(one)));
  EXPECT_TRUE(pending.take(second).has_value());
  pending.beginAgain();

  one = pending.nextAgain();
  EXPECT_EQ(one.get(), first);
  three = pending.nextAgain();
  EXPECT_EQ(three.get(), third);
  EXPECT_FALSE(pending.needsAgain());
  EXPECT_TRUE(pending.take(third).has_value());
  EXPECT_TRUE(pending.take(first).has_value());
}

TEST_F(PendingAcksTest, WhatTheLibraryHasYetHoldsTheLaterOnesUp) {
  add(one);
  add(two);
  EXPECT_TRUE(pending.giveBack(std::move(two)));

  pending.beginAgain();
  EXPECT_TRUE(pending.needsAgain());
  EXPECT_FALSE(pending.hasAgain());
  EXPECT_TRUE(pending.take(one.get()).has_value());

  EXPECT_TRUE(pending.hasAgain());
}

TEST_F(PendingAcksTest, ASecondFailureBeginsAtTheOldestAgain) {
  const natsMsg* const first = add(one);
  add(two);
  EXPECT_TRUE(pending.giveBack(std::move(one)));
  EXPECT_TRUE(pending.giveBack(std::move(two)));
  pending.beginAgain();
  one = pending.nextAgain();

  EXPECT_TRUE(pending.giveBack(std::move(one)));
  pending.beginAgain();

  one = pending.nextAgain();
  EXPECT_EQ(one.get(), first);
  EXPECT_TRUE(pending.hasAgain());
}

TEST_F(PendingAcksTest, WhatIsOverdueIsGivenUpWhereverItIs) {
  add(one, at(1));
  add(two, at(1));
  const natsMsg* const third = add(three, at(3));
  EXPECT_TRUE(pending.giveBack(std::move(one)));
  EXPECT_EQ(pending.firstDeadline(), at(1));

  EXPECT_EQ(pending.takeOverdue(at(2)).size(), 2U);

  EXPECT_FALSE(pending.take(two.get()).has_value());
  EXPECT_FALSE(pending.giveBack(std::move(two)));
  EXPECT_TRUE(pending.take(third).has_value());
  EXPECT_FALSE(pending.firstDeadline().has_value());
}

TEST_F(PendingAcksTest, TakingAllLeavesAnEmptyWindow) {
  add(one);
  add(two);
  EXPECT_TRUE(pending.take(two.get()).has_value());

  EXPECT_EQ(pending.takeAll().size(), 1U);

  EXPECT_TRUE(pending.hasRoom());
  EXPECT_EQ(pending.size(), 0U);
}

TEST_F(PendingAcksTest, KnowsTheOldestMessageThatTheSpoolDoesNotHave) {
  EXPECT_FALSE(pending.firstUnspooled().has_value());
  pending.add(one.get(), {.bytes = 1, .published = at(1), .spooled = 8});
  EXPECT_FALSE(pending.firstUnspooled().has_value());
  pending.add(two.get(), {.bytes = 1, .published = at(2)});
  pending.add(three.get(), {.bytes = 1, .published = at(3)});
  EXPECT_EQ(pending.firstUnspooled(), at(2));

  EXPECT_TRUE(pending.take(two.get()).has_value());

  EXPECT_EQ(pending.firstUnspooled(), at(3));
}

TEST_F(PendingAcksTest, GivesEachMessageToTheSpoolOnce) {
  pending.add(one.get(), {.bytes = 1, .spooled = 8});
  pending.add(two.get(), {.bytes = 1});
  pending.add(three.get(), {.bytes = 1});
  EXPECT_TRUE(pending.take(three.get()).has_value());
  std::vector<natsMsg*> spooled;
  const auto spool = [&spooled](natsMsg* message) {
    spooled.push_back(message);
    return LinkSpool::Number{9};
  };

  pending.forEachUnspooled(spool);
  pending.forEachUnspooled(spool);

  EXPECT_EQ(spooled, std::vector<natsMsg*>{two.get()});
  EXPECT_FALSE(pending.firstUnspooled().has_value());
  EXPECT_EQ(pending.take(two.get())->spooled, 9U);
}

}  // namespace
}  // namespace halvox::platform::linux_
