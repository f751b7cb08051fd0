#pragma once

#include <string>
#include <vector>

#include "analysis/StreamBuilder.h"
#include "analysis/testing/RecordSeries.h"
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox::analysis {

// A fixture that makes stories of records. Its times are seconds after `kBegin`.
class StreamBuilderFixture : public testing::Test {
 protected:
  static constexpr double kBegin = 1'000'000;

  // A PipeWire stream and a session of another client.
  static RecordSeries::Sender stream(std::int64_t serial = 44,
                                     const std::string& application = "player") {
    return {.application = application, .sessionID = 5000 + serial, .serial = serial};
  }
  static RecordSeries::Sender session(std::int64_t sessionID = 7) {
    return {.sessionID = sessionID};
  }

  RecordSeries& at(double seconds) { return records.at(kBegin + seconds); }
  void start(double seconds, const RecordSeries::Sender& sender, int run = 1) {
    at(seconds).message(sender, "Session_Playback", "Start", "\"run\":" + std::to_string(run));
  }
  void stop(double seconds, const RecordSeries::Sender& sender, int run = 1) {
    at(seconds).message(sender, "Session_Playback", "Stop", "\"run\":" + std::to_string(run));
  }
  void volume(double seconds, const RecordSeries::Sender& sender, double volume, bool playing) {
    at(seconds).message(sender, "Volume", "State",
                        "\"RQSessionVolume\":" + std::to_string(volume) +
                            ",\"RQSessionVolumePlayingState\":" + (playing ? "1" : "0"));
  }
  void xrun(double seconds, const RecordSeries::Sender& sender, const std::string& members) {
    at(seconds).message(sender, "Session_Playback", "IssueDetector",
                        "\"issue_type\":\"xrun\"" + (members.empty() ? "" : "," + members));
  }

  // Makes the stories of all records so far.
  void build(const StreamBuilder::Finish& finish = {}) {
    StreamBuilder builder([this](const StreamStory& story) { stories.push_back(story); },
                          [this](const StreamStory& story, const StreamMoment& moment) {
                            moments.push_back({story.id, moment});
                          });
    EXPECT_TRUE(records.forEach({}, [&](const Record& record) { builder.add(record); }));
    builder.finish(finish);
  }
  // The only story. The first call makes it.
  const StreamStory& story() {
    if (stories.empty()) build();
    EXPECT_EQ(stories.size(), 1U);
    if (stories.empty()) stories.emplace_back();
    return stories.front();
  }

  struct Told {
    std::int64_t story;
    StreamMoment moment;
  };
  RecordSeries records;
  std::vector<StreamStory> stories;
  std::vector<Told> moments;
};

}  // namespace halvox::analysis
