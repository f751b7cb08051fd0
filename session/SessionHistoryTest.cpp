#include "session/SessionHistory.h"

#include <memory>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace halvox {
namespace {

using platform::Dictionary;
using Outcome = SessionHistory::Outcome;

constexpr auto kPlayback = AudioEventCategory::kPlayback;
constexpr auto kStart = AudioEventType::kStart;

class SessionHistoryTest : public testing::Test {
 protected:
  SessionHistoryTest() { held_.chargeTo(account_); }

  platform::FakePlatform platform_;
  const std::shared_ptr<ResourceAccount> account_ = std::make_shared<ResourceAccount>();
  ResourceTally held_;
  SessionHistory history_{ReporterID{7}, held_};
};

TEST_F(SessionHistoryTest, OutsideARunRecordsNothing) {
  EXPECT_EQ(history_.record(kPlayback, kStart, Dictionary{{"a", 1}}), Outcome::kNotStarted);
  EXPECT_EQ(history_.record(kPlayback, kStart, Dictionary{{"a", 1}}), Outcome::kNotStarted);

  EXPECT_EQ(history_.size(), 0U);
  EXPECT_FALSE(history_.lock()->has_value());
  EXPECT_FALSE(history_.end().has_value());
}

TEST_F(SessionHistoryTest, RepetitionInARunIsRedundant) {
  history_.begin();

  EXPECT_EQ(history_.record(kPlayback, kStart, Dictionary{{"a", 1}}), Outcome::kRecorded);
  EXPECT_EQ(history_.record(kPlayback, kStart, Dictionary{{"a", 1}}), Outcome::kRedundant);

  EXPECT_EQ(history_.size(), 1U);
}

TEST_F(SessionHistoryTest, ARepetitionIsKnownWithoutAHistory) {
  const Dictionary first{{"a", 1}, {"processuptime_ms", 1}};
  const Dictionary again{{"a", 1}, {"processuptime_ms", 2}};
  const Dictionary other{{"a", 2}, {"processuptime_ms", 1}};

  EXPECT_TRUE(SessionHistory::isRedundant(&first, kPlayback, kStart, again));
  EXPECT_FALSE(SessionHistory::isRedundant(&first, kPlayback, kStart, other));
  EXPECT_FALSE(SessionHistory::isRedundant(nullptr, kPlayback, kStart, again));
  EXPECT_FALSE(SessionHistory::isRedundant(&first, AudioEventCategory::kError, kStart, again));
  EXPECT_FALSE(SessionHistory::isRedundant(&first, kPlayback, AudioEventType::kError, again));
}

TEST_F(SessionHistoryTest, EndReturnsTheHistoryAndItsCharge) {
  history_.begin();
  history_.record(kPlayback, kStart, Dictionary{{"a", 1}});
  EXPECT_GT(account_->use().bytes, 0U);

  const auto ended = history_.end();

  ASSERT_TRUE(ended.has_value());
  EXPECT_EQ(ended->size(), 1U);
  EXPECT_EQ(history_.size(), 0U);
  EXPECT_EQ(account_->use().bytes, 0U);
}

}  // namespace
}  // namespace halvox
