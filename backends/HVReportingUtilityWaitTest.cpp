#include <chrono>
#include <functional>
#include <limits>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "backends/HVReportingUtility.h"
#include "platform/fake/FakePlatform.h"

namespace halvox {
namespace {

using namespace std::chrono_literals;
using platform::FakeLogService;
using platform::LogLevel;

// Much longer than any step takes. Only a failing test waits for it.
constexpr double kLongTimeout = 60;

class HVReportingUtilityWaitTest : public testing::Test {
 protected:
  bool wait(double timeoutSeconds) {
    return HVReportingUtilityWait(condition_, timeoutSeconds, &flag_, "waiting for it",
                                  "it did not come", HVReportingSessionCategory());
  }
  // Waits until the text was logged `count` times. Returns false if that takes too long.
  bool awaitLines(std::string_view text, std::ptrdiff_t count) {
    const auto deadline = std::chrono::steady_clock::now() + 30s;
    while (std::chrono::steady_clock::now() < deadline) {
      const std::vector<std::string> texts = platform_.log.texts();
      if (std::count(texts.begin(), texts.end(), text) >= count) return true;
      std::this_thread::yield();
    }
    return false;
  }
  // Causes a spurious wake-up. Takes the lock first, because the waiter releases the lock only
  // while it waits.
  void wakeForNothing() {
    const std::lock_guard lock(condition_.mutex);
    condition_.condition.notify_one();
  }

  platform::FakePlatform platform_;
  HVReportingUtilityCondition condition_;
  bool flag_ = false;
};

TEST_F(HVReportingUtilityWaitTest, ASetFlagEndsTheWaitAtOnceAndSilently) {
  HVReportingUtilitySignal(condition_, &flag_);

  EXPECT_TRUE(wait(kLongTimeout));
  EXPECT_TRUE(platform_.log.lines().empty());
}

TEST_F(HVReportingUtilityWaitTest, ASignalEndsTheWait) {
  bool result = false;
  std::jthread waiter([this, &result] { result = wait(kLongTimeout); });
  ASSERT_TRUE(awaitLines("waiting for it", 1));

  HVReportingUtilitySignal(condition_, &flag_);
  waiter.join();

  EXPECT_TRUE(result);
  EXPECT_EQ(platform_.log.texts(LogLevel::kInfo).front(), "waiting for it");
  EXPECT_EQ(platform_.log.texts(LogLevel::kInfo).back(), "continuing");
  EXPECT_TRUE(platform_.log.lines(LogLevel::kError).empty());
}

TEST_F(HVReportingUtilityWaitTest, ATimeoutEndsTheWaitWithAnErrorLine) {
  EXPECT_FALSE(wait(0.01));
  EXPECT_EQ(platform_.log.texts(LogLevel::kInfo).front(), "waiting for it");
  EXPECT_EQ(platform_.log.texts(LogLevel::kError), std::vector<std::string>{"it did not come"});
  EXPECT_EQ(platform_.log.texts().back(), "it did not come");
}

TEST_F(HVReportingUtilityWaitTest, TheTimeoutIsWaitedFor) {
  const auto begin = std::chrono::steady_clock::now();

  EXPECT_FALSE(wait(0.05));

  EXPECT_GE(std::chrono::steady_clock::now() - begin, 50ms);
}

TEST_F(HVReportingUtilityWaitTest, TheLockIsFreeAfterwards) {
  EXPECT_FALSE(wait(0));
  EXPECT_TRUE(condition_.mutex.try_lock());
  condition_.mutex.unlock();

  HVReportingUtilitySignal(condition_, &flag_);
  EXPECT_TRUE(wait(0));
  EXPECT_TRUE(condition_.mutex.try_lock());
  condition_.mutex.unlock();
}

TEST_F(HVReportingUtilityWaitTest, AWakeUpWithoutTheFlagWaitsAgain) {
  bool result = false;
  std::jthread waiter([this, &result] { result = wait(kLongTimeout); });
  ASSERT_TRUE(awaitLines("waiting for it", 1));

  wakeForNothing();
  ASSERT_TRUE(awaitLines("waiting for it", 2));
  const std::vector<std::string> texts = platform_.log.texts();
  HVReportingUtilitySignal(condition_, &flag_);
  waiter.join();

  EXPECT_TRUE(result);
  EXPECT_EQ(texts[0], "waiting for it");
  EXPECT_EQ(texts[1], "continuing");
  EXPECT_EQ(texts[2], "waiting for it");
}

TEST_F(HVReportingUtilityWaitTest, EachWakeUpRestartsTheTimeout) {
  bool result = false;
  std::jthread waiter([this, &result] { result = wait(1.0); });
  const auto end = std::chrono::steady_clock::now() + 1.5s;

  while (std::chrono::steady_clock::now() < end) {
    wakeForNothing();
    std::this_thread::yield();
  }
  HVReportingUtilitySignal(condition_, &flag_);
  waiter.join();

  EXPECT_TRUE(result);
}

TEST_F(HVReportingUtilityWaitTest, ATimeoutThatIsNaNOrNegativeEndsAtOnce) {
  EXPECT_FALSE(wait(0));
  EXPECT_FALSE(wait(-5));
  EXPECT_FALSE(wait(std::numeric_limits<double>::quiet_NaN()));
}

TEST_F(HVReportingUtilityWaitTest, AnInfiniteTimeoutWaitsForTheSignal) {
  bool result = false;
  std::jthread waiter([this, &result] { result = wait(std::numeric_limits<double>::infinity()); });
  ASSERT_TRUE(awaitLines("waiting for it", 1));

  HVReportingUtilitySignal(condition_, &flag_);
  waiter.join();

  EXPECT_TRUE(result);
}

TEST_F(HVReportingUtilityWaitTest, LinesGoToTheCallersCategoryWithThePrefix) {
  EXPECT_FALSE(wait(0));

  const FakeLogService::Line line = platform_.log.lines(LogLevel::kError).front();
  EXPECT_EQ(line.category, "hvrr");
  EXPECT_TRUE(line.line.starts_with("       HVReportingUtility:")) << line.line;
}

TEST_F(HVReportingUtilityWaitTest, SignalSetsTheFlag) {
  HVReportingUtilitySignal(condition_, &flag_);

  EXPECT_TRUE(flag_);
}

}  // namespace
}  // namespace halvox
