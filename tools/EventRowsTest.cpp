#include "tools/EventRows.h"

#include <algorithm>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

using platform::linux_::RecordOrder;
using platform::linux_::StoredEvent;

constexpr const char* kFirst = "com.tarno.halvox.Playback.Start";
constexpr const char* kSecond = "com.tarno.music.Playback.Start";

// The numbers of the events that are shown.
class EventRowsTest : public testing::Test {
 protected:
  void add(std::int64_t id, const char* name, const char* payload = "{}") {
    rows_.add({id, 0, name, payload});
  }
  void reverse() {
    rows_ = EventRows(RecordOrder::kNewestFirst, [this](const auto& event) { note(event); });
  }
  void note(const StoredEvent& event) { shown_ += std::to_string(event.id); }

  std::string shown_;
  EventRows rows_{RecordOrder::kOldestFirst, [this](const auto& event) { note(event); }};
};

TEST_F(EventRowsTest, ShowsTheSecondNameOfEachMessage) {
  add(1, kFirst);
  add(2, kSecond);
  add(3, kFirst);
  add(4, kSecond);
  rows_.flush();

  EXPECT_EQ(shown_, "24");
}

TEST_F(EventRowsTest, ShowsTheSecondNameInTheOppositeOrderToo) {
  reverse();
  add(4, kSecond);
  add(3, kFirst);
  add(2, kSecond);
  add(1, kFirst);
  rows_.flush();

  EXPECT_EQ(shown_, "42");
}

TEST_F(EventRowsTest, ShowsEventsWithoutAPartner) {
  for (const bool isReversed : {false, true}) {
    if (isReversed) reverse();
    shown_.clear();
    add(1, kFirst);
    add(2, "com.tarno.music.Playback.Stop");
    add(3, kFirst, R"({"a":1})");
    add(4, kSecond, R"({"a":2})");
    add(5, "com.tarno.halvox.uptime");
    add(6, "com.tarno.halvox.uptime");
    add(7, kFirst);
    rows_.flush();

    EXPECT_EQ(shown_, "1234567");
  }
}

TEST_F(EventRowsTest, OneEventIsThePartnerOfOnlyOneOther) {
  add(1, kFirst);
  add(2, kSecond);
  add(3, kSecond);
  add(4, kFirst);
  add(5, kFirst);
  add(6, kSecond);
  rows_.flush();

  EXPECT_EQ(shown_, "2346");
}

TEST_F(EventRowsTest, APartnerThatComesAfterAFlushIsNotShown) {
  add(1, kFirst);
  rows_.flush();
  EXPECT_EQ(shown_, "1");
  rows_.flush();
  add(2, kSecond);
  add(3, kSecond);
  rows_.flush();

  EXPECT_EQ(shown_, "13");
}

TEST_F(EventRowsTest, NeitherTheEventThatWasShownBeforeNorItsPartnerIsShown) {
  rows_.treatAsShown(1);
  add(1, kFirst);
  add(2, kSecond);
  add(3, kSecond);
  rows_.flush();
  EXPECT_EQ(shown_, "3");

  reverse();
  rows_.treatAsShown(4);
  add(4, kSecond);
  add(3, kFirst);
  add(2, kFirst);
  EXPECT_EQ(shown_, "32");
}

TEST_F(EventRowsTest, AnotherFirstEventThanTheOneShownBeforeIsShown) {
  rows_.treatAsShown(1);
  add(3, kSecond);
  add(1, kSecond);
  rows_.flush();

  EXPECT_EQ(shown_, "31");
}

}  // namespace
}  // namespace halvox::tools
