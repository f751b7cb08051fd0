#include "client/MessageRing.h"

#include <algorithm>
#include <atomic>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

namespace halvox::client {
namespace {

constexpr std::size_t kPlentyOfBytes = std::size_t{1} << 30;

OutgoingMessage messageFor(ReporterID id, std::int64_t number = 0) {
  return {.recipients = id, .message = {{"number", number}}, .category = 4, .type = 1};
}

std::int64_t numberOf(const OutgoingMessage& message) {
  return message.message.find("number")->toInt64();
}

TEST(MessageRingTest, GivesMessagesBackInTheirOrder) {
  MessageRing ring(4, kPlentyOfBytes);

  for (int number = 0; number < 100; ++number) {
    ASSERT_TRUE(ring.tryPush(messageFor(7, number)));
    ASSERT_TRUE(ring.isReady());
    EXPECT_EQ(numberOf(ring.front()), number);
    ring.pop();
  }
  EXPECT_FALSE(ring.isReady());
  EXPECT_EQ(ring.tail(), 100U);
}

TEST(MessageRingTest, HoldsNoMoreItemsThanItsBoundEvenWhenThatIsNoPowerOfTwo) {
  MessageRing ring(5, kPlentyOfBytes);

  for (int number = 0; number < 5; ++number) EXPECT_TRUE(ring.tryPush(messageFor(7)));
  EXPECT_FALSE(ring.tryPush(messageFor(7)));
  ring.pop();

  EXPECT_TRUE(ring.tryPush(messageFor(7)));
  EXPECT_FALSE(ring.tryPush(messageFor(7)));
}

TEST(MessageRingTest, HoldsNoMoreBytesThanItsBound) {
  const std::size_t weight = messageFor(7).weight();
  MessageRing ring(100, 3 * weight);

  for (int number = 0; number < 3; ++number) EXPECT_TRUE(ring.tryPush(messageFor(7)));
  EXPECT_FALSE(ring.tryPush(messageFor(7)));
  ring.pop();

  EXPECT_TRUE(ring.tryPush(messageFor(7)));
}

TEST(MessageRingTest, LeavesARefusedMessageToItsOwner) {
  MessageRing ring(1, kPlentyOfBytes);
  ASSERT_TRUE(ring.tryPush(messageFor(7, 1)));

  OutgoingMessage refused = messageFor(7, 2);
  EXPECT_FALSE(ring.tryPush(std::move(refused)));

  EXPECT_EQ(numberOf(refused), 2);  // NOLINT(bugprone-use-after-move): not moved when refused
}

TEST(MessageRingTest, ListsOfRecipientsCountForTheBoundInBytes) {
  OutgoingMessage broad = messageFor(7);
  broad.recipients = std::vector<ReporterID>(1000, 7);

  EXPECT_GE(broad.weight(), 1000 * sizeof(ReporterID));
}

// Each producer numbers its messages; the consumer must see each producer's numbers rise without
// a gap, and all that was taken.
TEST(MessageRingTest, KeepsEachProducersOrderAndLosesNothingThatItTook) {
  constexpr int kProducers = 4;
  constexpr std::int64_t kTaken = 20'000;
  MessageRing ring(37, kPlentyOfBytes);
  std::vector<std::jthread> producers;
  producers.reserve(kProducers);
  for (int producer = 0; producer < kProducers; ++producer) {
    producers.emplace_back([&ring, producer] {
      for (std::int64_t number = 0; number < kTaken;) {
        if (ring.tryPush(messageFor(producer, number))) {
          ++number;
        } else {
          std::this_thread::yield();
        }
      }
    });
  }

  std::vector<std::int64_t> next(kProducers, 0);
  for (std::int64_t seen = 0; seen < kProducers * kTaken;) {
    if (!ring.isReady()) {
      std::this_thread::yield();
      continue;
    }
    const auto producer = std::get<ReporterID>(ring.front().recipients);
    ASSERT_EQ(numberOf(ring.front()), next[static_cast<std::size_t>(producer)]++);
    ring.pop();
    ++seen;
  }

  EXPECT_EQ(ring.tail(), static_cast<std::uint64_t>(kProducers * kTaken));
  EXPECT_FALSE(ring.isReady());
}

}  // namespace
}  // namespace halvox::client
