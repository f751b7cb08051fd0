#include "client/FrameRing.h"

#include <atomic>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/ValueDecoder.h"

namespace halvox::client {
namespace {

namespace dbus = platform::linux_::dbus;

constexpr std::size_t kPlentyOfBytes = std::size_t{1} << 26;

EncodeOutcome push(FrameRing& ring, const Dictionary& message, ReporterID id = 7) {
  return ring.tryPush(MessageView{std::span(&id, 1), message, 4, 1});
}
bool pushNumber(FrameRing& ring, std::int64_t number, ReporterID id = 7) {
  return push(ring, {{"number", number}}, id) == EncodeOutcome::kDone;
}

// Returns the arguments of the oldest frame, as the service decodes them.
std::vector<Value> takeArguments(FrameRing& ring) {
  if (!ring.isReady()) return {};
  const FrameRing::FrameNumber taken = ring.take();
  std::string frame(kMessageHeaderBytes + ring.bytesOf(taken), '\0');
  putMessageHeader(frame.data(), ring.bytesOf(taken));
  ring.copy(taken, frame.data() + kMessageHeaderBytes);
  ring.drop(taken);
  setSerial(frame.data(), 1);
  const auto read = dbus::readFrame(std::as_bytes(std::span(frame)));
  std::vector<Value> arguments;
  const auto* valid = std::get_if<dbus::Frame>(&read);
  if (valid == nullptr || dbus::decodeBody(*valid, "a{sv}uqaax", arguments)) return {};
  return arguments;
}
std::int64_t takeNumber(FrameRing& ring) {
  const auto arguments = takeArguments(ring);
  return arguments.empty() ? -1 : arguments[0].dictionary().find("number")->toInt64();
}

TEST(FrameRingTest, GivesMessagesBackInTheirOrder) {
  FrameRing ring(4, kPlentyOfBytes);

  for (int number = 0; number < 100; ++number) {
    ASSERT_TRUE(pushNumber(ring, number));
    ASSERT_TRUE(ring.isReady());
    EXPECT_EQ(takeNumber(ring), number);
    ring.release();
  }
  EXPECT_FALSE(ring.isReady());
  EXPECT_EQ(ring.tail(), 100U);
}

TEST(FrameRingTest, HoldsNoMoreFramesThanItsBoundEvenWhenThatIsNoPowerOfTwo) {
  FrameRing ring(5, kPlentyOfBytes);

  for (int number = 0; number < 5; ++number) EXPECT_TRUE(pushNumber(ring, number));
  EXPECT_FALSE(pushNumber(ring, 5));
  takeNumber(ring);
  EXPECT_FALSE(pushNumber(ring, 5));  // the cells are free only after release()
  ring.release();

  EXPECT_TRUE(pushNumber(ring, 5));
  EXPECT_FALSE(pushNumber(ring, 6));
}

TEST(FrameRingTest, HoldsNoMoreBytesThanItsBound) {
  const Dictionary large{{"text", std::string(10'000, 'x')}};
  FrameRing ring(100, 35'000);

  for (int number = 0; number < 3; ++number) EXPECT_EQ(push(ring, large), EncodeOutcome::kDone);
  EXPECT_EQ(push(ring, large), EncodeOutcome::kNoRoom);
  takeArguments(ring);
  ring.release();

  EXPECT_EQ(push(ring, large), EncodeOutcome::kDone);
}

TEST(FrameRingTest, AFrameThatFitsAloneTakesNothingWhenItIsRefused) {
  const Dictionary large{{"text", std::string(20'000, 'x')}};
  FrameRing ring(100, 30'000);
  ASSERT_EQ(push(ring, large), EncodeOutcome::kDone);

  for (int number = 0; number < 100; ++number) {
    ASSERT_EQ(push(ring, large), EncodeOutcome::kNoRoom);
  }

  EXPECT_TRUE(pushNumber(ring, 1));
  EXPECT_EQ(ring.tail(), 2U);
}

TEST(FrameRingTest, AMessageLargerThanTheRingIsRefused) {
  FrameRing ring(100, 4096);

  EXPECT_EQ(push(ring, {{"text", std::string(5000, 'x')}}), EncodeOutcome::kNoRoom);
  EXPECT_TRUE(pushNumber(ring, 1));
}

TEST(FrameRingTest, WithoutAnyBytesItTakesNothing) {
  FrameRing ring(100, 0);

  EXPECT_FALSE(pushNumber(ring, 1));
}

TEST(FrameRingTest, AMessageWithoutFormOnTheWireChangesNothing) {
  FrameRing ring(1, kPlentyOfBytes);

  EXPECT_EQ(push(ring, {{"n", Value()}}), EncodeOutcome::kNoWireForm);

  EXPECT_EQ(ring.tail(), 0U);
  EXPECT_TRUE(pushNumber(ring, 1));
}

TEST(FrameRingTest, FramesOfManySizesComeOutAsTheyWere) {
  FrameRing ring(64, kPlentyOfBytes);

  for (std::size_t size = 0; size < 5000; size += 61) {
    const Dictionary message{{"text", std::string(size, 'x')}, {"after", std::uint8_t{7}}};
    ASSERT_EQ(push(ring, message, -5), EncodeOutcome::kDone);
    const auto arguments = takeArguments(ring);
    ring.release();
    using platform::Array;
    EXPECT_EQ(arguments, (std::vector<Value>{message, 4, 1, Array{Value(Array{-5})}}));
  }
}

TEST(FrameRingTest, FramesDroppedWithoutACopyAreGone) {
  FrameRing ring(2, 4096);
  ASSERT_TRUE(pushNumber(ring, 1));
  ASSERT_TRUE(pushNumber(ring, 2));

  ASSERT_TRUE(ring.isReady());
  ring.drop(ring.take());
  ring.release();

  EXPECT_EQ(takeNumber(ring), 2);
}

TEST(FrameRingTest, ATakenFrameKeepsItsBytesAndItsPlaceUntilItIsDropped) {
  const auto text = [](char filling) { return Dictionary{{"text", std::string(700, filling)}}; };
  FrameRing ring(3, kPlentyOfBytes);
  for (const char filling : {'a', 'b', 'c'})
    ASSERT_EQ(push(ring, text(filling)), EncodeOutcome::kDone);
  ASSERT_TRUE(ring.isReady());
  const FrameRing::FrameNumber first = ring.take();
  const FrameRing::FrameNumber second = ring.take();
  std::string bytes(ring.bytesOf(first), '\0');
  ring.copy(first, bytes.data());

  ring.release();
  EXPECT_EQ(push(ring, text('d')), EncodeOutcome::kNoRoom);  // no frame was dropped
  ring.drop(second);
  ring.release();
  EXPECT_EQ(push(ring, text('d')), EncodeOutcome::kDone);  // uses the cells of the second frame

  std::string again(bytes.size(), '\0');
  ring.copy(first, again.data());
  EXPECT_EQ(again, bytes);
  EXPECT_NE(bytes.find(std::string(700, 'a')), std::string::npos);
  EXPECT_EQ(ring.tail(), 4U);
}

// The consumer takes all frames as one list. Frames that are published after that come after this
// list.
TEST(FrameRingTest, FramesThatComeWhileOthersAreTakenComeOutAfterThem) {
  FrameRing ring(100, kPlentyOfBytes);
  for (int number = 0; number < 3; ++number) ASSERT_TRUE(pushNumber(ring, number));
  EXPECT_EQ(takeNumber(ring), 0);
  for (int number = 3; number < 6; ++number) ASSERT_TRUE(pushNumber(ring, number));
  ring.release();

  for (int number = 1; number < 6; ++number) EXPECT_EQ(takeNumber(ring), number);

  EXPECT_FALSE(ring.isReady());
  EXPECT_EQ(ring.head(), 6U);
  EXPECT_EQ(ring.tail(), 6U);
}

// Each producer numbers its messages, and some messages take several cells. The consumer must see
// the numbers of each producer rise without a gap, and every frame must be complete.
TEST(FrameRingTest, KeepsEachProducersOrderAndLosesNothingThatItTook) {
  constexpr int kProducers = 4;
  constexpr std::int64_t kTaken = 10'000;
  FrameRing ring(37, 20'000);
  std::vector<std::jthread> producers;
  producers.reserve(kProducers);
  for (int producer = 0; producer < kProducers; ++producer) {
    producers.emplace_back([&ring, producer] {
      for (std::int64_t number = 0; number < kTaken;) {
        const std::string text(static_cast<std::size_t>(number * 7 % 2500), 'x');
        if (push(ring, {{"number", number}, {"text", text}}, producer) == EncodeOutcome::kDone) {
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
      ring.release();
      std::this_thread::yield();
      continue;
    }
    const auto arguments = takeArguments(ring);
    ASSERT_EQ(arguments.size(), 4U);
    const Dictionary message = arguments[0].dictionary();
    const auto producer = arguments[3].array()[0].array()[0].toInt64();
    const std::int64_t number = next[static_cast<std::size_t>(producer)]++;
    ASSERT_EQ(message.find("number")->toInt64(), number);
    ASSERT_EQ(message.find("text")->string().size(), static_cast<std::size_t>(number * 7 % 2500));
    ++seen;
  }

  EXPECT_EQ(ring.tail(), static_cast<std::uint64_t>(kProducers * kTaken));
  EXPECT_FALSE(ring.isReady());
}

}  // namespace
}  // namespace halvox::client
