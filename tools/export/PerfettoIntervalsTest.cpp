#include "tools/export/PerfettoIntervals.h"

#include <limits>
#include <string>

#include <gmock/gmock.h>

#include "tools/export/testing/PerfettoText.h"

namespace halvox::tools {
namespace {

using ::testing::ElementsAre;

TEST(PerfettoIntervalsTest, IntervalsFollowEachOtherUntilTheFileWasWritten) {
  std::string text;
  PerfettoTrace trace(text);
  constexpr double kNone = std::numeric_limits<double>::quiet_NaN();
  const TraceResults results{.values = {{"Empty", {}}, {"IOStart", {2e9, kNone, 1e9}}}};

  EXPECT_EQ(addIntervals(trace, results, PerfettoTrace::timeOf(100)), 2U);
  EXPECT_THAT(packetLines(text),
              ElementsAre("process 1000000 trace results",
                          "track 1 of 1000000: IOStart (lengths in order; times are not recorded)",
                          "1 begin 97 IOStart", "1 end 99", "1 begin 99 IOStart", "1 end 100"));
}

TEST(PerfettoIntervalsTest, WithoutIntervalsThereIsNoProcess) {
  std::string text;
  PerfettoTrace trace(text);
  EXPECT_EQ(addIntervals(trace, {.values = {{"Empty", {}}}}, PerfettoTrace::timeOf(100)), 0U);
  EXPECT_EQ(text, "");
}

}  // namespace
}  // namespace halvox::tools
