#include "session/FailureLog.h"

#include <chrono>
#include <optional>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace halvox {
namespace {

using namespace std::chrono_literals;

class FailureLogTest : public testing::Test {
 protected:
  platform::FakePlatform platform_;
  FailureLog failures_;
};

TEST_F(FailureLogTest, TheFirstFailureHasItsLineAtOnce) { EXPECT_EQ(failures_.note(), ""); }

TEST_F(FailureLogTest, FurtherFailuresOfTheSameSecondHaveNoLine) {
  EXPECT_EQ(failures_.note(), "");
  platform_.clock.advance(999ms);

  EXPECT_EQ(failures_.note(), std::nullopt);
}

TEST_F(FailureLogTest, TheNextLineSaysHowManyFailuresHadNone) {
  EXPECT_EQ(failures_.note(), "");
  for (int number = 0; number < 5; ++number) EXPECT_EQ(failures_.note(), std::nullopt);
  platform_.clock.advance(1s);

  EXPECT_EQ(failures_.note(), " (5 more since the previous line)");
  platform_.clock.advance(1s);
  EXPECT_EQ(failures_.note(), "");
}

}  // namespace
}  // namespace halvox
