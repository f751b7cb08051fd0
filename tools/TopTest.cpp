#include "tools/Top.h"

#include <cstdlib>
#include <deque>
#include <fstream>
#include <sstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tools/StoredEventsFixture.h"
#include "tools/top/TopText.h"

namespace halvox::tools {
namespace {

using std::chrono::milliseconds;
using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

// Shows nothing, and plays a list of keys. When the list ends, the terminal is closed.
class FakeView final : public TopView {
 public:
  explicit FakeView(std::deque<TopKey> keys) : keys_(std::move(keys)) {}

  [[nodiscard]] TopSize size() const override { return {.columns = 80, .lines = 24}; }
  void draw(const std::vector<TopLine>& lines) override {
    std::string& screen = screens.emplace_back();
    for (const TopLine& line : lines) screen += line.text + "\n";
  }
  [[nodiscard]] TopKey wait(milliseconds time) override {
    waits.push_back(time);
    if (keys_.empty()) return {.kind = TopKey::Kind::kClosed};
    const TopKey key = keys_.front();
    keys_.pop_front();
    return key;
  }

  std::vector<std::string> screens;
  std::vector<milliseconds> waits;

 private:
  std::deque<TopKey> keys_;
};

TopKey key(char character) { return {.kind = TopKey::Kind::kCharacter, .character = character}; }

TEST(TopScreenTest, AKeyDrawsAtOnceAndReadsNothing) {
  FakeView view({key('r'), key('?')});
  int turns = 0;

  runTopScreen({.interval = std::chrono::hours(1)}, view, [&](TopModel&) { ++turns; });

  EXPECT_EQ(turns, 1);
  ASSERT_EQ(view.screens.size(), 4U);
  EXPECT_THAT(view.screens[0], HasSubstr("Reading"));
  EXPECT_THAT(view.screens[2], HasSubstr("sort: xruns, reversed"));
  EXPECT_THAT(view.screens[3], HasSubstr("reverse the order"));
}

TEST(TopScreenTest, APausedScreenReadsNothing) {
  FakeView view({key('p'), {}, {}, {}});
  int turns = 0;

  runTopScreen({.interval = milliseconds(0)}, view, [&](TopModel&) { ++turns; });

  EXPECT_EQ(turns, 1);
  EXPECT_THAT(view.screens.back(), HasSubstr("PAUSED"));
  EXPECT_GT(view.waits.back(), std::chrono::minutes(1));
}

TEST(TopScreenTest, ItEndsAfterTheCount) {
  FakeView view({{}, {}, {}, {}});
  int turns = 0;

  runTopScreen({.interval = milliseconds(0), .count = 2}, view, [&](TopModel&) { ++turns; });

  EXPECT_EQ(turns, 2);
}

TEST(TopTextTest, JsonHasNullForWhatIsNotKnown) {
  TopSnapshot snapshot;
  snapshot.time = 7;
  snapshot.streams.emplace_back().application = "a\x1b";

  EXPECT_EQ(batchJson(snapshot),
            R"({"time":7.0,"seconds":0.0,"service":{"connected":false,"problem":"",)"
            R"("uptime_seconds":null,"clients":null,"sessions":null,"messages_per_second":null,)"
            R"("stored_per_second":null,"waiting_jobs":null,"waiting_records":null,)"
            R"("store_bytes":null},"losses":[],"devices":[],"streams":[{"id":0,)"
            R"("session_id":null,"application":"a\u001B","service":"","direction":"",)"
            R"("devices":"","device_node_names":"","volume":null,"state":"open","started":0.0,)"
            R"("xruns_last_minute":0,"lost_milliseconds_last_minute":0.0,"xruns":0}]})");
}

class TopTest : public StoredEventsFixture {
 protected:
  ExitStatus show(ShowTop request, bool json = false) {
    request.database = directory();
    request.interval = milliseconds(1);
    CommonOptions options;
    options.json = json;
    return showTop(request, options, {input_, out_, errors_});
  }

  std::istringstream input_;
  std::ostringstream out_;
  std::ostringstream errors_;
};

TEST_F(TopTest, ANamedStoreIsShownWithoutAService) {
  store("com.tarno.generic.Session_Playback.Start",
        {{"run", 1}, {"object_serial", 44}, {"HostApplicationDisplayID", "player"}});

  EXPECT_EQ(show({.count = 1}), ExitStatus::kDone);
  EXPECT_THAT(out_.str(), AllOf(HasSubstr("player"), HasSubstr("running"),
                                HasSubstr("a store without its service")));
}

TEST_F(TopTest, EachBatchOfJsonIsOneLine) {
  EXPECT_EQ(show({.count = 3}, true), ExitStatus::kDone);

  const std::string text = out_.str();
  EXPECT_EQ(std::ranges::count(text, '\n'), 3);
  EXPECT_THAT(text, Not(HasSubstr("\n\n")));
}

TEST_F(TopTest, AMissingStoreIsReported) {
  ShowTop request;
  request.database = scratch_.path("nothing") + "/halvox.db";

  EXPECT_EQ(showTop(request, {}, {input_, out_, errors_}), ExitStatus::kNoService);
  EXPECT_THAT(errors_.str(), HasSubstr("halvoxctl top: "));
}

}  // namespace
}  // namespace halvox::tools
