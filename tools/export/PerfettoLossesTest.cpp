#include "tools/export/PerfettoLosses.h"

#include <string>

#include <gmock/gmock.h>

#include "tools/export/testing/PerfettoText.h"

namespace halvox::tools {
namespace {

using ::testing::ElementsAre;

TEST(PerfettoLossesTest, ALossIsAnInstantOfTheService) {
  std::string text;
  PerfettoTrace trace(text);
  PerfettoLosses losses(trace);
  analysis::Record record;
  record.time = 100;
  record.name = "link local";
  record.reason = "dropped: disk full";
  record.number = 12;

  losses.add(record);
  EXPECT_EQ(text, "");
  record.kind = analysis::RecordKind::kLoss;
  losses.add(record);
  losses.add(record);

  EXPECT_THAT(packetLines(text),
              ElementsAre("process 1000001 halvox-reportingd",
                          "track 1 of 1000001: losses (at the time of recording)",
                          "1 instant 100 link local: dropped: disk full {count=12}",
                          "1 instant 100 link local: dropped: disk full {count=12}"));
}

}  // namespace
}  // namespace halvox::tools
