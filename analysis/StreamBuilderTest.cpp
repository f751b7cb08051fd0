#include "analysis/StreamBuilder.h"

#include "analysis/StreamBuilderFixture.h"

namespace halvox::analysis {
namespace {

using ::testing::SizeIs;

class StreamBuilderTest : public StreamBuilderFixture {};

TEST_F(StreamBuilderTest, TellsTheStoryOfAStream) {
  at(0).message(stream(), "Session_Setup", "Setup", R"("session_selected_format":"S16LE")");
  at(0).message(stream(), "RouteChange", "State",
                R"("active_devices":"Speakers","device_node_names":["hw0"])");
  start(1, stream());
  volume(1, stream(), 0.8, true);
  volume(3, stream(), 0.3, true);
  xrun(4, stream(), R"("xrun_milliseconds":21.5,"missed_cycles":2,"xrun_role":"culprit")");
  volume(6, stream(), 0.3, false);
  stop(6, stream());
  records.summary(stream());

  const StreamStory& made = story();
  EXPECT_EQ(made.id, 1);
  EXPECT_EQ(made.sessionID, 5044);
  EXPECT_EQ(made.objectSerial, 44);
  EXPECT_EQ(made.application, "player");
  EXPECT_EQ(made.service, "longformaudio");
  EXPECT_EQ(made.direction, StreamDirection::kPlayback);
  EXPECT_EQ(made.started, kBegin);
  EXPECT_EQ(made.ended, kBegin + 6);
  EXPECT_EQ(made.end, StreamEnd::kStopped);
  EXPECT_DOUBLE_EQ(made.ranSeconds, 5);
  ASSERT_THAT(made.volumes, SizeIs(2));
  EXPECT_DOUBLE_EQ(made.volumes[0].seconds, 2);
  EXPECT_DOUBLE_EQ(made.volumes[1].seconds, 3);
  ASSERT_THAT(made.formats, SizeIs(1));
  EXPECT_EQ(made.formats[0].text, "S16LE");
  ASSERT_THAT(made.routes, SizeIs(1));
  EXPECT_EQ(made.routes[0].names, "hw0");
  EXPECT_EQ(made.xruns.reports, 1U);
  EXPECT_EQ(made.xruns.missedCycles, 2U);
  EXPECT_DOUBLE_EQ(made.xruns.milliseconds, 21.5);
  EXPECT_EQ(made.xruns.asCulprit, 1U);
  EXPECT_EQ(made.messages, 8U);
}

}  // namespace
}  // namespace halvox::analysis
