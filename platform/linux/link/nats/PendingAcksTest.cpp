#include "platform/linux/link/nats/PendingAcks.h"

#include <array>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

PendingAcks::Entry entryOf(std::size_t bytes) {
  return {.ledger = nullptr, .number = 0, .bytes = bytes, .epoch = 0};
}

TEST(PendingAcksTest, WindowIsFullAtItsMessages) {
  PendingAcks pending({.messages = 2, .bytes = 1000});
  const std::array<char, 2> messages{};

  pending.add(&messages[0], entryOf(1));
  EXPECT_TRUE(pending.hasRoom());
  pending.add(&messages[1], entryOf(1));
  EXPECT_FALSE(pending.hasRoom());
  EXPECT_TRUE(pending.take(&messages[0]).has_value());

  EXPECT_TRUE(pending.hasRoom());
}

TEST(PendingAcksTest, WindowIsFullAtItsBytes) {
  PendingAcks pending({.messages = 100, .bytes = 1000});
  const char message = 0;

  pending.add(&message, entryOf(5000));

  EXPECT_FALSE(pending.hasRoom());
}

TEST(PendingAcksTest, AMessageIsTakenOnce) {
  PendingAcks pending({});
  const char message = 0;
  pending.add(&message, entryOf(7));

  EXPECT_EQ(pending.take(&message)->bytes, 7U);
  EXPECT_FALSE(pending.take(&message).has_value());
}

TEST(PendingAcksTest, WhatABrokenConnectionLeftDoesNotFillTheWindow) {
  PendingAcks pending({.messages = 1, .bytes = 1000});
  const std::array<char, 2> messages{};
  pending.add(&messages[0], entryOf(1));

  pending.beginEpoch();
  EXPECT_TRUE(pending.hasRoom());
  pending.add(&messages[1], entryOf(1));
  EXPECT_TRUE(pending.take(&messages[0]).has_value());

  EXPECT_FALSE(pending.hasRoom());
  EXPECT_EQ(pending.size(), 1U);
}

TEST(PendingAcksTest, TakingAllLeavesAnEmptyWindow) {
  PendingAcks pending({.messages = 1, .bytes = 1000});
  const char message = 0;
  pending.add(&message, entryOf(1));

  EXPECT_EQ(pending.takeAll().size(), 1U);

  EXPECT_TRUE(pending.hasRoom());
  EXPECT_EQ(pending.size(), 0U);
}

}  // namespace
}  // namespace halvox::platform::linux_
