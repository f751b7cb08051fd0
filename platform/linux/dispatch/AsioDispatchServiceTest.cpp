#include "platform/linux/dispatch/AsioDispatchService.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <future>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <unistd.h>

#include "platform/linux/dispatch/DispatchFixture.h"
#include "platform/linux/testing/Eventually.h"

namespace halvox::platform::linux_ {
namespace {

class AsioDispatchServiceTest : public DispatchFixture {
 protected:
  std::shared_ptr<DispatchQueue> createQueue(QueueThreading threading) {
    return service_->createSerialQueue("com.tarno.halvox.reporting.server",
                                       QualityOfService::kUserInteractive, threading);
  }
  // Waits until all jobs that were added before have run.
  static bool drain(DispatchQueue& queue) {
    std::promise<void> done;
    auto ran = done.get_future();
    queue.async(JobWeight::kBrief, [&done] { done.set_value(); });
    return ran.wait_for(kTestDeadline) == std::future_status::ready;
  }
};

// May count threads that have ended and been joined: the kernel removes a thread from the list a
// little later. A later count can therefore be lower.
std::size_t threadsOfThisProcess() {
  const std::filesystem::directory_iterator tasks("/proc/self/task");
  return static_cast<std::size_t>(std::distance(begin(tasks), end(tasks)));
}

TEST_F(AsioDispatchServiceTest, OwnThreadBearsTheLastWordsOfTheLabel) {
  std::array<char, 16> name{};
  const auto queue = createQueue(QueueThreading::kOwnThread);

  queue->async(JobWeight::kBrief,
               [&] { ::pthread_getname_np(::pthread_self(), name.data(), name.size()); });
  ASSERT_TRUE(drain(*queue));

  EXPECT_STREQ(name.data(), "server");
}

TEST_F(AsioDispatchServiceTest, ThreadsLeaveSignalsToTheMainThread) {
  for (const auto threading : {QueueThreading::kOwnThread, QueueThreading::kShared}) {
    sigset_t blocked;
    const auto queue = createQueue(threading);

    queue->async(JobWeight::kBrief, [&] { ::pthread_sigmask(SIG_BLOCK, nullptr, &blocked); });
    ASSERT_TRUE(drain(*queue));

    EXPECT_EQ(::sigismember(&blocked, SIGTERM), 1);
    EXPECT_EQ(::sigismember(&blocked, SIGUSR1), 1);
  }
}

TEST_F(AsioDispatchServiceTest, BackgroundQueueWithOwnThreadYieldsToOthers) {
  const auto nicenessNow = [] {
    return ::getpriority(PRIO_PROCESS, static_cast<id_t>(::gettid()));
  };
  const int own = nicenessNow();
  int niceness = own;
  const auto queue = service_->createSerialQueue("background", QualityOfService::kBackground,
                                                 QueueThreading::kOwnThread);

  queue->async(JobWeight::kBrief, [&] { niceness = nicenessNow(); });
  ASSERT_TRUE(drain(*queue));

  constexpr int kLowest = 19;
  EXPECT_GE(niceness, std::min(own + 10, kLowest));
}

TEST_F(AsioDispatchServiceTest, JobThatThrowsIsLoggedAndCountedAndTheQueueGoesOn) {
  for (const auto threading : {QueueThreading::kOwnThread, QueueThreading::kShared}) {
    const auto queue = createQueue(threading);
    queue->async(JobWeight::kBrief, [] { throw std::runtime_error("out of luck"); });
    queue->async(JobWeight::kBrief, [] { throw 7; });  // not a std::exception
    EXPECT_TRUE(drain(*queue));
  }

  EXPECT_EQ(count("jobs that failed"), 4U);
  const auto lines = logLines();
  EXPECT_THAT(lines, ::testing::Contains(::testing::HasSubstr("out of luck")).Times(2));
  EXPECT_THAT(lines, ::testing::Contains(::testing::HasSubstr("unknown kind")).Times(2));
}

TEST_F(AsioDispatchServiceTest, ThousandsOfDelaysCostNoThread) {
  const std::size_t before = threadsOfThisProcess();

  for (int number = 0; number < 10'000; ++number) {
    service_->asyncAfterOnBackgroundQueue(std::chrono::hours(1), [] {});
  }

  EXPECT_LE(threadsOfThisProcess(), before);
}

TEST_F(AsioDispatchServiceTest, EarlierDelayOvertakesAPendingOne) {
  std::promise<void> ran;
  service_->asyncAfterOnBackgroundQueue(std::chrono::nanoseconds::max(), [] { FAIL(); });
  service_->asyncAfterOnBackgroundQueue(std::chrono::hours(1), [] { FAIL(); });

  service_->asyncAfterOnBackgroundQueue(std::chrono::milliseconds(1), [&] { ran.set_value(); });

  EXPECT_EQ(ran.get_future().wait_for(kTestDeadline), std::future_status::ready);
}

TEST_F(AsioDispatchServiceTest, DelayIsNeverCutShort) {
  std::promise<std::chrono::steady_clock::time_point> ran;
  const auto start = std::chrono::steady_clock::now();

  service_->asyncAfterOnBackgroundQueue(std::chrono::milliseconds(30),
                                        [&] { ran.set_value(std::chrono::steady_clock::now()); });

  EXPECT_GE(ran.get_future().get() - start, std::chrono::milliseconds(30));
}

TEST_F(AsioDispatchServiceTest, JobThatWaitsDoesNotHoldUpAnotherSharedQueue) {
  const auto first = createQueue(QueueThreading::kShared);
  const auto second = createQueue(QueueThreading::kShared);
  std::promise<void> release;

  first->async(JobWeight::kMayBlock, [&] { release.get_future().wait(); });

  EXPECT_TRUE(drain(*second));
  release.set_value();
  EXPECT_TRUE(drain(*first));
}

TEST_F(AsioDispatchServiceTest, ThreadOfADroppedQueueEnds) {
  const std::size_t before = threadsOfThisProcess();
  for (int number = 0; number < 20; ++number) {
    const auto queue = createQueue(QueueThreading::kOwnThread);
    queue->async(JobWeight::kBrief, [] {});
  }

  EXPECT_TRUE(eventually([before] { return threadsOfThisProcess() <= before; }));
}

TEST_F(AsioDispatchServiceTest, QueueMayBeDroppedByItsOwnJob) {
  std::promise<void> ran;
  auto queue = createQueue(QueueThreading::kOwnThread);
  DispatchQueue& borrowed = *queue;

  borrowed.async(JobWeight::kBrief, [&ran, queue = std::move(queue)]() mutable {
    queue.reset();
    ran.set_value();
  });

  EXPECT_EQ(ran.get_future().wait_for(kTestDeadline), std::future_status::ready);
}

TEST_F(AsioDispatchServiceTest, StopDiscardsWaitingJobsAndCountsThem) {
  for (const auto threading : {QueueThreading::kOwnThread, QueueThreading::kShared}) {
    AsioDispatchService service(*log_, statistics_);
    const std::uint64_t before = count("jobs discarded at the stop");
    const auto queue = service.createSerialQueue("q", QualityOfService::kUtility, threading);
    std::promise<void> started;
    std::promise<void> release;
    auto held = std::make_shared<int>(0);
    const std::weak_ptr<int> watched = held;
    std::atomic<int> ran{0};

    queue->async(JobWeight::kMayBlock, [&] {
      started.set_value();
      release.get_future().wait();
    });
    for (int number = 0; number < 10; ++number) {
      queue->async(JobWeight::kBrief, [&ran, held, queue] { ++ran; });
    }
    service.asyncAfterOnBackgroundQueue(std::chrono::hours(1), [held = std::move(held), queue] {});
    started.get_future().wait();
    std::thread releaser([&] { release.set_value(); });
    EXPECT_TRUE(service.stop(kTestDeadline));
    releaser.join();

    // The release may have come before the stop. Either way, every job has run or was discarded.
    EXPECT_EQ(count("jobs discarded at the stop") - before + static_cast<std::uint64_t>(ran), 11U);
    EXPECT_TRUE(watched.expired());
  }
}

TEST_F(AsioDispatchServiceTest, StopMayBeCalledAgainAndLaterJobsAreDiscarded) {
  const auto own = createQueue(QueueThreading::kOwnThread);
  const auto shared = createQueue(QueueThreading::kShared);
  EXPECT_TRUE(service_->stop(kTestDeadline));
  EXPECT_TRUE(service_->stop(kTestDeadline));

  own->async(JobWeight::kBrief, [] { FAIL(); });
  shared->async(JobWeight::kBrief, [] { FAIL(); });
  createQueue(QueueThreading::kOwnThread)->async(JobWeight::kBrief, [] { FAIL(); });
  service_->asyncAfterOnBackgroundQueue(std::chrono::nanoseconds(0), [] { FAIL(); });

  EXPECT_EQ(count("jobs discarded at the stop"), 4U);
}

TEST_F(AsioDispatchServiceTest, StopIsBoundedWhenAJobDoesNotEnd) {
  for (const auto threading : {QueueThreading::kOwnThread, QueueThreading::kShared}) {
    AsioDispatchService service(*log_, statistics_);
    StuckQueue queue(service, "q", threading);

    EXPECT_FALSE(service.stop(std::chrono::milliseconds(20)));

    queue.release();
    EXPECT_TRUE(service.stop(kTestDeadline));
  }
}

TEST_F(AsioDispatchServiceTest, QueuesMayOutliveTheService) {
  const auto own = createQueue(QueueThreading::kOwnThread);
  const auto shared = createQueue(QueueThreading::kShared);

  service_.reset();

  own->async(JobWeight::kBrief, [] { FAIL(); });
  shared->async(JobWeight::kBrief, [] { FAIL(); });
  EXPECT_EQ(count("jobs discarded at the stop"), 2U);
}

class AsioDispatchWaitTest : public AsioDispatchServiceTest {
 protected:
  // Makes that number of queues wait on the semaphore, and returns when all of them wait.
  void letQueuesWait(AsioDispatchService& service, int queues,
                     std::optional<std::chrono::nanoseconds> timeout) {
    const auto semaphore = semaphore_;
    for (int number = 0; number < queues; ++number) {
      const auto queue =
          service.createSerialQueue("q", QualityOfService::kUtility, QueueThreading::kShared);
      queue->async(JobWeight::kBrief, [this, queue, semaphore, timeout, held = held_] {
        queue->waitOn(semaphore, timeout, [this, queue, held](WaitOutcome) { ++ended_; });
        ++begun_;
      });
      queue->async(JobWeight::kBrief, [held = held_] {});
    }
    ASSERT_TRUE(eventually([&] { return begun_ == queues; }));
  }
  // Returns how often the pool's threads have started to run so far.
  static long wakeUps() {
    long sum = 0;
    for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
      std::ifstream status(task.path() / "status");
      std::string line;
      std::getline(status, line);
      if (!line.starts_with("Name:\tpool-")) continue;
      while (std::getline(status, line)) {
        const std::size_t name = line.find("ctxt_switches:");
        if (name != std::string::npos) sum += std::stol(line.substr(line.find(':') + 1));
      }
    }
    return sum;
  }

  std::shared_ptr<int> held_ = std::make_shared<int>(0);
  std::atomic<int> begun_{0};
  std::atomic<int> ended_{0};
  std::shared_ptr<DispatchSemaphore> semaphore_ = service_->createSemaphore(0);
};

TEST_F(AsioDispatchWaitTest, ThousandWaitingQueuesCostNoThreadAndNoWakeUps) {
  const std::size_t before = threadsOfThisProcess();
  letQueuesWait(*service_, 1000, std::chrono::hours(1));
  EXPECT_LE(threadsOfThisProcess(), before);

  EXPECT_GT(wakeUps(), 0);
  EXPECT_TRUE(staysQuiet(wakeUps, std::chrono::milliseconds(200)));
  EXPECT_EQ(ended_, 0);
}

TEST_F(AsioDispatchWaitTest, AWaitThatEndedWakesNobodyWhenItsTimeOutWouldHaveCome) {
  constexpr std::chrono::milliseconds kTimeOut{1500};
  const auto begun = std::chrono::steady_clock::now();
  letQueuesWait(*service_, 3, kTimeOut);
  for (int signal = 0; signal < 3; ++signal) semaphore_->signal();
  ASSERT_TRUE(eventually([&] { return ended_ == 3; }));

  if (std::chrono::steady_clock::now() > begun + kTimeOut / 2)
    GTEST_SKIP() << "too busy to measure";
  EXPECT_TRUE(staysQuiet(wakeUps, 2 * kTimeOut));
}

TEST_F(AsioDispatchWaitTest, StopDropsWaitsWithTheJobsAfterThemAndCountsThem) {
  for (const auto timeout : {std::optional<std::chrono::nanoseconds>(), {std::chrono::hours(1)}}) {
    AsioDispatchService service(*log_, statistics_);
    const std::uint64_t before = count("jobs discarded at the stop");
    begun_ = 0;
    held_ = std::make_shared<int>(0);
    const std::weak_ptr<int> watched = held_;
    semaphore_ = service.createSemaphore(0);
    letQueuesWait(service, 100, timeout);
    held_.reset();

    const auto start = std::chrono::steady_clock::now();
    EXPECT_TRUE(service.stop(kTestDeadline));

    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(5));
    EXPECT_TRUE(watched.expired());
    EXPECT_EQ(count("jobs discarded at the stop") - before, 200U);
    semaphore_->signal();
    EXPECT_EQ(ended_, 0);
  }
}

TEST_F(AsioDispatchWaitTest, SemaphoreMayOutliveTheService) {
  letQueuesWait(*service_, 1, std::nullopt);
  service_.reset();

  semaphore_->signal();

  EXPECT_EQ(ended_, 0);
}

TEST_F(AsioDispatchWaitTest, SignalsAndTimeOutsThatMeetEndEachWaitOnce) {
  constexpr int kRounds = 2000;
  const auto queue = createQueue(QueueThreading::kShared);
  std::atomic<int> signalled{0};
  for (int round = 0; round < kRounds; ++round) {
    queue->async(JobWeight::kBrief, [&] {
      queue->waitOn(semaphore_, std::chrono::microseconds(50), [&](WaitOutcome outcome) {
        if (outcome == WaitOutcome::kSignalled) ++signalled;
        ++ended_;
      });
    });
  }
  int sent = 0;
  while (ended_ < kRounds) {
    if (sent <= signalled) {
      semaphore_->signal();
      ++sent;
    }
    std::this_thread::yield();
  }
  ASSERT_TRUE(drain(*queue));

  EXPECT_EQ(ended_, kRounds);
  EXPECT_TRUE(signalled == sent || signalled == sent - 1);
}

TEST_F(AsioDispatchWaitTest, QueueWithItsOwnThreadRefusesToWait) {
  const auto queue = createQueue(QueueThreading::kOwnThread);

  queue->async(JobWeight::kBrief,
               [&] { queue->waitOn(semaphore_, std::nullopt, [](WaitOutcome) { FAIL(); }); });
  ASSERT_TRUE(drain(*queue));

  EXPECT_EQ(count("jobs that failed"), 1U);
}

TEST_F(AsioDispatchWaitTest, JobThatWaitsTwiceFailsAndItsFirstWaitGoesOn) {
  const auto queue = createQueue(QueueThreading::kShared);

  queue->async(JobWeight::kBrief, [&] {
    queue->waitOn(semaphore_, std::nullopt, [&](WaitOutcome) { ++ended_; });
    queue->waitOn(semaphore_, std::nullopt, [](WaitOutcome) { FAIL(); });
  });
  ASSERT_TRUE(eventually([&] { return count("jobs that failed") == 1; }));
  semaphore_->signal();
  ASSERT_TRUE(drain(*queue));

  EXPECT_EQ(ended_, 1);
}

}  // namespace
}  // namespace halvox::platform::linux_
