#include "platform/linux/store/EraseSelection.h"

#include <string>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

using Kind = ErasableRecord::Kind;

TEST(EraseSelectionTest, TheStampIsTheLastOfItsName) {
  EXPECT_EQ(stampOf(R"({"a":{"hvreporting_timestamp":1},"hvreporting_timestamp":2.5,"b":3})"), 2.5);
  EXPECT_FALSE(stampOf(R"({"hvreporting_timestamp":"1"})"));
  EXPECT_FALSE(stampOf(R"({"a":"\"hvreporting_timestamp\":1"})"));
}

TEST(EraseSelectionTest, ANameIsAWholeText) {
  EraseSelection selection({.application = "a\"b"});
  selection.endLook();

  EXPECT_TRUE(selection.selects({.kind = Kind::kEvent, .application = "a\"b"}));
  EXPECT_TRUE(selection.selects({.kind = Kind::kEvent, .payload = R"({"k":"a\"b"})"}));
  EXPECT_FALSE(selection.selects({.kind = Kind::kEvent, .payload = R"({"k":"a\"b c"})"}));
  EXPECT_TRUE(selection.selects({.payload = "\x2a\x03"
                                            "a\"b"}));
  EXPECT_FALSE(selection.selects({.payload = "\x2a\x04"
                                             "a\"bc"}));
}

TEST(EraseSelectionTest, LongNamesInMetricsHaveALongLength) {
  const std::string name(200, 'x');
  EraseSelection selection({.application = name});
  selection.endLook();

  EXPECT_TRUE(selection.selects({.payload = "\x2a\xc8\x01" + name}));
}

TEST(EraseSelectionTest, ALinkMessageBeforeItsEventIsStillThatOfAnotherApplication) {
  EraseSelection selection({.application = "player"});
  const ErasableRecord own{
      .kind = Kind::kLink, .sessionID = 1, .payload = R"({"hvreporting_timestamp":1.5})"};
  const ErasableRecord other{
      .kind = Kind::kLink, .sessionID = 1, .payload = R"({"hvreporting_timestamp":2.5})"};
  const ErasableRecord event{.kind = Kind::kEvent, .application = "player", .payload = own.payload};
  const ErasableRecord otherEvent{
      .kind = Kind::kEvent, .application = "browser", .payload = other.payload};
  for (const ErasableRecord& record : {own, event, other, otherEvent}) selection.look(record);
  selection.endLook();
  for (const ErasableRecord& record : {own, event, other, otherEvent}) selection.announce(record);

  EXPECT_TRUE(selection.selects(own));
  EXPECT_FALSE(selection.selects(other));
  EXPECT_FALSE(selection.selects(otherEvent));
}

TEST(EraseSelectionTest, CapturesAreOfAll) {
  EraseSelection selection({.session = 7});
  selection.endLook();

  EXPECT_TRUE(selection.selects({.isOfAll = true}));
  EXPECT_FALSE(selection.selects({}));
}

}  // namespace
}  // namespace halvox::platform::linux_
