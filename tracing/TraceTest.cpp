#include "tracing/Trace.h"

#include <memory>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace halvox {
namespace {

using Pairs = std::vector<std::pair<std::string, std::uint64_t>>;

class TraceTest : public testing::Test {
 protected:
  void addInterval(const char* name, std::uint32_t begin) {
    trace_.addTraceDataToCollect(
        std::make_unique<TraceInterval>(name, TraceIntervalCodes{begin, begin + 1, false}));
  }
  void process(const TraceData::Events& events) {
    trace_.processTracepoints(platform_.ktrace.ktrace_session_create(), events);
  }
  static platform::trace_point event(std::uint32_t code, std::uint64_t tick) {
    return {.timestamp = tick, .debugid = code};
  }
  Pairs results() {
    const Trace::Results all = trace_.getResults();
    return {all.begin(), all.end()};
  }

  platform::FakePlatform platform_;
  Trace trace_{"T", Trace::Kind::kKernelTrace};
};

TEST_F(TraceTest, WithoutResultsItsResultsAreEmpty) {
  addInterval("a", 1);
  process({});

  EXPECT_TRUE(results().empty());
}

TEST_F(TraceTest, EveryMeasurementSeesAllEventsAndResultsAreByName) {
  addInterval("b", 10);
  addInterval("a", 20);
  process({event(10, 1), event(20, 2), event(11, 4), event(21, 9)});

  EXPECT_EQ(results(), (Pairs{{"a", 7}, {"b", 3}}));
}

TEST_F(TraceTest, MeasurementsOfOneNameFeedOneKeyInTheirOrder) {
  addInterval("same", 10);
  addInterval("same", 20);
  process({event(20, 1), event(21, 100), event(10, 200), event(11, 201), event(10, 300),
           event(11, 350)});

  EXPECT_EQ(results(), (Pairs{{"same", 1}, {"same", 50}, {"same", 99}}));
}

TEST_F(TraceTest, AskingTwiceGivesEveryResultTwice) {
  addInterval("a", 10);
  process({event(10, 1), event(11, 4)});
  results();

  EXPECT_EQ(results(), (Pairs{{"a", 3}, {"a", 3}}));
}

}  // namespace
}  // namespace halvox
