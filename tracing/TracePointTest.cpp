#include "tracing/TracePoint.h"

#include <cmath>
#include <limits>

#include <gtest/gtest.h>

namespace halvox {
namespace {

constexpr std::uint32_t kCode = 0x21040005;

std::vector<std::uint64_t> valuesOf(std::int32_t argumentIndex) {
  TracePoint point("Level", kCode, argumentIndex);
  const platform::trace_point event{
      .arg1 = 11, .arg2 = 22, .arg3 = 33, .arg4 = 44, .debugid = kCode};
  const platform::trace_point other{.arg1 = 1, .debugid = kCode + 1};
  point.processTracepoints(nullptr, {event, other, event});
  return point.getResults();
}

TEST(TracePointTest, TakesTheArgumentOfEachEventWithItsCode) {
  using Values = std::vector<std::uint64_t>;
  EXPECT_EQ(valuesOf(1), (Values{11, 11}));
  EXPECT_EQ(valuesOf(2), (Values{22, 22}));
  EXPECT_EQ(valuesOf(3), (Values{33, 33}));
  EXPECT_EQ(valuesOf(4), (Values{44, 44}));
}

TEST(TracePointTest, AnyOtherArgumentFindsNothing) {
  for (const std::int32_t index : {0, 5, -1, std::numeric_limits<std::int32_t>::min()}) {
    EXPECT_TRUE(valuesOf(index).empty()) << index;
  }
}

TEST(TracePointTest, DoesNotCountWhatItFound) {
  TracePoint point("Level", kCode, 1);
  point.processTracepoints(nullptr, {{.arg1 = 5, .debugid = kCode}});

  EXPECT_TRUE(point.hasResults());
  EXPECT_EQ(point.getNumTimesTraced(), 0U);
  EXPECT_TRUE(std::isinf(point.getAverageResult()));
}

}  // namespace
}  // namespace halvox
