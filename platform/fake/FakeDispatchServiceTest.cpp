#include "platform/fake/FakeDispatchService.h"

#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

namespace halvox::platform {
namespace {

using namespace std::chrono_literals;
using Steps = std::vector<std::string>;

class FakeDispatchServiceTest : public testing::Test {
 protected:
  std::shared_ptr<DispatchQueue> makeQueue(std::string_view label) {
    return dispatch_.createSerialQueue(label, QualityOfService::kUtility, QueueThreading::kShared);
  }
  Job step(std::string name) {
    return [this, name = std::move(name)] { steps_.push_back(name); };
  }

  FakeClockService clock_;
  Steps steps_;
  FakeDispatchService dispatch_{clock_};
};

TEST_F(FakeDispatchServiceTest, JobsRunWhenPumpedInTheOrderOfTheirComing) {
  const auto first = makeQueue("first");
  const auto second = makeQueue("second");
  first->async(JobWeight::kBrief, step("a"));
  second->async(JobWeight::kBrief, step("b"));
  first->async(JobWeight::kBrief, step("c"));
  EXPECT_TRUE(steps_.empty());
  EXPECT_EQ(dispatch_.waitingJobs(), 3U);

  dispatch_.runUntilIdle();

  EXPECT_EQ(steps_, (Steps{"a", "b", "c"}));
  EXPECT_EQ(dispatch_.waitingJobs(), 0U);
}

TEST_F(FakeDispatchServiceTest, JobsThatAJobAddsRunAfterIt) {
  const auto queue = makeQueue("queue");
  queue->async(JobWeight::kBrief, [this, &queue] {
    queue->async(JobWeight::kBrief, step("inner"));
    steps_.emplace_back("outer");
  });

  dispatch_.runUntilIdle();

  EXPECT_EQ(steps_, (Steps{"outer", "inner"}));
}

TEST_F(FakeDispatchServiceTest, RunOneRunsOne) {
  const auto queue = makeQueue("queue");
  queue->async(JobWeight::kBrief, step("a"));
  queue->async(JobWeight::kBrief, step("b"));

  EXPECT_TRUE(dispatch_.runOne());
  EXPECT_EQ(steps_, Steps{"a"});
  EXPECT_TRUE(dispatch_.runOne());
  EXPECT_FALSE(dispatch_.runOne());
}

TEST_F(FakeDispatchServiceTest, OnlyTheRunningQueueIsCurrentAndOnlyOnItsThread) {
  const auto queue = makeQueue("queue");
  const auto other = makeQueue("other");
  std::vector<bool> current;
  queue->async(JobWeight::kBrief, [&] {
    current = {queue->isCurrent(), other->isCurrent()};
    std::jthread([&] { current.push_back(queue->isCurrent()); });
  });
  EXPECT_FALSE(queue->isCurrent());

  dispatch_.runUntilIdle();

  EXPECT_EQ(current, (std::vector<bool>{true, false, false}));
  EXPECT_FALSE(queue->isCurrent());
}

TEST_F(FakeDispatchServiceTest, DelayedJobsRunAtTheirTimeAndTheClockShowsIt) {
  const double begin = clock_.currentDate().secondsSince1970;
  std::vector<double> times;
  const auto note = [&] { times.push_back(clock_.currentDate().secondsSince1970 - begin); };
  dispatch_.asyncAfterOnBackgroundQueue(2s, note);
  dispatch_.asyncAfterOnBackgroundQueue(1s, note);

  dispatch_.advance(999ms);
  EXPECT_TRUE(times.empty());
  dispatch_.runUntilIdle();
  EXPECT_TRUE(times.empty());
  dispatch_.advance(5s);

  ASSERT_EQ(times.size(), 2U);
  EXPECT_NEAR(times[0], 1.0, 1e-6);
  EXPECT_NEAR(times[1], 2.0, 1e-6);
  EXPECT_NEAR(clock_.currentDate().secondsSince1970 - begin, 5.999, 1e-6);
  EXPECT_EQ(clock_.processUptime(), 65'999ms);
}

TEST_F(FakeDispatchServiceTest, WhatADelayedJobQueuesRunsBeforeTheNextDelayedJob) {
  const auto queue = makeQueue("queue");
  dispatch_.asyncAfterOnBackgroundQueue(
      1s, [this, &queue] { queue->async(JobWeight::kBrief, step("follows")); });
  dispatch_.asyncAfterOnBackgroundQueue(1s, step("second"));
  queue->async(JobWeight::kBrief, step("waiting"));

  dispatch_.advance(1s);

  EXPECT_EQ(steps_, (Steps{"waiting", "follows", "second"}));
}

TEST_F(FakeDispatchServiceTest, DelaysAreThoseStillToWait) {
  dispatch_.asyncAfterOnBackgroundQueue(3s, step("a"));
  dispatch_.asyncAfterOnBackgroundQueue(2s, step("b"));
  dispatch_.advance(1s);

  EXPECT_EQ(dispatch_.delays(), (std::vector<std::chrono::nanoseconds>{1s, 2s}));
  EXPECT_EQ(dispatch_.delayedJobs(), 2U);
}

TEST_F(FakeDispatchServiceTest, NoQueueIsCurrentInABackgroundJob) {
  const auto queue = makeQueue("queue");
  bool current = true;
  dispatch_.asyncAfterOnBackgroundQueue(1s, [&] { current = queue->isCurrent(); });

  dispatch_.advance(1s);

  EXPECT_FALSE(current);
}

TEST_F(FakeDispatchServiceTest, PumpingInsideAJobIsRefused) {
  const auto queue = makeQueue("queue");
  queue->async(JobWeight::kBrief, [this] { dispatch_.runUntilIdle(); });
  queue->async(JobWeight::kBrief, [] {});

  EXPECT_THROW(dispatch_.runUntilIdle(), std::logic_error);
}

TEST_F(FakeDispatchServiceTest, RemembersQueuesAndWeights) {
  const auto queue = dispatch_.createSerialQueue("own", QualityOfService::kUserInteractive,
                                                 QueueThreading::kOwnThread);
  queue->async(JobWeight::kBrief, [] {});
  queue->async(JobWeight::kMayBlock, [] {});

  ASSERT_EQ(dispatch_.createdQueues().size(), 1U);
  const FakeDispatchQueue::Traits traits = dispatch_.createdQueues().front();
  EXPECT_EQ(traits.label, "own");
  EXPECT_EQ(traits.quality, QualityOfService::kUserInteractive);
  EXPECT_EQ(traits.threading, QueueThreading::kOwnThread);
  EXPECT_EQ(dispatch_.weights("own"),
            (std::vector<JobWeight>{JobWeight::kBrief, JobWeight::kMayBlock}));
}

TEST_F(FakeDispatchServiceTest, JobsKeepTheirQueueAndGoWithWhatTheyHold) {
  auto queue = makeQueue("queue");
  const std::weak_ptr<DispatchQueue> weakQueue = queue;
  auto held = std::make_shared<int>(1);
  const std::weak_ptr<int> weakHeld = held;
  queue->async(JobWeight::kBrief, [held = std::move(held)] {});
  queue.reset();
  EXPECT_FALSE(weakQueue.expired());

  dispatch_.runUntilIdle();

  EXPECT_TRUE(weakQueue.expired());
  EXPECT_TRUE(weakHeld.expired());
}

TEST_F(FakeDispatchServiceTest, ClearingDropsJobsAndWhatTheirDestructionAdds) {
  const auto queue = makeQueue("queue");
  const std::shared_ptr<void> atEnd(nullptr, [this, &queue](void*) {
    queue->async(JobWeight::kBrief, step("added by a destructor"));
  });
  queue->async(JobWeight::kBrief, [held = std::make_shared<std::shared_ptr<void>>(atEnd)] {});
  dispatch_.asyncAfterOnBackgroundQueue(1s, step("delayed"));

  dispatch_.clear();
  dispatch_.advance(2s);

  EXPECT_TRUE(steps_.empty());
}

TEST_F(FakeDispatchServiceTest, AnyThreadMayAddJobs) {
  const auto queue = makeQueue("queue");
  int ran = 0;
  {
    std::vector<std::jthread> threads;
    threads.reserve(4);
    for (int thread = 0; thread < 4; ++thread) {
      threads.emplace_back([&] {
        for (int job = 0; job < 100; ++job) queue->async(JobWeight::kBrief, [&ran] { ++ran; });
      });
    }
  }

  dispatch_.runUntilIdle();

  EXPECT_EQ(ran, 400);
}

class FakeDispatchWaitTest : public FakeDispatchServiceTest {
 protected:
  // Adds a job that waits on the semaphore and records the outcome.
  Job waitOn(const std::shared_ptr<DispatchQueue>& queue,
             std::optional<std::chrono::nanoseconds> timeout) {
    return [this, &queue, timeout] {
      queue->waitOn(semaphore_, timeout, [this](WaitOutcome outcome) {
        steps_.emplace_back(outcome == WaitOutcome::kSignalled ? "signalled" : "timed out");
      });
    };
  }

  std::shared_ptr<DispatchSemaphore> semaphore_ = dispatch_.createSemaphore(0);
};

TEST_F(FakeDispatchWaitTest, WaitingQueueKeepsItsJobsWhileOthersGoOn) {
  const auto queue = makeQueue("queue");
  const auto other = makeQueue("other");
  queue->async(JobWeight::kBrief, waitOn(queue, std::nullopt));
  queue->async(JobWeight::kBrief, step("after"));
  other->async(JobWeight::kBrief, step("other"));

  dispatch_.runUntilIdle();
  EXPECT_EQ(steps_, Steps{"other"});
  EXPECT_EQ(dispatch_.waitingJobs(), 1U);
  EXPECT_EQ(dispatch_.waitingQueues(), 1U);
  std::jthread([this] { semaphore_->signal(); }).join();
  dispatch_.runUntilIdle();

  EXPECT_EQ(steps_, (Steps{"other", "signalled", "after"}));
}

TEST_F(FakeDispatchWaitTest, WaitEndsAtItsTimeAndTheClockShowsIt) {
  const auto queue = makeQueue("queue");
  const auto begin = clock_.processUptime();
  queue->async(JobWeight::kBrief, waitOn(queue, 5s));
  queue->async(JobWeight::kBrief,
               [&] { steps_.push_back(std::to_string((clock_.processUptime() - begin).count())); });

  dispatch_.advance(4999ms);
  EXPECT_TRUE(steps_.empty());
  dispatch_.advance(2s);

  EXPECT_EQ(steps_, (Steps{"timed out", "5000"}));
  EXPECT_EQ(dispatch_.waitingQueues(), 0U);
}

TEST_F(FakeDispatchWaitTest, SignalAtTheTimeOfTheTimeOutEndsTheWait) {
  const auto queue = makeQueue("queue");
  queue->async(JobWeight::kBrief, waitOn(queue, 1s));
  dispatch_.runUntilIdle();
  dispatch_.asyncAfterOnBackgroundQueue(1s, [this] { semaphore_->signal(); });

  dispatch_.advance(1s);

  EXPECT_EQ(steps_, Steps{"signalled"});
}

TEST_F(FakeDispatchWaitTest, EndlessTimeOutIsLater) {
  const auto queue = makeQueue("queue");
  dispatch_.advance(1s);
  queue->async(JobWeight::kBrief, waitOn(queue, std::chrono::nanoseconds::max()));

  dispatch_.advance(std::chrono::hours(24));

  EXPECT_TRUE(steps_.empty());
  EXPECT_EQ(dispatch_.waitingQueues(), 1U);
}

TEST_F(FakeDispatchWaitTest, ClearingDropsWaits) {
  auto queue = makeQueue("queue");
  const std::weak_ptr<DispatchQueue> weakQueue = queue;
  queue->async(JobWeight::kBrief, waitOn(queue, 1s));
  dispatch_.runUntilIdle();

  dispatch_.clear();
  dispatch_.advance(2s);
  EXPECT_TRUE(steps_.empty());
  EXPECT_EQ(dispatch_.waitingQueues(), 0U);
  queue->async(JobWeight::kBrief, step("later"));
  dispatch_.runUntilIdle();
  queue.reset();

  EXPECT_EQ(steps_, Steps{"later"});
  EXPECT_TRUE(weakQueue.expired());
}

TEST_F(FakeDispatchWaitTest, RefusesWaitsThatNoQueueDoes) {
  const auto queue = makeQueue("queue");
  const auto own = dispatch_.createSerialQueue("own", QualityOfService::kUserInteractive,
                                               QueueThreading::kOwnThread);
  EXPECT_THROW(waitOn(queue, 1s)(), std::logic_error);
  own->async(JobWeight::kBrief, waitOn(own, 1s));
  EXPECT_THROW(dispatch_.runUntilIdle(), std::logic_error);
  queue->async(JobWeight::kBrief, [&] {
    waitOn(queue, 1s)();
    waitOn(queue, 1s)();
  });
  EXPECT_THROW(dispatch_.runUntilIdle(), std::logic_error);
}

}  // namespace
}  // namespace halvox::platform
