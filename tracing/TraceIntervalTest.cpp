#include "tracing/TraceInterval.h"

#include <cmath>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace halvox {
namespace {

using platform::LogLevel;
using platform::trace_point;
using Texts = std::vector<std::string>;
using Values = std::vector<std::uint64_t>;

constexpr std::uint32_t kBegin = 0x21040001;
constexpr std::uint32_t kEnd = 0x21040002;
constexpr std::uint64_t kThreadA = 1;
constexpr std::uint64_t kThreadB = 2;

trace_point event(std::uint32_t code, std::uint64_t tick, std::uint64_t thread = kThreadA) {
  return {.timestamp = tick, .threadid = thread, .debugid = code};
}

class TraceIntervalTest : public testing::Test {
 protected:
  Values sameThread(const TraceData::Events& events) {
    TraceInterval interval("IO", {kBegin, kEnd, true});
    interval.processTracepoints(session_, events);
    EXPECT_EQ(interval.getNumTimesTraced(), interval.getResults().size());
    return interval.getResults();
  }
  Values anyThread(const TraceData::Events& events) {
    TraceInterval interval("IO", {kBegin, kEnd, false});
    interval.processTracepoints(session_, events);
    EXPECT_EQ(interval.getNumTimesTraced(), interval.getResults().size());
    return interval.getResults();
  }
  static std::string starts(int count) {
    return "DISCARDED " + std::to_string(count) +
           " trace Start points for interval IO because no stop points found";
  }
  // The line about stops prints the number of starts, however many stops there are.
  static std::string stops(int startCount) {
    return "DISCARDED " + std::to_string(startCount) +
           " trace Stop points for interval IO because no start points found";
  }

  platform::FakePlatform platform_;
  platform::KtraceService::Session session_ = platform_.ktrace.ktrace_session_create();
};

// --- Same thread --------------------------------------------------------------------------------

TEST_F(TraceIntervalTest, SameThreadMeasuresFromTheNewerOfTwoStarts) {
  EXPECT_EQ(sameThread({event(kBegin, 10), event(kBegin, 20), event(kEnd, 25)}), Values{5});
  EXPECT_EQ(platform_.log.texts(LogLevel::kDebug), Texts{starts(1)});
}

TEST_F(TraceIntervalTest, SameThreadDoesNotPairEventsOfTwoThreads) {
  EXPECT_TRUE(sameThread({event(kBegin, 10, kThreadA), event(kEnd, 25, kThreadB)}).empty());
  EXPECT_EQ(platform_.log.texts(LogLevel::kDebug), Texts{stops(0)});
}

TEST_F(TraceIntervalTest, SameThreadMeasuresEachThreadByItself) {
  EXPECT_EQ(sameThread({event(kBegin, 10, kThreadA), event(kBegin, 11, kThreadB),
                        event(kEnd, 15, kThreadB), event(kEnd, 30, kThreadA)}),
            (Values{4, 20}));
  EXPECT_TRUE(platform_.log.lines().empty());
}

TEST_F(TraceIntervalTest, SameThreadUsesAStartOnce) {
  EXPECT_EQ(sameThread({event(kBegin, 10), event(kEnd, 20), event(kEnd, 30)}), Values{10});
  EXPECT_EQ(platform_.log.texts(LogLevel::kDebug), Texts{stops(0)});
}

TEST_F(TraceIntervalTest, SameThreadTakesAStartAtTickZero) {
  EXPECT_EQ(sameThread({event(kBegin, 0), event(kEnd, 5)}), Values{5});
}

TEST_F(TraceIntervalTest, SameThreadDropsAnOpenStartAtTheEndWithoutAWord) {
  EXPECT_TRUE(sameThread({event(kBegin, 10)}).empty());
  EXPECT_TRUE(platform_.log.lines().empty());
}

TEST_F(TraceIntervalTest, SameThreadLineAboutStopsShowsTheNumberOfStarts) {
  sameThread({event(kEnd, 1), event(kEnd, 2), event(kBegin, 3), event(kBegin, 4)});

  EXPECT_EQ(platform_.log.texts(LogLevel::kDebug), (Texts{starts(1), stops(1)}));
}

// --- Any thread ---------------------------------------------------------------------------------

TEST_F(TraceIntervalTest, AnyThreadPairsEventsOfTwoThreads) {
  EXPECT_EQ(anyThread({event(kBegin, 10, kThreadA), event(kEnd, 25, kThreadB)}), Values{15});
}

TEST_F(TraceIntervalTest, AnyThreadUsesAStartOnce) {
  EXPECT_EQ(anyThread({event(kBegin, 10), event(kEnd, 20), event(kEnd, 30)}), Values{10});
  EXPECT_EQ(platform_.log.texts(LogLevel::kDefault), Texts{stops(0)});
}

TEST_F(TraceIntervalTest, AnyThreadMeasuresFromTheNewerOfTwoStarts) {
  EXPECT_EQ(anyThread({event(kBegin, 10), event(kBegin, 20, kThreadB), event(kEnd, 25)}),
            Values{5});
  EXPECT_EQ(platform_.log.texts(LogLevel::kDefault), Texts{starts(1)});
}

TEST_F(TraceIntervalTest, AnyThreadTreatsAStartAtTickZeroAsNone) {
  EXPECT_TRUE(anyThread({event(kBegin, 0), event(kEnd, 5)}).empty());
  EXPECT_EQ(platform_.log.texts(LogLevel::kDefault), Texts{stops(0)});
}

TEST_F(TraceIntervalTest, AnyThreadLeavesThePendingStartAtOtherEvents) {
  EXPECT_EQ(anyThread({event(kBegin, 10), event(0x21040003, 12), event(kEnd, 15)}), Values{5});
}

// --- Both ---------------------------------------------------------------------------------------

TEST_F(TraceIntervalTest, CodeThatIsBeginAndEndOnlyBegins) {
  for (const bool byThread : {true, false}) {
    TraceInterval interval("IO", {kBegin, kBegin, byThread});
    interval.processTracepoints(session_, {event(kBegin, 10), event(kBegin, 20)});
    EXPECT_FALSE(interval.hasResults());
  }
  EXPECT_EQ(platform_.log.texts(LogLevel::kDebug), Texts{starts(1)});
  EXPECT_EQ(platform_.log.texts(LogLevel::kDefault), Texts{starts(1)});
}

TEST_F(TraceIntervalTest, NoEventsDoNothingAndLogNothing) {
  EXPECT_TRUE(sameThread({}).empty());
  EXPECT_TRUE(anyThread({}).empty());
  EXPECT_TRUE(platform_.log.lines().empty());
}

TEST_F(TraceIntervalTest, CodesAreComparedWhole) {
  EXPECT_TRUE(anyThread({event(kBegin | 0x80000000, 10), event(kEnd, 20)}).empty());
}

TEST_F(TraceIntervalTest, TicksAreConvertedBeforeTheyAreSubtracted) {
  platform_.ktrace.setNanosecondsPerTick(125);

  EXPECT_EQ(anyThread({event(kBegin, 10), event(kEnd, 14)}), Values{500});
}

// 10 and 14 ticks are 416 and 583 whole nanoseconds, but 4 ticks are 166.
TEST_F(TraceIntervalTest, EachTickIsConvertedByItself) {
  platform_.ktrace.setTimebase(125, 3);

  EXPECT_EQ(anyThread({event(kBegin, 10), event(kEnd, 14)}), Values{167});
  EXPECT_EQ(sameThread({event(kBegin, 10), event(kEnd, 14)}), Values{167});
}

TEST_F(TraceIntervalTest, EndBeforeItsStartWrapsAround) {
  EXPECT_EQ(anyThread({event(kBegin, 10), event(kEnd, 9)}), Values{UINT64_MAX});
}

TEST_F(TraceIntervalTest, ResultsAddUpOverPassesAndStartsDoNot) {
  TraceInterval interval("IO", {kBegin, kEnd, false});
  interval.processTracepoints(session_, {event(kBegin, 1), event(kEnd, 3), event(kBegin, 5)});
  interval.processTracepoints(session_, {event(kEnd, 7), event(kBegin, 10), event(kEnd, 13)});

  EXPECT_EQ(interval.getResults(), (Values{2, 3}));
  EXPECT_EQ(interval.getNumTimesTraced(), 2U);
}

TEST_F(TraceIntervalTest, LinesGoToTheTracesCategoryUnderTheIntervalsName) {
  anyThread({event(kEnd, 1)});
  sameThread({event(kEnd, 1)});

  for (const auto& line : platform_.log.lines()) {
    EXPECT_EQ(line.category, "hvrt");
    EXPECT_EQ(line.line.substr(0, 26), "            TraceInterval:");
  }
  EXPECT_EQ(platform_.log.lines().size(), 2U);
}

TEST_F(TraceIntervalTest, AverageIsTakenInSinglePrecision) {
  TraceInterval interval("IO", {kBegin, kEnd, false});
  interval.processTracepoints(
      session_, {event(kBegin, 1), event(kEnd, 16777218), event(kBegin, 1), event(kEnd, 2)});

  // Neither 16777217 nor its sum with 1 can be represented in single precision.
  EXPECT_EQ(interval.getAverageResult(), 8388608.0F);
}

TEST_F(TraceIntervalTest, AverageWithoutResultsIsNotANumber) {
  EXPECT_TRUE(std::isnan(TraceInterval("IO", {kBegin, kEnd, false}).getAverageResult()));
}

}  // namespace
}  // namespace halvox
