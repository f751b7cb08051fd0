#pragma once

#include <atomic>
#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/dispatch.h"
#include "platform/fake/contracts/DispatchDrain.h"

namespace halvox::platform::contract {

// What every DispatchService promises about queues that wait on semaphores. `Harness` is that of
// DispatchContract.
template <typename Harness>
class DispatchWaitContract : public ::testing::Test {
 protected:
  using Steps = std::vector<std::string>;
  using Timeout = std::optional<std::chrono::nanoseconds>;

  std::shared_ptr<DispatchQueue> createQueue() {
    return harness_.service().createSerialQueue("com.tarno.halvox.test", QualityOfService::kUtility,
                                                QueueThreading::kShared);
  }
  std::shared_ptr<DispatchSemaphore> createSemaphore(std::uint64_t signals) {
    return harness_.service().createSemaphore(signals);
  }
  // Adds a job that begins a wait. The end of the wait adds its outcome to the steps.
  void addWait(const std::shared_ptr<DispatchQueue>& queue,
               const std::shared_ptr<DispatchSemaphore>& semaphore, Timeout timeout) {
    queue->async(JobWeight::kBrief, [this, queue, semaphore, timeout] {
      queue->waitOn(semaphore, timeout, [this](WaitOutcome outcome) {
        steps_.push_back(word(outcome));
        ++ended_;
      });
      ++begun_;
    });
  }
  static std::string word(WaitOutcome outcome) {
    return outcome == WaitOutcome::kSignalled ? "signalled" : "timed out";
  }
  void addStep(DispatchQueue& queue, std::string name) {
    queue.async(JobWeight::kBrief, [this, name] { steps_.push_back(name); });
  }
  bool letBegin(int waits) {
    return harness_.letRunUntil([this, waits] { return begun_ == waits; });
  }
  bool letEnd(int waits) {
    return harness_.letRunUntil([this, waits] { return ended_ == waits; });
  }
  bool drain(DispatchQueue& queue) { return drainBy(harness_, queue); }

  static constexpr std::chrono::nanoseconds kShort = std::chrono::milliseconds(20);
  static constexpr std::chrono::nanoseconds kLong = std::chrono::hours(1);

  Steps steps_;  // used by one queue at a time; read after the queue was drained
  std::atomic<int> begun_{0};
  std::atomic<int> ended_{0};
  Harness harness_;  // last, so that no job runs when the other members are destroyed
};
TYPED_TEST_SUITE_P(DispatchWaitContract);

TYPED_TEST_P(DispatchWaitContract, SignalThatIsThereEndsTheWaitAtOnce) {
  const auto queue = this->createQueue();
  const auto semaphore = this->createSemaphore(0);
  semaphore->signal();

  this->addWait(queue, semaphore, std::nullopt);
  ASSERT_TRUE(this->drain(*queue));

  EXPECT_EQ(this->steps_, (std::vector<std::string>{"signalled"}));
}

TYPED_TEST_P(DispatchWaitContract, SignalThatComesLaterEndsTheWait) {
  const auto queue = this->createQueue();
  const auto semaphore = this->createSemaphore(0);
  this->addWait(queue, semaphore, this->kLong);
  ASSERT_TRUE(this->letBegin(1));
  EXPECT_EQ(this->ended_, 0);

  semaphore->signal();
  ASSERT_TRUE(this->drain(*queue));

  EXPECT_EQ(this->steps_, (std::vector<std::string>{"signalled"}));
}

TYPED_TEST_P(DispatchWaitContract, WaitWithoutSignalTimesOut) {
  const auto queue = this->createQueue();
  const auto semaphore = this->createSemaphore(0);

  this->addWait(queue, semaphore, this->kShort);
  ASSERT_TRUE(this->drain(*queue));

  EXPECT_EQ(this->steps_, (std::vector<std::string>{"timed out"}));
}

TYPED_TEST_P(DispatchWaitContract, WaitOfNoTimeTakesASignalOrNone) {
  const auto queue = this->createQueue();
  const auto semaphore = this->createSemaphore(1);

  this->addWait(queue, semaphore, std::chrono::nanoseconds(0));
  this->addWait(queue, semaphore, std::chrono::nanoseconds(0));
  ASSERT_TRUE(this->drain(*queue));

  EXPECT_EQ(this->steps_, (std::vector<std::string>{"signalled", "timed out"}));
}

TYPED_TEST_P(DispatchWaitContract, SignalsThatNobodyWaitsForStay) {
  const auto queue = this->createQueue();
  const auto semaphore = this->createSemaphore(1);
  this->addWait(queue, semaphore, this->kShort);
  ASSERT_TRUE(this->drain(*queue));
  semaphore->signal();
  semaphore->signal();

  for (int wait = 0; wait < 3; ++wait) this->addWait(queue, semaphore, this->kShort);
  ASSERT_TRUE(this->drain(*queue));

  EXPECT_EQ(this->steps_,
            (std::vector<std::string>{"signalled", "signalled", "signalled", "timed out"}));
}

TYPED_TEST_P(DispatchWaitContract, SignalAfterTheTimeOutIsForTheNextWait) {
  const auto queue = this->createQueue();
  const auto semaphore = this->createSemaphore(0);
  this->addWait(queue, semaphore, this->kShort);
  ASSERT_TRUE(this->drain(*queue));
  semaphore->signal();

  this->addWait(queue, semaphore, this->kShort);
  ASSERT_TRUE(this->drain(*queue));

  EXPECT_EQ(this->steps_, (std::vector<std::string>{"timed out", "signalled"}));
}

TYPED_TEST_P(DispatchWaitContract, JobsOfAWaitingQueueRunInOrderAfterTheEndOfTheWait) {
  const auto queue = this->createQueue();
  const auto other = this->createQueue();
  const auto semaphore = this->createSemaphore(0);
  this->addWait(queue, semaphore, std::nullopt);
  this->addStep(*queue, "first");
  ASSERT_TRUE(this->letBegin(1));
  this->addStep(*queue, "second");
  ASSERT_TRUE(this->drain(*other));
  EXPECT_EQ(this->ended_, 0);

  semaphore->signal();
  this->addStep(*queue, "third");
  ASSERT_TRUE(this->drain(*queue));

  EXPECT_EQ(this->steps_, (std::vector<std::string>{"signalled", "first", "second", "third"}));
}

TYPED_TEST_P(DispatchWaitContract, EndOfAWaitIsAJobOfItsQueueAndMayWaitAgain) {
  const auto queue = this->createQueue();
  const auto semaphore = this->createSemaphore(0);
  std::vector<bool> isCurrent;
  queue->async(JobWeight::kBrief, [&] {
    queue->waitOn(semaphore, this->kShort, [&](WaitOutcome first) {
      this->steps_.push_back(this->word(first));
      isCurrent.push_back(queue->isCurrent());
      semaphore->signal();
      queue->waitOn(semaphore, this->kLong, [&](WaitOutcome second) {
        this->steps_.push_back(this->word(second));
        isCurrent.push_back(queue->isCurrent());
      });
    });
  });
  this->addStep(*queue, "job");
  ASSERT_TRUE(this->drain(*queue));

  EXPECT_EQ(this->steps_, (std::vector<std::string>{"timed out", "signalled", "job"}));
  EXPECT_EQ(isCurrent, (std::vector<bool>{true, true}));
}

TYPED_TEST_P(DispatchWaitContract, EachSignalEndsOneWaitFirstComeFirstServed) {
  const auto semaphore = this->createSemaphore(0);
  std::vector<std::shared_ptr<DispatchQueue>> queues;
  std::atomic<int> firstEnded{-1};
  std::atomic<int> lastEnded{-1};
  for (int number = 0; number < 2; ++number) {
    queues.push_back(this->createQueue());
    queues.back()->async(JobWeight::kBrief, [&, number, queue = queues.back()] {
      queue->waitOn(semaphore, std::nullopt, [&, number](WaitOutcome) {
        (this->ended_ == 0 ? firstEnded : lastEnded) = number;
        ++this->ended_;
      });
      ++this->begun_;
    });
    ASSERT_TRUE(this->letBegin(number + 1));
  }

  semaphore->signal();
  ASSERT_TRUE(this->letEnd(1));
  EXPECT_EQ(firstEnded, 0);
  semaphore->signal();
  ASSERT_TRUE(this->letEnd(2));

  EXPECT_EQ(lastEnded, 1);
}

TYPED_TEST_P(DispatchWaitContract, AThousandWaitingQueuesDelayNoOther) {
  const auto semaphore = this->createSemaphore(0);
  const auto other = this->createQueue();
  for (int number = 0; number < 1000; ++number) {
    const auto queue = this->createQueue();
    queue->async(JobWeight::kBrief, [this, queue, semaphore] {
      queue->waitOn(semaphore, this->kLong, [this](WaitOutcome) { ++this->ended_; });
      ++this->begun_;
    });
  }
  ASSERT_TRUE(this->letBegin(1000));

  EXPECT_TRUE(this->drain(*other));
  EXPECT_EQ(this->ended_, 0);

  for (int signal = 0; signal < 1000; ++signal) semaphore->signal();
  EXPECT_TRUE(this->letEnd(1000));
}

TYPED_TEST_P(DispatchWaitContract, LetsGoOfWhatTheWaitHeldOnceItHasEnded) {
  const auto queue = this->createQueue();
  auto semaphore = this->createSemaphore(1);
  const std::weak_ptr<DispatchSemaphore> watchedSemaphore = semaphore;
  auto held = std::make_shared<int>(1);
  const std::weak_ptr<int> watched = held;

  queue->async(JobWeight::kBrief, [queue, semaphore, held] {
    queue->waitOn(semaphore, std::nullopt, [held](WaitOutcome) {});
  });
  semaphore.reset();
  held.reset();
  ASSERT_TRUE(this->drain(*queue));

  EXPECT_TRUE(watched.expired());
  EXPECT_TRUE(watchedSemaphore.expired());
}

TYPED_TEST_P(DispatchWaitContract, AThreadThatBlocksGoesOnAfterASignal) {
  const auto queue = this->createQueue();
  const auto semaphore = this->createSemaphore(1);
  semaphore->wait();  // consumes the signal that exists
  this->addStep(*queue, "before the signal");
  queue->async(JobWeight::kBrief, [semaphore] { semaphore->signal(); });

  semaphore->wait();

  EXPECT_EQ(this->steps_, typename TestFixture::Steps{"before the signal"});
}

REGISTER_TYPED_TEST_SUITE_P(DispatchWaitContract, AThreadThatBlocksGoesOnAfterASignal,
                            SignalThatIsThereEndsTheWaitAtOnce, SignalThatComesLaterEndsTheWait,
                            WaitWithoutSignalTimesOut, WaitOfNoTimeTakesASignalOrNone,
                            SignalsThatNobodyWaitsForStay, SignalAfterTheTimeOutIsForTheNextWait,
                            JobsOfAWaitingQueueRunInOrderAfterTheEndOfTheWait,
                            EndOfAWaitIsAJobOfItsQueueAndMayWaitAgain,
                            EachSignalEndsOneWaitFirstComeFirstServed,
                            AThousandWaitingQueuesDelayNoOther,
                            LetsGoOfWhatTheWaitHeldOnceItHasEnded);

}  // namespace halvox::platform::contract
