#include "platform/linux/connection/FlowControl.h"

#include <atomic>
#include <thread>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

TEST(FlowControlTest, IsFullAtTheMostRequests) {
  FlowControl flow;
  for (std::size_t request = 0; request < kMaxOpenRequests - 1; ++request) flow.open({});
  EXPECT_FALSE(flow.isFull());

  flow.open({});

  EXPECT_TRUE(flow.isFull());
}

TEST(FlowControlTest, IsFullAtTheMostBytes) {
  FlowControl flow;
  flow.open({.requests = 1, .bytes = kMaxOpenRequestBytes - 1});
  EXPECT_FALSE(flow.isFull());

  flow.open({.requests = 1, .bytes = 1});

  EXPECT_TRUE(flow.isFull());
}

TEST(FlowControlTest, ReaderIsWokenOnceWhenHalfIsDone) {
  FlowControl flow;
  for (std::size_t request = 0; request < kMaxOpenRequests; ++request) flow.open({});
  ASSERT_TRUE(flow.wait());

  std::size_t wakes = 0;
  for (std::size_t request = 0; request < kMaxOpenRequests; ++request) {
    const bool wake = flow.close({});
    if (wake) ++wakes;
    EXPECT_EQ(wake, request + 1 == kMaxOpenRequests / 2);
  }

  EXPECT_EQ(wakes, 1U);
}

TEST(FlowControlTest, NobodyIsWokenWhoDoesNotWait) {
  FlowControl flow;
  flow.open({});

  EXPECT_FALSE(flow.close({}));
}

TEST(FlowControlTest, WaitingIsRefusedWhenThereIsRoom) {
  FlowControl flow;

  EXPECT_FALSE(flow.wait());
}

// If the last close comes first, the wait must see it. If the wait comes first, the last close must
// see it.
TEST(FlowControlTest, NoWakeUpIsLostBetweenThreads) {
  for (int round = 0; round < 20'000; ++round) {
    FlowControl flow;
    const FlowControl::Cost all{.requests = kMaxOpenRequests, .bytes = 0};
    flow.open(all);
    std::atomic<bool> woken = false;
    std::atomic<bool> go = false;
    {
      const std::jthread closer([&] {
        while (!go) {
        }
        if (flow.close(all)) woken = true;
      });
      go = true;
      if (!flow.wait()) woken = true;
    }
    ASSERT_TRUE(woken);
  }
}

}  // namespace
}  // namespace halvox::platform::linux_
