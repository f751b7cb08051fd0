#include "platform/linux/connection/Deadlines.h"

#include <chrono>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

using std::chrono::milliseconds;
using Clock = DeadlineQueue::Clock;

class Owner final : public DeadlineOwner {
 public:
  void onDeadline() override { ++calls; }
  int calls = 0;
};

TEST(DeadlinesTest, OnlyWhatIsDueExpiresAndOnce) {
  DeadlineQueue queue(milliseconds(1000));
  Owner owner;
  Deadline deadline(owner);
  const Clock::time_point start = Clock::now();
  queue.start(deadline);

  queue.expire(start + milliseconds(999));
  EXPECT_EQ(owner.calls, 0);
  queue.expire(Clock::now() + milliseconds(1000));
  queue.expire(Clock::now() + milliseconds(2000));

  EXPECT_EQ(owner.calls, 1);
  EXPECT_FALSE(deadline.isRunning());
}

TEST(DeadlinesTest, FirstIsTheOneThatStartedFirst) {
  DeadlineQueue queue(milliseconds(1000));
  Owner owner;
  Deadline first(owner);
  Deadline second(owner);
  queue.start(first);
  const auto due = queue.first();
  queue.start(second);

  EXPECT_EQ(queue.first(), due);
  first.stop();
  EXPECT_GE(queue.first(), due);
  second.stop();
  EXPECT_FALSE(queue.first().has_value());
}

TEST(DeadlinesTest, DestroyedDeadlineLeavesItsQueue) {
  DeadlineQueue queue(milliseconds(0));
  Owner owner;
  Deadline before(owner);
  queue.start(before);
  {
    Deadline between(owner);
    queue.start(between);
  }
  Deadline after(owner);
  queue.start(after);

  queue.expire(Clock::now());

  EXPECT_EQ(owner.calls, 2);
}

TEST(DeadlinesTest, RunningDeadlineIsNotPutOff) {
  DeadlineQueue queue(milliseconds(1000));
  Owner owner;
  Deadline deadline(owner);
  queue.start(deadline);
  const auto due = queue.first();

  queue.start(deadline);

  EXPECT_EQ(queue.first(), due);
}

TEST(DeadlinesTest, LoopWakesUpWhenSomethingIsDue) {
  EventLoop loop;
  LoopTimer timer;
  ASSERT_TRUE(timer.open(loop));
  const Clock::time_point due = Clock::now() + milliseconds(20);

  timer.arrange(due, LoopTimer::Before::kSleep);
  loop.runOnce(EventLoop::Wait::kBlock);

  EXPECT_GE(Clock::now(), due);
}

TEST(DeadlinesTest, TimerThatNobodyNeedsIsSwitchedOffBeforeTheLoopSleeps) {
  EventLoop loop;
  LoopTimer timer;
  ASSERT_TRUE(timer.open(loop));
  timer.arrange(Clock::now() - milliseconds(1), LoopTimer::Before::kSleep);

  timer.arrange(std::nullopt, LoopTimer::Before::kSleep);

  EXPECT_EQ(loop.runOnce(EventLoop::Wait::kPoll), 0U);
}

}  // namespace
}  // namespace halvox::platform::linux_
