#include "platform/linux/store/WriterQueue.h"

#include <atomic>
#include <thread>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

constexpr QueueLimits kSmall{.softRecords = 8,
                             .softBytes = 1000,
                             .softTime = std::chrono::milliseconds(75),
                             .hardFactor = 2,
                             .gatherTime = std::chrono::milliseconds(0),
                             .gatherRecords = 4};

WriterQueue::Time soon() { return std::chrono::steady_clock::now(); }
WriterQueue::Time never() { return std::chrono::steady_clock::now() + std::chrono::hours(1); }

void addMany(WriterQueue& queue, int count) {
  for (int index = 0; index < count; ++index) ASSERT_TRUE(queue.add([] {}));
}

TEST(WriterQueueTest, RaisesBackpressureAtTheSoftLimit) {
  Backpressure backpressure;
  WriterQueue queue(kSmall, backpressure);

  addMany(queue, 7);
  EXPECT_FALSE(backpressure.isHigh());
  addMany(queue, 1);
  EXPECT_TRUE(backpressure.isHigh());
}

TEST(WriterQueueTest, RelievesBackpressureBelowAQuarterAndCallsTheHandler) {
  Backpressure backpressure;
  int reliefs = 0;
  backpressure.setReliefHandler([&] { ++reliefs; });
  WriterQueue queue(kSmall, backpressure);
  addMany(queue, 8);
  ASSERT_TRUE(queue.take(soon(), [] {}));

  queue.finish(5, 0);
  EXPECT_TRUE(backpressure.isHigh());
  queue.finish(1, 0);
  EXPECT_FALSE(backpressure.isHigh());
  EXPECT_EQ(reliefs, 1);
}

TEST(WriterQueueTest, RaisesBackpressureWhenTheLimitFallsBelowWhatWaits) {
  Backpressure backpressure;
  WriterQueue queue(kSmall, backpressure);
  addMany(queue, 2);
  ASSERT_TRUE(queue.take(soon(), [] {}));
  addMany(queue, 4);
  ASSERT_FALSE(queue.isBehind());

  // With payloads of this size, the soft limit is two waiting records and the hard limit is four.
  queue.finish(2, 1000);

  EXPECT_TRUE(queue.isBehind());
}

TEST(WriterQueueTest, MakesCallersWaitAtTheHardLimitUntilThereIsRoom) {
  Backpressure backpressure;
  WriterQueue queue(kSmall, backpressure);
  addMany(queue, 16);
  std::atomic<bool> added{false};
  std::thread caller([&] {
    EXPECT_TRUE(queue.add([] {}));
    added = true;
  });

  ASSERT_TRUE(queue.take(soon(), [] {}));
  EXPECT_FALSE(added);
  queue.finish(1, 0);
  caller.join();
  EXPECT_TRUE(added);
  EXPECT_EQ(queue.waiting(), 16U);
}

TEST(WriterQueueTest, HoldsFewerRecordsWhenTheirPayloadsAreLarge) {
  Backpressure backpressure;
  WriterQueue queue(kSmall, backpressure);
  addMany(queue, 1);
  ASSERT_TRUE(queue.take(soon(), [] {}));
  queue.finish(1, 500);

  addMany(queue, 1);
  EXPECT_FALSE(backpressure.isHigh());
  addMany(queue, 1);
  EXPECT_TRUE(backpressure.isHigh());
}

TEST(WriterQueueTest, TimeSpentOnAFailureDoesNotLowerTheLimit) {
  Backpressure backpressure;
  WriterQueue::Time now = soon();
  WriterQueue queue(kSmall, backpressure, [&now] { return now; });
  addMany(queue, 1);
  ASSERT_TRUE(queue.take(soon(), [] {}));
  now += kSmall.softTime;  // the failure
  queue.disregardTime();
  queue.finish(1, 0);

  addMany(queue, kSmall.softRecords - 1);

  EXPECT_FALSE(backpressure.isHigh());
}

TEST(WriterQueueTest, HoldsFewerRecordsWhenWritingIsSlow) {
  Backpressure backpressure;
  WriterQueue::Time now = soon();
  WriterQueue queue(kSmall, backpressure, [&now] { return now; });
  addMany(queue, 4);
  ASSERT_TRUE(queue.take(soon(), [] {}));
  now += kSmall.softTime;  // the slow writing
  queue.finish(4, 0);

  // Four waiting records reach the soft limit, because the last four took longer to write than the
  // soft time.
  addMany(queue, 4);
  EXPECT_TRUE(backpressure.isHigh());
}

TEST(WriterQueueTest, GathersUntilManyWait) {
  Backpressure backpressure;
  WriterQueue queue(kSmall, backpressure);
  std::atomic<bool> taken{false};
  std::thread writer([&] {
    EXPECT_TRUE(queue.take(never(), [] {}));
    taken = true;
  });

  addMany(queue, 3);
  EXPECT_FALSE(taken);
  addMany(queue, 1);
  writer.join();
  EXPECT_TRUE(taken);
}

TEST(WriterQueueTest, EndsGatheringWhenItsTimeIsOver) {
  Backpressure backpressure;
  WriterQueue queue(kSmall, backpressure);
  addMany(queue, 1);
  const auto limit = std::chrono::steady_clock::now() + std::chrono::milliseconds(30);

  EXPECT_TRUE(queue.take(limit, [] {}));
  EXPECT_GE(std::chrono::steady_clock::now(), limit);
}

TEST(WriterQueueTest, ClosingLetsTheWriterFinishAndRefusesNewRecords) {
  Backpressure backpressure;
  WriterQueue queue(kSmall, backpressure);
  addMany(queue, 2);

  queue.close();
  EXPECT_FALSE(queue.add([] { FAIL() << "append ran although the queue is closed"; }));
  EXPECT_TRUE(queue.take(never(), [] {}));
  queue.finish(2, 0);
  EXPECT_FALSE(queue.take(never(), [] {}));
}

TEST(WriterQueueTest, ClosingFreesCallersThatWaitForRoom) {
  Backpressure backpressure;
  WriterQueue queue(kSmall, backpressure);
  addMany(queue, 16);
  std::thread caller([&] { EXPECT_FALSE(queue.add([] {})); });

  queue.close();
  caller.join();
}

TEST(WriterQueueTest, CountsRecordsThatManyThreadsAddAtOnce) {
  Backpressure backpressure;
  WriterQueue queue(kSmall, backpressure);
  constexpr std::uint64_t kEach = 2000;
  std::uint64_t inside = 0;  // guarded by the queue's lock
  std::vector<std::thread> callers;
  for (int caller = 0; caller < 4; ++caller) {
    callers.emplace_back([&] {
      for (std::uint64_t index = 0; index < kEach; ++index) {
        EXPECT_TRUE(queue.add([&] { ++inside; }));
      }
    });
  }
  std::uint64_t done = 0;
  while (done < 4 * kEach) {
    std::uint64_t batch = 0;
    ASSERT_TRUE(queue.take(soon(), [&] { batch = std::exchange(inside, 0); }));
    queue.finish(batch, batch);
    done += batch;
  }
  for (std::thread& caller : callers) caller.join();
  EXPECT_EQ(queue.waiting(), 0U);
}

}  // namespace
}  // namespace halvox::platform::linux_
