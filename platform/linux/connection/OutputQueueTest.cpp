#include "platform/linux/connection/OutputQueue.h"

#include <array>
#include <string>

#include <gtest/gtest.h>
#include <sys/socket.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {
namespace {

class OutputQueueTest : public testing::Test {
 protected:
  void SetUp() override {
    std::array<int, 2> fds{};
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, fds.data()), 0);
    ours_.reset(fds[0]);
    theirs_.reset(fds[1]);
  }
  void append(const std::string& frame) {
    queue_.bytes() += frame;
    queue_.frameAppended();
  }
  OutputQueue::Flush flush() { return queue_.flush(ours_.get(), sentBytes_, droppedFrames_); }
  std::string read(std::size_t most) {
    std::string bytes(most, '\0');
    const ssize_t count = recv(theirs_.get(), bytes.data(), most, MSG_DONTWAIT);
    bytes.resize(count > 0 ? static_cast<std::size_t>(count) : 0);
    return bytes;
  }

  UniqueFd ours_;
  UniqueFd theirs_;
  OutputBufferPool pool_;
  OutputQueue queue_{pool_};
  std::size_t sentBytes_ = 0;
  std::size_t droppedFrames_ = 0;
};

TEST_F(OutputQueueTest, AllFramesLeaveWithOneFlush) {
  append("one");
  append("two");

  EXPECT_EQ(flush(), OutputQueue::Flush::kEmpty);

  EXPECT_EQ(read(100), "onetwo");
  EXPECT_EQ(sentBytes_, 6U);
  EXPECT_TRUE(queue_.isEmpty());
}

TEST_F(OutputQueueTest, FramesLeaveInOrderHoweverLittleIsTaken) {
  constexpr std::size_t kFrames = 2000;
  std::string expected;
  for (std::size_t frame = 0; frame < kFrames; ++frame) {
    const std::string bytes(1 + frame % 700, static_cast<char>('a' + frame % 26));
    append(bytes);
    expected += bytes;
  }
  std::string got;
  std::size_t left = kFrames;
  while (got.size() < expected.size()) {
    flush();
    EXPECT_LE(queue_.unsentFrames(), left);
    left = queue_.unsentFrames();
    got += read(3000);
  }

  EXPECT_EQ(got, expected);
  EXPECT_EQ(queue_.unsentFrames(), 0U);
}

TEST_F(OutputQueueTest, FrameCountsAsUnsentUntilItsLastByteIsTaken) {
  append(std::string(1000 * 1000, 'a'));

  EXPECT_EQ(flush(), OutputQueue::Flush::kBlocked);

  EXPECT_EQ(queue_.unsentFrames(), 1U);
  EXPECT_EQ(queue_.unsentBytes(), 1000U * 1000U - sentBytes_);
}

TEST_F(OutputQueueTest, AllIsDroppedWhenThePeerHasDisconnected) {
  append("one");
  append("two");
  theirs_.reset();

  EXPECT_EQ(flush(), OutputQueue::Flush::kPeerGone);

  EXPECT_EQ(droppedFrames_, 2U);
  EXPECT_TRUE(queue_.isEmpty());
}

}  // namespace
}  // namespace halvox::platform::linux_
