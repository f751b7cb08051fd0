#include "tools/Streams.h"

#include <algorithm>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tools/StoredEventsFixture.h"
#include "tools/StreamText.h"
#include "tools/TextTable.h"

namespace halvox::tools {
namespace {

using analysis::StreamEnd;
using analysis::StreamMoment;
using analysis::StreamStory;
using testing::HasSubstr;
using testing::Not;

class StreamsTest : public StoredEventsFixture {
 protected:
  void storeRun(const std::string& application, bool starts) {
    const std::string name = starts ? "Start" : "Stop";
    store("com.tarno.generic.Session_Playback." + name,
          {{"run", 1}, {"object_serial", 44}, {"HostApplicationDisplayID", application}});
  }
  ExitStatus list(ShowStreams request, OutputForm form = OutputForm::kText) {
    request.database = directory();
    return showStreams(request, form, out_, -1, errors_);
  }

  std::ostringstream out_;
  std::ostringstream errors_;
};

TEST_F(StreamsTest, ListsStreams) {
  storeRun("player", true);
  storeRun("player", false);

  EXPECT_EQ(list({}), ExitStatus::kDone);
  EXPECT_THAT(out_.str(), HasSubstr("player"));
  EXPECT_THAT(out_.str(), HasSubstr("playback"));
  EXPECT_THAT(out_.str(), HasSubstr("1.0s"));
}

TEST_F(StreamsTest, ANarrowTerminalHasTheStartTheApplicationAndTheXruns) {
  constexpr std::size_t kWidth = 40;
  StreamStory story;
  story.id = 1'204'000;
  story.application = "org.example.player-with-a-long-name";
  story.xruns.reports = 3;
  TextTable table(streamColumns());
  table.add(streamRow(story));

  table.print(out_, kWidth);

  EXPECT_THAT(out_.str(), HasSubstr("STARTED"));
  EXPECT_THAT(out_.str(), HasSubstr("org.ex"));
  std::istringstream lines(out_.str());
  for (std::string line; std::getline(lines, line);) EXPECT_LE(displayWidth(line), kWidth) << line;
}

TEST_F(StreamsTest, SelectsByApplication) {
  storeRun("player", true);
  storeRun("other", true);

  EXPECT_EQ(list({.applications = {"o*"}}), ExitStatus::kDone);
  EXPECT_THAT(out_.str(), HasSubstr("other"));
  EXPECT_THAT(out_.str(), Not(HasSubstr("player")));
}

TEST_F(StreamsTest, AStreamOfAServiceThatWasStartedAnewDoesNotRun) {
  // This process has the store open. The stored message is of one that started before the machine
  // did.
  store("com.tarno.generic.Session_Playback.Start", {{"run", 1},
                                                     {"object_serial", 44},
                                                     {"hvreporting_timestamp", 100.0},
                                                     {"systemuptime_sec", 50},
                                                     {"processuptime_ms", 100'000}});

  EXPECT_EQ(list({}, OutputForm::kJson), ExitStatus::kDone);
  EXPECT_THAT(out_.str(), HasSubstr("\"end\":\"service gone\""));
  EXPECT_THAT(out_.str(), HasSubstr("\"ended\":100"));
}

TEST_F(StreamsTest, ShowsTheMomentsOfOneStream) {
  storeRun("player", true);
  storeRun("player", false);
  EXPECT_EQ(list({}, OutputForm::kJson), ExitStatus::kDone);
  const std::string json = out_.str();
  const std::int64_t id = std::stoll(json.substr(json.find(':') + 1));

  out_.str("");
  EXPECT_EQ(showStream({.id = id, .database = directory()}, OutputForm::kText, out_, errors_),
            ExitStatus::kDone);
  EXPECT_THAT(out_.str(), HasSubstr("It starts.\n"));
  EXPECT_THAT(out_.str(), HasSubstr("It stops.\n"));
}

TEST_F(StreamsTest, SaysHowManyMomentsAreNotShown) {
  storeRun("player", true);
  EXPECT_EQ(list({}, OutputForm::kJson), ExitStatus::kDone);
  EXPECT_EQ(out_.str().find("moments_not_shown"), std::string::npos);
  const std::int64_t id = std::stoll(out_.str().substr(out_.str().find(':') + 1));
  const auto show = [&](OutputForm form, std::size_t most) {
    out_.str("");
    EXPECT_EQ(
        showStream({.id = id, .database = directory(), .mostMoments = most}, form, out_, errors_),
        ExitStatus::kDone);
    return out_.str();
  };

  const std::string all = show(OutputForm::kJson, 100);
  EXPECT_THAT(all, HasSubstr("\"moments_not_shown\":0}"));
  const auto moments = std::ranges::count(all, '\n') - 1;
  ASSERT_GT(moments, 2);
  // The first one and the end.
  const std::string some = show(OutputForm::kJson, 1);
  EXPECT_EQ(std::ranges::count(some, '\n'), 1 + 2);
  EXPECT_THAT(some, HasSubstr("\"moments_not_shown\":" + std::to_string(moments - 2) + "}"));
  EXPECT_THAT(show(OutputForm::kText, 1),
              HasSubstr(std::to_string(moments - 2) + " further moments are not shown.\n"));
}

TEST_F(StreamsTest, AnUnknownStreamIsAnError) {
  storeRun("player", true);

  EXPECT_EQ(showStream({.id = 99, .database = directory()}, OutputForm::kJson, out_, errors_),
            ExitStatus::kRefused);
  EXPECT_THAT(out_.str(), HasSubstr("\"kind\":\"refused\""));
  EXPECT_THAT(errors_.str(), HasSubstr("no stream or session has the ID 99"));
}

TEST(StreamTextTest, DurationsAreShort) {
  EXPECT_EQ(durationText(4.56), "4.6s");
  EXPECT_EQ(durationText(59.96), "1m00s");
  EXPECT_EQ(durationText(754), "12m34s");
  EXPECT_EQ(durationText(3723), "1h02m03s");
  EXPECT_EQ(durationText(-1), "0.0s");
}

TEST(StreamTextTest, ARowHasChangesInOrder) {
  StreamStory story;
  story.id = 7;
  story.application = "a\x1b[31m";
  story.ranSeconds = 6;
  story.volumes = {{.volume = 0.8, .seconds = 2}, {.volume = 0, .seconds = 3}};
  story.routes = {{.time = 1, .text = "A", .names = "a"},
                  {.time = 2, .text = "A", .names = "b"},
                  {.time = 3, .text = "B", .names = "c"}};
  story.routesNotKept = 4;
  story.xruns = {.reports = 2, .milliseconds = 469.3};
  story.end = StreamEnd::kClientGone;

  const std::vector<std::string> row = streamRow(story);
  EXPECT_EQ(row.size(), streamColumns().size());
  EXPECT_EQ(row[2], "a\\u001b[31m");
  EXPECT_EQ(row[5], "A → B → 4 more");
  EXPECT_EQ(row[7], "0.80 2.0s, muted 3.0s, unknown 1.0s");
  EXPECT_EQ(row[8], "-");
  EXPECT_EQ(row[9], "2 (469 ms)");
  EXPECT_EQ(row[10], "client gone");
}

TEST(StreamTextTest, ARowShowsTheFirstOfManyChanges) {
  StreamStory story;
  for (int number = 0; number < 20; ++number) {
    story.volumes.push_back({.volume = 0.01 * number, .seconds = 1});
    story.routes.push_back({.time = 0, .text = std::to_string(number), .names = {}});
  }
  story.otherVolumeSeconds = 5;
  story.ranSeconds = 25;
  story.routesNotKept = 3;

  const std::vector<std::string> row = streamRow(story);
  EXPECT_EQ(row[5], "0 → 1 → 2 → 3 → 4 → 5 → 6 → 7 → 15 more");
  EXPECT_EQ(row[7],
            "muted 1.0s, 0.01 1.0s, 0.02 1.0s, 0.03 1.0s, 0.04 1.0s, 0.05 1.0s, 0.06 1.0s, "
            "0.07 1.0s, others 17.0s");
  // The story has all.
  EXPECT_THAT(describeStream(story), HasSubstr("0.19 1.0s, others 5.0s.\n"));
}

TEST(StreamTextTest, JsonHasEveryMemberAndIsValidWhateverTheTexts) {
  StreamStory story;
  story.id = 7;
  story.sessionID = -1;
  story.application = "\xFF\"\x1B\u200B";
  story.started = 1;
  story.volumes = {{.volume = 0.5, .seconds = 2}};
  story.formats = {{.time = 1, .text = "F32LE", .names = {}}};
  story.routes = {{.time = 1, .text = "A", .names = "a"}};

  EXPECT_EQ(
      streamJson(story),
      R"({"id":7,"session_id":-1,"object_serial":null,"application":"�\"\u001B\u200b","service":"",)"
      R"("direction":"","started":1.0,"ended":null,"end":"still running","ran_seconds":0.0,)"
      R"("volumes":[{"volume":0.5,"seconds":2.0}],"other_volume_seconds":0.0,)"
      R"("unknown_volume_seconds":0.0,"formats":[{"time":1.0,"format":"F32LE"}],)"
      R"("routes":[{"time":1.0,"devices":"A","device_node_names":"a"}],)"
      R"("xruns":{"reports":0,"missed_cycles":0,"milliseconds":0.0,"as_culprit":0,"as_victim":0,)"
      R"("by_device":0},"messages":0})");
  EXPECT_THAT(streamJson(story, 3), HasSubstr(R"("messages":0,"moments_not_shown":3})"));

  StreamMoment moment;
  moment.kind = StreamMoment::Kind::kVolume;
  moment.playing = true;
  EXPECT_EQ(momentJson(moment),
            R"({"time":0.0,"moment":"volume","message_id":0,"volume":0.0,"playing":true})");
  moment.kind = StreamMoment::Kind::kXrun;
  EXPECT_EQ(momentJson(moment),
            R"({"time":0.0,"moment":"xrun","message_id":0,"milliseconds":0.0,"missed_cycles":0,)"
            R"("quantum":0,"rate":0,"role":"","device":"","late_node":"","late_process":"",)"
            R"("late_object_serial":null})");
}

TEST(StreamTextTest, SaysWhoWasLate) {
  StreamMoment moment;
  moment.kind = StreamMoment::Kind::kXrun;
  moment.xrun = {.milliseconds = 21.3,
                 .missedCycles = 1,
                 .quantum = 1024,
                 .rate = 48000,
                 .role = "victim",
                 .device = "hw0",
                 .lateNode = "browser",
                 .lateProcess = "web",
                 .lateObjectSerial = 9};

  EXPECT_EQ(describeMoment({}, moment),
            "It lost 21 ms in 1 cycle on hw0 (quantum 1024 at 48000 Hz): browser was late, of "
            "process web, object 9.");
  moment.xrun.role = "culprit";
  EXPECT_THAT(describeMoment({}, moment), HasSubstr(": this stream was late."));
}

}  // namespace
}  // namespace halvox::tools
