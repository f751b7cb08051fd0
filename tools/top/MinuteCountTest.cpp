#include "tools/top/MinuteCount.h"

#include <limits>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

TEST(MinuteCountTest, CountsWhatHappenedInTheLastMinute) {
  MinuteCount count;
  count.add(1000.2, 1, 5);
  count.add(1000.8, 2, 7);
  count.add(1030, 1, 1);

  EXPECT_EQ(count.total(1031).events, 4U);
  EXPECT_EQ(count.total(1031).amount, 13);
  EXPECT_EQ(count.total(1060).events, 1U);
  EXPECT_EQ(count.total(1090).events, 0U);
}

TEST(MinuteCountTest, AnOldEventDoesNotReplaceThoseOfALaterMinute) {
  MinuteCount count;
  count.add(1060, 3, 0);
  count.add(1000, 1, 0);

  EXPECT_EQ(count.total(1060).events, 3U);
}

TEST(MinuteCountTest, EventsOfTheFutureAreNotCounted) {
  MinuteCount count;
  count.add(1010, 1, 0);
  count.add(1000.9, 1, 0);

  EXPECT_EQ(count.total(1000).events, 1U);
}

TEST(MinuteCountTest, AnyTimeIsTaken) {
  MinuteCount count;
  for (const double time : {std::numeric_limits<double>::quiet_NaN(), -1e300, 1e300,
                            std::numeric_limits<double>::infinity()}) {
    count.add(time, 1, 0);
  }

  EXPECT_EQ(count.total(1000).events, 0U);
}

}  // namespace
}  // namespace halvox::tools
