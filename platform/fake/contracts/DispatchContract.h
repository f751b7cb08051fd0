#pragma once

#include <array>
#include <atomic>
#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/dispatch.h"
#include "platform/fake/contracts/DispatchDrain.h"

namespace halvox::platform::contract {

// What every DispatchService promises, whatever runs the jobs.
//
// `Harness` is default-constructible and has
//   DispatchService& service();
//   bool letRunUntil(const std::function<bool()>& condition);
//     lets jobs run, and delays pass, until the condition holds; false if it never does
// The condition may be called only on the test's thread, while jobs run elsewhere.
template <typename Harness>
class DispatchContract : public ::testing::Test {
 protected:
  std::shared_ptr<DispatchQueue> createQueue(QueueThreading threading) {
    return harness_.service().createSerialQueue("com.tarno.halvox.test", QualityOfService::kUtility,
                                                threading);
  }
  bool drain(DispatchQueue& queue) { return drainBy(harness_, queue); }

  static constexpr std::array kThreadings{QueueThreading::kOwnThread, QueueThreading::kShared};
  Harness harness_;
};
TYPED_TEST_SUITE_P(DispatchContract);

TYPED_TEST_P(DispatchContract, RunsTheJobsOfOneThreadInTheirOrder) {
  for (const QueueThreading threading : this->kThreadings) {
    const auto queue = this->createQueue(threading);
    std::vector<int> ran;  // used by the queue only; read after the queue was drained

    for (int number = 0; number < 1000; ++number) {
      const auto weight = number % 3 == 0 ? JobWeight::kMayBlock : JobWeight::kBrief;
      queue->async(weight, [&ran, number] { ran.push_back(number); });
    }
    ASSERT_TRUE(this->drain(*queue));

    ASSERT_EQ(ran.size(), 1000U);
    for (int number = 0; number < 1000; ++number) {
      ASSERT_EQ(ran[static_cast<std::size_t>(number)], number);
    }
  }
}

TYPED_TEST_P(DispatchContract, RunsNoTwoJobsOfOneQueueAtOnce) {
  for (const QueueThreading threading : this->kThreadings) {
    const auto queue = this->createQueue(threading);
    std::atomic<int> running{0};
    std::atomic<int> most{0};
    std::atomic<int> total{0};
    const auto job = [&] {
      const int now = ++running;
      if (now > most) most = now;
      ++total;
      --running;
    };

    std::vector<std::thread> adders;
    adders.reserve(4);
    for (int thread = 0; thread < 4; ++thread) {
      adders.emplace_back([&] {
        for (int count = 0; count < 500; ++count) queue->async(JobWeight::kBrief, job);
      });
    }
    for (std::thread& adder : adders) adder.join();
    ASSERT_TRUE(this->drain(*queue));

    EXPECT_EQ(total, 2000);
    EXPECT_EQ(most, 1);
  }
}

TYPED_TEST_P(DispatchContract, RunsAJobThatAJobAddsAfterTheOneThatAddsIt) {
  for (const QueueThreading threading : this->kThreadings) {
    const auto queue = this->createQueue(threading);
    std::vector<int> ran;
    std::atomic<bool> done{false};

    queue->async(JobWeight::kBrief, [&] {
      queue->async(JobWeight::kBrief, [&] {
        ran.push_back(2);
        done = true;
      });
      ran.push_back(1);
    });

    ASSERT_TRUE(this->harness_.letRunUntil([&] { return done.load(); }));
    EXPECT_EQ(ran, (std::vector<int>{1, 2}));
  }
}

TYPED_TEST_P(DispatchContract, QueueIsCurrentWithinItsJobsOnly) {
  for (const QueueThreading threading : this->kThreadings) {
    const auto queue = this->createQueue(threading);
    const auto other = this->createQueue(threading);
    std::optional<bool> own;
    std::optional<bool> others;

    queue->async(JobWeight::kBrief, [&] {
      own = queue->isCurrent();
      others = other->isCurrent();
    });
    ASSERT_TRUE(this->drain(*queue));

    EXPECT_EQ(own, true);
    EXPECT_EQ(others, false);
    EXPECT_FALSE(queue->isCurrent());
  }
}

TYPED_TEST_P(DispatchContract, JobsKeepTheirQueueUntilTheyHaveRun) {
  for (const QueueThreading threading : this->kThreadings) {
    auto queue = this->createQueue(threading);
    std::atomic<bool> done{false};

    queue->async(JobWeight::kBrief, [] {});
    queue->async(JobWeight::kMayBlock, [&] { done = true; });
    queue.reset();

    EXPECT_TRUE(this->harness_.letRunUntil([&] { return done.load(); }));
  }
}

TYPED_TEST_P(DispatchContract, LetsGoOfWhatAJobHeldOnceItHasRun) {
  for (const QueueThreading threading : this->kThreadings) {
    const auto queue = this->createQueue(threading);
    auto held = std::make_shared<int>(1);
    const std::weak_ptr<int> watched = held;

    queue->async(JobWeight::kBrief, [held = std::move(held)] {});
    ASSERT_TRUE(this->drain(*queue));

    EXPECT_TRUE(watched.expired());
  }
}

TYPED_TEST_P(DispatchContract, QueuesDoNotWaitForEachOther) {
  for (const QueueThreading threading : this->kThreadings) {
    const auto first = this->createQueue(threading);
    const auto second = this->createQueue(threading);
    std::atomic<int> ran{0};

    first->async(JobWeight::kBrief, [&] {
      second->async(JobWeight::kBrief, [&] {
        first->async(JobWeight::kBrief, [&] { ++ran; });
        ++ran;
      });
      ++ran;
    });

    EXPECT_TRUE(this->harness_.letRunUntil([&] { return ran == 3; }));
  }
}

TYPED_TEST_P(DispatchContract, DelayedJobsRunWhenTheirTimeHasCome) {
  std::atomic<int> ran{0};
  for (int number = 0; number < 100; ++number) {
    this->harness_.service().asyncAfterOnBackgroundQueue(std::chrono::milliseconds(number % 10),
                                                         [&] { ++ran; });
  }

  EXPECT_TRUE(this->harness_.letRunUntil([&] { return ran == 100; }));
}

TYPED_TEST_P(DispatchContract, DelayedJobRunsLaterThanOneOfShorterDelay) {
  std::atomic<int> turn{0};
  std::atomic<int> shortTurn{0};
  std::atomic<int> longTurn{0};

  this->harness_.service().asyncAfterOnBackgroundQueue(std::chrono::milliseconds(60),
                                                       [&] { longTurn = ++turn; });
  this->harness_.service().asyncAfterOnBackgroundQueue(std::chrono::milliseconds(1),
                                                       [&] { shortTurn = ++turn; });

  ASSERT_TRUE(this->harness_.letRunUntil([&] { return longTurn > 0; }));
  EXPECT_EQ(shortTurn, 1);
  EXPECT_EQ(longTurn, 2);
}

TYPED_TEST_P(DispatchContract, DelayedJobDoesNotRunBeforeItsMakerReturns) {
  std::atomic<bool> isWithinJob{false};
  std::atomic<bool> nested{false};
  std::atomic<bool> done{false};

  this->harness_.service().asyncAfterOnBackgroundQueue(std::chrono::nanoseconds(0), [&] {
    isWithinJob = true;
    const auto adder = std::this_thread::get_id();
    this->harness_.service().asyncAfterOnBackgroundQueue(std::chrono::nanoseconds(-1), [&, adder] {
      nested = isWithinJob && std::this_thread::get_id() == adder;
      done = true;
    });
    isWithinJob = false;
  });

  ASSERT_TRUE(this->harness_.letRunUntil([&] { return done.load(); }));
  EXPECT_FALSE(nested);
}

REGISTER_TYPED_TEST_SUITE_P(DispatchContract, RunsTheJobsOfOneThreadInTheirOrder,
                            RunsNoTwoJobsOfOneQueueAtOnce,
                            RunsAJobThatAJobAddsAfterTheOneThatAddsIt,
                            QueueIsCurrentWithinItsJobsOnly, JobsKeepTheirQueueUntilTheyHaveRun,
                            LetsGoOfWhatAJobHeldOnceItHasRun, QueuesDoNotWaitForEachOther,
                            DelayedJobsRunWhenTheirTimeHasCome,
                            DelayedJobRunsLaterThanOneOfShorterDelay,
                            DelayedJobDoesNotRunBeforeItsMakerReturns);

}  // namespace halvox::platform::contract
