// Tests that many jobs for the pool's queues wake the pool only once.

#include <atomic>
#include <future>
#include <memory>
#include <thread>

#include <gtest/gtest.h>

#include "platform/linux/dispatch/AsioDispatchService.h"
#include "platform/linux/log/QueuedLogService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/testing/Eventually.h"
#include "platform/linux/testing/MemoryLogSink.h"

namespace halvox::platform::linux_ {
namespace {

class HoldingTest : public ::testing::Test {
 protected:
  std::shared_ptr<DispatchQueue> createQueue(QueueThreading threading) {
    return service_.createSerialQueue("q", QualityOfService::kUtility, threading);
  }
  static bool isSet(std::future<void>& event) {
    return event.wait_for(kTestDeadline) == std::future_status::ready;
  }
  // Lets another thread add 100 jobs to a shared queue, each after the one before it has run.
  // Returns false if one does not run in time.
  bool passJobs() {
    bool passed = true;
    std::thread other([this, &passed] {
      const auto queue = createQueue(QueueThreading::kShared);
      for (int count = 0; count < 100 && passed; ++count) {
        std::promise<void> done;
        auto ran = done.get_future();
        queue->async(JobWeight::kBrief, [&done] { done.set_value(); });
        passed = isSet(ran);
      }
    });
    other.join();
    return passed;
  }

  CounterStatisticsService statistics_;
  QueuedLogService log_{LogLevel::kError, std::make_unique<MemoryLogSink>(), statistics_};
  AsioDispatchService service_{log_, statistics_};
};

TEST_F(HoldingTest, JobsRunWhenThePoolIsNotHeldAnyMore) {
  const auto queue = createQueue(QueueThreading::kShared);
  std::atomic<int> ran = 0;

  service_.holdPool();
  queue->async(JobWeight::kMayBlock, [&ran] { ++ran; });
  queue->async(JobWeight::kMayBlock, [&ran] { ++ran; });
  ASSERT_TRUE(passJobs());
  EXPECT_EQ(ran, 0);
  service_.wakePool();

  EXPECT_TRUE(eventually([&ran] { return ran == 2; }));
}

TEST_F(HoldingTest, JobsThatHelpedJobsHandOnWakeThePoolToo) {
  const auto own = createQueue(QueueThreading::kOwnThread);
  const auto shared = createQueue(QueueThreading::kShared);
  std::promise<void> done;
  auto ran = done.get_future();

  service_.holdPool();
  service_.beginHelping();
  own->async(JobWeight::kBrief, [&shared, &done] {
    shared->async(JobWeight::kMayBlock, [&done] { done.set_value(); });
  });
  service_.endHelping();
  service_.wakePool();

  EXPECT_TRUE(isSet(ran));
}

TEST_F(HoldingTest, AJobRunsAtOnceWhenThePoolIsNotHeld) {
  const auto queue = createQueue(QueueThreading::kShared);
  std::promise<void> done;
  auto ran = done.get_future();
  service_.holdPool();
  service_.wakePool();

  queue->async(JobWeight::kMayBlock, [&done] { done.set_value(); });

  EXPECT_TRUE(isSet(ran));
}

TEST_F(HoldingTest, AJobThatMayBlockCanWaitForWhatAnEarlierOneHandedOn) {
  const auto own = createQueue(QueueThreading::kOwnThread);
  const auto shared = createQueue(QueueThreading::kShared);
  std::promise<void> go;
  std::promise<void> handedOn;
  auto ran = handedOn.get_future();
  std::promise<bool> waited;

  own->async(JobWeight::kMayBlock, [&go] { go.get_future().wait(); });
  own->async(JobWeight::kBrief, [&shared, &handedOn] {
    shared->async(JobWeight::kMayBlock, [&handedOn] { handedOn.set_value(); });
  });
  own->async(JobWeight::kMayBlock, [&ran, &waited] { waited.set_value(isSet(ran)); });
  go.set_value();

  EXPECT_TRUE(waited.get_future().get());
}

TEST_F(HoldingTest, AJobThatMayBlockCanWaitForWhatItHandsOn) {
  const auto own = createQueue(QueueThreading::kOwnThread);
  const auto shared = createQueue(QueueThreading::kShared);
  std::promise<bool> waited;

  own->async(JobWeight::kMayBlock, [&shared, &waited] {
    std::promise<void> done;
    auto ran = done.get_future();
    shared->async(JobWeight::kMayBlock, [&done] { done.set_value(); });
    waited.set_value(isSet(ran));
  });

  EXPECT_TRUE(waited.get_future().get());
}

TEST_F(HoldingTest, ABatchThatEndsAfterTheStopDiscardsItsJobs) {
  const auto queue = createQueue(QueueThreading::kShared);
  std::atomic<bool> ran = false;

  service_.holdPool();
  queue->async(JobWeight::kMayBlock, [&ran] { ran = true; });
  EXPECT_TRUE(service_.stop(kTestDeadline));
  service_.wakePool();

  EXPECT_FALSE(ran);
  EXPECT_EQ(statistics_.counter("dispatch", "jobs discarded at the stop").value(), 1U);
}

}  // namespace
}  // namespace halvox::platform::linux_
