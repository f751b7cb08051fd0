#include "platform/linux/connection/FrameBuffer.h"

#include <algorithm>
#include <array>
#include <string>
#include <variant>

#include <gtest/gtest.h>

#include "platform/linux/connection/wire/FrameWriter.h"

namespace halvox::platform::linux_ {
namespace {

using State = FrameBuffer::State;

std::string callWithText(std::size_t textBytes) {
  std::string bytes;
  const std::array arguments = {Value(std::string(textBytes, 'a'))};
  const dbus::CallTarget target{.destination = "", .path = "/a", .interface = "", .member = "m"};
  EXPECT_TRUE(dbus::appendMethodCall(bytes, 1, target, "s", arguments));
  return bytes;
}

class FrameBufferTest : public testing::Test {
 protected:
  // Simulates one read. Returns how many bytes it took.
  std::size_t arrive(std::string_view bytes) {
    const std::span<std::byte> room = buffer_.readInto(scratch_);
    const std::size_t count = std::min(room.size(), bytes.size());
    std::copy_n(reinterpret_cast<const std::byte*>(bytes.data()), count, room.data());
    buffer_.received(count);
    return count;
  }
  void arriveAll(std::string_view bytes) {
    while (!bytes.empty()) {
      bytes.remove_prefix(arrive(bytes));
      buffer_.settle();
    }
  }

  ReadScratch scratch_;
  FrameBuffer buffer_{1 * kMiB};
};

TEST_F(FrameBufferTest, FramesOfOneReadComeOneByOne) {
  const std::string frame = callWithText(10);
  arrive(frame + frame + frame.substr(0, 20));

  for (int count = 0; count < 2; ++count) {
    const FrameBuffer::Next next = buffer_.next();
    ASSERT_EQ(next.state, State::kFrame);
    EXPECT_EQ(next.totalBytes, frame.size());
    buffer_.consume(next.totalBytes);
  }
  EXPECT_EQ(buffer_.next().state, State::kPartial);
}

TEST_F(FrameBufferTest, RestOfAReadIsJoinedWithTheNext) {
  const std::string frame = callWithText(10);
  arrive(frame.substr(0, 20));
  buffer_.settle();
  arrive(frame.substr(20));

  EXPECT_EQ(buffer_.next().state, State::kFrame);
}

TEST_F(FrameBufferTest, FramesLeftOverSurviveTheUseOfTheScratchByOthers) {
  const std::string frame = callWithText(10);
  arrive(frame + frame);
  buffer_.consume(frame.size());
  buffer_.settle();
  std::fill(scratch_.bytes().begin(), scratch_.bytes().end(), std::byte{0xEE});

  const FrameBuffer::Next next = buffer_.next();
  ASSERT_EQ(next.state, State::kFrame);
  EXPECT_TRUE(std::holds_alternative<dbus::Frame>(dbus::readFrame(next.bytes)));
}

TEST_F(FrameBufferTest, FrameLargerThanAReadIsPutTogether) {
  const std::string frame = callWithText(500 * kKiB);
  arriveAll(frame + callWithText(5));

  const FrameBuffer::Next next = buffer_.next();
  ASSERT_EQ(next.state, State::kFrame);
  EXPECT_EQ(next.totalBytes, frame.size());
  EXPECT_TRUE(std::equal(next.bytes.begin(), next.bytes.end(),
                         reinterpret_cast<const std::byte*>(frame.data())));
}

TEST_F(FrameBufferTest, WhatFollowsALargeFrameIsNotLost) {
  const std::string large = callWithText(500 * kKiB);
  const std::string small = callWithText(5);
  const std::string bytes = large + small;
  std::string_view stream = bytes;
  while (buffer_.next().state != State::kFrame) {
    stream.remove_prefix(arrive(stream));
    buffer_.settle();
  }
  buffer_.consume(large.size());
  buffer_.settle();
  arriveAll(stream);

  EXPECT_EQ(buffer_.next().totalBytes, small.size());
}

TEST_F(FrameBufferTest, TooLargeFrameIsSkippedAsItComes) {
  const std::string frame = callWithText(2 * kMiB);
  std::string_view rest = frame;
  rest.remove_prefix(arrive(rest));
  const FrameBuffer::Next next = buffer_.next();
  ASSERT_EQ(next.state, State::kOversized);
  const std::vector<std::byte> header = FrameBuffer::withoutBody(next);
  EXPECT_TRUE(std::holds_alternative<dbus::Frame>(dbus::readFrame(header)));
  buffer_.consume(next.totalBytes);
  buffer_.settle();
  EXPECT_EQ(buffer_.next().state, State::kPartial);

  arriveAll(std::string(rest) + callWithText(5));

  EXPECT_EQ(buffer_.next().state, State::kFrame);
}

TEST_F(FrameBufferTest, NonsenseIsBroken) {
  arrive("nonsense nonsense nonsense");

  EXPECT_EQ(buffer_.next().state, State::kBroken);
  EXPECT_FALSE(buffer_.next().error.message.empty());
}

TEST_F(FrameBufferTest, AppendedFramesComeInOrder) {
  for (std::size_t size = 1; size <= 100; ++size) {
    const std::string frame = callWithText(size);
    buffer_.append(std::as_bytes(std::span(frame)));
    if (size % 3 == 0) buffer_.consume(buffer_.next().totalBytes);
  }

  for (std::size_t size = 34; size <= 100; ++size) {
    const FrameBuffer::Next next = buffer_.next();
    ASSERT_EQ(next.totalBytes, callWithText(size).size());
    buffer_.consume(next.totalBytes);
  }
  EXPECT_EQ(buffer_.next().state, State::kEmpty);
}

}  // namespace
}  // namespace halvox::platform::linux_
