#include <array>
#include <memory>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include <gtest/gtest.h>

#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/ValueDecoder.h"
#include "platform/linux/connection/wire/testdata/TestFrames.h"

// The content of the decoder's caches must not change the result of decoding.
namespace halvox::platform::linux_::dbus {
namespace {

using Values = std::vector<Value>;

constexpr std::string_view kSignature = "a{sv}uqaax";

// One entry of a{sv}, which begins at a multiple of 8 bytes.
WireBytes& entry(WireBytes& bytes, std::string_view key, std::string_view type) {
  return bytes.align(8).text(key).signature(type);
}

std::string messageBody(const WireBytes& entries, std::uint64_t reporter, bool bigEndian = false) {
  WireBytes body(bigEndian);
  body.array(8, entries.bytes()).u32(4).u16(18);
  WireBytes numbers(bigEndian);
  numbers.u64(reporter);
  // A list that contains one list of one number. Written by hand, because the padding of the inner
  // list depends on its place in the message.
  body.align(4);
  const std::size_t lists = body.bytes().size() + 4;
  WireBytes inner(bigEndian);
  inner.raw(std::string(lists % 8, '\0')).u32(8).align(8).raw(numbers.bytes());
  return body.u32(static_cast<std::uint32_t>(inner.bytes().size() - lists % 8))
      .raw(std::string_view(inner.bytes()).substr(lists % 8))
      .bytes();
}

WireBytes typicalEntries(std::uint64_t number, std::string_view text, bool bigEndian = false) {
  WireBytes entries(bigEndian);
  entry(entries, "frame_counter", "x").u64(number);
  entry(entries, "id", "u").u32(7);
  entry(entries, "", "y").u8(1);
  entry(entries, "route", "s").text(text);
  entry(entries, "volume", "d").real(0.5);
  entry(entries, "is_running", "b").u32(1);
  entry(entries, "field_number_1", "q").u16(1);
  entry(entries, "field_number_2", "q").u16(2);
  return entries;
}

struct Decoded {
  Values values;
  std::optional<std::string> error;
  bool operator==(const Decoded&) const = default;
};

Decoded decoded(const std::string& body, DecodeScratch& scratch, bool bigEndian = false) {
  Frame frame;
  frame.header.signature = kSignature;
  frame.header.bigEndian = bigEndian;
  frame.body = asBytes(body);
  Decoded result;
  if (const auto error = decodeBody(frame, kSignature, result.values, scratch)) {
    result.error = error->message;
  }
  return result;
}

Decoded decodedAlone(const std::string& body, bool bigEndian = false) {
  DecodeScratch scratch;
  return decoded(body, scratch, bigEndian);
}

class DecodeCachesTest : public ::testing::Test {
 protected:
  void expectSame(const std::string& body, bool bigEndian = false) {
    const Decoded expected = decodedAlone(body, bigEndian);
    const Decoded actual = decoded(body, scratch_, bigEndian);
    EXPECT_EQ(actual.error, expected.error);
    EXPECT_EQ(actual.values, expected.values);
  }

  DecodeScratch scratch_{.caches = std::make_unique<DecodeCaches>()};
};

TEST_F(DecodeCachesTest, MessagesWithTheSameKeysAreDecodedAnew) {
  for (std::uint64_t number = 0; number < 3; ++number) {
    const std::string body =
        messageBody(typicalEntries(number, std::string(number, 't')), 1 + number / 2);
    ASSERT_FALSE(decodedAlone(body).error.has_value());
    expectSame(body);
  }
}

TEST_F(DecodeCachesTest, AKeyMayComeWithAnotherType) {
  for (const std::string_view type : {"u", "i", "u", "(d)", "i"}) {
    WireBytes entries;
    entry(entries, "a", type).align(type == "(d)" ? 8 : 4).raw(std::string(8, '\1'));
    if (type != "(d)") entries = WireBytes(), entry(entries, "a", type).u32(1);
    expectSame(messageBody(entries, 1));
  }
}

TEST_F(DecodeCachesTest, TheLastOfEntriesWithOneKnownKeyCounts) {
  WireBytes once;
  entry(once, "a", "u").u32(1);
  expectSame(messageBody(once, 1));
  WireBytes twice;
  entry(twice, "a", "u").u32(1);
  entry(twice, "b", "u").u32(2);
  entry(twice, "a", "u").u32(3);

  const Decoded result = decoded(messageBody(twice, 1), scratch_);

  EXPECT_EQ(result.values.front(), Value(Dictionary{{"a", 3U}, {"b", 2U}}));
  expectSame(messageBody(twice, 1));
}

TEST_F(DecodeCachesTest, AKnownKeyIsFoundTwiceIfOneOfItsValuesIsAContainer) {
  WireBytes once;
  entry(once, "a", "u").u32(1);
  expectSame(messageBody(once, 1));
  for (const bool isFirst : {true, false}) {
    WireBytes twice;
    if (!isFirst) entry(twice, "a", "u").u32(1);
    entry(twice, "a", "au").array(4, WireBytes().u32(2).bytes());
    if (isFirst) entry(twice, "a", "u").u32(1);
    expectSame(messageBody(twice, 1));
  }
}

TEST_F(DecodeCachesTest, InnerDictionariesMayHaveTheKeysOfTheOuterOne) {
  WireBytes once;
  entry(once, "a", "u").u32(1);
  entry(once, "b", "u").u32(1);
  expectSame(messageBody(once, 1));
  WireBytes inner;
  entry(inner, "a", "u").u32(2);
  WireBytes outer;
  entry(outer, "a", "u").u32(1);
  // Begin at offset 24, where an inner array of dictionaries needs no padding of its own.
  entry(outer, "c", "a{sv}").align(4);
  outer.u32(static_cast<std::uint32_t>(inner.bytes().size())).align(8).raw(inner.bytes());
  entry(outer, "a", "u").u32(3);
  entry(outer, "b", "u").u32(4);
  ASSERT_FALSE(decodedAlone(messageBody(outer, 1)).error.has_value());
  expectSame(messageBody(outer, 1));
}

TEST_F(DecodeCachesTest, BytesInTheOtherOrderAreNotTakenForKnownOnes) {
  for (const bool bigEndian : {false, true, false}) {
    const std::string body = messageBody(typicalEntries(1, "x", bigEndian), 1, bigEndian);
    ASSERT_FALSE(decodedAlone(body, bigEndian).error.has_value());
    expectSame(body, bigEndian);
  }
  expectSame(messageBody(typicalEntries(1, "x"), 1), true);
}

TEST_F(DecodeCachesTest, ZerosAreNotTakenForAKnownKey) {
  expectSame(messageBody(WireBytes().raw(std::string(16, '\0')), 1));
}

TEST_F(DecodeCachesTest, EveryTruncationFailsAsBefore) {
  const std::string body = messageBody(typicalEntries(1, "a text"), 1);
  expectSame(body);
  for (std::size_t length = 0; length < body.size(); ++length) expectSame(body.substr(0, length));
}

TEST_F(DecodeCachesTest, EveryChangedByteIsDecodedAsBefore) {
  const std::string body = messageBody(typicalEntries(1, "a text"), 1);
  for (std::size_t place = 0; place < body.size(); ++place) {
    for (const int change : {0x01, 0x04, 0x80, 0xFF}) {
      expectSame(body);
      std::string changed = body;
      changed[place] = static_cast<char>(changed[place] ^ change);
      expectSame(changed);
    }
  }
}

TEST_F(DecodeCachesTest, MoreKeysThanTheCacheHasRoomForAreAllFound) {
  for (int round = 0; round < 3; ++round) {
    WireBytes entries;
    for (int number = 0; number < 600; ++number) {
      entry(entries, "number " + std::to_string(number % 500), "u").u32(7);
    }
    expectSame(messageBody(entries, 1));
  }
}

TEST_F(DecodeCachesTest, DictionariesHaveRoomForTheEntriesOfTheReceiver) {
  scratch_.addedEntries = 4;
  Decoded result = decoded(messageBody(typicalEntries(1, "x"), 1), scratch_);
  Dictionary message = result.values.front().dictionary();
  const Dictionary::Entry* const before = message.begin();

  for (const char* const key : {"added 1", "added 2", "added 3", "added 4"}) message.add(key, 1);

  EXPECT_EQ(message.begin(), before);
  EXPECT_EQ(message.size(), 12U);
}

TEST_F(DecodeCachesTest, TextsOfEveryLengthAreDecodedAnew) {
  for (const std::size_t length : {0U, 14U, 15U, 127U, 128U, 129U, 1000U}) {
    for (const char letter : {'a', 'b', 'c'}) {
      expectSame(messageBody(typicalEntries(1, std::string(length, letter)), 1));
    }
  }
}

TEST_F(DecodeCachesTest, TextsOutliveTheBytesOfTheirMessage) {
  for (const std::size_t length : {15U, 128U, 129U}) {
    const std::string text(length, 't');
    Decoded result;
    for (int round = 0; round < 2; ++round) {
      auto body = std::make_unique<std::string>(messageBody(typicalEntries(1, text), 1));
      result = decoded(*body, scratch_);
      body->assign(body->size(), '-');
    }
    const Dictionary message = result.values.front().dictionary();
    ASSERT_NE(message.find("route"), nullptr);
    EXPECT_EQ(message.find("route")->string(), text);
  }
}

TEST_F(DecodeCachesTest, LastOfEntriesWithOneKeyOutlivesTheBytesOfItsMessage) {
  const std::string text(20, 't');
  Decoded result;
  for (int round = 0; round < 2; ++round) {
    WireBytes entries = typicalEntries(1, std::string(30, 'u'));
    entry(entries, "route", "s").text(text);
    std::string body = messageBody(entries, 1);
    expectSame(body);
    result = decoded(body, scratch_);
    body.assign(body.size(), '-');
  }
  EXPECT_EQ(result.values.front().dictionary().find("route")->string(), text);
}

TEST_F(DecodeCachesTest, TextsThatAreNotUTF8AreRefusedAsBefore) {
  expectSame(messageBody(typicalEntries(1, std::string(20, 't')), 1));
  expectSame(messageBody(typicalEntries(1, std::string(19, 't') + "\xFF"), 1));
  expectSame(messageBody(typicalEntries(1, std::string(10, 't') + '\0' + std::string(9, 't')), 1));
}

// --- Headers ------------------------------------------------------------------------------------

struct ReadHeader {
  std::optional<std::string> error;
  std::vector<std::string> texts;
  std::vector<std::uint64_t> numbers;
  bool operator==(const ReadHeader&) const = default;
};

ReadHeader readHeader(const std::variant<Frame, WireError>& read) {
  if (const auto* error = std::get_if<WireError>(&read)) {
    return {error->message + std::to_string(error->offset), {}, {}};
  }
  const MessageHeader& header = std::get<Frame>(read).header;
  return {std::nullopt,
          {std::string(header.path), std::string(header.interface), std::string(header.member),
           std::string(header.errorName), std::string(header.destination),
           std::string(header.sender), std::string(header.signature)},
          {static_cast<std::uint64_t>(header.type), header.flags, header.bigEndian, header.serial,
           header.replySerial, header.unixFds, std::get<Frame>(read).body.size()}};
}

TEST(HeaderCacheTest, EveryChangedByteIsReadAsBefore) {
  HeaderCache cache;
  const std::string frame = callWith("u", WireBytes().u32(1));
  for (std::size_t place = 0; place < frame.size(); ++place) {
    for (const int change : {0, 0x01, 0x02, 0x80, 0xFF}) {
      std::string changed = frame;
      changed[place] = static_cast<char>(changed[place] ^ change);
      EXPECT_EQ(readHeader(readFrame(asBytes(changed), cache)),
                readHeader(readFrame(asBytes(changed))))
          << place << " " << change;
    }
  }
}

TEST(HeaderCacheTest, SerialNumberAndFlagsAreThoseOfTheFrame) {
  HeaderCache cache;
  for (const std::uint32_t serial : {1U, 2U, 0U, 3U}) {
    std::string frame = frameOf(1, callFields("u"), WireBytes().u32(1).bytes(), serial);
    frame[2] = static_cast<char>(serial);
    EXPECT_EQ(readHeader(readFrame(asBytes(frame), cache)), readHeader(readFrame(asBytes(frame))));
  }
}

TEST(HeaderCacheTest, TheSameFieldsMeanSomethingElseInOtherMessages) {
  HeaderCache cache;
  for (const auto type : std::to_array<std::uint8_t>({1, 3, 1, 2, 9})) {
    const std::string frame = frameOf(type, callFields("u"), WireBytes().u32(1).bytes());
    EXPECT_EQ(readHeader(readFrame(asBytes(frame), cache)), readHeader(readFrame(asBytes(frame))));
  }
}

TEST(HeaderCacheTest, TextsDoNotPointIntoAnEarlierFrame) {
  HeaderCache cache;
  {
    const std::string frame = callWith("u", WireBytes().u32(1));
    ASSERT_TRUE(std::holds_alternative<Frame>(readFrame(asBytes(frame), cache)));
  }
  const std::string frame = callWith("u", WireBytes().u32(1));
  EXPECT_EQ(readHeader(readFrame(asBytes(frame), cache)), readHeader(readFrame(asBytes(frame))));
}

}  // namespace
}  // namespace halvox::platform::linux_::dbus
