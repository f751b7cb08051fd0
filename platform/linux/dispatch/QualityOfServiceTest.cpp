#include <algorithm>
#include <array>
#include <atomic>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <future>
#include <memory>
#include <stdexcept>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <sys/resource.h>
#include <unistd.h>

#include "platform/linux/dispatch/DispatchFixture.h"
#include "platform/linux/testing/Eventually.h"
#include "platform/linux/testing/NoThreadsToHave.h"

// Tests the effects of qualities of service and of the labels of queues.
namespace halvox::platform::linux_ {
namespace {

using ::testing::Contains;
using ::testing::HasSubstr;

int nicenessHere() { return ::getpriority(PRIO_PROCESS, static_cast<id_t>(::gettid())); }

// Returns the niceness of a thread that is `steps` below this thread, because the tests may
// themselves run at a low priority.
int stepsBelow(int steps) { return std::min(nicenessHere() + steps, 19); }

bool hasThreadNamed(const std::string& name) {
  for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
    std::string found;
    std::ifstream(task.path() / "comm") >> found;
    if (found == name) return true;
  }
  return false;
}

class QualityOfServiceTest : public DispatchFixture {
 protected:
  std::shared_ptr<DispatchQueue> createQueue(QualityOfService quality, QueueThreading threading) {
    return service_->createSerialQueue("com.tarno.halvox.test", quality, threading);
  }
  static int nicenessOn(DispatchQueue& queue) {
    std::promise<int> niceness;
    queue.async(JobWeight::kBrief, [&] { niceness.set_value(nicenessHere()); });
    return niceness.get_future().get();
  }
  int nicenessInBackground() {
    std::promise<int> niceness;
    service_->asyncAfterOnBackgroundQueue(std::chrono::nanoseconds(0),
                                          [&] { niceness.set_value(nicenessHere()); });
    return niceness.get_future().get();
  }
};

TEST_F(QualityOfServiceTest, WorkOfALowerQualityRunsAtALowerPriority) {
  for (const auto threading : {QueueThreading::kOwnThread, QueueThreading::kShared}) {
    const auto urgent = createQueue(QualityOfService::kUserInteractive, threading);
    const auto utility = createQueue(QualityOfService::kUtility, threading);
    const auto background = createQueue(QualityOfService::kBackground, threading);

    EXPECT_EQ(nicenessOn(*urgent), nicenessHere());
    EXPECT_EQ(nicenessOn(*utility), stepsBelow(5));
    EXPECT_EQ(nicenessOn(*background), stepsBelow(10));
  }
  EXPECT_EQ(nicenessInBackground(), stepsBelow(10));
}

TEST_F(QualityOfServiceTest, AQueueKeepsItsPriorityWhoeverAddsItsJobs) {
  const auto utility = createQueue(QualityOfService::kUtility, QueueThreading::kShared);
  std::promise<int> niceness;

  service_->asyncAfterOnBackgroundQueue(std::chrono::nanoseconds(0), [&] {
    utility->async(JobWeight::kBrief, [&] { niceness.set_value(nicenessHere()); });
  });

  EXPECT_EQ(niceness.get_future().get(), stepsBelow(5));
}

TEST_F(QualityOfServiceTest, ThreadsForBackgroundWorkAreMadeWhenThereIsSome) {
  EXPECT_TRUE(eventually([] { return hasThreadNamed("pool-utility"); }));
  EXPECT_FALSE(hasThreadNamed("pool-background"));

  EXPECT_EQ(nicenessInBackground(), stepsBelow(10));

  EXPECT_TRUE(hasThreadNamed("pool-background"));
}

TEST_F(QualityOfServiceTest, BackgroundJobsThatBlockDelayNeitherQueuesNorTimeOuts) {
  std::promise<void> release;
  const auto released = release.get_future().share();
  std::atomic<int> blocked{0};
  for (int number = 0; number < 10; ++number) {
    service_->asyncAfterOnBackgroundQueue(std::chrono::nanoseconds(0), [&blocked, released] {
      ++blocked;
      released.wait();
    });
  }
  ASSERT_TRUE(eventually([&] { return blocked > 1; }));
  const auto queue = createQueue(QualityOfService::kUtility, QueueThreading::kShared);
  std::promise<WaitOutcome> outcome;

  queue->async(JobWeight::kBrief, [&, queue] {
    queue->waitOn(service_->createSemaphore(0), std::chrono::milliseconds(1),
                  [&](WaitOutcome ended) { outcome.set_value(ended); });
  });

  auto ended = outcome.get_future();
  ASSERT_EQ(ended.wait_for(kTestDeadline), std::future_status::ready);
  EXPECT_EQ(ended.get(), WaitOutcome::kTimedOut);
  release.set_value();
  EXPECT_TRUE(eventually([&] { return blocked == 10; }));  // no job uses `blocked` after this
}

TEST_F(QualityOfServiceTest, WithoutMoreThreadsToHaveTheOthersDoTheWork) {
  const NoThreadsToHave none;

  EXPECT_EQ(nicenessInBackground(), stepsBelow(5));
}

TEST_F(QualityOfServiceTest, JobsOfSharedQueuesAreCountedByTheirLabel) {
  for (int number = 0; number < 2; ++number) {
    const auto queue = createQueue(QualityOfService::kUtility, QueueThreading::kShared);
    nicenessOn(*queue);
  }
  const auto count = [&](const char* what) {
    return statistics_.counter("queues", std::string("com.tarno.halvox.test: jobs ") + what)
        .value();
  };

  EXPECT_EQ(count("added"), 2U);
  EXPECT_TRUE(eventually([&] { return count("run") == 2; }));
}

TEST_F(QualityOfServiceTest, AJobThatFailsIsLoggedWithItsQueue) {
  for (const auto threading : {QueueThreading::kOwnThread, QueueThreading::kShared}) {
    const auto queue = createQueue(QualityOfService::kUtility, threading);
    queue->async(JobWeight::kBrief, [] { throw std::runtime_error("out of luck"); });
    nicenessOn(*queue);
  }

  EXPECT_THAT(logLines(),
              Contains(HasSubstr("a job of queue \"com.tarno.halvox.test\" failed")).Times(2));
}

TEST_F(QualityOfServiceTest, WhatQueuesHaveIsFinishedBeforeAnEndThatLosesNothing) {
  std::atomic<int> ran{0};
  const auto waiting = createQueue(QualityOfService::kUtility, QueueThreading::kShared);
  waiting->async(JobWeight::kBrief, [&, waiting] {
    ++ran;
    waiting->waitOn(service_->createSemaphore(0), std::nullopt, [](WaitOutcome) { FAIL(); });
  });
  service_->holdPool();
  for (int number = 0; number < 200; ++number) {
    const auto queue = createQueue(QualityOfService::kUtility, QueueThreading::kShared);
    for (int job = 0; job < 100; ++job) queue->async(JobWeight::kBrief, [&] { ++ran; });
  }

  EXPECT_EQ(service_->finish({.withoutProgress = kTestDeadline, .total = kTestDeadline}), 0U);
  EXPECT_EQ(ran, 20'001);

  EXPECT_TRUE(service_->stop(kTestDeadline));
}

TEST_F(QualityOfServiceTest, AFinishIsBoundedByItsLimit) {
  const auto queue = createQueue(QualityOfService::kUtility, QueueThreading::kShared);
  std::promise<void> release;
  queue->async(JobWeight::kMayBlock, [&] { release.get_future().wait(); });

  constexpr std::chrono::milliseconds kShort{10};
  EXPECT_GE(service_->finish({.withoutProgress = kShort, .total = kShort}), 1U);
  release.set_value();

  EXPECT_TRUE(service_->stop(kTestDeadline));
}

TEST_F(QualityOfServiceTest, AStopThatIsHeldUpNamesTheQueue) {
  for (const auto threading : {QueueThreading::kOwnThread, QueueThreading::kShared}) {
    AsioDispatchService service(*log_, statistics_);
    StuckQueue queue(service, "the stuck one", threading);

    EXPECT_FALSE(service.stop(std::chrono::milliseconds(20)));
    queue.release();
  }

  EXPECT_THAT(logLines(), Contains(HasSubstr("\"the stuck one\"")).Times(2));
}

}  // namespace
}  // namespace halvox::platform::linux_
