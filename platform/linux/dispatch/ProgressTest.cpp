#include <atomic>
#include <future>
#include <memory>

#include <gtest/gtest.h>

#include "platform/linux/dispatch/DispatchFixture.h"
#include "platform/linux/testing/Eventually.h"

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kWatched = "com.tarno.halvox.test.watched";

class ProgressTest : public DispatchFixture {
 protected:
  std::shared_ptr<DispatchQueue> createQueue(const char* label = kWatched) {
    return service_->createSerialQueue(label, QualityOfService::kUserInteractive,
                                       QueueThreading::kOwnThread);
  }
  // A thread that has just been blocked may still use processor time to fall asleep.
  [[nodiscard]] bool isStuckAtLast() {
    return eventually([this] { return !service_->hasProgressed(kWatched); });
  }
};

TEST_F(ProgressTest, QueueWithoutJobsIsNeverStuck) {
  const auto queue = createQueue();

  for (int look = 0; look < 100; ++look) EXPECT_TRUE(service_->hasProgressed(kWatched));
}

TEST_F(ProgressTest, UnknownLabelIsNeverStuck) {
  EXPECT_TRUE(service_->hasProgressed("com.tarno.halvox.test.unknown"));
}

TEST_F(ProgressTest, JobThatSleepsIsStuckUntilItEnds) {
  StuckQueue queue(*service_, kWatched, QueueThreading::kOwnThread);

  EXPECT_TRUE(isStuckAtLast());
  EXPECT_FALSE(service_->hasProgressed(kWatched));
  queue.release();

  EXPECT_TRUE(eventually(
      [this] { return service_->hasProgressed(kWatched) && service_->hasProgressed(kWatched); }));
}

TEST_F(ProgressTest, JobsThatEndAreProgressEvenIfTheNextOneSleeps) {
  const auto queue = createQueue();
  std::promise<void> first;
  std::promise<void> second;
  queue->async(JobWeight::kMayBlock, [released = first.get_future().share()] { released.wait(); });
  queue->async(JobWeight::kMayBlock, [released = second.get_future().share()] { released.wait(); });
  ASSERT_TRUE(isStuckAtLast());

  first.set_value();

  EXPECT_TRUE(eventually([this] { return service_->hasProgressed(kWatched); }));
  EXPECT_TRUE(isStuckAtLast());
  second.set_value();
}

TEST_F(ProgressTest, JobThatComputesIsNotStuck) {
  const auto queue = createQueue();
  const auto rounds = std::make_shared<std::atomic<unsigned>>(0);
  const auto ends = std::make_shared<std::atomic<bool>>(false);
  queue->async(JobWeight::kMayBlock, [rounds, ends] {
    while (!ends->load()) rounds->fetch_add(1);
  });

  for (int look = 0; look < 10; ++look) {
    // The job computes between two looks, however busy the machine is.
    const unsigned before = rounds->load();
    ASSERT_TRUE(eventually([&] { return rounds->load() - before > 1'000'000; }));
    EXPECT_TRUE(service_->hasProgressed(kWatched));
  }
  ends->store(true);
}

TEST_F(ProgressTest, JobThatWaitsOnASemaphoreIsNotStuck) {
  const auto queue = createQueue();
  const std::shared_ptr<DispatchSemaphore> semaphore = service_->createSemaphore(0);
  std::promise<void> started;
  std::promise<void> slept;
  queue->async(JobWeight::kMayBlock, [&started, semaphore, released = slept.get_future().share()] {
    started.set_value();
    semaphore->wait();
    released.wait();
  });
  started.get_future().wait();

  // Between its start and its wait, the job may look stuck for a moment.
  EXPECT_TRUE(eventually([this] {
    for (int look = 0; look < 1000; ++look) {
      if (!service_->hasProgressed(kWatched)) return false;
    }
    return true;
  }));
  semaphore->signal();

  EXPECT_TRUE(isStuckAtLast()) << "the wait on the semaphore has ended";
  slept.set_value();
}

TEST_F(ProgressTest, StuckQueueOfAnotherLabelIsIgnored) {
  StuckQueue other(*service_, "com.tarno.halvox.test.other", QueueThreading::kOwnThread);
  const auto queue = createQueue();

  for (int look = 0; look < 100; ++look) EXPECT_TRUE(service_->hasProgressed(kWatched));
  other.release();
}

}  // namespace
}  // namespace halvox::platform::linux_
