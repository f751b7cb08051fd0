#include <cstdint>
#include <limits>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/protobuf.h"

namespace halvox::platform {
namespace {

using Bytes = std::vector<std::uint8_t>;

std::span<const std::byte> span(const Bytes& bytes) { return std::as_bytes(std::span(bytes)); }

Bytes written(const ProtoWriter& writer) {
  Bytes bytes;
  for (const std::byte byte : writer.bytes()) bytes.push_back(std::to_integer<std::uint8_t>(byte));
  return bytes;
}

struct Varint {
  std::uint64_t value;
  bool error;
  std::size_t position;
  friend bool operator==(const Varint&, const Varint&) = default;
};

Varint readVarint(const Bytes& bytes) {
  ProtoReader reader(span(bytes));
  const std::uint64_t value = reader.readVarint();
  return {value, reader.hasError(), reader.position()};
}

// Whether the value is skipped completely.
bool skips(std::uint64_t number, ProtoWireType wireType, const Bytes& bytes) {
  ProtoReader reader(span(bytes));
  const bool skipped = reader.skipField(number, wireType);
  EXPECT_EQ(skipped, !reader.hasError());
  EXPECT_TRUE(!skipped || reader.position() == bytes.size());
  return skipped;
}

// --- Varints ------------------------------------------------------------------------------------

TEST(ProtoReaderTest, VarintsHaveSevenBitsAByteLowestFirst) {
  EXPECT_EQ(readVarint({0x00}), (Varint{0, false, 1}));
  EXPECT_EQ(readVarint({0x7F, 0x01}), (Varint{127, false, 1}));
  EXPECT_EQ(readVarint({0xAC, 0x02}), (Varint{300, false, 2}));
}

TEST(ProtoReaderTest, AVarintOfTenBytesHasAll64Bits) {
  const Bytes bytes{0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0x01};
  EXPECT_EQ(readVarint(bytes), (Varint{std::numeric_limits<std::uint64_t>::max(), false, 10}));
}

TEST(ProtoReaderTest, AVarintThatRunsLongerReadsAsZeroWithoutError) {
  EXPECT_EQ(readVarint(Bytes(12, 0xFF)), (Varint{0, false, 10}));
}

TEST(ProtoReaderTest, AVarintCutOffByTheEndIsAnErrorAndReadsAsZero) {
  EXPECT_EQ(readVarint({}), (Varint{0, true, 0}));
  EXPECT_EQ(readVarint({0x81}), (Varint{0, true, 1}));
  EXPECT_EQ(readVarint(Bytes(9, 0xFF)), (Varint{0, true, 9}));
}

// --- Strings ------------------------------------------------------------------------------------

TEST(ProtoReaderTest, AStringReplacesTheOldValueByteForByte) {
  const Bytes bytes{0x03, 'a', 0x00, 0xFF, 'b'};
  ProtoReader reader(span(bytes));
  std::string value = "something before";

  reader.readString(value);

  EXPECT_EQ(value, std::string("a\0\xFF", 3));
  EXPECT_EQ(reader.position(), 4U);
  EXPECT_TRUE(reader.hasMore());
}

TEST(ProtoReaderTest, AStringLongerThanWhatIsLeftIsAnErrorAndKeepsTheOldValue) {
  for (const Bytes& bytes : {Bytes{0x02, 'a'}, Bytes{}, Bytes{0x80},
                             Bytes{0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0x01}}) {
    ProtoReader reader(span(bytes));
    std::string value = "kept";

    reader.readString(value);

    EXPECT_TRUE(reader.hasError());
    EXPECT_FALSE(reader.hasMore());
    EXPECT_EQ(value, "kept");
  }
}

// --- Skipping -----------------------------------------------------------------------------------

TEST(ProtoReaderTest, ValuesOfEveryWireTypeAreSkipped) {
  EXPECT_TRUE(skips(9, ProtoWireType::kVarint, {0xAC, 0x02}));
  EXPECT_TRUE(skips(9, ProtoWireType::kFixed64, Bytes(8, 0xFF)));
  EXPECT_TRUE(skips(9, ProtoWireType::kLengthDelimited, {0x02, 0xFF, 0xFF}));
  EXPECT_TRUE(skips(9, ProtoWireType::kFixed32, Bytes(4, 0xFF)));
  // A group that contains a varint, a group with a string, and a fixed value.
  EXPECT_TRUE(skips(9, ProtoWireType::kStartGroup,
                    {0x08, 0x05, 0x53, 0x12, 0x01, 'x', 0x54, 0x1D, 1, 2, 3, 4, 0x4C}));
}

TEST(ProtoReaderTest, ValuesCutOffByTheEndAreNotSkipped) {
  EXPECT_FALSE(skips(9, ProtoWireType::kVarint, {0xAC}));
  EXPECT_FALSE(skips(9, ProtoWireType::kFixed64, Bytes(7, 0xFF)));
  EXPECT_FALSE(skips(9, ProtoWireType::kLengthDelimited, {0x02, 0xFF}));
  EXPECT_FALSE(skips(9, ProtoWireType::kFixed32, Bytes(3, 0xFF)));
  EXPECT_FALSE(skips(9, ProtoWireType::kStartGroup, {0x08, 0x05}));
}

TEST(ProtoReaderTest, WireTypesWithoutAValueAreNotSkipped) {
  for (const int wireType : {4, 6, 7}) {
    EXPECT_FALSE(skips(9, static_cast<ProtoWireType>(wireType), Bytes(16, 0)));
  }
}

TEST(ProtoReaderTest, AGroupEndsOnlyWithItsOwnNumber) {
  EXPECT_TRUE(skips(9, ProtoWireType::kStartGroup, {0x4C}));
  EXPECT_FALSE(skips(9, ProtoWireType::kStartGroup, {0x54}));
}

TEST(ProtoReaderTest, GroupsAreSkippedToADepthOfOneHundred) {
  const auto nested = [](std::size_t depth) {
    Bytes bytes(depth - 1, 0x4B);  // the tag of the outermost group has been read already
    bytes.insert(bytes.end(), depth, 0x4C);
    return bytes;
  };
  EXPECT_TRUE(skips(9, ProtoWireType::kStartGroup, nested(100)));
  EXPECT_FALSE(skips(9, ProtoWireType::kStartGroup, nested(101)));
  EXPECT_FALSE(skips(9, ProtoWireType::kStartGroup, nested(1'000'000)));
}

// --- Writing ------------------------------------------------------------------------------------

TEST(ProtoWriterTest, FieldsAreTagAndValueInTheOrderOfWriting) {
  ProtoWriter writer;
  writer.writeUInt64(300, 1);
  writer.writeInt32(5, 2);
  writer.writeString("ab", 16);

  EXPECT_EQ(written(writer), (Bytes{0x08, 0xAC, 0x02, 0x10, 0x05, 0x82, 0x01, 0x02, 'a', 'b'}));
}

TEST(ProtoWriterTest, ANegativeNumberTakesTenBytes) {
  ProtoWriter writer;
  writer.writeInt32(-1, 2);

  EXPECT_EQ(written(writer),
            (Bytes{0x10, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0x01}));
}

TEST(ProtoWriterTest, WhatIsWrittenIsReadAgain) {
  for (unsigned shift = 0; shift < 64; ++shift) {
    for (const std::uint64_t value : {std::uint64_t{1} << shift, (std::uint64_t{1} << shift) - 1}) {
      ProtoWriter writer;
      writer.writeUInt64(value, 536'870'911);
      ProtoReader reader(writer.bytes());
      EXPECT_EQ(reader.readTag().number, 536'870'911U);
      EXPECT_EQ(reader.readVarint(), value);
      EXPECT_EQ(reader.position(), reader.end());
    }
  }
}

// --- Text ---------------------------------------------------------------------------------------

TEST(ProtoTextFormatterTest, ObjectsAreIndentedAndStringsQuoted) {
  ProtoTextFormatter formatter;
  formatter.beginObject("outer");
  formatter.format("count", std::int32_t{-3});
  formatter.beginObject(nullptr);
  formatter.format("time", std::uint64_t{18'446'744'073'709'551'615U});
  formatter.endObject();
  formatter.format("node", "mixer");
  formatter.endObject();

  EXPECT_EQ(
      formatter.text(),
      "outer {\n  count: -3\n  {\n    time: 18446744073709551615\n  }\n  node: \"mixer\"\n}\n");
}

TEST(ProtoTextFormatterTest, WhatIsNotPrintableIsEscaped) {
  ProtoTextFormatter formatter;
  formatter.format("s", std::string_view("a\"\\\n\r\t\0\x7F\xC3\xA9"
                                         "1",
                                         11));

  EXPECT_EQ(formatter.text(), "s: \"a\\\"\\\\\\n\\r\\t\\000\\177\\303\\2511\"\n");
}

}  // namespace
}  // namespace halvox::platform
