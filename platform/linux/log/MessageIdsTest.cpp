#include "platform/linux/log/MessageIds.h"

#include <string>

#include <gtest/gtest.h>

#include "platform/log.h"

namespace halvox::platform::linux_ {
namespace {

std::string line(std::string_view unit, std::string_view text) {
  return detail::logPrefix(unit, 120) + std::string(text);
}

TEST(MessageIdsTest, LinesOfOneMeaningHaveOneIdentifier) {
  const std::string_view atStart =
      messageId(line("StoreOpening", "the database is damaged: page 3; it was set aside as x"));
  const std::string_view later = messageId(line("SqliteStore", "the database is damaged: page 3"));

  EXPECT_EQ(atStart.size(), 32U);
  EXPECT_EQ(atStart, later);
}

TEST(MessageIdsTest, AnIdentifierIsFoundAfterANameInTheText) {
  EXPECT_EQ(
      messageId(line("SourceReader", "driver source alsa did not answer within 50 ms")).size(),
      32U);
}

TEST(MessageIdsTest, OtherLinesHaveNone) {
  EXPECT_EQ(messageId(line("SqliteStore", "opened the database")), "");
  EXPECT_EQ(messageId(line("Other", "the database is damaged: page 3")), "");
  EXPECT_EQ(messageId(line("SqliteStoreCopy", "the database is damaged: page 3")), "");
  EXPECT_EQ(messageId("the database is damaged"), "");
  EXPECT_EQ(messageId(":"), "");
  EXPECT_EQ(messageId(""), "");
}

}  // namespace
}  // namespace halvox::platform::linux_
