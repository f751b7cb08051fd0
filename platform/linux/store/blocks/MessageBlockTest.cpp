#include "platform/linux/store/blocks/MessageBlock.h"

#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/store/blocks/MessageBlockReader.h"
#include "platform/linux/store/blocks/MessageBlockWriter.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Lt;
using ::testing::SizeIs;

// A record as one line.
std::string line(const BlockRecord& record) {
  const std::string time = std::to_string(record.time);
  switch (record.kind) {
    case BlockRecordKind::kGap:
      return "gap";
    case BlockRecordKind::kEvent:
      return time + " " + std::string(record.name) +
             (record.application.empty() ? " " : " of " + std::string(record.application) + " ") +
             std::string(record.payload);
    case BlockRecordKind::kLink:
      return time + " " + std::to_string(record.sessionID) + " " + std::string(record.clientName) +
             " " + std::string(record.serviceName) + " " + std::to_string(record.category) + " " +
             std::to_string(record.type) + " " + std::string(record.payload);
  }
  return {};
}

class MessageBlockTest : public ::testing::Test {
 protected:
  // Returns the records of a block as lines. If the block is damaged, the last line is "damaged".
  std::vector<std::string> lines(std::string_view block, std::uint64_t records) {
    std::vector<std::string> read;
    reader.open(block, static_cast<std::int64_t>(records));
    while (reader.next()) read.push_back(line(reader.record()));
    if (reader.isDamaged()) read.emplace_back("damaged");
    return read;
  }
  // Adds messages as a client sends them: two events and a link message each.
  void addMessages(int count) {
    for (int number = 0; number < count; ++number) {
      const std::string fields = R"({"counter":)" + std::to_string(number) +
                                 R"(,"route":"Speaker","format":"lpcm/float32")";
      const double time = 1'700'000'000 + 0.001 * number;
      writer.addEvent(time, {"com.tarno.halvox.Playback.Start"}, fields + R"(,"app":"a"})");
      writer.addEvent(time, {"com.tarno.generic.Playback.Start"}, fields + R"(,"app":"a"})");
      writer.addLink(time, {party, 4, 1}, fields + R"(,"audiotag":"PlaybackStart"})");
    }
  }

  const LinkParty party{.sessionID = -7, .clientName = "client", .serviceName = "music_session"};
  MessageBlockWriter writer;
  MessageBlockReader reader;
};

TEST_F(MessageBlockTest, ReturnsEventsAndLinkMessagesInTheirOrder) {
  writer.addEvent(1.5, {"first"}, R"({"a":1})");
  writer.addLink(2.5, {party, 4, 65'535}, R"({"a":1,"b":2})");
  writer.addEvent(0.5, {"second"}, "{}");

  for (const BlockPacking packing : {BlockPacking::kPlain, BlockPacking::kZstd}) {
    EXPECT_THAT(lines(writer.finish(packing), 3),
                ElementsAre(R"(1.500000 first {"a":1})",
                            R"(2.500000 -7 client music_session 4 65535 {"a":1,"b":2})",
                            "0.500000 second {}"));
  }
}

TEST_F(MessageBlockTest, KeepsEveryBitOfATime) {
  const std::vector<double> times{1'700'000'000.123456,
                                  std::nextafter(1'700'000'000.123456, 0),
                                  -0.0,
                                  std::numeric_limits<double>::infinity(),
                                  std::numeric_limits<double>::lowest(),
                                  std::numeric_limits<double>::denorm_min()};
  for (const double time : times) writer.addEvent(time, {"e"}, "{}");

  std::vector<double> read;
  reader.open(writer.finish(BlockPacking::kZstd), static_cast<std::int64_t>(times.size()));
  while (reader.next()) read.push_back(reader.record().time);
  ASSERT_EQ(read, times);
  EXPECT_TRUE(std::signbit(read[2]));
}

TEST_F(MessageBlockTest, KeepsApartHeadsThatDifferInOnePart) {
  const LinkParty other{.sessionID = -7, .clientName = "clientm", .serviceName = "usic_session"};
  for (int round = 0; round < 2; ++round) {
    writer.addLink(1, {party, 4, 1}, "{}");
    writer.addLink(1, {party, 4, 2}, "{}");
    writer.addLink(1, {party, 5, 1}, "{}");
    writer.addLink(1, {other, 4, 1}, "{}");
    writer.addEvent(1, {""}, "{}");
  }

  const auto read = lines(writer.finish(BlockPacking::kZstd), 10);
  EXPECT_THAT(std::vector(read.begin(), read.begin() + 5),
              ElementsAre("1.000000 -7 client music_session 4 1 {}",
                          "1.000000 -7 client music_session 4 2 {}",
                          "1.000000 -7 client music_session 5 1 {}",
                          "1.000000 -7 clientm usic_session 4 1 {}", "1.000000  {}"));
  EXPECT_EQ(std::vector(read.begin(), read.begin() + 5), std::vector(read.begin() + 5, read.end()));
}

TEST_F(MessageBlockTest, KeepsTheApplicationOfAnEvent) {
  for (int round = 0; round < 2; ++round) {
    writer.addEvent(1, {"ab", "c"}, "{}");
    writer.addEvent(1, {"a", "bc"}, "{}");
    writer.addEvent(1, {"abc"}, "{}");
  }

  EXPECT_THAT(lines(writer.finish(BlockPacking::kPlain), 6),
              ElementsAre("1.000000 ab of c {}", "1.000000 a of bc {}", "1.000000 abc {}",
                          "1.000000 ab of c {}", "1.000000 a of bc {}", "1.000000 abc {}"));
}

TEST_F(MessageBlockTest, KeysAreThoseOfItsRecords) {
  writer.addEvent(1, {"name", "org.app"}, "{}");
  writer.addLink(1, {party, 4, 1}, "{}");
  const std::string keys(writer.keys());

  EXPECT_EQ(keys.size(), 10U);
  EXPECT_TRUE(mayHave(keys, blockKey(BlockKeyKind::kName, "name")));
  EXPECT_TRUE(mayHave(keys, blockKey(BlockKeyKind::kApplication, "org.app")));
  EXPECT_TRUE(mayHave(keys, sessionKey(-7)));
  EXPECT_TRUE(mayHave(keys, blockKey(BlockKeyKind::kApplication, "client")));
  EXPECT_TRUE(mayHave(keys, blockKey(BlockKeyKind::kName, "music_session")));
  writer.clear();
  EXPECT_TRUE(writer.keys().empty());
}

TEST_F(MessageBlockTest, KeepsTheNumbersOfTheRecordsAfterADeletedOne) {
  writer.addEvent(1, {"a"}, "{}");
  writer.addGap();
  writer.addEvent(3, {"c"}, "{}");

  reader.open(writer.finish(BlockPacking::kPlain), 3);
  std::vector<std::string> read;
  while (reader.next()) read.push_back(std::to_string(reader.index()) + line(reader.record()));
  EXPECT_THAT(read, ElementsAre("01.000000 a {}", "1gap", "23.000000 c {}"));
}

TEST_F(MessageBlockTest, CostsFewBytesForMessagesThatDiffer) {
  addMessages(300);

  EXPECT_EQ(writer.records(), 900U);
  const std::string block(writer.finish(BlockPacking::kZstd));
  EXPECT_THAT(block, SizeIs(Lt(300U * 12)));
  const auto read = lines(block, 900);
  ASSERT_THAT(read, SizeIs(900));
  EXPECT_EQ(read.back(),
            "1700000000.299000 -7 client music_session 4 1 {\"counter\":299,\"route\":\"Speaker\","
            "\"format\":\"lpcm/float32\",\"audiotag\":\"PlaybackStart\"}");
}

TEST_F(MessageBlockTest, BeginsAnewAfterClear) {
  addMessages(3);
  writer.clear();
  writer.addEvent(1, {"com.tarno.halvox.Playback.Start"}, "{}");
  EXPECT_EQ(writer.records(), 1U);
  EXPECT_THAT(lines(writer.finish(BlockPacking::kZstd), 1),
              ElementsAre("1.000000 com.tarno.halvox.Playback.Start {}"));
}

TEST_F(MessageBlockTest, CompressesAgainAfterItsMemoryWasReleased) {
  addMessages(50);
  const std::string block(writer.finish(BlockPacking::kZstd));
  writer.release();
  EXPECT_EQ(writer.finish(BlockPacking::kZstd), block);
}

TEST_F(MessageBlockTest, HoldsALongPayload) {
  const std::string payload = "{\"x\":\"" + std::string(3'000'000, 'x') + "\"}";
  writer.addEvent(1, {"a"}, payload);
  writer.addEvent(1, {"b"}, "{}");
  EXPECT_THAT(lines(writer.finish(BlockPacking::kZstd), 2),
              ElementsAre("1.000000 a " + payload, "1.000000 b {}"));
}

TEST_F(MessageBlockTest, LeavesBytesThatDoNotBecomeShorterAsTheyAre) {
  writer.addEvent(1, {"a"}, "{}");
  EXPECT_EQ(writer.finish(BlockPacking::kZstd), std::string(writer.finish(BlockPacking::kPlain)));
}

TEST_F(MessageBlockTest, EmptyBlockHasNoRecords) {
  EXPECT_THAT(lines({}, 0), IsEmpty());
  EXPECT_THAT(lines(writer.finish(BlockPacking::kZstd), 0), IsEmpty());
  EXPECT_THAT(lines({}, 1), ElementsAre("damaged"));
}

TEST_F(MessageBlockTest, EveryShortenedBlockIsDamaged) {
  addMessages(2);
  for (const BlockPacking packing : {BlockPacking::kPlain, BlockPacking::kZstd}) {
    const std::string block(writer.finish(packing));
    for (std::size_t length = 0; length < block.size(); ++length) {
      const auto read = lines(std::string_view(block).substr(0, length), 6);
      ASSERT_FALSE(read.empty());
      EXPECT_EQ(read.back(), "damaged") << length;
    }
  }
}

TEST_F(MessageBlockTest, EveryFlippedBitOfACompressedBlockIsFound) {
  addMessages(40);
  std::string block(writer.finish(BlockPacking::kZstd));
  const auto whole = lines(block, 120);
  ASSERT_THAT(whole, SizeIs(120));
  for (std::size_t bit = 0; bit < 8 * block.size(); ++bit) {
    char& byte = block[bit / 8];
    const char before = byte;
    byte = static_cast<char>(static_cast<unsigned char>(byte) ^ (1U << (bit % 8)));
    const auto read = lines(block, 120);
    // A changed bit may be one that zstd does not use, and the text is then unchanged. No other
    // text may come out.
    EXPECT_TRUE(read == whole || read == std::vector<std::string>{"damaged"}) << bit;
    byte = before;
  }
}

TEST_F(MessageBlockTest, WrongNumberOfRecordsIsDamage) {
  writer.addEvent(1, {"a"}, "{}");
  writer.addEvent(2, {"b"}, "{}");
  const std::string block(writer.finish(BlockPacking::kPlain));
  EXPECT_THAT(lines(block, 1), ElementsAre("1.000000 a {}", "damaged"));
  EXPECT_THAT(lines(block, 3), ElementsAre("1.000000 a {}", "2.000000 b {}", "damaged"));
  EXPECT_THAT(lines(block, std::numeric_limits<std::uint64_t>::max()), ElementsAre("damaged"));
}

TEST_F(MessageBlockTest, ReferenceToAHeadThatDoesNotExistIsDamage) {
  // An event that refers to head 1, which does not exist; then time, shared bytes and rest, all 0.
  const std::string block{1, 1 | 1 << 2, 0, 0, 0};
  EXPECT_THAT(lines(block, 1), ElementsAre("damaged"));
}

TEST_F(MessageBlockTest, MoreSharedBytesThanThePayloadBeforeHasIsDamage) {
  // An event with a new head and an empty name, time 0, one shared byte (there is no payload before
  // it) and no rest.
  const std::string block{1, 1, 0, 0, 1, 0};
  EXPECT_THAT(lines(block, 1), ElementsAre("damaged"));
}

TEST_F(MessageBlockTest, UnknownPackingIsDamage) {
  EXPECT_THAT(lines(std::string(20, '\7'), 1), ElementsAre("damaged"));
}

}  // namespace
}  // namespace halvox::platform::linux_
