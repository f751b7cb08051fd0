#include "tools/RowCursor.h"

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

TEST(RowCursorTest, ReadsBackWhatItPrints) {
  for (const double time : {0.0, 1795313222.25, 1795313222.1234567, 1e300, -5.5}) {
    const RowCursor cursor{"events", 4711, time};
    const auto parsed = parseCursor(cursorText(cursor));
    ASSERT_TRUE(parsed) << parsed.error().message;
    EXPECT_EQ(*parsed, cursor);
  }
  EXPECT_EQ(cursorText({"link", 7, 100}), "link:7@100");
}

TEST(RowCursorTest, RefusesAnythingElseWithAnExample) {
  for (const char* text : {"", "7", "events", "events:7", "events:7@", "events:@5", "events:x@5",
                           "events:0@5", "events:-7@5", "events:7@5s", "events@7:5",
                           "events:99999999999999999999@5", "events:7@nan", "events:7@inf"}) {
    const auto parsed = parseCursor(text);
    ASSERT_FALSE(parsed) << text;
    EXPECT_NE(parsed.error().message.find("such as events:4711@"), std::string::npos);
  }
}

}  // namespace
}  // namespace halvox::tools
