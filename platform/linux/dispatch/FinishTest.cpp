#include <atomic>
#include <chrono>
#include <functional>
#include <future>
#include <memory>

#include <gtest/gtest.h>

#include "platform/linux/dispatch/DispatchFixture.h"
#include "platform/linux/testing/Eventually.h"

// Tests of AsioDispatchService::finish().

namespace halvox::platform::linux_ {
namespace {

class FinishTest : public DispatchFixture {
 protected:
  std::shared_ptr<DispatchQueue> createQueue(QueueThreading threading) {
    return service_->createSerialQueue("q", QualityOfService::kUserInteractive, threading);
  }
};

class FinishOfQueueTest : public FinishTest, public testing::WithParamInterface<QueueThreading> {};

INSTANTIATE_TEST_SUITE_P(Queues, FinishOfQueueTest,
                         testing::Values(QueueThreading::kOwnThread, QueueThreading::kShared),
                         [](const auto& one) {
                           return one.param == QueueThreading::kShared ? "Shared" : "OwnThread";
                         });

TEST_P(FinishOfQueueTest, FinishWaitsAsLongAsJobsEnd) {
  constexpr int kJobs = 16;
  const auto queue = createQueue(GetParam());
  std::promise<void> never;
  const std::shared_future<void> longJob = never.get_future().share();
  std::atomic<int> ran{0};
  for (int job = 0; job < kJobs; ++job) {
    queue->async(JobWeight::kMayBlock, [&ran, longJob] {
      longJob.wait_for(std::chrono::milliseconds(100));
      ++ran;
    });
  }

  // All jobs together take longer than the limit for one of them. The limit is many times as long
  // as a job, because a busy machine delays single jobs.
  EXPECT_EQ(service_->finish(
                {.withoutProgress = std::chrono::milliseconds(1500), .total = kTestDeadline}),
            0U);

  EXPECT_EQ(ran, kJobs);
  EXPECT_TRUE(service_->stop(kTestDeadline));
}

// A summary file is written on a shared queue. The rest of the stop is a job of the reporting
// queue, which has a thread of its own, and adds the last job to the queue of a link.
TEST_F(FinishTest, FinishWaitsForJobsThatJobsAddToOtherQueues) {
  const auto shared = createQueue(QueueThreading::kShared);
  const auto own = createQueue(QueueThreading::kOwnThread);
  std::promise<void> never;
  std::atomic<bool> hasEnded{false};
  shared->async(JobWeight::kMayBlock, [&] {
    own->async(JobWeight::kMayBlock, [&] {
      // The shared queue is empty here. finish() must still wait.
      never.get_future().wait_for(std::chrono::milliseconds(100));
      shared->async(JobWeight::kMayBlock, [&] { hasEnded = true; });
    });
  });

  EXPECT_EQ(service_->finish({.withoutProgress = kTestDeadline, .total = kTestDeadline}), 0U);

  EXPECT_TRUE(hasEnded);
  EXPECT_TRUE(service_->stop(kTestDeadline));
}

TEST_F(FinishTest, FinishWaitsForDelayedJobsThatAreDueAndForNoOthers) {
  const auto queue = createQueue(QueueThreading::kShared);
  std::promise<void> never;
  std::atomic<bool> hasEnded{false};
  service_->asyncAfterOnBackgroundQueue(std::chrono::hours(1), [] { FAIL(); });
  service_->asyncAfterOnBackgroundQueue(std::chrono::nanoseconds(0), [&] {
    never.get_future().wait_for(std::chrono::milliseconds(100));
    queue->async(JobWeight::kBrief, [&] { hasEnded = true; });
  });

  EXPECT_EQ(service_->finish({.withoutProgress = kTestDeadline, .total = kTestDeadline}), 0U);

  EXPECT_TRUE(hasEnded);
  EXPECT_TRUE(service_->stop(kTestDeadline));
}

TEST_F(FinishTest, FinishCountsADelayedJobThatDoesNotEnd) {
  std::promise<void> release;
  service_->asyncAfterOnBackgroundQueue(std::chrono::nanoseconds(0),
                                        [&] { release.get_future().wait(); });

  EXPECT_EQ(
      service_->finish({.withoutProgress = std::chrono::milliseconds(20), .total = kTestDeadline}),
      1U);

  release.set_value();
  EXPECT_TRUE(service_->stop(kTestDeadline));
}

TEST_P(FinishOfQueueTest, FinishEndsWithoutProgressAndSaysWhatIsLeft) {
  StuckQueue stuck(*service_, "stuck", GetParam());
  const auto queue = createQueue(QueueThreading::kShared);
  std::promise<void> ran;
  queue->async(JobWeight::kBrief, [&ran] { ran.set_value(); });
  ASSERT_EQ(ran.get_future().wait_for(kTestDeadline), std::future_status::ready);

  EXPECT_EQ(
      service_->finish({.withoutProgress = std::chrono::milliseconds(20), .total = kTestDeadline}),
      1U);

  stuck.release();
}

TEST_P(FinishOfQueueTest, FinishIsBoundedEvenIfJobsEndForEver) {
  const auto queue = createQueue(GetParam());
  std::function<void()> again = [&] { queue->async(JobWeight::kBrief, again); };
  again();

  EXPECT_GE(service_->finish({.withoutProgress = std::chrono::milliseconds(20),
                              .total = std::chrono::milliseconds(60)}),
            1U);

  EXPECT_TRUE(service_->stop(kTestDeadline));
}

}  // namespace
}  // namespace halvox::platform::linux_
