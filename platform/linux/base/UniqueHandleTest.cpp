#include "platform/linux/base/UniqueHandle.h"

#include <cerrno>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

std::vector<int>& released() {
  static std::vector<int> numbers;
  return numbers;
}

int releaseNumber(const int* number) {
  released().push_back(*number);
  return 0;
}

void makeNumber(const int** out) {
  static const int number = 7;
  *out = &number;
}

using Number = UniqueHandle<const int*, releaseNumber>;

class UniqueHandleTest : public ::testing::Test {
 protected:
  void SetUp() override { released().clear(); }
  const int one_ = 1;
  const int two_ = 2;
};

TEST_F(UniqueHandleTest, ReleasesWhatItHoldsOnce) {
  { const Number number(&one_); }

  EXPECT_EQ(released(), std::vector{1});
}

TEST_F(UniqueHandleTest, EmptyHandleReleasesNothing) {
  {
    const Number number;
    EXPECT_FALSE(number);
  }

  EXPECT_TRUE(released().empty());
}

TEST_F(UniqueHandleTest, MovingHandsTheHandleOver) {
  Number first(&one_);
  Number second(&two_);

  second = std::move(first);

  EXPECT_EQ(released(), std::vector{2});
  EXPECT_EQ(second.get(), &one_);
  EXPECT_FALSE(first);  // NOLINT(bugprone-use-after-move): what the test is about
}

TEST_F(UniqueHandleTest, MovingOntoItselfKeepsTheHandle) {
  Number number(&one_);
  Number& same = number;

  number = std::move(same);

  EXPECT_EQ(number.get(), &one_);
  EXPECT_TRUE(released().empty());
}

TEST_F(UniqueHandleTest, OutReleasesTheOldHandleAndTakesTheNew) {
  Number number(&one_);

  makeNumber(number.out());

  EXPECT_EQ(released(), std::vector{1});
  EXPECT_EQ(*number.get(), 7);
}

TEST_F(UniqueHandleTest, ReleaseGivesTheHandleUp) {
  Number number(&one_);

  EXPECT_EQ(number.release(), &one_);

  number.reset();
  EXPECT_TRUE(released().empty());
}

TEST_F(UniqueHandleTest, DescriptorIsClosed) {
  int raw = -1;
  {
    const UniqueFd fd(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    ASSERT_TRUE(fd);
    raw = fd.get();
  }

  EXPECT_EQ(::fcntl(raw, F_GETFD), -1);
  EXPECT_EQ(errno, EBADF);
}

}  // namespace
}  // namespace halvox::platform::linux_
