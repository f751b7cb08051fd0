// Tests how a thread that delivers requests itself runs the jobs that it adds to queues.

#include <algorithm>
#include <array>
#include <atomic>
#include <future>
#include <memory>
#include <optional>
#include <thread>
#include <vector>

#include <gtest/gtest.h>
#include <unistd.h>

#include "platform/linux/base/ProcessStat.h"
#include "platform/linux/dispatch/AsioDispatchService.h"
#include "platform/linux/log/QueuedLogService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/testing/Eventually.h"
#include "platform/linux/testing/MemoryLogSink.h"

namespace halvox::platform::linux_ {
namespace {

using ThreadIDs = std::vector<std::thread::id>;

class HelpingTest : public ::testing::Test {
 protected:
  // Returns a queue whose own thread sleeps. A thread that is still starting would look for jobs
  // and might run one before the helper does.
  std::shared_ptr<DispatchQueue> createQueue() {
    auto queue =
        service_.createSerialQueue("q", QualityOfService::kUtility, QueueThreading::kOwnThread);
    EXPECT_TRUE(letOwnThreadSleep(*queue));
    return queue;
  }
  static bool drain(DispatchQueue& queue) {
    std::promise<void> done;
    auto ran = done.get_future();
    queue.async(JobWeight::kMayBlock, [&done] { done.set_value(); });
    return ran.wait_for(kTestDeadline) == std::future_status::ready;
  }
  // Waits until the queue's own thread has nothing to do and must be woken for its next job.
  static bool letOwnThreadSleep(DispatchQueue& queue) {
    pid_t thread = 0;
    queue.async(JobWeight::kMayBlock, [&thread] { thread = ::gettid(); });
    if (!drain(queue)) return false;
    return eventually([thread] {
      const auto stat = readProcessStat(thread);  // threads have such a file too
      return stat.has_value() && stat->state == 'S';
    });
  }
  // Returns a job that records the thread that runs it.
  static Job noteThread(ThreadIDs& threads) {
    return [&threads] { threads.push_back(std::this_thread::get_id()); };
  }

  const std::thread::id self_ = std::this_thread::get_id();
  CounterStatisticsService statistics_;
  QueuedLogService log_{LogLevel::kError, std::make_unique<MemoryLogSink>(), statistics_};
  AsioDispatchService service_{log_, statistics_};
};

TEST_F(HelpingTest, HelperRunsItsBriefJobsWhenItsBatchEnds) {
  const auto queue = createQueue();
  ThreadIDs threads;

  service_.beginHelping();
  queue->async(JobWeight::kBrief, noteThread(threads));
  queue->async(JobWeight::kBrief, noteThread(threads));
  EXPECT_TRUE(threads.empty());
  service_.endHelping();

  EXPECT_EQ(threads, (ThreadIDs{self_, self_}));
}

TEST_F(HelpingTest, QueueIsCurrentForTheHelperDuringAJob) {
  const auto queue = createQueue();
  const auto other = createQueue();
  std::optional<bool> own;
  std::optional<bool> others;

  service_.beginHelping();
  queue->async(JobWeight::kBrief, [&] {
    own = queue->isCurrent();
    others = other->isCurrent();
  });
  service_.endHelping();

  EXPECT_EQ(own, true);
  EXPECT_EQ(others, false);
  EXPECT_FALSE(queue->isCurrent());
}

TEST_F(HelpingTest, OutsideABatchJobsGoToTheOwnThread) {
  const auto queue = createQueue();
  ThreadIDs threads;
  service_.beginHelping();
  service_.endHelping();

  queue->async(JobWeight::kBrief, noteThread(threads));
  ASSERT_TRUE(drain(*queue));

  ASSERT_EQ(threads.size(), 1U);
  EXPECT_NE(threads[0], self_);
}

TEST_F(HelpingTest, JobThatMayBlockAndWhatFollowsGoToTheOwnThread) {
  const auto queue = createQueue();
  ThreadIDs threads;

  service_.beginHelping();
  queue->async(JobWeight::kMayBlock, noteThread(threads));
  queue->async(JobWeight::kBrief, noteThread(threads));
  service_.endHelping();
  ASSERT_TRUE(drain(*queue));

  ASSERT_EQ(threads.size(), 2U);
  EXPECT_NE(threads[0], self_);
}

TEST_F(HelpingTest, HelperNeverRunsAJobThatMayBlock) {
  const auto queue = createQueue();
  ThreadIDs threads;

  for (int round = 0; round < 200; ++round) {
    service_.beginHelping();
    queue->async(JobWeight::kBrief, [] {});
    queue->async(JobWeight::kMayBlock, noteThread(threads));
    queue->async(JobWeight::kBrief, [] {});
    service_.endHelping();
  }
  ASSERT_TRUE(drain(*queue));

  EXPECT_EQ(threads.size(), 200U);
  EXPECT_EQ(std::ranges::count(threads, self_), 0);
}

TEST_F(HelpingTest, HelperDoesNotWaitForTheOwnThreadAtWork) {
  const auto queue = createQueue();
  std::promise<void> started;
  std::promise<void> release;
  ThreadIDs threads;
  queue->async(JobWeight::kMayBlock, [&] {
    started.set_value();
    release.get_future().wait();
  });
  started.get_future().wait();

  service_.beginHelping();
  queue->async(JobWeight::kBrief, noteThread(threads));
  service_.endHelping();
  EXPECT_TRUE(threads.empty());
  release.set_value();
  ASSERT_TRUE(drain(*queue));

  ASSERT_EQ(threads.size(), 1U);
  EXPECT_NE(threads[0], self_);
}

TEST_F(HelpingTest, HelperLeavesItsJobsToTheOwnThreadThatAnotherThreadWoke) {
  const auto queue = createQueue();
  std::promise<void> started;
  std::promise<void> release;
  ThreadIDs threads;

  service_.beginHelping();
  queue->async(JobWeight::kBrief, noteThread(threads));
  std::thread([&] {
    queue->async(JobWeight::kMayBlock, [&] {
      started.set_value();
      release.get_future().wait();
    });
    started.get_future().wait();
  }).join();
  queue->async(JobWeight::kBrief, noteThread(threads));
  service_.endHelping();
  EXPECT_EQ(threads.size(), 1U);
  release.set_value();
  ASSERT_TRUE(drain(*queue));

  EXPECT_EQ(threads.size(), 2U);
  EXPECT_EQ(std::ranges::count(threads, self_), 0);
}

TEST_F(HelpingTest, HelperRunsWhatItsJobsAddToThisAndOtherQueues) {
  const auto queue = createQueue();
  const auto other = createQueue();
  ThreadIDs threads;

  service_.beginHelping();
  queue->async(JobWeight::kBrief, [&] {
    queue->async(JobWeight::kBrief, noteThread(threads));
    other->async(JobWeight::kBrief, [&] {
      threads.push_back(std::this_thread::get_id());
      queue->async(JobWeight::kBrief, noteThread(threads));
    });
  });
  service_.endHelping();

  EXPECT_EQ(threads, (ThreadIDs{self_, self_, self_}));
}

TEST_F(HelpingTest, EndlessWorkIsLeftToTheOwnThread) {
  const auto queue = createQueue();
  std::atomic<int> helped{0};
  std::atomic<bool> isDone{false};
  Job again = [&] {
    if (std::this_thread::get_id() != self_) {
      isDone = true;
      return;
    }
    ++helped;
    queue->async(JobWeight::kBrief, again);
  };

  service_.beginHelping();
  queue->async(JobWeight::kBrief, again);
  service_.endHelping();

  EXPECT_TRUE(eventually([&] { return isDone.load(); }));
  EXPECT_EQ(helped, 1000);
}

TEST_F(HelpingTest, JobsOfOtherThreadsDoNotWaitForTheEndOfABatch) {
  const auto queue = createQueue();
  ThreadIDs threads;

  service_.beginHelping();
  queue->async(JobWeight::kBrief, noteThread(threads));
  std::thread([&] { EXPECT_TRUE(drain(*queue)); }).join();
  EXPECT_EQ(threads.size(), 1U);
  queue->async(JobWeight::kBrief, noteThread(threads));
  service_.endHelping();
  ASSERT_TRUE(drain(*queue));

  EXPECT_EQ(threads.size(), 2U);
}

TEST_F(HelpingTest, ThreadThatEndsWithinABatchForgetsNoJob) {
  const auto queue = createQueue();
  std::promise<void> ran;

  std::thread([&] {
    service_.beginHelping();
    queue->async(JobWeight::kBrief, [&] { ran.set_value(); });
  }).join();

  EXPECT_EQ(ran.get_future().wait_for(kTestDeadline), std::future_status::ready);
}

TEST_F(HelpingTest, QueueDroppedWithinABatchRunsItsJobs) {
  std::promise<void> ran;

  service_.beginHelping();
  createQueue()->async(JobWeight::kBrief, [&] { ran.set_value(); });
  service_.endHelping();

  EXPECT_EQ(ran.get_future().wait_for(kTestDeadline), std::future_status::ready);
}

// The jobs that one queue of the test below has run. Only the jobs of that queue use this record.
// It is not atomic, because ThreadSanitizer must report two jobs that run at the same time.
struct Record {
  static constexpr std::size_t kAdders = 6;
  std::array<int, kAdders> last{};
  int total = 0;
  bool isInOrder = true;
  bool wasAlwaysCurrent = true;

  void note(const DispatchQueue& queue, std::size_t adder, int number) {
    isInOrder = isInOrder && number == last[adder] + 1;
    wasAlwaysCurrent = wasAlwaysCurrent && queue.isCurrent();
    last[adder] = number;
    ++total;
  }
};

class HelpingTrial : public HelpingTest {
 protected:
  static constexpr int kJobs = 6000;

  // Adds numbered jobs, each to both queues, in batches of 1 to 17 numbers. Every 13th job may
  // block.
  void add(std::size_t adder) {
    const bool isHelper = adder % 3 != 0;
    for (int number = 1; number <= kJobs;) {
      if (isHelper) service_.beginHelping();
      for (int count = number % 17; count >= 0 && number <= kJobs; --count, ++number) {
        const auto weight = number % 13 == 0 ? JobWeight::kMayBlock : JobWeight::kBrief;
        for (std::size_t index = 0; index < queues_.size(); ++index) {
          queues_[index]->async(weight, [this, index, adder, number] {
            records_[index].note(*queues_[index], adder, number);
          });
        }
      }
      if (isHelper) service_.endHelping();
    }
  }

  std::array<std::shared_ptr<DispatchQueue>, 2> queues_{createQueue(), createQueue()};
  std::array<Record, 2> records_;
};

TEST_F(HelpingTrial, OrderAndExclusionHoldWhoeverRunsTheJobs) {
  std::vector<std::thread> threads;
  threads.reserve(Record::kAdders);
  for (std::size_t adder = 0; adder < Record::kAdders; ++adder) {
    threads.emplace_back([this, adder] { add(adder); });
  }
  for (std::thread& thread : threads) thread.join();

  for (std::size_t index = 0; index < queues_.size(); ++index) {
    ASSERT_TRUE(drain(*queues_[index]));
    EXPECT_EQ(records_[index].total, kJobs * static_cast<int>(Record::kAdders));
    EXPECT_TRUE(records_[index].isInOrder);
    EXPECT_TRUE(records_[index].wasAlwaysCurrent);
  }
}

TEST_F(HelpingTrial, StopAmidHelpingEndsAllThreads) {
  std::atomic<bool> isOver{false};
  std::vector<std::thread> threads;
  threads.reserve(3);
  for (int helper = 0; helper < 3; ++helper) {
    threads.emplace_back([&] {
      while (!isOver) {
        service_.beginHelping();
        for (int count = 0; count < 5; ++count) queues_[0]->async(JobWeight::kBrief, [] {});
        service_.endHelping();
      }
    });
  }

  EXPECT_TRUE(service_.stop(kTestDeadline));

  isOver = true;
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
}  // namespace halvox::platform::linux_
