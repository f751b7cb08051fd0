#include "platform/linux/store/spool/SpoolRow.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

SpooledMessage message(int number) {
  return {.subject = "halvox.media_session." + std::to_string(number),
          .identifier = "run-" + std::to_string(number),
          .body = R"({"sessionInfo":{},"payload":{"n":)" + std::to_string(number) + "}}"};
}

std::string rowOf(const std::vector<SpooledMessage>& messages) {
  SpoolRowWriter writer;
  for (const SpooledMessage& each : messages) writer.add(each);
  return std::string(writer.finish().value_or(""));
}

TEST(SpoolRowTest, GivesBackWhatWasWritten) {
  const std::vector<SpooledMessage> messages{message(1), SpooledMessage(), message(300)};

  EXPECT_EQ(readSpoolRow(rowOf(messages), messages.size()), messages);
}

TEST(SpoolRowTest, WritesOneRowAfterAnother) {
  SpoolRowWriter writer;
  writer.add(message(1));
  ASSERT_TRUE(writer.finish());
  writer.add(message(2));

  const std::string second(writer.finish().value_or(""));

  EXPECT_EQ(readSpoolRow(second, 1), std::vector<SpooledMessage>{message(2)});
}

TEST(SpoolRowTest, HasRoomForAThousandMessagesOrAQuarterOfAMebibyte) {
  SpoolRowWriter many;
  for (int number = 0; number < 1024; ++number) {
    ASSERT_TRUE(many.hasRoom());
    many.add(message(number));
  }
  SpoolRowWriter large;
  large.add({.subject = "s", .identifier = "i", .body = std::string(256U << 10U, 'x')});

  EXPECT_FALSE(many.hasRoom());
  EXPECT_FALSE(large.hasRoom());
}

TEST(SpoolRowTest, RefusesEveryDamagedByteAndEveryShorterRow) {
  const std::vector<SpooledMessage> messages{message(1), message(2)};
  const std::string row = rowOf(messages);

  for (std::size_t length = 0; length < row.size(); ++length) {
    EXPECT_FALSE(readSpoolRow(row.substr(0, length), 2)) << "first " << length << " bytes";
  }
  for (std::size_t index = 0; index < row.size(); ++index) {
    std::string damaged = row;
    damaged[index] = static_cast<char>(damaged[index] ^ 0x40);
    const auto read = readSpoolRow(damaged, 2);
    // Some bits of the frame's header have no meaning.
    EXPECT_TRUE(!read || *read == messages) << "byte " << index;
  }
}

TEST(SpoolRowTest, RefusesAnotherNumberOfMessages) {
  const std::string row = rowOf({message(1), message(2)});

  EXPECT_FALSE(readSpoolRow(row, 1));
  EXPECT_FALSE(readSpoolRow(row, 3));
  EXPECT_FALSE(readSpoolRow(row, SpoolRowWriter::kMostMessages + 1));
}

}  // namespace
}  // namespace halvox::platform::linux_
