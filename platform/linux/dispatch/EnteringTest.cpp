// Tests how a thread does brief work in a shared queue without adding a job.

#include <atomic>
#include <chrono>
#include <future>
#include <memory>
#include <stdexcept>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/linux/dispatch/DispatchFixture.h"
#include "platform/linux/testing/Eventually.h"

namespace halvox::platform::linux_ {
namespace {

// Long enough for a thread to do what must not happen.
constexpr std::chrono::milliseconds kQuietTime{50};

class EnteringTest : public DispatchFixture {
 protected:
  // Waits until the queue has run all jobs that were added before this call.
  bool drain() {
    std::promise<void> done;
    auto ran = done.get_future();
    queue_->async(JobWeight::kMayBlock, [&done] { done.set_value(); });
    return ran.wait_for(kTestDeadline) == std::future_status::ready;
  }
  // Also wait until the last turn has ended.
  bool enterEventually() {
    return eventually([this] { return static_cast<bool>(QueueEntry(*queue_)); });
  }

  std::shared_ptr<DispatchQueue> queue_ =
      service_->createSerialQueue("q", QualityOfService::kUtility, QueueThreading::kShared);
};

TEST_F(EnteringTest, AThreadEntersAnIdleQueueAndIsItsCurrentThread) {
  {
    const QueueEntry entry(*queue_);
    EXPECT_TRUE(static_cast<bool>(entry));
    EXPECT_TRUE(queue_->isCurrent());
  }
  EXPECT_FALSE(queue_->isCurrent());
}

TEST_F(EnteringTest, NobodyElseEntersMeanwhile) {
  const QueueEntry entry(*queue_);
  bool entered = true;

  std::jthread([&] { entered = static_cast<bool>(QueueEntry(*queue_)); }).join();

  EXPECT_FALSE(entered);
  EXPECT_FALSE(static_cast<bool>(QueueEntry(*queue_)));
  EXPECT_TRUE(queue_->isCurrent());
}

TEST_F(EnteringTest, JobsThatAreAddedMeanwhileRunAfterwards) {
  std::atomic<bool> ran{false};
  {
    const QueueEntry entry(*queue_);
    queue_->async(JobWeight::kBrief, [&ran] { ran = true; });
    EXPECT_TRUE(staysQuiet([&ran] { return long{ran}; }, kQuietTime));
  }
  EXPECT_TRUE(eventually([&ran] { return ran.load(); }));
}

TEST_F(EnteringTest, AQueueWithJobsDeclines) {
  std::promise<void> release;
  queue_->async(JobWeight::kMayBlock,
                [released = release.get_future().share()] { released.wait(); });

  EXPECT_FALSE(static_cast<bool>(QueueEntry(*queue_)));

  release.set_value();
  EXPECT_TRUE(enterEventually());
}

TEST_F(EnteringTest, AQueueWhoseJobsAreHeldBackDeclines) {
  service_->holdPool();
  queue_->async(JobWeight::kBrief, [] {});

  EXPECT_FALSE(static_cast<bool>(QueueEntry(*queue_)));

  service_->wakePool();
  EXPECT_TRUE(enterEventually());
}

TEST_F(EnteringTest, AQueueThatWaitsDeclines) {
  const auto semaphore = service_->createSemaphore(0);
  std::atomic<bool> waits{false};
  queue_->async(JobWeight::kMayBlock, [&] {
    queue_->waitOn(semaphore, std::nullopt, [](WaitOutcome) {});
    waits = true;
  });
  ASSERT_TRUE(eventually([&waits] { return waits.load(); }));

  EXPECT_FALSE(static_cast<bool>(QueueEntry(*queue_)));

  semaphore->signal();
  EXPECT_TRUE(enterEventually());
}

TEST_F(EnteringTest, WhoHasEnteredCannotWait) {
  const auto semaphore = service_->createSemaphore(1);
  const QueueEntry entry(*queue_);
  ASSERT_TRUE(static_cast<bool>(entry));
  EXPECT_THROW(queue_->waitOn(semaphore, std::nullopt, [](WaitOutcome) {}), std::logic_error);
}

TEST_F(EnteringTest, AnEntryCountsAsAJobOfTheQueue) {
  { const QueueEntry entry(*queue_); }
  EXPECT_EQ(statistics_.counter("queues", "q: jobs added").value(), 1U);
  EXPECT_EQ(statistics_.counter("queues", "q: jobs run").value(), 1U);
}

TEST_F(EnteringTest, AStoppedServiceDeclines) {
  ASSERT_TRUE(service_->stop(kTestDeadline));
  EXPECT_FALSE(static_cast<bool>(QueueEntry(*queue_)));
}

TEST_F(EnteringTest, TheEndWaitsForAnEntry) {
  std::atomic<bool> hasEnded{false};
  std::jthread ending;
  {
    const QueueEntry entry(*queue_);
    ending = std::jthread([&] {
      EXPECT_EQ(service_->finish({.withoutProgress = kTestDeadline, .total = kTestDeadline}), 0U);
      hasEnded = true;
    });
    EXPECT_TRUE(staysQuiet([&hasEnded] { return long{hasEnded}; }, kQuietTime));
  }
  EXPECT_TRUE(eventually([&hasEnded] { return hasEnded.load(); }));
}

TEST_F(EnteringTest, EntriesAndJobsOfManyThreadsNeverOverlap) {
  constexpr int kThreads = 4;
  constexpr int kRounds = 2'000;
  int inside = 0;  // not atomic: only the queue guards it
  int done = 0;
  const auto work = [&] {
    EXPECT_EQ(++inside, 1);
    ++done;
    --inside;
  };
  {
    std::vector<std::jthread> threads;
    for (int thread = 0; thread < kThreads; ++thread) {
      threads.emplace_back([&] {
        for (int round = 0; round < kRounds; ++round) {
          const QueueEntry entry(*queue_);
          if (entry) {
            work();
          } else {
            queue_->async(JobWeight::kBrief, work);
          }
        }
      });
    }
  }
  ASSERT_TRUE(drain());
  EXPECT_EQ(done, kThreads * kRounds);
}

}  // namespace
}  // namespace halvox::platform::linux_
